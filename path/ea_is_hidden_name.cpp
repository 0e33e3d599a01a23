// Legacy metadata names, such as "MAVO:Resource".

#include <string.h>

#include "include/mavoea.h"

int MAVOEAIsHiddenName(const char* szName) {
    return szName != nullptr && strchr(szName, ':') != nullptr ? 1 : 0;
}
