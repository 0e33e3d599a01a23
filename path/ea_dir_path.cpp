// The EA directory: "@eaDir" beside the object holds its metadata files, "@eaDir/<name>" is its
// legacy folder.

#include "path/ea_dir_path.h"

#include <errno.h>

#include <cstdint>

#include "include/mavoea.h"
#include "util/path_text.h"
#include "util/unit.h"

namespace mavoea {
namespace {

constexpr Unit unit("ea_dir_path");

// What the longest result, "<parent>@eaDir/<name>", adds to the path.
constexpr std::int64_t kAdded = kEADirName.size() + 1;
constexpr std::int64_t kLongest = 4095;

}  // namespace

char* DeriveDirPath(int form, std::string_view path, char* szBuf, int cbBuf) {
    if (path.empty() || szBuf == nullptr) {
        errno = ENOENT;
        unit.Fail(Err::kBadArgument);
        return nullptr;
    }
    // The bound counts the path as it was given and no NUL, whatever the form.
    const std::int64_t need = static_cast<std::int64_t>(path.size()) + kAdded;
    if (need > cbBuf || need > kLongest) {
        errno = ENAMETOOLONG;
        unit.Fail(Err::kNameTooLong);
        return nullptr;
    }
    const ObjectPath object = SplitObject(WithoutTrailingSlash(path));
    PathWriter out(szBuf);
    out.Add(object.parent).Add(kEADirName);
    if (form == EA_FORM_FOLDER) out.Add("/").Add(object.name);
    return out.Finish();
}

}  // namespace mavoea

using namespace mavoea;

int MAVOEADirPath(int form, const char* szPath, char* szBuf, int cbBuf) {
    if (szPath == nullptr || szBuf == nullptr) {
        errno = ENOENT;
        return unit.Fail(Err::kBadArgument);
    }
    const SourcePath path(szPath, szBuf, cbBuf);
    if (!path.ok()) return unit.Fail(Err::kMemory);
    return DeriveDirPath(form, path.text(), szBuf, cbBuf) == nullptr ? -1 : 0;
}
