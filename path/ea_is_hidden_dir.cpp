// The system's hidden directories.

#include <libgen.h>
#include <string.h>
#include <strings.h>

#include "include/mavoea.h"
#include "path/names.h"
#include "util/owned.h"
#include "util/unit.h"

namespace mavoea {
namespace {

constexpr Unit unit("ea_is_hidden_dir");

// Every hidden directory's name begins with one of these.
constexpr bool MayBeHidden(char first) { return first == '@' || first == '.'; }

int IsHiddenDirName(const char* name) {
    if (!MayBeHidden(*name)) return 0;
    for (const char* hidden : kHiddenDirNames) {
        if (strcasecmp(name, hidden) == 0) return 1;
    }
    return 0;
}

}  // namespace
}  // namespace mavoea

using namespace mavoea;

int MAVOEAIsHiddenDir(const char* szPath) {
    if (szPath == nullptr) return -1;
    if (*szPath != '/') return IsHiddenDirName(szPath);

    const std::size_t size = strlen(szPath) + 1;
    const auto copy = Owned<char>::Allocate(size);  // basename writes into what it is given
    if (!copy) return unit.Fail(Err::kMemory);
    memcpy(copy.get(), szPath, size);
    const char* const name = basename(copy.get());
    if (name == nullptr) return unit.Fail(Err::kBaseName);
    return IsHiddenDirName(name);
}

int MAVOEAIsHiddenDirName(const char* szName) {
    if (szName == nullptr) return -1;
    return MayBeHidden(*szName) ? MAVOEAIsHiddenDir(szName) : 0;
}
