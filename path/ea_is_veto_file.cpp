// Names that clients must not create or touch.

#include "include/mavoea.h"
#include "path/names.h"

int MAVOEAIsVetoFile(const char* szName) {
    if (szName == nullptr) return 0;
    switch (*szName) {
        case '@':
            return mavoea::IsHiddenDirName(szName) ? 1 : 0;
        case '/':
            return MAVOEAIsHiddenDir(szName) == 1 ? 1 : 0;
        case '.':  // No hidden directory's name begins with a dot.
            return mavoea::IsVetoDotName(szName) ? 1 : 0;
        default:
            return 0;
    }
}
