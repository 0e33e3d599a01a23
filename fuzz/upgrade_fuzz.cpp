// The upgrade of legacy layouts, asked for and by an open that gives it its chance. One input is an
// EA directory with a legacy folder in it, as it could be found: attribute files, reserved names,
// links, pipes and folders, a "._" file, what is in the current layout already.

#include <dirent.h>
#include <errno.h>
#include <fcntl.h>
#include <string.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <string_view>

#include "fuzz/support/apple_double_model.h"
#include "fuzz/support/volume.h"
#include "include/mavoea.h"
#include "platform/include/mavocore.h"
#include "tests/support/mac_files.h"
#include "tests/support/stream_builder.h"

namespace mavoea::fuzz {
namespace {

struct Places {
    std::string share = Folder() + "/share";
    std::string object = share + "/object";
    std::string apple_double = share + "/._object";
    std::string ea_dir = share + "/@eaDir";
    std::string folder = ea_dir + "/object";
    std::string neighbour = ea_dir + "/neighbour@MavoEAStream";
    // Where nothing may be touched.
    std::string outside = Folder() + "/outside";
    std::string secret = outside + "/secret";
    std::string missing = outside + "/missing";
    std::string other_folder = outside + "/folder";

    Places() {
        for (const std::string& directory : {share, outside, other_folder}) {
            if (mkdir(directory.c_str(), 0777) != 0) Fail("no directory");
        }
        Put(secret, test::Ascii("not to be read"));
        for (const char* const name : {"victim", MAVOEA_KIND_LEGACY_RESOURCE, "MAVO:x"}) {
            Put(other_folder + "/" + name, test::Ascii("not to be moved"));
        }
        if (chmod(secret.c_str(), 0640) != 0) Fail("no mode");
    }
};
const Places& At() {
    static const Places places;
    return places;
}

// ---- What is found ------------------------------------------------------------------------------

enum class Sort { kFile, kLink, kDanglingLink, kPipe, kDirectory };

struct Entry {
    std::string name;
    Sort sort;
    bool no_mode;
    std::uint8_t read_at;  // its access time, in seconds
    Bytes bytes;
};

enum class Kind { kStream, kResource, kOther };

struct Case {
    Kind kind;
    bool by_open, creates;
    bool has_current;
    enum class Legacy { kFolder, kMissing, kLink, kPipe } legacy;
    Sort current;
    enum class Object { kFile, kLocked, kDirectory, kMissing } object;
    std::optional<Entry> apple_double;
    std::vector<Entry> entries;

