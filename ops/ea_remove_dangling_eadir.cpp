// Removes the EA directory of a directory that holds nothing else.

#include <string.h>

#include "include/mavoea.h"
#include "ops/folder.h"
#include "platform/include/mavocore.h"
#include "util/owned.h"
#include "util/path_text.h"
#include "util/unit.h"

namespace mavoea {
namespace {

constexpr Unit unit("ea_remove_dangling_eadir");

constexpr std::string_view kEADir = "/@eaDir";

// Whether the only entry of a directory is its EA directory, whose objects are then all gone. A
// walk that did not come upon ".", ".." and that one has not seen all.
bool OnlyEADir(Folder& dir) {
    int count = 0;
    while (const dirent* const entry = dir.NextOfAll()) {
        const std::string_view name = entry->d_name;
        if (name != "." && name != ".." && name != kEADir.substr(1)) return false;
        ++count;
    }
    return !dir.failed() && count == 3;
}

}  // namespace
}  // namespace mavoea

using namespace mavoea;

void MAVOEARemoveDanglingEADir(const char* szDir) {
    if (szDir == nullptr) return;
    Folder dir(szDir, Folder::Links::kFollowed);
    if (!dir) {
        unit.Log("%s:%d failed to opendir [%s], errno=%m", szDir);
        return;
    }
    if (!OnlyEADir(dir)) return;
    const std::size_t size = strlen(szDir) + kEADir.size() + 1;
    const auto path = Owned<char>::Allocate(size);
    if (!path) return;
    CutShort(path.get(), static_cast<int>(size)).Add(szDir).Add(kEADir);
    (void)MLIBCExec("/bin/rm", "-rf", path.get(), nullptr);
}
