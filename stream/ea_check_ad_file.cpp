// Tells whether a path is the "._" file of something that is there.

#include <string.h>

#include <string_view>

#include "format/apple_double.h"
#include "include/mavoea.h"
#include "util/file_io.h"
#include "util/owned.h"
#include "util/path_text.h"
#include "util/unit.h"

namespace mavoea {
namespace {

constexpr Unit unit("ea_check_ad_file");

constexpr std::string_view kPrefix = "._";

constexpr int kValid = 0;
constexpr int kNoPrefix = -2;
constexpr int kNotAppleDouble = -3;
constexpr int kNoCompanion = -4;

bool HasMagic(const char* path) {
    const UniqueFd fd(kernel::OpenToRead(path));
    std::uint8_t magic[4];
    return fd && ReadAt(fd.get(), magic, 0) == std::int64_t{sizeof magic} &&
           LoadBe32(magic) == kAppleDoubleMagic;
}

// `file` is the path of a "._" file in a buffer of its own, which becomes the companion's: the name
// without its prefix. A symbolic link is a companion, wherever it points.
bool HasCompanion(WorkingPath& file) {
    const std::string_view name = SplitObject(file.text()).name;
    if (name == kPrefix) return false;
    char* const at = file.data() + (file.text().size() - name.size());
    memmove(at, at + kPrefix.size(), name.size() - kPrefix.size() + 1);
    struct stat info;
    return kernel::Lstat(file.data(), &info) == 0;
}

}  // namespace
}  // namespace mavoea

using namespace mavoea;

int MAVOEACheckADFile(const char* path) {
    if (path == nullptr || *path == '\0') return unit.Fail(Err::kBadArgument);
    WorkingPath file(path);
    if (!file.ok()) return unit.Fail(Err::kMemory);
    if (!SplitObject(file.text()).name.starts_with(kPrefix)) return kNoPrefix;
    if (!HasMagic(path)) return kNotAppleDouble;
    return HasCompanion(file) ? kValid : kNoCompanion;
}
