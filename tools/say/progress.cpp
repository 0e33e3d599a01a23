#include "tools/say/progress.h"

#include <sys/ioctl.h>
#include <unistd.h>

#include <iostream>

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

}  // namespace

Progress::Progress(const char* doing) : doing_(doing), on_(::isatty(STDERR_FILENO) == 1) {}

void Progress::Show(const std::string& status, const std::string& path) {
    using std::chrono::steady_clock;
    constexpr std::chrono::milliseconds kInterval(100);
    if (!on_) return;
    const auto now = steady_clock::now();
    if (shown_ && now - last_ < kInterval) return;
    last_ = now;
    shown_ = true;
    Write('\r' + Cut(std::string(doing_) + ": " + status + ", " + Printable(path)) + kEraseRest);
}

void Progress::Clear() {
    if (shown_) Write(std::string("\r") + kEraseRest);
    shown_ = false;
}

}  // namespace mavoea::tool
