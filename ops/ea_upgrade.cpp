// Converts the metadata that earlier versions kept, in a folder per object or in a "._" file, into
// the current layout, one object and kind at a time.

#include <errno.h>
#include <string.h>
#include <sys/stat.h>

#include <algorithm>
#include <cstdint>
#include <optional>
#include <string_view>

#include "format/apple_double.h"
#include "format/finder_info.h"
#include "include/mavoea.h"
#include "ops/folder.h"
#include "ops/new_file.h"
#include "path/ea_adpath.h"
#include "path/ea_open.h"
#include "platform/file_status.h"
#include "platform/include/mavocore.h"
#include "platform/marks.h"
#include "stream/attribute_writer.h"
#include "stream/layout.h"
#include "util/file_io.h"
#include "util/owned.h"
#include "util/path_text.h"
#include "util/unit.h"

namespace mavoea {
namespace {

constexpr Unit unit("ea_upgrade");

constexpr int kConverted = 0;
constexpr int kCurrent = 1;  // already in the current layout
constexpr int kNothing = 2;  // no metadata of that kind in any layout
constexpr int kFailure = -1;

constexpr std::string_view kReserved = "MAVO";
constexpr mode_t kMode = 0777;
constexpr mode_t kWritable = 0222;
constexpr mode_t kPermissions = 07777;

// Whether a call that failed with `error` has said that there is no such file. After any other
// failure there may be one, and nothing is decided.
bool SaysMissing(int error) { return error == ENOENT || error == ENOTDIR || error == ENAMETOOLONG; }

// Whether something is at `path`: 1 or 0, or -1 after recording that it cannot be told.
int IsThere(const char* path, int line = __builtin_LINE()) {
    if (kernel::Access(path, F_OK) == 0) return 1;
    return SaysMissing(errno) ? 0 : unit.Fail(Err::kOpen, line);
}

// What is known of the file of the current layout beforehand.
enum class Current { kUnknown, kMissed };

// Whether something is there by now: another process may have been quicker. errno stays.
bool IsThereNow(const char* path) {
    const ErrnoKeeper keep;
    return kernel::Access(path, F_OK) == 0;
}

// The folder of the legacy file at `path`, for calls on what is in it; not one that a symbolic link
// leads to, which somebody may have put there to have other files moved.
UniqueFd FolderOf(const char* path) {
    char folder[kPathBufferSize];
    CutShort(folder, sizeof folder).Add(WithoutTrailingSlash(SplitObject(path).parent));
    return UniqueFd(kernel::Open(folder, O_PATH | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC, 0));
}

// Removes a legacy folder that has become empty; one that has not, stays. `result`, or kFailure. A
// failure of the conversion stands as it was recorded.
int RemoveFolder(const char* folder, int result, int line = __builtin_LINE()) {
    const int error = errno;
    if (kernel::Rmdir(folder) != 0 && errno != ENOTEMPTY && errno != ENOENT && result != kFailure) {
        return unit.Fail(Err::kRemove, line);
    }
    errno = error;
    return result;
}

// ---- Attribute files ----------------------------------------------------------------------------

// The next attribute file of a legacy folder: not one of the reserved names. nullptr at the end.
const char* NextAttribute(Folder* folder) {
    while (const char* const name = folder->Next()) {
        if (!std::string_view(name).starts_with(kReserved) && strchr(name, ':') == nullptr) {
            return name;
        }
    }
    return nullptr;
}

// When a file was last read, in seconds.
std::int64_t AccessTime(const struct stat& info) {
    return std::max<std::int64_t>(info.st_atime, 0);
}

// When the attribute files of a legacy folder were last read: the latest counts, 0 when there are
// none. -1 after recording that the folder could not be read, or none of the files looked at.
std::int64_t LatestAccess(Folder* folder) {
    std::int64_t latest = 0;
    int unseen = 0;  // why one could not be looked at
    while (const char* const name = NextAttribute(folder)) {
        struct stat info;
        if (kernel::FstatAt(folder->fd(), name, &info, 0) == 0) {
            latest = std::max(latest, AccessTime(info));
        } else if (!SaysMissing(errno)) {
            unseen = errno;
        }
    }
    if (folder->failed()) return unit.Fail(Err::kRead);
    if (latest != 0 || unseen == 0) return latest;
    errno = unseen;
    return unit.Fail(Err::kSystemCall);
}

// Attribute files on their way into a stream.
class AttributeImport {
 public:
    AttributeImport(const char* object, int folder, AttributeWriter* stream)
        : object_(object), folder_(folder), stream_(stream) {}

