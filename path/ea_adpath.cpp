// The metadata file of an object on an AppleDouble volume: a sibling named "._" and the object's
// name, so "/v/a/b" has "/v/a/._b".

#include "path/ea_adpath.h"

#include "include/mavoea.h"
#include "util/path_text.h"
#include "util/unit.h"

namespace mavoea {
namespace {

constexpr Unit unit("ea_adpath");

}  // namespace
}  // namespace mavoea

using namespace mavoea;

int MAVOEAADPath(const char* szPath, char* szBuf, int cbBuf) {
    if (szPath == nullptr || szBuf == nullptr || cbBuf <= 0) return unit.Fail(Err::kBadArgument);
    // The name as it was given: empty for a path that ends in '/'.
    if (SplitObject(szPath).name.size() > kAppleDoubleNameMax) return unit.Fail(Err::kNameTooLong);

    const SourcePath path(szPath, szBuf, cbBuf);
    if (!path.ok()) return unit.Fail(Err::kMemory);
    const ObjectPath object = SplitObject(WithoutTrailingSlash(path.text()));
    CutShort out(szBuf, cbBuf);
    out.Add(object.parent).Add(kAppleDoublePrefix).Add(object.name);
    return 0;
}
