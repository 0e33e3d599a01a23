#include "fuzz/support/platform.h"

#include <dirent.h>
#include <errno.h>
#include <sanitizer/allocator_interface.h>
#include <stdarg.h>
#include <stdio.h>
#include <stdlib.h>
#include <syslog.h>

#include <algorithm>
#include <utility>

#include "include/mavoea.h"
#include "platform/include/mavoacl.h"
#include "platform/include/mavocore.h"

namespace mavoea::fuzz {
namespace {

struct Record {
    int code;
    const char* file;
    int line;
};

std::vector<int> codes;
Record top = {0, "", 0};

struct Watched {
    bool on;
    std::size_t largest;
    std::size_t total;
    long live;
};
Watched watched;

void NoteAllocation(const volatile void*, std::size_t size) {
    if (!watched.on) return;
    watched.largest = std::max(watched.largest, size);
    watched.total += size;
    ++watched.live;
}

void NoteFree(const volatile void* block) {
    if (watched.on && block != nullptr) --watched.live;
}

}  // namespace

std::vector<int> TakeCodes() { return std::exchange(codes, {}); }

bool IsKnownCode(int code) {
    static constexpr int kKnown[] = {
        MAVOEA_ERR_BUFFER_MEMORY,  MAVOEA_ERR_MEMORY,
        MAVOEA_ERR_NOT_PERMITTED,  MAVOEA_ERR_LOCK,
        MAVOEA_ERR_NOTHING_THERE,  MAVOEA_ERR_OPEN,
        MAVOEA_ERR_READ,           MAVOEA_ERR_WRITE,
        MAVOEA_ERR_BAD_ARGUMENT,   MAVOEA_ERR_NO_ATTRIBUTE,
        MAVOEA_ERR_STAT,           MAVOEA_ERR_RENAME,
        MAVOEA_ERR_SYSTEM_CALL,    MAVOEA_ERR_REMOVE,
        MAVOEA_ERR_MAKE_DIRECTORY, MAVOEA_ERR_BAD_APPLEDOUBLE,
        MAVOEA_ERR_BASE_NAME,      MAVOEA_ERR_RANGE,
        MAVOEA_ERR_NAME_TOO_LONG,
    };
    return std::find(std::begin(kKnown), std::end(kKnown), code) != std::end(kKnown);
}

void Fail(const char* format, ...) {
    va_list arguments;
    va_start(arguments, format);
    vfprintf(stderr, format, arguments);
    va_end(arguments);
    fputc('\n', stderr);
    abort();
}

int OpenDescriptors() {
    DIR* const directory = opendir("/proc/self/fd");
    if (directory == nullptr) Fail("/proc/self/fd cannot be listed");
    int count = -1;  // The listing's own.
    while (const dirent* entry = readdir(directory)) {
        if (entry->d_name[0] != '.') ++count;
    }
    closedir(directory);
    return count;
}

AllocationWatch::AllocationWatch() {
    static const int installed =
        __sanitizer_install_malloc_and_free_hooks(NoteAllocation, NoteFree);
    if (installed == 0 || watched.on) Fail("allocations cannot be watched");
    watched = {.on = true, .largest = 0, .total = 0, .live = 0};
}
AllocationWatch::~AllocationWatch() { watched.on = false; }
std::size_t AllocationWatch::largest() const { return watched.largest; }
std::size_t AllocationWatch::total() const { return watched.total; }
long AllocationWatch::live() const { return watched.live; }

}  // namespace mavoea::fuzz

using namespace mavoea::fuzz;

extern "C" {

// Less memory that waits for late accesses: an input frees little, and new pages cost most.
const char* __asan_default_options() { return "quarantine_size_mb=8:malloc_context_size=12"; }

void MLIBCErrSetEx(int code, const char* file, int line) {
    top = {code, file, line};
    const bool watching = std::exchange(watched.on, false);  // Our own memory is not the library's.
    codes.push_back(code);
    watched.on = watching;
}
int MLIBCErrGet(void) { return top.code; }
const char* MLIBCErrorGetFile(void) { return top.file; }
int MLIBCErrorGetLine(void) { return top.line; }

int MAVOACLSetEADirACL(const char*) { return 0; }

void syslog(int, const char* format, ...) {
    // Formatted, so that a bad argument shows.
    char text[4096];
    va_list arguments;
    va_start(arguments, format);
    vsnprintf(text, sizeof text, format, arguments);
    va_end(arguments);
    errno = EDOM;  // syslog is free to change errno.
}

}  // extern "C"
