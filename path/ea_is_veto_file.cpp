// Names that clients must not create or touch.

#include <string.h>

#include <string_view>

#include "include/mavoea.h"

namespace {

constexpr std::string_view kDatabasePrefix = ".MAVOGALDB";

}  // namespace

int MAVOEAIsVetoFile(const char* szName) {
    if (szName == nullptr) return 0;
    switch (*szName) {
        case '@':
        case '/':
            return MAVOEAIsHiddenDir(szName) == 1 ? 1 : 0;
        case '.':
            break;  // No hidden directory's name begins with a dot.
        default:
            return 0;
    }
    if (strcmp(szName, ".") == 0 || strcmp(szName, "..") == 0) return 1;
    return strncmp(szName, kDatabasePrefix.data(), kDatabasePrefix.size()) == 0 ? 1 : 0;
}