    // The attribute file `name` into the stream. What cannot be read, or no stream can hold, is
    // left out, with a code and a line. False when the stream could not be written, with both as
    // well.
    bool Add(const char* name) {
        // What no path leads to stays, too.
        char path[kPathBufferSize];
        if (MAVOEAPath(EA_FORM_FOLDER, object_, name, path, kDerivedPathMax, EA_PLACE_EADIR) != 0) {
            unit.Log("%s:%d cannot EAPath[%s][%s] MavoErr=[0x%04X %s:%d]", object_, name,
                     MLIBCErrGet(), MLIBCErrorGetFile(), MLIBCErrorGetLine());
            return true;
        }
        std::uint32_t size = 0;
        if (Read(name, &size) != 0) {
            unit.Log("%s:%d cannot read[%s][%s] MavoErr=[0x%04X %s:%d]", object_, name,
                     MLIBCErrGet(), MLIBCErrorGetFile(), MLIBCErrorGetLine());
            return true;
        }
        if (stream_->Write(name, value_.get(), size)) return true;
        unit.Log("%s:%d MAVOEASWrite error, MavoErr=[0x%04X %s:%d]", MLIBCErrGet(),
                 MLIBCErrorGetFile(), MLIBCErrorGetLine());
        return MLIBCErrGet() == MAVOEA_ERR_BAD_ARGUMENT;
    }

 private:
    // The file's bytes into value_. 0, or -1 after recording why.
    int Read(const char* name, std::uint32_t* size) {
        struct stat info;
        if (kernel::FstatAt(folder_, name, &info, 0) != 0) return unit.Fail(Err::kSystemCall);
        if (S_ISDIR(info.st_mode)) return unit.Fail(Err::kRead);
        if (!S_ISREG(info.st_mode)) return unit.Fail(Err::kOpen);
        // Should it have become something else meanwhile, nobody is waited for.
        const UniqueFd fd(
            kernel::OpenAt(folder_, name, O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC, 0));
        if (fd.get() <= 0) return unit.Fail(Err::kOpen);
        *size = static_cast<std::uint32_t>(info.st_size);
        if (!Reach(*size)) return unit.Fail(Err::kBufferMemory);
        return ReadAt(fd.get(), {value_.get(), *size}, 0) == *size ? 0 : unit.Fail(Err::kRead);
    }

    bool Reach(std::uint32_t size) {
        if (size <= room_) return true;
        if (size > kValueMax) return false;
        void* const larger = kernel::Reallocate(value_.get(), size);
        if (larger == nullptr) return false;
        (void)value_.Release();
        value_ = Owned<std::uint8_t>(static_cast<std::uint8_t*>(larger));
        room_ = size;
        return true;
    }

    // No stream takes more, whatever memory there is.
    static constexpr std::uint32_t kValueMax = 0x7FFFFFFF;

