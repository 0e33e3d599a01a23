#include "tests/platform/support/syslog_capture.h"

#include <stdarg.h>
#include <stdio.h>
#include <syslog.h>

#include <mutex>
#include <utility>

namespace mavoea::test {
namespace {

std::mutex mutex;
std::vector<std::string> lines;

void Capture(int priority, const char* format, va_list arguments) {
    char text[1024];
    vsnprintf(text, sizeof text, format, arguments);
    const std::lock_guard lock(mutex);
    lines.push_back("<" + std::to_string(priority) + ">" + text);
}

}  // namespace

std::vector<std::string> TakeSyslog() {
    const std::lock_guard lock(mutex);
    return std::exchange(lines, {});
}

}  // namespace mavoea::test

extern "C" {

void syslog(int priority, const char* format, ...) {
    va_list arguments;
    va_start(arguments, format);
    mavoea::test::Capture(priority, format, arguments);
    va_end(arguments);
}

// What syslog() is called where the C library's fortified headers are in use.
void __syslog_chk(int priority, int /*flag*/, const char* format, ...);
void __syslog_chk(int priority, int /*flag*/, const char* format, ...) {
    va_list arguments;
    va_start(arguments, format);
    mavoea::test::Capture(priority, format, arguments);
    va_end(arguments);
}

}  // extern "C"
