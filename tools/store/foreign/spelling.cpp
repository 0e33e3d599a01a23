#include "tools/store/foreign/spelling.h"

#include <linux/magic.h>
#include <sys/vfs.h>

#include <algorithm>
#include <cerrno>

#include "format/afp_info.h"
#include "format/samba_stream.h"
#include "platform/dos_attributes.h"
#include "tools/say/messages.h"
#include "tools/say/text.h"
#include "tools/store/marks.h"
#include "tools/store/metadata.h"

namespace mavoea::tool {
namespace {

using Datum = Spelling::Datum;

constexpr std::string_view kUser = "user.";
constexpr std::size_t kValueMax = 65536;  // the kernel's

Datum DatumOf(std::string_view name) {
    switch (KindOf(name)) {
        case Kind::kFinderInfo:
            return Datum::kFinderInfo;
        case Kind::kResourceFork:
            return Datum::kFork;
        case Kind::kAttribute:
        case Kind::kLocked:
            break;
    }
    return Datum::kAttribute;
}

Datum DatumOfStream(std::string_view name) {
    if (name == kAfpInfoStream) return Datum::kAfpInfo;
    return name == kAfpResourceStream ? Datum::kFork : Datum::kAttribute;
}

// Those in which something else is kept than an attribute of the user.
bool IsReserved(const std::string& attribute) {
    return !attribute.starts_with(kUser) || IsMark(attribute) || attribute == kDosAttributesName;
}

// What there is room for, in words.
std::string Limit(const Inode& inode, const Spelling& spelling, std::size_t size) {
    const std::size_t most = kValueMax - (spelling.has_nul ? 1 : 0);
    struct statfs info = {};
    if (size <= most && ::statfs(inode.ProcPath().c_str(), &info) == 0 &&
        info.f_type == EXT4_SUPER_MAGIC) {
        return "the file system has " + std::to_string(info.f_bsize) +
               " bytes for all attributes of an object";
    }
    return "a value has " + std::to_string(most) + " bytes at most";
}

}  // namespace

std::optional<Spelling> SpellingOf(const std::string& attribute, const Dialect& dialect) {
    if (attribute == kRecordAttribute) {
        return Spelling{attribute,
                        Datum::kRecord,
                        {},
                        false,
                        dialect.finder_info == Dialect::FinderInfo::kRecord};
    }
    if (const auto stream = DecodeStreamAttribute(attribute)) {
        if (stream->extent > 0) return std::nullopt;
        const std::string name(stream->name.text());
        return Spelling{attribute, DatumOfStream(name), name, true,
                        dialect.names == Dialect::Names::kStream};
    }
    if (dialect.names == Dialect::Names::kStream || IsReserved(attribute)) return std::nullopt;
    const std::string name = attribute.substr(kUser.size());
    if (name.empty()) return std::nullopt;
    const bool has_nul = dialect.names == Dialect::Names::kPlainWithNul;
    const Datum datum = DatumOf(name);
    return Spelling{attribute, datum, name, has_nul, true, datum != Datum::kAttribute};
}

std::vector<Spelling> SpellingsOf(const AttributeSource& source, const Dialect& dialect) {
    return SpellingsAmong(source.AttributeNames(), dialect);
}

std::vector<Spelling> SpellingsAmong(const std::vector<std::string>& attributes,
                                     const Dialect& dialect) {
    std::vector<Spelling> all;
    for (const std::string& attribute : attributes) {
        if (auto spelling = SpellingOf(attribute, dialect)) all.push_back(*std::move(spelling));
    }
    std::stable_partition(all.begin(), all.end(), [](const Spelling& one) { return one.own; });
    return all;
}

std::optional<Spelling> SpellAttribute(const std::string& name, const Dialect& dialect) {
    std::string attribute;
    if (dialect.names == Dialect::Names::kStream) {
        const auto stream = EncodeStreamAttribute(name);
        if (!stream) return std::nullopt;
        attribute = stream->text();
    } else {
        attribute = std::string(kUser) + name;
        if (attribute.size() > kXattrNameMax) return std::nullopt;
    }
    auto spelling = SpellingOf(attribute, dialect);
    const bool means_it =
        spelling && spelling->datum == Datum::kAttribute && spelling->name == name;
    return means_it ? spelling : std::nullopt;
}

Spelling SpellFinderInfo(const Dialect& dialect) {
    if (dialect.finder_info == Dialect::FinderInfo::kStream) {
        return {"user.DosStream.AFP_AfpInfo:$DATA", Datum::kAfpInfo, {}, true, true};
    }
    return {std::string(kUser) + std::string(kFinderInfoName), Datum::kFinderInfo, {}, false, true};
}

Spelling SpellFork(const Dialect& dialect) {
    if (dialect.names == Dialect::Names::kStream) {
        return {"user.DosStream.AFP_Resource:$DATA", Datum::kFork, {}, true, true};
    }
    return {std::string(kUser) + std::string(kResourceForkName), Datum::kFork, {}, false, true};
}

std::string NameOfExtent(std::string_view attribute, unsigned extent) {
    constexpr std::string_view kFirst = "user.DosStream.";
    return "user.DosStreamExt." + std::to_string(extent) + '.' +
           std::string(attribute.substr(kFirst.size()));
}

bool IsForeign(const std::string& attribute, const Dialect& dialect) {
    return SpellingOf(attribute, dialect) || DecodeStreamAttribute(attribute);
}

bool IsForeignInAny(const std::string& attribute) {
    return attribute == kRecordAttribute || DecodeStreamAttribute(attribute) ||
           (attribute.starts_with(kUser) &&
            DatumOf(attribute.substr(kUser.size())) != Datum::kAttribute);
}

std::optional<Bytes> Spelling::Value(const AttributeSource& source) const {
    auto value = source.Attribute(attribute);
    if (!value || !has_nul) return value;
    if (!DecodeStreamAttribute(attribute)) {
        if (!value->empty() && value->back() == 0) value->pop_back();
        return value;
    }
    const auto stream = DecodeStreamValue(*value);
    if (!stream) return value;
    Bytes bytes(stream->bytes.begin(), stream->bytes.end());
    for (unsigned extent = 1; extent <= stream->extents; ++extent) {
        const auto more = source.Attribute(NameOfExtent(attribute, extent));
        // A last byte that tells of nothing is one of the value, which has been written without.
        if (!more && extent == 1) return value;
        if (!more) {
            throw Failure(kFailed, source.path(),
                          NameOfAttribute(attribute) + " is damaged: a part of it is missing",
                          "see what there is with: getfattr -d -m - PATH", Fault::kDamage);
        }
        bytes.insert(bytes.end(), more->begin(), more->end());
    }
    return bytes;
}

void Store(const Inode& inode, const Spelling& spelling, Bytes value) {
    const std::size_t size = value.size();
    if (spelling.has_nul) value.push_back(0);
    const auto no_room = [&] {
        return Failure(
            kFailed, inode.path(),
            "no room for its " + std::to_string(size) + " bytes: " + Limit(inode, spelling, size),
            "make it smaller, or use a file system with more room for attributes");
    };
    if (value.size() > kValueMax) throw no_room();
    try {
        inode.SetAttribute(spelling.attribute, value);
    } catch (const SystemFailure& failure) {
        if (failure.error() == ENOSPC || failure.error() == E2BIG || failure.error() == ERANGE) {
            throw no_room();
        }
        throw;
    }
    if (inode.Attribute(spelling.attribute) == value) return;
    throw Failure(kFailed, inode.path(), "what was written is not what is read back",
                  "check the disk");
}

std::optional<std::string> NoteOfUnseen(const Object& object, const std::string& name,
                                        std::uint64_t size) {
    const Dialect* const dialect = object.dialect();
    const bool seen = dialect == nullptr || dialect->names != Dialect::Names::kStream || size > 0 ||
                      KindOf(name) != Kind::kAttribute;
    if (seen) return std::nullopt;
    return Printable(object.path()) + ": " + NameOfAttribute(name) +
           " has no value, and Samba's clients do not see such attributes";
}

bool Drop(const Inode& inode, const Spelling& spelling) {
    const auto stream = DecodeStreamAttribute(spelling.attribute);
    const auto value = stream ? inode.Attribute(spelling.attribute) : std::nullopt;
    const auto decoded = value ? DecodeStreamValue(*value) : std::nullopt;
    for (unsigned extent = 1; decoded && extent <= decoded->extents; ++extent) {
        (void)inode.RemoveAttribute(NameOfExtent(spelling.attribute, extent));
    }
    return inode.RemoveAttribute(spelling.attribute);
}

}  // namespace mavoea::tool
