#include "tools/store/foreign/detection.h"

#include <algorithm>
#include <memory>

#include "format/afp_info.h"
#include "format/samba_stream.h"
#include "platform/dos_attributes.h"
#include "platform/include/mavocore.h"
#include "tools/say/messages.h"
#include "tools/say/text.h"
#include "tools/store/foreign/spelling.h"
#include "tools/store/metadata.h"

namespace mavoea::tool {
namespace {

// Of many objects some tell it, as all are of one share.
std::optional<Sign> SignAmong(const DirectoryRef& directory) {
    constexpr std::size_t kMost = 64;
    std::size_t left = kMost;
    if (auto sign = SignOf({directory, "."})) return sign;
    for (const Directory::Entry& entry : directory->EntriesAtFirst()) {
        if (!S_ISREG(entry.type) && !S_ISDIR(entry.type)) continue;
        if (left-- == 0) break;
        if (auto sign = SignOf({directory, entry.name})) return sign;
    }
    return std::nullopt;
}

// Kept for the next object of the directory.
const std::optional<Sign>& SignInDirectory(const DirectoryRef& directory) {
    static std::weak_ptr<const Directory> last;
    static std::optional<Sign> sign;
    if (last.lock() != directory) {
        sign = SignAmong(directory);
        last = directory;
    }
    return sign;
}

}  // namespace

std::optional<Sign> SignIn(const std::vector<std::string>& attributes) {
    const auto has = [&](const auto& matches) {
        return std::any_of(attributes.begin(), attributes.end(), matches);
    };
    const auto is_stream = [](const std::string& name) {
        return DecodeStreamAttribute(name).has_value();
    };
    const auto is_stream_of = [](std::string_view wanted) {
        return [wanted](const std::string& name) {
            const auto stream = DecodeStreamAttribute(name);
            return stream && stream->name.text() == wanted;
        };
    };
    const auto is = [](std::string_view wanted) {
        return [wanted](const std::string& name) { return name == wanted; };
    };
    if (has(is_stream_of(kAfpResourceStream)) && !has(is(kRecordAttribute))) {
        return Sign{DialectOf(MAVO_VOLUME_SAMBA_ALL_STREAMS), "user.DosStream.AFP_Resource"};
    }
    if (has(is_stream_of(kAfpInfoStream))) {
        return Sign{DialectOf(MAVO_VOLUME_SAMBA_STREAM), "user.DosStream.AFP_AfpInfo"};
    }
    if (has(is_stream)) return Sign{DialectOf(MAVO_VOLUME_SAMBA), "user.DosStream.*"};
    if (has(is(kDosAttributesName))) {
        return Sign{DialectOf(MAVO_VOLUME_SAMBA), kDosAttributesName};
    }
    if (has(is(kRecordAttribute))) {
        return Sign{DialectOf(MAVO_VOLUME_NETATALK), kRecordAttribute};
    }
    for (const std::string_view name : {kFinderInfoName, kResourceForkName}) {
        const std::string attribute = "user." + std::string(name);
        if (has(is(attribute))) return Sign{DialectOf(MAVO_VOLUME_LINUX), attribute};
    }
    return std::nullopt;
}

std::optional<Sign> SignOf(const Place& place) {
    const auto inode = Inode::Find(place);
    if (!inode || !inode->HoldsContents()) return std::nullopt;
    return SignIn(inode->AttributeNames());
}

std::optional<Sign> FindSign(const Place& place) {
    if (auto sign = SignOf(place)) return sign;
    return SignInDirectory(place.directory);
}

void RequireDeclared(const Object& object) {
    if (object.declared) return;
    const auto sign = FindSign(object.place);
    if (!sign) return;
    const std::string& directory = object.place.directory->location();
    throw Failure(kFailed, object.path(),
                  std::string(sign->dialect->program) + " keeps metadata there, by " + sign->text +
                      ", and would not see this",
                  "say so with --volume " + Printable(directory) + '=' +
                      std::string(sign->dialect->name) +
                      " or in " MAVO_VOLUME_TABLE ", or that it is to be of another type");
}

}  // namespace mavoea::tool
