// Metadata files in the EA directory, "<parent>/@eaDir/<name>@<kind>", and the choice between them
// and the "._" file.

#include <errno.h>

#include <algorithm>
#include <cstdint>

#include "include/mavoea.h"
#include "path/ea_dir_path.h"
#include "util/path_text.h"
#include "util/unit.h"

namespace mavoea {
namespace {

constexpr Unit unit("ea_path");

constexpr std::int64_t kLongest = MAVOEA_PATH_SIZE;

// "<name>@MavoEAStream" fits the 255 bytes of a file name.
constexpr std::size_t kNameMax = 255 - 1 - std::string_view(MAVOEA_KIND_STREAM).size();
static_assert(kNameMax == 242);

// An extension survives shortening when it has at most this many bytes, its '.' included.
constexpr std::size_t kExtensionMax = 6;

// The character that stands for what shortening drops; the last one is a space.
constexpr std::string_view kCheckCharacters =
    "1234567890abcdefghijklmnopqrstuvwxyz-_=+';[]{}~`.!@#$%^&*() ";
static_assert(kCheckCharacters.size() == 60);

char CheckCharacter(std::string_view dropped) {
    std::uint32_t sum = 0;
    for (const char c : dropped) sum += static_cast<unsigned char>(c);
    return kCheckCharacters[sum % kCheckCharacters.size()];
}

// Shortens a name of more than kNameMax bytes to exactly kNameMax, in `to`.
std::string_view Shorten(std::string_view name, char* to) {
    // It stands for all from the last byte that has room on.
    const char check = CheckCharacter(name.substr(kNameMax - 1));
    const std::string_view end = name.substr(name.size() - kExtensionMax);
    const std::string_view extension = end.substr(std::min(end.rfind('.'), end.size()));
    PathWriter(to)
        .Add(name.substr(0, kNameMax - 1 - extension.size()))
        .Add({&check, 1})
        .Add(extension);
    return {to, kNameMax};
}

}  // namespace
}  // namespace mavoea

using namespace mavoea;

int MAVOEAPathNoADFS(int form, const char* szPath, const char* szName, char* szBuf, int cbBuf) {
    if (szPath == nullptr || szName == nullptr) return unit.Fail(Err::kBadArgument);
    if (*szPath == '\0') return unit.Fail(Err::kBadArgument);

    const SourcePath source(szPath, szBuf, cbBuf);
    if (!source.ok()) return unit.Fail(Err::kMemory);
    std::string_view path = WithoutTrailingSlash(source.text());

    // Made on the name as it is; only the file form counts the NUL.
    const std::string_view kind(szName);
    const auto need =
        static_cast<std::int64_t>(path.size() + kind.size()) + (form == EA_FORM_FILE ? 9 : 8);
    if (need > cbBuf || need > kLongest) {
        errno = ENAMETOOLONG;
        return unit.Fail(Err::kNameTooLong);
    }

    std::string_view name;
    char shortened[kNameMax];
    if (form == EA_FORM_FILE) {
        name = SplitObject(path).name;
        if (name.size() > kNameMax) {
            path.remove_suffix(name.size() - kNameMax);
            name = Shorten(name, shortened);
        }
    }
    char* const dir_end = DeriveDirPath(form, path, szBuf, cbBuf);
    if (dir_end == nullptr) return -1;
    PathWriter out(dir_end);
    out.Add("/");
    if (form == EA_FORM_FILE) out.Add(name).Add("@");
    out.Add(kind).Finish();
    return 0;
}

int MAVOEAPath(int form, const char* szPath, const char* szName, char* szBuf, int cbBuf,
               int place) {
    if (szPath == nullptr || szName == nullptr) return unit.Fail(Err::kBadArgument);
    switch (place) {
        case EA_PLACE_EADIR:
            return MAVOEAPathNoADFS(form, szPath, szName, szBuf, cbBuf) == 0 ? 0 : -1;
        case EA_PLACE_APPLEDOUBLE:
            return MAVOEAADPath(szPath, szBuf, cbBuf) == 0 ? 0 : -1;
        default:
            return unit.Fail(Err::kBadArgument);
    }
}
