// Tells the platform's search index of a change.

#include "include/mavoea.h"
#include "platform/include/mavocore.h"

int MAVOIndex(const char* szPath, const char* szOldPath, int op) {
    return MLIBMavoIndexAddEx(szPath, szOldPath, op, 0, 0);
}
