#include "tools/say/progress.h"

#include <sys/ioctl.h>
#include <unistd.h>

#include <array>
#include <cstdio>
#include <iostream>

#include "tools/say/interrupt.h"
#include "tools/say/output.h"
#include "tools/say/text.h"

namespace mavoea::tool {
namespace {

constexpr const char* kEraseRest = "\x1b[K";

// To the terminal's width, whole characters of UTF-8.
std::string Cut(std::string line) {
    constexpr std::size_t kUsual = 80;
    winsize size{};
    const bool known = ::ioctl(STDERR_FILENO, TIOCGWINSZ, &size) == 0 && size.ws_col > 1;
    std::size_t room = (known ? size.ws_col : kUsual) - 1;
    if (line.size() <= room) return line;
    while (room > 0 && (static_cast<unsigned char>(line[room]) & 0xC0) == 0x80) --room;
    line.resize(room);
    return line;
}

void Write(const std::string& text) { std::cerr << text << std::flush; }

std::optional<std::chrono::seconds>& Interval() {
    static std::optional<std::chrono::seconds> interval;
    return interval;
}

bool& Silent() {
    static bool silent = false;
    return silent;
}

// "12.5/s".
std::string Rate(std::uint64_t done, std::chrono::duration<double> time) {
    std::array<char, 64> text;
    const double rate = time.count() > 0 ? static_cast<double>(done) / time.count() : 0;
    (void)std::snprintf(text.data(), text.size(), "%.1f/s", rate);
    return text.data();
}

}  // namespace

void ReportProgressEach(std::chrono::seconds interval) { Interval() = interval; }

void SilenceProgress() { Silent() = true; }

Progress::Progress(const char* doing, Lines lines)
    : doing_(doing), on_(lines == Lines::kOnTerminal && ::isatty(STDERR_FILENO) == 1) {}

bool Progress::wanted() const { return !Silent() && (on_ || Interval() || ProgressRequested()); }

void Progress::Show(const std::string& status, const std::string& path,
                    std::optional<std::uint64_t> done) {
    constexpr std::chrono::milliseconds kInterval(100);
    if (!wanted()) return;
    const auto now = Clock::now();
    const bool due = !on_ && Interval() && now - told_ >= *Interval();
    if (TakeProgressRequest() || due) {
        told_ = now;
        Tell(status, path, done);
    }
    if (!on_ || (shown_ && now - last_ < kInterval)) return;
    last_ = now;
    shown_ = true;
    Write('\r' + Cut(std::string(doing_) + ": " + status + ", " + Printable(path)) + kEraseRest);
}

void Progress::Tell(const std::string& status, const std::string& path,
                    std::optional<std::uint64_t> done) {
    Clear();
    const std::string rate = done ? ", " + Rate(*done, told_ - begin_) : std::string();
    Report(std::string(doing_) + ": " + status + rate + ", " + Printable(path));
}

void Progress::Clear() {
    if (shown_) Write(std::string("\r") + kEraseRest);
    shown_ = false;
}

}  // namespace mavoea::tool
