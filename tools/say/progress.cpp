#include "tools/say/progress.h"

#include <sys/ioctl.h>
#include <unistd.h>

#include <array>
#include <cstdio>
#include <iostream>
#include <utility>

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

std::function<std::optional<std::uint64_t>()>& Total() {
    static std::function<std::optional<std::uint64_t>()> total;
    return total;
}

bool& Silent() {
    static bool silent = false;
    return silent;
}

// "40 s", "3 min", "2 h 5 min".
std::string Duration(std::uint64_t seconds) {
    constexpr std::uint64_t kMinute = 60;
    constexpr std::uint64_t kHour = 60 * kMinute;
    const std::string minutes = std::to_string(seconds % kHour / kMinute) + " min";
    if (seconds >= kHour) return std::to_string(seconds / kHour) + " h " + minutes;
    return seconds >= kMinute ? minutes : std::to_string(seconds) + " s";
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

void ExpectTotal(std::function<std::optional<std::uint64_t>()> total) {
    Total() = std::move(total);
}

void SilenceProgress() { Silent() = true; }

std::string SizeText(std::uint64_t size) {
    constexpr std::array kUnits = {"KiB", "MiB", "GiB", "TiB", "PiB", "EiB"};
    constexpr std::uint64_t kUnit = 1024;
    if (size < kUnit) return std::to_string(size) + " bytes";
    std::size_t unit = 0;
    auto units = static_cast<double>(size) / kUnit;
    for (; units >= kUnit && unit + 1 < kUnits.size(); ++unit) units /= kUnit;
    std::array<char, 64> text;
    (void)std::snprintf(text.data(), text.size(), "%.1f %s", units, kUnits[unit]);
    return text.data();
}

Progress::Progress(const char* doing, Lines lines)
    : doing_(doing), on_(lines == Lines::kOnTerminal && ::isatty(STDERR_FILENO) == 1) {}

bool Progress::wanted() const { return !Silent() && (on_ || Interval() || ProgressRequested()); }

void Progress::Show(const std::string& so_far, const std::string& path,
                    std::optional<std::uint64_t> done, std::optional<std::uint64_t> of_total) {
    constexpr std::chrono::milliseconds kInterval(100);
    constexpr std::chrono::milliseconds kSoon(500);
    if (!wanted()) return;
    const auto now = Clock::now();
    const bool due = !on_ && Interval() && now - told_ >= *Interval();
    const bool tells = TakeProgressRequest() || due;
    const bool shows = on_ && (!shown_ || now - last_ >= kInterval);
    if (!tells && !shows) return;
    // What is soon done needs no total.
    const bool soon = !tells && now - begin_ < kSoon;
    const std::string status = so_far + (soon ? std::string() : Share(of_total ? of_total : done));
    if (tells) {
        told_ = now;
        Tell(status, path, done);
    }
    if (!shows) return;
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

// ", 24 % of 5000, 3 min left", as far as that is known.
std::string Progress::Share(std::optional<std::uint64_t> done) const {
    const auto total = done && Total() ? Total()() : std::nullopt;
    if (!total || *total < *done || *done == 0) return {};
    constexpr std::uint64_t kHundred = 100;
    const std::chrono::duration<double> passed = Clock::now() - begin_;
    const auto left = static_cast<std::uint64_t>(
        passed.count() * static_cast<double>(*total - *done) / static_cast<double>(*done));
    return ", " + std::to_string(kHundred * *done / *total) + " % of " + std::to_string(*total) +
           ", " + Duration(left) + " left";
}

void Progress::Clear() {
    if (shown_) Write(std::string("\r") + kEraseRest);
    shown_ = false;
}

}  // namespace mavoea::tool
