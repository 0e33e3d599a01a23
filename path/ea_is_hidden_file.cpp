// Names that directory listings leave out.

#include <string.h>

#include "include/mavoea.h"
#include "path/names.h"

namespace {

bool IsHiddenDotName(const char* name) {
    if (name[1] == '_') return true;
    if (name[1] == 'D') return strcmp(name, ".DS_Store") == 0;
    return mavoea::IsVetoDotName(name);
}

}  // namespace

int MAVOEAIsHiddenFile(const char* szName) {
    if (szName == nullptr) return 0;
    if (static_cast<unsigned char>(*szName) > '@') return 0;  // as most names begin
    if (*szName == '@') return mavoea::IsHiddenDirName(szName) ? 1 : 0;
    if (*szName == '.') return IsHiddenDotName(szName) ? 1 : 0;
    return MAVOEAIsVetoFile(szName);
}
