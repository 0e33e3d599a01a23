#include "tools/store/foreign/detection.h"

#include <algorithm>
#include <filesystem>
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

namespace fs = std::filesystem;

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

// ---- streams_depot ------------------------------------------------------------------------------

// What it gives to an object that has streams, so that a later one of the same inode has none.
constexpr std::string_view kDepotAttribute = "user.SAMBA_STREAMS";
constexpr const char* kDepotName = ".streams";

// The first of the two levels of directories in it has names of two digits each.
bool IsDepot(const fs::path& path) {
    std::error_code error;
    if (!fs::is_directory(fs::symlink_status(path, error))) return false;
    constexpr std::string_view kDigits = "0123456789ABCDEF";
    fs::directory_iterator entries(path, error);
    for (; !error && entries != fs::directory_iterator(); entries.increment(error)) {
        const std::string name = entries->path().filename();
        if (entries->symlink_status(error).type() != fs::file_type::directory) continue;
        if (name.size() == 2 && name.find_first_not_of(kDigits) == std::string::npos) return true;
    }
    return false;
}

// In a directory or one of those above it, as text: a share has one in its root.
const std::string& DepotAbove(const Directory& directory) {
    std::optional<std::string>& depot = directory.depot();
    if (depot) return *depot;
    depot.emplace();
    for (fs::path at = directory.location();; at = at.parent_path()) {
        if (IsDepot(at / kDepotName)) *depot = at / kDepotName;
        if (!depot->empty() || at == at.parent_path()) return *depot;
    }
}

}  // namespace

std::string FindDepot(const Object& object, const Inode* inode,
                      const std::vector<std::string>& attributes) {
    const Dialect* const dialect = object.dialect();
    const bool is_sambas = dialect != nullptr && dialect->names == Dialect::Names::kStream;
    if (object.declared && !is_sambas) return {};
    const std::string& above = DepotAbove(*object.place.directory);
    if (!above.empty()) return above;
    if (inode != nullptr && S_ISDIR(inode->info().st_mode)) {
        const fs::path own = fs::path(object.place.location()) / kDepotName;
        if (IsDepot(own)) return own;
    }
    const bool has_some =
        std::find(attributes.begin(), attributes.end(), kDepotAttribute) != attributes.end();
    return has_some ? std::string(kDepotAttribute) : std::string();
}

Failure DepotIsUnknown(const Object& object, const std::string& depot) {
    return {kFailed, object.path(),
            "Samba keeps streams elsewhere there, by " + Printable(depot) +
                ", in a way that is not known: streams_depot",
            "have smbd serve it with streams_xattr, and copy what clients see onto that"};
}

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
    if (object.declared && object.dialect() == nullptr) return;
    const auto inode = Inode::Find(object.place);
    std::vector<std::string> attributes;
    if (inode && inode->HoldsContents()) attributes = inode->AttributeNames();
    if (const std::string depot = FindDepot(object, inode.get(), attributes); !depot.empty()) {
        throw DepotIsUnknown(object, depot);
    }
    if (object.declared) return;
    auto sign = SignIn(attributes);
    if (!sign) sign = SignInDirectory(object.place.directory);
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
