// The names that file services must not show.
#ifndef MAVOEA_PATH_NAMES_H_
#define MAVOEA_PATH_NAMES_H_

#include <string.h>

#include <string_view>

namespace mavoea {

// In the order in which they are listed and compared.
inline constexpr const char* kHiddenDirNames[] = {"@eaDir", "@tmp", "@sharebin"};

// Whether a name that begins with '@' is one of them. Out of line, so that callers decide most
// names without a stack frame.
bool IsHiddenDirAtName(const char* name);

inline bool IsHiddenDirName(const char* name) {
    return *name == '@' && IsHiddenDirAtName(name);  // as the names of all of them begin
}

inline constexpr std::string_view kDatabasePrefix = ".MAVOGALDB";

// Whether a name that begins with a dot is a veto file. Listings ask it of every name, so the
// second byte decides wherever it can.
inline bool IsVetoDotName(const char* name) {
    switch (name[1]) {
        case '\0':
            return true;
        case '.':
            return name[2] == '\0';
        case kDatabasePrefix[1]:
            return strncmp(name, kDatabasePrefix.data(), kDatabasePrefix.size()) == 0;
        default:
            return false;
    }
}

}  // namespace mavoea

#endif  // MAVOEA_PATH_NAMES_H_
