#include "tests/tool/holdings.h"

#include <errno.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/stat.h>
#include <sys/xattr.h>

#include <algorithm>
#include <filesystem>
#include <optional>

#include "tests/support/mac_files.h"
#include "tests/support/record_builder.h"

namespace mavoea::test {
namespace {

namespace fs = std::filesystem;

constexpr std::size_t kNameLimit = 242;

[[noreturn]] void Die(const std::string& what) {
    fprintf(stderr, "test support: %s: %s\n", what.c_str(), strerror(errno));
    abort();
}

void MakeDirectory(const std::string& path) {
    if (mkdir(path.c_str(), 0777) != 0 && errno != EEXIST) Die(path);
    if (chmod(path.c_str(), 0777) != 0) Die(path);
}

std::vector<std::string> FileAttributeNames(const std::string& path) {
    std::string names(65536, '\0');
    const ssize_t size = llistxattr(path.c_str(), names.data(), names.size());
    std::vector<std::string> all;
    const char* const end = names.data() + std::max<ssize_t>(size, 0);
    for (const char* name = names.data(); name < end; name += strlen(name) + 1) {
        all.emplace_back(name);
    }
    return all;
}

bool IsZero(const Bytes& bytes) {
    return std::all_of(bytes.begin(), bytes.end(), [](std::uint8_t byte) { return byte == 0; });
}

std::optional<Bytes> Part(const Bytes& bytes, std::size_t at, std::size_t length) {
    if (at > bytes.size() || length > bytes.size() - at) return std::nullopt;
    const auto begin = bytes.begin() + static_cast<std::ptrdiff_t>(at);
    return Bytes(begin, begin + static_cast<std::ptrdiff_t>(length));
}

// Adds what an AppleDouble file or a record has; nothing of a file that is none, or is cut short.
void AddAppleDouble(const Bytes& bytes, Holdings* holdings) {
    if (bytes.size() < 26 || U32At(bytes, 0) != 0x00051607 || U32At(bytes, 4) != 0x00020000) return;
    const std::size_t count = U16At(bytes, 24);
    if (bytes.size() < 26 + 12 * count) return;
    for (std::size_t at = 26; at < 26 + 12 * count; at += 12) {
        const std::uint32_t id = U32At(bytes, at);
        const std::size_t length = id == kFinderInfoEntry ? 32 : U32At(bytes, at + 8);
        const std::optional<Bytes> value = Part(bytes, U32At(bytes, at + 4), length);
        if (!value || value->empty()) continue;
        if (id == kForkEntry) {
            holdings->forks.push_back(*value);
        } else if (id != kFinderInfoEntry) {
            holdings->entries.emplace(id, *value);
        } else if (!IsZero(*value)) {
            holdings->finder_infos.push_back(*value);
        }
    }
    const std::optional<MacContents> contents = ReadMacFile(bytes);
    if (!contents) return;
    std::size_t at = kTableAt;  // The reader has found every record to be there.
    for (std::size_t left = contents->attributes.size(); left > 0; --left) {
        const std::size_t name_length = bytes[at + 10];
        const std::string name(reinterpret_cast<const char*>(&bytes[at + 11]), name_length - 1);
        holdings->attributes[name] = {name, contents->attributes.at(name), U16At(bytes, at + 8)};
        at += RecordSize(name_length);
    }
}

void AddFile(const std::string& path, Holdings* holdings) {
    struct stat info = {};
    if (lstat(path.c_str(), &info) == 0 && S_ISREG(info.st_mode)) {
        AddAppleDouble(ReadFile(path), holdings);
    }
}

// Of the legacy folder: attributes, unless there is a stream, and what is no earlier layout.
void AddFolder(const MetadataPaths& paths, Holdings* holdings) {
    struct stat info = {};
    if (lstat(paths.folder.c_str(), &info) != 0 || !S_ISDIR(info.st_mode)) return;
    for (const std::string& name : NamesIn(paths.folder)) {
        const std::string path = paths.folder + '/' + name;
        if (lstat(path.c_str(), &info) != 0 || !S_ISREG(info.st_mode)) continue;
        if (name == "MAVO:Resource") {
            if (!Exists(paths.resource)) AddFile(path, holdings);
        } else if (name.starts_with("MAVO") || name.find(':') != std::string::npos) {
            holdings->others['/' + name] = ReadFile(path);
        } else if (!Exists(paths.stream)) {
            holdings->attributes[name] = {name, ReadFile(path)};
        }
    }
}

// What other services keep lies there on volumes of every kind.
void AddOthers(const MetadataPaths& paths, const std::string& object, Holdings* holdings) {
    AddFolder(paths, holdings);
    if (!Exists(paths.ea_directory)) return;
    const std::string prefix = fs::path(object).filename().string() + '@';
    for (const std::string& name : NamesIn(paths.ea_directory)) {
        if (!name.starts_with(prefix) || name.ends_with("@MavoEAStream") ||
            name.ends_with("@MavoResource")) {
            continue;
        }
        holdings->others[name.substr(prefix.size() - 1)] =
            ReadFile(paths.ea_directory + '/' + name);
    }
}

void AddEaDirectory(const MetadataPaths& paths, Holdings* holdings) {
    AddFile(paths.stream, holdings);
    AddFile(paths.resource, holdings);
    if (!Exists(paths.stream)) AddFile(paths.apple_double, holdings);
}

bool Has(const std::vector<Bytes>& values, const Bytes& value) {
    return std::find(values.begin(), values.end(), value) != values.end();
}

}  // namespace

std::string ShortenedName(const std::string& name) {
    static constexpr char kCheckCharacters[] =
        "1234567890"
        "abcdefghijklmnopqrstuvwxyz"
        "-_=+';[]{}~`.!@#$%^&*() ";
    static_assert(sizeof kCheckCharacters == 60 + 1);
    if (name.size() <= kNameLimit) return name;
    unsigned sum = 0;
    for (std::size_t i = kNameLimit - 1; i < name.size(); ++i) {
        sum += static_cast<unsigned char>(name[i]);
    }
    const std::size_t dot = name.rfind('.');
    const bool has_extension = dot != std::string::npos && dot >= name.size() - 6;
    const std::string extension = has_extension ? name.substr(dot) : "";
    return name.substr(0, kNameLimit - 1 - extension.size()) + kCheckCharacters[sum % 60] +
           extension;
}

MetadataPaths::MetadataPaths(const std::string& object) {
    const std::size_t slash = object.rfind('/');
    const std::string parent = object.substr(0, slash + 1);
    const std::string name = object.substr(slash + 1);
    apple_double = parent + "._" + name;
    ea_directory = parent + "@eaDir";
    stream = ea_directory + '/' + ShortenedName(name) + "@MavoEAStream";
    resource = ea_directory + '/' + ShortenedName(name) + "@MavoResource";
    folder = ea_directory + '/' + name;
}

std::string MetadataPaths::OfKind(const std::string& kind) const { return folder + '@' + kind; }

bool UsesAppleDouble(int type) { return type == 0 || type == 5; }
bool UsesEaDirectory(int type) { return !UsesAppleDouble(type) && type != 7; }

Bytes AppleDoubleOf(const Entries& entries) {
    Bytes file = Hex("00 05 16 07  00 02 00 00  00*16  00 00");
    PutU16(file, 24, static_cast<std::uint32_t>(entries.size()));
    std::size_t at = file.size() + 12 * entries.size();
    for (const auto& [id, bytes] : entries) {
        Bytes descriptor(12);
        PutU32(descriptor, 0, id);
        PutU32(descriptor, 4, at);
        PutU32(descriptor, 8, bytes.size());
        file = std::move(file) + descriptor;
        at += bytes.size();
    }
    for (const auto& [id, bytes] : entries) file = std::move(file) + bytes;
    return file;
}

Bytes ResourceFileOf(const Entries& entries) {
    Entries head = entries;
    Bytes fork;
    if (!head.empty() && head.back().first == kForkEntry) {
        fork = head.back().second;
        head.pop_back();
    }
    if (head.size() == 1 && head[0].first == kFinderInfoEntry) {
        return PlainAppleDouble(head[0].second, fork);
    }
    head.emplace_back(kForkEntry, Bytes());
    Bytes file = AppleDoubleOf(head);
    const std::size_t fork_descriptor = 26 + 12 * (head.size() - 1);
    if (file.size() > kNetatalkHead) abort();
    file.resize(kNetatalkHead);
    PutU32(file, fork_descriptor + 4, kNetatalkHead);
    PutU32(file, fork_descriptor + 8, fork.size());
    return std::move(file) + fork;
}

Bytes RecordOf(const RecordContents& contents) {
    constexpr std::size_t kCommentLengthAt = 46;
    Bytes record = AttributeRecord();
    const auto put = [&record](std::size_t at, std::size_t room, const Bytes& bytes) {
        if (bytes.size() > room) abort();
        std::fill_n(record.begin() + static_cast<std::ptrdiff_t>(at), room, 0);
        std::copy(bytes.begin(), bytes.end(), record.begin() + static_cast<std::ptrdiff_t>(at));
    };
    put(122, 32, contents.finder_info);
    put(154, 200, contents.comment);
    put(354, 16, contents.dates);
    put(370, 4, contents.afp_info);
    PutU32(record, kCommentLengthAt, contents.comment.size());
    return record;
}

void SetFileAttribute(const std::string& path, const std::string& name, const Bytes& value) {
    if (lsetxattr(path.c_str(), name.c_str(), value.data(), value.size(), 0) != 0) {
        Die(path + ": " + name);
    }
}

void SetMarks(const std::string& path, std::uint32_t marks) {
    Bytes word(4);
    PutU32(word, 0, marks);
    SetFileAttribute(path, kMarksAttribute, word);
}

Bytes FileAttribute(const std::string& path, const std::string& name) {
    Bytes value(65536);
    const ssize_t size = lgetxattr(path.c_str(), name.c_str(), value.data(), value.size());
    value.resize(size < 0 ? 0 : static_cast<std::size_t>(size));
    return value;
}

std::uint32_t MarksOf(const std::string& path) {
    const Bytes marks = FileAttribute(path, kMarksAttribute);
    return marks.size() == 4 ? U32At(marks, 0) : 0;
}

void PutAppleDouble(const std::string& object, const Bytes& bytes) {
    WriteFile(MetadataPaths(object).apple_double, bytes);
}

void PutStream(const std::string& object, const Bytes& bytes) {
    const MetadataPaths paths(object);
    MakeDirectory(paths.ea_directory);
    WriteFile(paths.stream, bytes);
}

void PutResource(const std::string& object, const Bytes& bytes) {
    const MetadataPaths paths(object);
    MakeDirectory(paths.ea_directory);
    WriteFile(paths.resource, bytes);
}

void PutKind(const std::string& object, const std::string& kind, const Bytes& bytes) {
    const MetadataPaths paths(object);
    MakeDirectory(paths.ea_directory);
    WriteFile(paths.OfKind(kind), bytes);
}

void PutLegacy(const std::string& object, const std::string& name, const Bytes& bytes) {
    const MetadataPaths paths(object);
    MakeDirectory(paths.ea_directory);
    MakeDirectory(paths.folder);
    WriteFile(paths.folder + '/' + name, bytes);
}

Bytes BytesIn(const std::string& path) {
    struct stat info = {};
    const bool is_file = stat(path.c_str(), &info) == 0 && S_ISREG(info.st_mode);
    return is_file ? ReadFile(path) : Bytes();
}

bool Holdings::HasAttribute(const Attribute& attribute) const {
    const auto found = attributes.find(attribute.name);
    return found != attributes.end() && found->second == attribute;
}

bool Holdings::HasFinderInfo(const Bytes& value) const { return Has(finder_infos, value); }
bool Holdings::HasFork(const Bytes& value) const { return Has(forks, value); }

bool Holdings::HasEntry(std::uint32_t id, const Bytes& value) const {
    const auto [first, last] = entries.equal_range(id);
    return std::any_of(first, last, [&value](const auto& entry) { return entry.second == value; });
}

Holdings HoldingsOf(int type, const std::string& object) {
    Holdings holdings;
    struct stat info = {};
    if (lstat(object.c_str(), &info) == 0) holdings.writable = (info.st_mode & 0222) != 0;
    holdings.marks = MarksOf(object);
    const MetadataPaths paths(object);
    if (UsesAppleDouble(type)) AddFile(paths.apple_double, &holdings);
    if (UsesEaDirectory(type)) AddEaDirectory(paths, &holdings);
    AddOthers(paths, object, &holdings);
    if (type == 2) AddAppleDouble(FileAttribute(object, kRecordAttribute), &holdings);
    if (type != 7) return holdings;
    for (const std::string& name : FileAttributeNames(object)) {
        if (name == kFinderInfoName) {
            holdings.finder_infos.push_back(FileAttribute(object, name));
        } else {
            holdings.attributes[name] = {name, FileAttribute(object, name)};
        }
    }
    return holdings;
}

}  // namespace mavoea::test
