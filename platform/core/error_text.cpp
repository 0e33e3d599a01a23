// What the codes on the error stack mean to who called, and what to do about them. The texts are
// those of docs/man/libmavoea-errors.7.scd.

#include <array>

#include "platform/include/mavocore.h"

namespace mavoea::core {
namespace {

struct ErrorText {
    const char* text;
    const char* advice;
    int code;
};

constexpr std::array kErrorTexts = {
    ErrorText{"No error is recorded", "Look at errno and at the system log.", 0},
    ErrorText{"Out of memory, or a buffer is too small", "Free memory or pass a larger buffer.",
              0x100},
    ErrorText{"Out of memory", "Free memory and try again.", 0x200},
    ErrorText{"The lock or the permissions do not allow it",
              "Open the stream with the lock that the call needs; check permissions.", 0x300},
    ErrorText{"Somebody else has the metadata locked", "Try again later.", 0x400},
    ErrorText{"There is no resource fork", "Treat the fork as absent.", 0x700},
    ErrorText{"A metadata file could not be opened", "Look at errno and at the system log.", 0x900},
    ErrorText{"Metadata could not be read, or is damaged",
              "Look at the system log; check the metadata file before writing to it.", 0xA00},
    ErrorText{"Metadata could not be written", "Look at errno: the volume may be full.", 0xB00},
    ErrorText{"An argument is not valid", "Correct the call.", 0xD00},
    ErrorText{"There is no such attribute", "Treat the attribute as absent.", 0x2000},
    ErrorText{"The file could not be looked at", "Look at errno.", 0x2700},
    ErrorText{"Metadata could not be renamed", "Look at errno; check both directories.", 0x2800},
    ErrorText{"A system call failed", "Look at errno and at the system log.", 0x2A00},
    ErrorText{"Metadata could not be removed", "Look at errno; check the EA directory.", 0x3900},
    ErrorText{"The EA directory could not be made",
              "Run as the superuser; check that the volume can be written to.", 0x3C00},
    ErrorText{"This is no usable AppleDouble file", "Leave the file as it is and examine it.",
              0x4000},
    ErrorText{"The path has no base name", "Correct the path.", 0x9A00},
    ErrorText{"The value does not fit in the buffer",
              "Ask for the length and pass a larger buffer.", 0xBF00},
    ErrorText{"The name or path is too long", "Use a shorter name.", 0xC300},
};

const ErrorText* Find(int code) {
    for (const ErrorText& row : kErrorTexts) {
        if (row.code == code) return &row;
    }
    return nullptr;
}

}  // namespace
}  // namespace mavoea::core

using namespace mavoea::core;

const char* MAVOErrorText(int code) {
    const ErrorText* row = Find(code);
    return row == nullptr ? "Unknown error code" : row->text;
}

const char* MAVOErrorAdvice(int code) {
    const ErrorText* row = Find(code);
    return row == nullptr ? "Look at errno and at the system log." : row->advice;
}
