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

}  // namespace

bool IsHiddenDirAtName(const char* name) {
    const char letter = static_cast<char>(name[1] | ('a' - 'A'));
    for (const char* hidden : kHiddenDirNames) {
        // Their second letters differ, so that at most one is compared whole.
        if (letter == hidden[1] && strcasecmp(name, hidden) == 0) return true;
    }
    return false;
}

}  // namespace mavoea

using namespace mavoea;

int MAVOEAIsHiddenDir(const char* szPath) {
    if (szPath == nullptr) return -1;
    if (*szPath != '/') return IsHiddenDirName(szPath) ? 1 : 0;

    const std::size_t size = strlen(szPath) + 1;
    const auto copy = Owned<char>::Allocate(size);  // basename writes into what it is given
    if (!copy) return unit.Fail(Err::kMemory);
    memcpy(copy.get(), szPath, size);
    const char* const name = basename(copy.get());
    if (name == nullptr) return unit.Fail(Err::kBaseName);
    return IsHiddenDirName(name) ? 1 : 0;
}

int MAVOEAIsHiddenDirName(const char* szName) {
    if (szName == nullptr) return -1;
    return IsHiddenDirName(szName) ? 1 : 0;
}
