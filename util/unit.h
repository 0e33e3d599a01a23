// How a unit reports: one record on the platform's error stack per failure, lines in the system
// log, both with the unit's name and the line that decided it.
#ifndef MAVOEA_UTIL_UNIT_H_
#define MAVOEA_UTIL_UNIT_H_

#include <errno.h>
#include <syslog.h>

#include <concepts>
#include <cstddef>
#include <type_traits>

#include "include/mavoea.h"
#include "platform/include/mavocore.h"

namespace mavoea {

// Codes on the error stack; mavoea.h says what each means.
enum class Err : int {
    kBufferMemory = MAVOEA_ERR_BUFFER_MEMORY,
    kMemory = MAVOEA_ERR_MEMORY,
    kNotPermitted = MAVOEA_ERR_NOT_PERMITTED,
    kLock = MAVOEA_ERR_LOCK,
    kNothingThere = MAVOEA_ERR_NOTHING_THERE,
    kOpen = MAVOEA_ERR_OPEN,
    kRead = MAVOEA_ERR_READ,
    kWrite = MAVOEA_ERR_WRITE,
    kBadArgument = MAVOEA_ERR_BAD_ARGUMENT,
    kNoAttribute = MAVOEA_ERR_NO_ATTRIBUTE,
    kStat = MAVOEA_ERR_STAT,
    kRename = MAVOEA_ERR_RENAME,
    kSystemCall = MAVOEA_ERR_SYSTEM_CALL,
    kRemove = MAVOEA_ERR_REMOVE,
    kMakeDirectory = MAVOEA_ERR_MAKE_DIRECTORY,
    kBadAppleDouble = MAVOEA_ERR_BAD_APPLEDOUBLE,
    kBaseName = MAVOEA_ERR_BASE_NAME,
    kRange = MAVOEA_ERR_RANGE,
    kNameTooLong = MAVOEA_ERR_NAME_TOO_LONG,
};

// Puts errno back when it goes out of scope, so that reporting does not disturb it.
class ErrnoKeeper {
 public:
    ErrnoKeeper() = default;
    ~ErrnoKeeper() { errno = saved_; }
    ErrnoKeeper(const ErrnoKeeper&) = delete;
    ErrnoKeeper& operator=(const ErrnoKeeper&) = delete;

 private:
    int saved_ = errno;
};

// A log line's format that has been checked, when compiled, against the arguments after the first
// two, which are always the unit's name and the line. Knows what the library's lines use: %s, %d,
// %i, %u, %0nX and %m.
template <class... Args>
class LogFormat {
 public:
    // NOLINTNEXTLINE(google-explicit-constructor): stands in for a string literal.
    consteval LogFormat(const char* text, int line = __builtin_LINE()) : text_(text), line_(line) {
        // cppcheck-suppress constStatement; it takes the pack's comma for an operator
        constexpr char kinds[] = {'s', 'd', KindOf<Args>()..., '\0'};
        std::size_t next = 0;
        for (const char* at = text; *at != '\0'; ++at) {
            if (*at != '%') continue;
            ++at;
            while (*at >= '0' && *at <= '9') ++at;
            if (*at == 'm') continue;
            const char wanted = *at == 'X' || *at == 'i' ? 'd' : *at;
            if (kinds[next++] != wanted) FormatAndArgumentsDiffer();
        }
        if (kinds[next] != '\0') FormatAndArgumentsDiffer();
    }

    constexpr const char* text() const { return text_; }
    constexpr int line() const { return line_; }

 private:
    static void FormatAndArgumentsDiffer();  // Not constexpr: reaching it fails the compilation.

    template <class Arg>
    static consteval char KindOf() {
        if constexpr (std::convertible_to<Arg, const char*>) return 's';
        if constexpr (std::same_as<std::remove_cvref_t<Arg>, int>) return 'd';
        if constexpr (std::same_as<std::remove_cvref_t<Arg>, unsigned>) return 'u';
        return '?';
    }

    const char* text_;
    int line_;
};

class Unit {
 public:
    explicit constexpr Unit(const char* name) : name_(name) {}

    // Records the failure at the caller's line; returns -1. errno stays as it is.
    int Fail(Err code, int line = __builtin_LINE()) const {
        const ErrnoKeeper keep;
        MLIBCErrSetEx(static_cast<int>(code), name_, line);
        return -1;
    }

    // Logs that `check`, the text of a failed argument check, does not hold, and records 0xD00.
    int FailCheck(const char* check, int line = __builtin_LINE()) const {
        // sic: "Invaild". Logs are searched for it.
        Write("%s:%d Invaild Argument (%s)=[%d]\n", line, check, 0);
        return Fail(Err::kBadArgument, line);
    }

    // Writes a line to the system log, at error priority. `format` begins "%s:%d", which take the
    // unit's name and the caller's line; the arguments follow. errno stays as it is.
    template <class... Args>
    void Log(LogFormat<std::type_identity_t<Args>...> format, Args... args) const {
        Write(format.text(), format.line(), args...);
    }

    // The same about a failure that another unit has recorded: the three arguments behind the first
    // two are that record, the error stack's top.
    template <class... Args>
    void LogWrapped(LogFormat<int, const char*, int, std::type_identity_t<Args>...> format,
                    Args... args) const {
        Write(format.text(), format.line(), MLIBCErrGet(), MLIBCErrorGetFile(), MLIBCErrorGetLine(),
              args...);
    }

    // The same for a helper that logs in the name of the unit's line that called it.
    template <class... Args>
    void LogAt(int line, LogFormat<std::type_identity_t<Args>...> format, Args... args) const {
        Write(format.text(), line, args...);
    }

 private:
    template <class... Args>
    void Write(const char* format, int line, Args... args) const {
        const ErrnoKeeper keep;
        syslog(LOG_ERR, format, name_, line, args...);
    }

    const char* name_;
};

}  // namespace mavoea

#endif  // MAVOEA_UTIL_UNIT_H_
