// Names that directory listings leave out.

#include <string.h>

#include "include/mavoea.h"

int MAVOEAIsHiddenFile(const char* szName) {
    if (szName == nullptr) return 0;
    if (MAVOEAIsVetoFile(szName) == 1) return 1;
    if (szName[0] != '.') return 0;
    return szName[1] == '_' || strcmp(szName, ".DS_Store") == 0 ? 1 : 0;
}