    const char* object_;
    int folder_;
    AttributeWriter* stream_;
    Owned<std::uint8_t> value_;
    std::uint32_t room_ = 0;
};

// The stream gets its name when it has all values and they are on disk, and the files go after
// that: each attribute is always where it is looked for.
int ImportAttributeFiles(const char* szPath, const char* stream_path, Folder* folder) {
    NewFile file(SplitObject(stream_path).parent, kMode);
    if (!file) return unit.Fail(Err::kOpen);
    AttributeWriter stream(file.fd());
    if (!stream) return kFailure;
    folder->Rewind();
    AttributeImport import(szPath, folder->fd(), &stream);
    while (const char* const name = NextAttribute(folder)) {
        if (!import.Add(name)) return kFailure;
    }
    if (folder->failed()) return unit.Fail(Err::kRead);

    // From its name on, others may want it.
    (void)MAVOEASLockSet(stream.stream(), F_UNLCK);
    if (!file.Name(stream_path)) {
        return IsThereNow(stream_path) ? kCurrent : unit.Fail(Err::kOpen);
    }
    // The name is on disk, too, before they go.
    if (MAVOEASFlush(stream.stream()) != 0) return kConverted;
    for (const EASEntry& attribute : Attributes(*stream.stream())) {
        (void)kernel::UnlinkAt(folder->fd(), attribute.name, 0);
    }
    return kConverted;
}

// ---- Streams ------------------------------------------------------------------------------------

// When the "._" file at `path` was last read, in seconds; 0 when there is none. -1 after recording
// that it cannot be told.
std::int64_t AppleDoubleAccess(const char* path) {
    struct stat info;
    if (kernel::Lstat(path, &info) != 0) {
        return SaysMissing(errno) ? 0 : unit.Fail(Err::kOpen);
    }
    // Looking into it, which is an access, comes after its time.
    return MAVOEACheckADFile(path) == 0 ? AccessTime(info) : 0;
}

// The "._" file becomes the stream as it is.
int AdoptAppleDouble(const char* szPath, const char* apple_double, const char* stream_path,
                     Current current) {
    if (current == Current::kMissed) {
        if (const int there = IsThere(stream_path); there != 0) return there;
    }
    char dir[kPathBufferSize];
    if (MAVOEADirPath(EA_FORM_FILE, szPath, dir, kDerivedPathMax) != 0) return kFailure;
    if (MAVOEAMKDir(0, dir) != 0) return kFailure;
    if (kernel::Rename(apple_double, stream_path) == 0) return kConverted;
    return IsThereNow(stream_path) ? kCurrent : unit.Fail(Err::kRename);
}

// Where the stream of an object may be kept in an earlier layout.
enum class Legacy { kAnywhere, kInFolder, kNowhere };

// Where that is for who has just missed the stream. The "._" file is looked for before the EA
// directory: who makes a stream of it meanwhile makes that first, if need be.
Legacy LegacyPlace(const char* szPath, const char* folder_path) {
    char path[kPathBufferSize];
    if (SplitObject(szPath).name.size() > kAppleDoubleNameMax ||
        MAVOEAADPath(szPath, path, kDerivedPathMax) != 0) {
        return Legacy::kAnywhere;
    }
    struct stat info;
    if (kernel::Lstat(path, &info) == 0 || errno != ENOENT) return Legacy::kAnywhere;
    CutShort(path, sizeof path).Add(WithoutTrailingSlash(SplitObject(folder_path).parent));
    return kernel::Access(path, F_OK) != 0 && errno == ENOENT ? Legacy::kNowhere
                                                              : Legacy::kInFolder;
}

int ConvertStream(const char* szPath, const char* stream_path, Folder* folder, Current current,
                  Legacy place) {
    const std::int64_t folder_time = *folder ? LatestAccess(folder) : 0;
    if (folder_time < 0) return kFailure;
    char apple_double[kPathBufferSize];
    if (MAVOEAADPath(szPath, apple_double, kDerivedPathMax) != 0) {
        // Names that are too long for one have none.
        if (MLIBCErrGet() != MAVOEA_ERR_NAME_TOO_LONG) return kFailure;
        return folder_time == 0 ? kConverted : ImportAttributeFiles(szPath, stream_path, folder);
    }
    const std::int64_t file_time = place == Legacy::kInFolder ? 0 : AppleDoubleAccess(apple_double);
    if (file_time < 0) return kFailure;
    if (folder_time == 0 && file_time == 0) {
        return *folder && IsThereNow(stream_path) ? kCurrent : kNothing;
    }
    // Deliberately the time of the last access, not that of the last change.
    return file_time < folder_time ? ImportAttributeFiles(szPath, stream_path, folder)
                                   : AdoptAppleDouble(szPath, apple_double, stream_path, current);
}

int UpgradeStream(const char* szPath, Current current, bool* nowhere) {
    char stream_path[kPathBufferSize];
    char folder_path[kPathBufferSize];
    if (MAVOEAPath(EA_FORM_FILE, szPath, MAVOEA_KIND_STREAM, stream_path, kDerivedPathMax,
                   EA_PLACE_EADIR) != 0 ||
        MAVOEADirPath(EA_FORM_FOLDER, szPath, folder_path, kDerivedPathMax) != 0) {
        return kFailure;
    }
    if (current == Current::kUnknown) {
        if (const int there = IsThere(stream_path); there != 0) return there;
    }
    Legacy place = Legacy::kAnywhere;
    if (nowhere != nullptr) {
        place = LegacyPlace(szPath, folder_path);
        *nowhere = place == Legacy::kNowhere;
        if (*nowhere) return kNothing;
    }
    Folder folder(folder_path);
    if (!folder && !SaysMissing(errno)) return unit.Fail(Err::kOpen);
    const bool missing = !folder && errno == ENOENT;
    const int result = ConvertStream(szPath, stream_path, &folder, current, place);
    return missing ? result : RemoveFolder(folder_path, result);
}

// ---- Resource files -----------------------------------------------------------------------------

// What a resource file says that the object itself shows on other volumes.
struct Marks {
    bool read_only = false;
    bool invisible = false;
};

// The 16 bits at `offset`. 0, or -1 after recording that they are not there.
int ReadBits(int fd, std::uint64_t offset, std::uint16_t* bits, int line = __builtin_LINE()) {
    std::uint8_t bytes[2];
    if (ReadAt(fd, bytes, offset) != std::int64_t{sizeof bytes}) {
        return unit.Fail(Err::kRead, line);
    }
    *bits = LoadBe16(bytes);
    return 0;
}

// Where a resource file has its AFP attributes and Finder flags; at least one of them.
struct MarkOffsets {
    std::optional<std::uint64_t> afp_attributes;
    std::optional<std::uint64_t> finder_flags;
};

int FindMarks(int fd, MarkOffsets* found) {
    std::uint8_t bytes[AppleDoubleHeader::kSize];
    if (ReadAt(fd, bytes, 0) != std::int64_t{sizeof bytes}) return unit.Fail(Err::kRead);
    BeReader in(bytes);
    const AppleDoubleHeader header = DecodeAppleDoubleHeader(in);
    if (header.version != kAppleDoubleVersion2) return unit.Fail(Err::kBadAppleDouble);

    for (std::uint16_t i = 0; i < header.entry_count; ++i) {
        std::uint8_t descriptor[EntryDescriptor::kSize];
        if (ReadAt(fd, descriptor, DescriptorsEnd(i)) != std::int64_t{sizeof descriptor}) {
            return unit.Fail(Err::kRead);
        }
        BeReader fields(descriptor);
        const EntryDescriptor entry = DecodeEntryDescriptor(fields);
        const std::uint64_t offset = entry.data.offset;
        if (entry.id == EntryId::kFinderInfo) found->finder_flags = offset + kFinderFlagsOffset;
        if (entry.id == EntryId::kAfpFileInfo) {
            found->afp_attributes = offset + kAfpAttributesOffset;
        }
    }
    return found->finder_flags || found->afp_attributes ? 0 : unit.Fail(Err::kBadAppleDouble);
}

int ReadMarks(const char* resource_file, Marks* marks) {
    const UniqueFd fd(kernel::OpenToRead(resource_file));
    if (!fd) return unit.Fail(Err::kOpen);
    MarkOffsets offsets;
    if (FindMarks(fd.get(), &offsets) != 0) return -1;
    if (offsets.afp_attributes) {
        std::uint16_t attributes = 0;
        if (ReadBits(fd.get(), *offsets.afp_attributes, &attributes) != 0) return -1;
        marks->read_only = (attributes & kAfpNoWrite) != 0;
        marks->invisible = (attributes & kAfpInvisible) != 0;
    }
    if (offsets.finder_flags) {
        std::uint16_t flags = 0;
        if (ReadBits(fd.get(), *offsets.finder_flags, &flags) != 0) return -1;
        if ((flags & kFinderInvisible) != 0) marks->invisible = true;
    }
    return 0;
}

// Gives the object the marks of its resource file, beside those that it has. Best effort.
void CarryMarks(const char* resource_file, const char* szPath) {
    Marks marks;
    if (ReadMarks(resource_file, &marks) != 0) return;
    FileStatus status;
    if (ReadFileStatus(szPath, &status)) {
        if ((status.mode & kWritable) == 0) marks.read_only = true;
        if ((status.attributes & MLIBC_ATTRIBUTE_HIDDEN) != 0) marks.invisible = true;
        const mode_t mode = status.mode & kPermissions;
        (void)kernel::Chmod(szPath, marks.read_only ? mode & ~kWritable : mode | kWritable);
    }
    (void)kernel::FileCommand(szPath, marks.invisible ? marks::kSetHidden : marks::kClearHidden);
}

int UpgradeResourceFile(const char* szPath, Current known) {
    char legacy[kPathBufferSize];
    char current[kPathBufferSize];
    if (MAVOEAPath(EA_FORM_FOLDER, szPath, MAVOEA_KIND_LEGACY_RESOURCE, legacy, kDerivedPathMax,
                   EA_PLACE_EADIR) != 0 ||
        MAVOEAPath(EA_FORM_FILE, szPath, MAVOEA_KIND_RESOURCE, current, kDerivedPathMax,
                   EA_PLACE_EADIR) != 0) {
        return kFailure;
    }
    if (known == Current::kUnknown) {
        if (const int there = IsThere(current); there != 0) return there;
    }
    if (const int there = IsThere(legacy); there != 1) return there == 0 ? kNothing : kFailure;
    if (known == Current::kMissed) {
        if (const int there = IsThere(current); there != 0) return there;
    }
    const UniqueFd folder = FolderOf(legacy);
    if (!folder) return unit.Fail(Err::kOpen);
    if (kernel::RenameAt(folder.get(), MAVOEA_KIND_LEGACY_RESOURCE, AT_FDCWD, current) != 0) {
        return IsThereNow(current) ? kCurrent : unit.Fail(Err::kRename);
    }
    CarryMarks(current, szPath);
    *strrchr(legacy, '/') = '\0';
    return RemoveFolder(legacy, kConverted);
}

// ---- Other reserved names -----------------------------------------------------------------------

int UpgradeReserved(const char* szPath, const char* szName) {
    char legacy[kPathBufferSize];
    if (MAVOEAPath(EA_FORM_FOLDER, szPath, szName, legacy, kDerivedPathMax, EA_PLACE_EADIR) != 0) {
        return kFailure;
    }
    char current[kPathBufferSize];
    memcpy(current, legacy, sizeof legacy);
    if (char* const colon = strrchr(current, ':'); colon != nullptr) *colon = '@';
    if (const int there = IsThere(current); there != 0) return there;
    if (const int there = IsThere(legacy); there != 1) return there == 0 ? kNothing : kFailure;
    if (!FolderOf(legacy)) return unit.Fail(Err::kOpen);
    return MLIBCExec("/bin/mv", legacy, current, nullptr) == -1 ? kFailure : kConverted;
}

int Upgrade(const char* szPath, const char* szName, Current current, bool* nowhere) {
    const std::string_view kind = szName;
    if (kind == MAVOEA_KIND_STREAM) return UpgradeStream(szPath, current, nowhere);
    if (kind == MAVOEA_KIND_RESOURCE) return UpgradeResourceFile(szPath, current);
    if (kind.starts_with(kReserved)) return UpgradeReserved(szPath, szName);
    return unit.Fail(Err::kBadArgument);
}

}  // namespace

int UpgradeMissed(const char* szPath, const char* szName, bool* nowhere) {
    return Upgrade(szPath, szName, Current::kMissed, nowhere);
}

}  // namespace mavoea

using namespace mavoea;

int MAVOEAUpgrade(const char* szPath, const char* szName) {
    if (szName == nullptr) return unit.Fail(Err::kBadArgument);
    return Upgrade(szPath, szName, Current::kUnknown, nullptr);
}