    const char* name() const {
        return kind == Kind::kStream     ? MAVOEA_KIND_STREAM
               : kind == Kind::kResource ? MAVOEA_KIND_RESOURCE
                                         : "MAVO:x";
    }
    const char* legacy_name() const {
        return kind == Kind::kResource ? MAVOEA_KIND_LEGACY_RESOURCE : "MAVO:x";
    }
    // Of the kind that is converted.
    std::string CurrentPath() const {
        return kind == Kind::kOther ? At().folder + "/MAVO@x" : At().folder + "@" + name();
    }
};

Sort SortOf(unsigned bits) {
    static constexpr Sort kSorts[] = {Sort::kFile, Sort::kFile, Sort::kFile,         Sort::kFile,
                                      Sort::kFile, Sort::kLink, Sort::kDanglingLink, Sort::kPipe};
    return (bits & 8) != 0 ? Sort::kDirectory : kSorts[bits & 7];
}

Entry DecodeEntry(Input* input, std::string name) {
    Entry entry;
    const unsigned bits = input->U8();
    entry.sort = SortOf(bits);
    entry.no_mode = (bits & 16) != 0;
    entry.read_at = input->U8();
    if (name.empty()) {
        const View text = input->Take(input->U8());
        name.assign(text.begin(), std::find(text.begin(), text.end(), 0));
    }
    entry.name = std::move(name);
    const View bytes = input->Take(input->U16());
    entry.bytes.assign(bytes.begin(), bytes.end());
    return entry;
}

Case Decode(Input input) {
    Case read{};
    const unsigned first = input.U8();
    const unsigned second = input.U8();
    read.kind = (first & 3) == 2   ? Kind::kResource
                : (first & 3) == 3 ? Kind::kOther
                                   : Kind::kStream;
    read.by_open = (first & 4) != 0;
    read.creates = (first & 8) != 0;
    read.has_current = (first & 16) != 0;
    // Mostly the folder that it should be.
    read.legacy =
        (first & 0xE0) == 0xE0 ? static_cast<Case::Legacy>(second >> 6) : Case::Legacy::kFolder;
    read.current = SortOf(second & 7);
    read.object = static_cast<Case::Object>(second >> 3 & 3);
    if ((second & 32) != 0) read.apple_double = DecodeEntry(&input, "._object");
    while (!input.empty() && read.entries.size() < 24) {
        Entry entry = DecodeEntry(&input, "");
        if (entry.name.empty()) entry.name = read.legacy_name();
        const bool fits = entry.name.size() <= 255 && entry.name != "." && entry.name != ".." &&
                          entry.name.find('/') == std::string::npos;
        const bool is_there = std::any_of(read.entries.begin(), read.entries.end(),
                                          [&](const Entry& e) { return e.name == entry.name; });
        if (fits && !is_there) read.entries.push_back(std::move(entry));
    }
    return read;
}

void Make(const std::string& path, const Entry& entry) {
    int made = 0;
    switch (entry.sort) {
        case Sort::kFile:
            Put(path, entry.bytes);
            break;
        case Sort::kLink:
            made = symlink(At().secret.c_str(), path.c_str());
            break;
        case Sort::kDanglingLink:
            made = symlink(At().missing.c_str(), path.c_str());
            break;
        case Sort::kPipe:
            made = mkfifo(path.c_str(), 0666);
            break;
        case Sort::kDirectory:
            made = mkdir(path.c_str(), 0777);
            break;
    }
    if (made != 0) Fail("cannot make %s: %s", path.c_str(), strerror(errno));
    const bool is_link = entry.sort == Sort::kLink || entry.sort == Sort::kDanglingLink;
    if (entry.no_mode && !is_link && geteuid() == 0) chmod(path.c_str(), 0);
    const timespec times[] = {{.tv_sec = entry.read_at, .tv_nsec = 0}, {.tv_sec = 0, .tv_nsec = 0}};
    utimensat(AT_FDCWD, path.c_str(), times, AT_SYMLINK_NOFOLLOW);
}

const Bytes& CurrentBytes() {
    static const Bytes& bytes =
        *new Bytes(test::StreamImage{.attributes = {{"current", test::Pattern(9)}}}.Build());
    return bytes;
}

void Build(const Case& given) {
    const auto& at = At();
    ClearAttributes();
    Empty(at.share);
    // Who reads it, through a link, changes the first of these.
    const timespec times[] = {{.tv_sec = 1, .tv_nsec = 0}, {.tv_sec = 2, .tv_nsec = 0}};
    utimensat(AT_FDCWD, at.secret.c_str(), times, 0);

    if (given.object == Case::Object::kDirectory) mkdir(at.object.c_str(), 0755);
    if (given.object == Case::Object::kFile || given.object == Case::Object::kLocked) {
        Put(at.object, {});
        chmod(at.object.c_str(), given.object == Case::Object::kLocked ? 0444 : 0640);
    }
    if (given.apple_double) Make(at.apple_double, *given.apple_double);
    mkdir(at.ea_dir.c_str(), 0777);
    Put(at.neighbour, CurrentBytes());
    switch (given.legacy) {
        case Case::Legacy::kFolder:
            mkdir(at.folder.c_str(), 0777);
            for (const Entry& entry : given.entries) Make(at.folder + "/" + entry.name, entry);
            break;
        case Case::Legacy::kMissing:
            break;
        case Case::Legacy::kLink:
            if (symlink(at.other_folder.c_str(), at.folder.c_str()) != 0) Fail("no link");
            break;
        case Case::Legacy::kPipe:
            mkfifo(at.folder.c_str(), 0666);
            break;
    }
    if (given.has_current && given.kind != Kind::kOther) {
        Make(given.CurrentPath(), {.name = {},
                                   .sort = given.current,
                                   .no_mode = false,
                                   .read_at = 3,
                                   .bytes = CurrentBytes()});
    }
}

// ---- What is left -------------------------------------------------------------------------------

// All that is below a directory: sorts, modes, contents.
void Describe(const std::string& directory, std::string* text) {
    std::vector<std::string> names;
    DIR* const open = opendir(directory.c_str());
    if (open == nullptr) Fail("cannot list %s", directory.c_str());
    while (const dirent* const entry = readdir(open)) names.push_back(entry->d_name);
    closedir(open);
    std::sort(names.begin(), names.end());
    for (const std::string& name : names) {
        if (name == "." || name == "..") continue;
        const std::string path = directory + "/" + name;
        struct stat info;
        if (lstat(path.c_str(), &info) != 0) Fail("cannot look at %s", path.c_str());
        *text += path + " " + std::to_string(info.st_mode) + " ";
        if (S_ISREG(info.st_mode)) {
            const Bytes bytes = Get(path).value_or(Bytes());
            text->append(bytes.begin(), bytes.end());
        }
        *text += "\n";
        if (S_ISDIR(info.st_mode)) Describe(path, text);
    }
}

std::string Description(const std::string& directory) {
    std::string text;
    Describe(directory, &text);
    return text;
}

void ExpectSecretKept() {
    struct stat info;
    if (lstat(At().secret.c_str(), &info) != 0) Fail("a file outside the share is gone");
    if (info.st_atim.tv_sec != 1) Fail("a file outside the share has been read");
}

void ExpectNoOthers() {
    const auto& at = At();
    const std::string allowed[] = {at.object, at.apple_double, at.ea_dir};
    const std::string inside[] = {at.folder, at.neighbour, at.folder + "@" + MAVOEA_KIND_STREAM,
                                  at.folder + "@" + MAVOEA_KIND_RESOURCE};
    const auto expect = [](const std::string& directory, const auto& names) {
        DIR* const open = opendir(directory.c_str());
        if (open == nullptr) Fail("%s is gone", directory.c_str());
        while (const dirent* const entry = readdir(open)) {
            const std::string_view name = entry->d_name;
            if (name == "." || name == "..") continue;
            const std::string path = directory + "/" + entry->d_name;
            if (std::find(std::begin(names), std::end(names), path) == std::end(names)) {
                Fail("%s: nobody asked for it", path.c_str());
            }
        }
        closedir(open);
    };
    expect(at.share, allowed);
    expect(at.ea_dir, inside);
    if (Get(at.neighbour) != CurrentBytes()) Fail("another object's stream has changed");
}

bool IsAttributeFile(const Entry& entry) {
    return !entry.name.starts_with("MAVO") && entry.name.find(':') == std::string::npos;
}

// Whether what stood in the folder as `entry` still does.
bool StillThere(const Entry& entry) {
    const std::string path = At().folder + "/" + entry.name;
    if (entry.sort != Sort::kFile) return IsThere(path);
    return Get(path) == entry.bytes;
}

// Whether a file's values moved: each is in the folder still, or in the stream.
void ExpectValues(const Case& given, bool adopted) {
    if (given.legacy != Case::Legacy::kFolder) return;
    std::optional<test::MacContents> stream;
    const auto bytes = Get(given.CurrentPath());
    if (bytes && !bytes->empty() && given.kind == Kind::kStream && !adopted) {
        stream = test::ReadMacFile(*bytes);
        if (!stream) Fail("the stream does not fit together");
    }
    for (const Entry& entry : given.entries) {
        if (given.kind != Kind::kStream && entry.name == given.legacy_name()) continue;
        if (StillThere(entry)) continue;
        if (entry.sort != Sort::kFile || !IsAttributeFile(entry) || given.kind != Kind::kStream) {
            Fail("\"%s\" is gone from the folder", entry.name.c_str());
        }
        if (!stream || !stream->attributes.contains(entry.name) ||
            stream->attributes[entry.name] != entry.bytes) {
            Fail("the value of \"%s\" is lost", entry.name.c_str());
        }
    }
}

// ---- One kind after the other -------------------------------------------------------------------

// Neither layout has anything: an open may make a file, the upgrade makes none.
void ExpectNothing(const Case& given, int result) {
    const bool makes = given.by_open && given.creates;
    if (result != (makes ? 0 : given.by_open ? -1 : 2)) Fail("%d with nothing there", result);
    const auto made = Get(given.CurrentPath());
    if (made != (makes ? std::optional(Bytes()) : std::nullopt)) Fail("made of nothing");
}

void ExpectStreamUpgrade(const Case& given, int result, const std::vector<int>& codes) {
    if (given.has_current) {
        if (!given.by_open && given.current != Sort::kDanglingLink && result != 1) {
            Fail("MAVOEAUpgrade: %d with a stream there", result);
        }
        return;
    }
    const bool plain_folder =
        given.legacy == Case::Legacy::kMissing || given.legacy == Case::Legacy::kFolder;
    const bool plain_file = !given.apple_double || given.apple_double->sort == Sort::kFile;
    if (!plain_folder || !plain_file) return;

    int folder_time = 0;
    bool all_files = true;
    if (given.legacy == Case::Legacy::kFolder) {
        for (const Entry& entry : given.entries) {
            if (!IsAttributeFile(entry)) continue;
            all_files = all_files && entry.sort == Sort::kFile;
            folder_time = std::max<int>(folder_time, entry.read_at);
        }
    }
    if (!all_files) return;
    int file_time = 0;
    if (given.apple_double && given.object != Case::Object::kMissing &&
        Field32(given.apple_double->bytes, 0) == 0x00051607) {
        file_time = given.apple_double->read_at;
    }
    const auto stream = Get(given.CurrentPath());
    const auto sidecar = Get(At().apple_double);
    if (folder_time == 0 && file_time == 0) {
        ExpectNothing(given, result);
        return;
    }
    if (result != 0) Fail("MAVOEAUpgrade: %d", result);
    if (file_time >= folder_time) {
        if (stream != given.apple_double->bytes || sidecar) Fail("the \"._\" file's bytes");
        return;
    }
    if (given.apple_double && sidecar != given.apple_double->bytes) Fail("the \"._\" file");
    for (const Entry& entry : given.entries) {
        const bool converted = IsAttributeFile(entry) && entry.name.size() <= 254;
        if (converted != !IsThere(At().folder + "/" + entry.name)) {
            Fail("\"%s\" has %sbeen converted", entry.name.c_str(), converted ? "not " : "");
        }
    }
    const bool too_long = std::any_of(given.entries.begin(), given.entries.end(),
                                      [](const Entry& e) { return e.name.size() > 254; });
    if (!codes.empty() && !too_long) Fail("a code on success");
}

// The marks that a resource file has for its object.
struct Marks {
    bool read_only = false;
    bool invisible = false;
};
std::optional<Marks> MarksOf(View file) {
    const auto descriptors = DescriptorsOf(file);
    if (!descriptors || Field32(file, 4) != 0x00020000) return std::nullopt;
    std::optional<std::uint64_t> flags_at;
    std::optional<std::uint64_t> attributes_at;
    for (const Descriptor& entry : *descriptors) {
        if (entry.id == 9) flags_at = entry.offset + std::uint64_t{8};
        if (entry.id == 14) attributes_at = entry.offset + std::uint64_t{2};
    }
    if (!flags_at && !attributes_at) return std::nullopt;
    if (flags_at && !Holds(file, *flags_at, 2)) return std::nullopt;
    if (attributes_at && !Holds(file, *attributes_at, 2)) return std::nullopt;
    Marks marks;
    if (attributes_at) {
        marks.read_only = (Field16(file, *attributes_at) & 0x20) != 0;
        marks.invisible = (Field16(file, *attributes_at) & 1) != 0;
    }
    if (flags_at && (Field16(file, *flags_at) & 0x4000) != 0) marks.invisible = true;
    return marks;
}

void ExpectResourceUpgrade(const Case& given, int result, const std::vector<int>& codes) {
    if (given.legacy != Case::Legacy::kFolder) return;
    if (given.has_current) {
        if (!given.by_open && given.current != Sort::kDanglingLink && result != 1) {
            Fail("MAVOEAUpgrade: %d with a resource file there", result);
        }
        return;
    }
    const auto legacy =
        std::find_if(given.entries.begin(), given.entries.end(),
                     [](const Entry& e) { return e.name == MAVOEA_KIND_LEGACY_RESOURCE; });
    if (legacy == given.entries.end()) {
        ExpectNothing(given, result);
        return;
    }
    if (legacy->sort != Sort::kFile) return;
    if (result != 0) Fail("MAVOEAUpgrade: %d", result);
    if (Get(given.CurrentPath()) != legacy->bytes) Fail("another resource file");
    if (IsThere(At().folder + "/" + legacy->name)) Fail("the legacy file stays");
    if (given.entries.size() == 1 && IsThere(At().folder)) Fail("the empty folder stays");
    if (given.object != Case::Object::kFile && given.object != Case::Object::kLocked) return;

    const auto marks = MarksOf(legacy->bytes);
    if (marks.has_value() != codes.empty()) Fail("marks and codes");
    const bool locked = given.object == Case::Object::kLocked;
    mode_t mode = locked ? 0444 : 0640;
    if (marks) mode = marks->read_only || locked ? mode & ~mode_t{0222} : mode | 0222;
    alignas(4) unsigned char info[128];
    std::uint32_t fields[2];
    if (MLIBCFileStat(At().object.c_str(), 3, info) != 0) Fail("no status");
    memcpy(&fields[0], info + 16, 4);
    memcpy(&fields[1], info + 116, 4);
    if ((fields[0] & 07777) != mode) Fail("the object's mode: %o, not %o", fields[0], mode);
    const bool hidden = (fields[1] & MLIBC_ATTRIBUTE_HIDDEN) != 0;
    if (hidden != (marks && marks->invisible)) Fail("the object's hidden attribute");
}

void ExpectOtherUpgrade(const Case& given, int result) {
    if (given.legacy != Case::Legacy::kFolder) return;
    const auto named = [&](std::string_view name) {
        return std::find_if(given.entries.begin(), given.entries.end(),
                            [&](const Entry& e) { return e.name == name; });
    };
    const auto end = given.entries.end();
    const auto legacy = named("MAVO:x");
    const auto current = named("MAVO@x");
    if ((legacy != end && legacy->sort != Sort::kFile) || (current != end)) return;
    if (legacy == end) {
        if (result != 2) Fail("MAVOEAUpgrade: %d without a legacy file", result);
        return;
    }
    if (result != 0 || Get(given.CurrentPath()) != legacy->bytes) {
        Fail("MAVOEAUpgrade: %d, or another file", result);
    }
}

// What the upgrade's result says of it.
void ExpectReported(const std::string& before, const Case& given, int result,
                    const std::vector<int>& codes) {
    if (result < -1 || result > 2) Fail("MAVOEAUpgrade: %d", result);
    if (result == -1 && codes.empty()) Fail("MAVOEAUpgrade: failed with no code");
    if (result > 0 && !codes.empty()) Fail("MAVOEAUpgrade: a code with %d", result);
    // An empty legacy folder may go whatever was found.
    const bool goes = given.kind == Kind::kStream && result == 2 && given.entries.empty();
    if (result > 0 && !goes && Description(At().share) != before) {
        Fail("MAVOEAUpgrade: changed with %d", result);
    }
}

void Run(const Case& given) {
    const auto& at = At();
    static const std::string outside = Description(at.outside);
    Build(given);
    const std::string built = Description(at.share);

    Call call(given.by_open ? "MAVOEAOpen" : "MAVOEAUpgrade");
    int result = 0;
    if (given.by_open) {
        const int flags = given.creates ? O_RDWR | O_CREAT : O_RDONLY;
        const int fd =
            MAVOEAOpen(EA_FORM_FILE, at.object.c_str(), given.name(), flags, EA_PLACE_EADIR);
        struct stat info;
        if (fd >= 0 && (fstat(fd, &info) != 0 || !S_ISREG(info.st_mode))) {
            Fail("MAVOEAOpen: opened what is no file");
        }
        if (fd >= 0) close(fd);
        result = fd < 0 ? -1 : 0;
    } else {
        result = MAVOEAUpgrade(at.object.c_str(), given.name());
    }
    const auto codes = call.End(kAnyMemory);

    ExpectSecretKept();
    if (Description(at.outside) != outside) Fail("something outside the share has changed");
    if (given.by_open && given.kind == Kind::kOther) return;  // It may have made what it opens.
    ExpectNoOthers();
    const auto current = Get(given.CurrentPath());
    const bool adopted =
        given.kind == Kind::kStream && given.apple_double && current == given.apple_double->bytes;
    if (!given.has_current) ExpectValues(given, adopted);
    if (!given.by_open) ExpectReported(built, given, result, codes);
    switch (given.kind) {
        case Kind::kStream:
            return ExpectStreamUpgrade(given, result, codes);
        case Kind::kResource:
            return ExpectResourceUpgrade(given, result, codes);
        case Kind::kOther:
            return ExpectOtherUpgrade(given, result);
    }
}

}  // namespace
}  // namespace mavoea::fuzz

using namespace mavoea::fuzz;

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* bytes, std::size_t size) {
    (void)At();
    umask(0);
    VolumeType() = 1;
    const Descriptors descriptors;
    Run(Decode(Input(bytes, size)));
    return 0;
}
