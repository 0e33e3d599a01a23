#include "tools/carry.h"

#include <dirent.h>
#include <fcntl.h>
#include <signal.h>
#include <sys/stat.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <filesystem>
#include <map>
#include <optional>
#include <vector>

#include "format/flush_time.h"
#include "format/netatalk_record.h"
#include "include/mavoea.h"
#include "platform/attribute_word.h"
#include "platform/include/mavocore.h"
#include "tools/file.h"
#include "tools/file_data.h"
#include "tools/lock.h"
#include "tools/messages.h"
#include "tools/sidecar.h"
#include "tools/store.h"
#include "tools/text.h"
#include "util/volume_kind.h"

namespace mavoea::tool {
namespace {

// Operations of the two indexes.
constexpr int kAdded = 1;

// The fork that a Mac writes where a file has none; conversions may leave it out.
constexpr std::uint64_t kBlankForkSize = 286;

constexpr mode_t kMetadataMode = 0777;

constexpr const char* kTryAgain = "see what is in the way, and copy it again";

// ---- Where it is --------------------------------------------------------------------------------

std::string PathOf(const Object& object, std::string_view id) {
    for (MetadataPath& place : MetadataPaths(object)) {
        if (place.id == id) return std::move(place.path);
    }
    return {};
}

bool IsBesideThe(const Object& object, std::string_view id) {
    switch (object.keeping()) {
        case Keeping::kAppleDouble:
            return id == "appleDouble" || id == "legacyFolder";
        case Keeping::kEaDirectory:
            return id != "legacyResource";
        case Keeping::kXattr:
            return id == "resource" || id == "legacyFolder";
        case Keeping::kNone:
            break;
    }
    return false;
}

std::vector<std::string> AttributeNames(const std::string& path) {
    std::vector<char> list;
    ssize_t size = ::llistxattr(path.c_str(), nullptr, 0);
    while (size > 0) {
        list.resize(static_cast<std::size_t>(size));
        size = ::llistxattr(path.c_str(), list.data(), list.size());
        if (size >= 0 || errno != ERANGE) break;
        size = ::llistxattr(path.c_str(), nullptr, 0);
    }
    if (size < 0 && errno != ENOTSUP && errno != ENODATA) throw SystemFailure(path, errno);
    std::vector<std::string> names;
    const char* const end = list.data() + std::max<ssize_t>(size, 0);
    for (const char* name = list.data(); name < end; name += names.back().size() + 1) {
        names.emplace_back(name);
    }
    return names;
}

// ---- One metadata file --------------------------------------------------------------------------

// Another process that changes it is waited for by nobody: it is a Failure.
void CopyMetadataFile(const std::string& from, const std::string& to) {
    const File source = File::OpenToRead(from);
    const FileLock lock(source, Access::kRead);
    constexpr int kFlags = O_WRONLY | O_CREAT | O_TRUNC | O_NOFOLLOW | O_CLOEXEC;
    int fd = ::open(to.c_str(), kFlags, kMetadataMode);
    if (fd < 0 && ::unlink(to.c_str()) == 0) fd = ::open(to.c_str(), kFlags, kMetadataMode);
    const File target(fd, to);
    if (fd < 0) throw SystemFailure(to, errno);
    try {
        CopyData(source, target, {});
    } catch (const Failure&) {
        (void)::unlink(to.c_str());
        throw;
    }
}

// What the library's copy has called: it only logs the failures of what follows the copy proper.
std::optional<std::string> noted_failure;

int CopyAndNote(const char* from, const char* to) {
    try {
        CopyMetadataFile(from, to);
        return 0;
    } catch (const std::exception& failure) {
        if (!noted_failure) noted_failure = failure.what();
        errno = EIO;
        return -1;
    }
}

// The programs that the library runs are not interrupted with this process.
class SignalsHeld {
 public:
    SignalsHeld() {
        sigset_t signals;
        ::sigemptyset(&signals);
        ::sigaddset(&signals, SIGINT);
        ::sigaddset(&signals, SIGTERM);
        ::sigprocmask(SIG_BLOCK, &signals, &former_);
    }
    ~SignalsHeld() { ::sigprocmask(SIG_SETMASK, &former_, nullptr); }
    SignalsHeld(const SignalsHeld&) = delete;
    SignalsHeld& operator=(const SignalsHeld&) = delete;

 private:
    sigset_t former_;
};

// ---- What should have arrived -------------------------------------------------------------------

Failure NotArrived(const Object& from, const Object& to, const std::string& what) {
    return {kFailed, from.path, what + " did not arrive at " + Printable(to.path), kTryAgain};
}

void CheckAttributes(const Object& from, const Object& to) {
    std::vector<Attribute> wanted;
    try {
        wanted = OpenStore(from)->List();
    } catch (const Failure&) {
        return;  // Files that nobody can read are copied as they are.
    }
    if (wanted.empty()) return;
    std::map<std::string, std::uint64_t> found;
    for (const Attribute& attribute : OpenStore(to)->List()) found[attribute.name] = attribute.size;
    for (const Attribute& attribute : wanted) {
        // Where the permissions say it, they say it at the destination as well.
        if (attribute.kind == Kind::kLocked && from.keeping() != Keeping::kEaDirectory) continue;
        if (attribute.kind == Kind::kResourceFork && attribute.size == kBlankForkSize) continue;
        const auto there = found.find(attribute.name);
        if (there != found.end() && there->second == attribute.size) continue;
        throw NotArrived(from, to, "\"" + Printable(attribute.name) + "\"");
    }
}

void CheckLegacyFolder(const Object& from, const Object& to) {
    namespace fs = std::filesystem;
    std::error_code error;
    const std::string source = PathOf(from, "legacyFolder");
    const std::string target = PathOf(to, "legacyFolder");
    for (fs::directory_iterator entry(source, error), end; !error && entry != end;
         entry.increment(error)) {
        std::error_code unknown;
        if (!entry->is_regular_file(unknown) || entry->is_symlink(unknown)) continue;
        const fs::path there = fs::path(target) / entry->path().filename();
        const std::uintmax_t size = fs::file_size(there, unknown);
        if (!unknown && size == entry->file_size(unknown)) continue;
        throw NotArrived(from, to, Printable(entry->path().string()));
    }
}

// Without a resource file the library leaves the stream behind on its way to file-EA volumes.
void CompleteStream(const Object& from, const Object& to) {
    if (VolumeKindOf(from.type) != VolumeKind::kEADir ||
        VolumeKindOf(to.type) != VolumeKind::kFileEA) {
        return;
    }
    const std::string source = PathOf(from, "stream");
    const std::string target = PathOf(to, "stream");
    if (target.empty() || !Exists(source) || Exists(target)) return;
    const ErrorMark mark;
    const std::string directory = target.substr(0, target.rfind('/'));
    if (MAVOEAMKDir(0, directory.c_str()) != 0) throw LibraryFailure(to.path, mark.Get());
    CopyMetadataFile(source, target);
    (void)::chmod(target.c_str(), kMetadataMode);
    (void)MAVOEAFileEAWriteFlushTime(to.path.c_str(), 0);
}

// The library would remove what is where a link in the legacy folder's place leads.
void RemoveLinkedFolder(const Object& object) {
    const std::string folder = PathOf(object, "legacyFolder");
    struct stat info;
    if (::lstat(folder.c_str(), &info) != 0 || !S_ISLNK(info.st_mode)) return;
    if (::unlink(folder.c_str()) != 0) throw SystemFailure(folder, errno);
}

Failure CopyFailure(const Object& from, int result, const LibraryError& error) {
    constexpr int kNameTooLong = -3;
    constexpr int kIconName = -32;
    constexpr int kReservedCharacter = -33;
    switch (result) {
        case kNameTooLong:
            return {kFailed, from.path, "its name is too long for a \"._\" file",
                    "use a shorter name"};
        case kIconName:
        case kReservedCharacter:
            return {kFailed, from.path,
                    "clients of the destination take no \"._\" file of its name",
                    "use another name"};
        default:
            break;
    }
    if (error.code != 0) return LibraryFailure(from.path, error);
    return {kFailed, from.path, "its metadata could not be copied", "the system log has the cause"};
}

// A "._" file of only attributes on its way to real ones: file systems without those of Macs do not
// take its Finder info, be it blank, and the copy ends with that. Whether nothing else is missing.
bool OnlyBlankFinderInfoIsMissing(const Object& from, const Object& to) {
    if (from.keeping() != Keeping::kAppleDouble || to.keeping() != Keeping::kXattr) return false;
    try {
        if (OpenStore(from)->Get(std::string(kFinderInfoName))) return false;
        CheckAttributes(from, to);
    } catch (const Failure&) {
        return false;
    }
    (void)EASetSmbArchive(to.path.c_str());
    return true;
}

void RunLibraryCopy(const Object& from, const Object& to) {
    const SignalsHeld held;
    noted_failure.reset();
    std::string target = to.path;
    const ErrorMark mark;
    const int result =
        MAVOEACopyEx(from.path.c_str(), target.data(), 0, 1, from.type, to.type, 1, 1, CopyAndNote);
    const LibraryError error = mark.Get();
    if (noted_failure) {
        throw Failure(kFailed, from.path, "its metadata could not be copied: " + *noted_failure,
                      kTryAgain);
    }
    if (result < 0 && !OnlyBlankFinderInfoIsMissing(from, to)) {
        throw CopyFailure(from, result, error);
    }
}

// What the library's copy to a "._" file takes besides: the file itself, when it is to get nothing
// but attributes, and the name of the object where the library gives it one for FAT.
class AppleDoubleTarget {
 public:
    AppleDoubleTarget(const Object& from, const Object& to) : from_(from), to_(to) {
        if (to.keeping() != Keeping::kAppleDouble) return;
        path_ = PathOf(to, "appleDouble");
        if (from.keeping() == Keeping::kXattr && !path_.empty() &&
            !AttributeNames(from.path).empty()) {
            const File made(::open(path_.c_str(), kFlags, kMetadataMode), path_);
            if (made.fd() < 0) throw SystemFailure(path_, errno);
        }
        if (from.keeping() != Keeping::kEaDirectory) return;
        std::string name(MAVOEA_PATH_SIZE + 1, '\0');
        if (MAVOStrReplaceFATReservedChar(path_.c_str(), name.data(), MAVOEA_PATH_SIZE) != 0) {
            return;
        }
        name.resize(name.find('\0'));
        if (name == path_) return;
        fat_path_ = name;
        if (!Exists(fat_path_)) return;
        throw Failure(kFailed, fat_path_, "it is in the way of metadata of " + Printable(to.path),
                      "move it away");
    }
    ~AppleDoubleTarget() {
        struct stat info;
        if (!path_.empty() && ::lstat(path_.c_str(), &info) == 0 && S_ISREG(info.st_mode) &&
            info.st_size == 0) {
            (void)::unlink(path_.c_str());
        }
        if (!fat_path_.empty()) (void)::unlink(fat_path_.c_str());
    }
    AppleDoubleTarget(const AppleDoubleTarget&) = delete;
    AppleDoubleTarget& operator=(const AppleDoubleTarget&) = delete;

    void Complete() const {
        if (fat_path_.empty() || !Exists(fat_path_)) return;
        if (::rename(fat_path_.c_str(), path_.c_str()) != 0) throw SystemFailure(path_, errno);
        const auto source = OpenStore(from_);
        const auto target = OpenStore(to_);
        for (const Attribute& attribute : source->List()) {
            if (attribute.kind != Kind::kAttribute) continue;
            if (const auto value = source->Get(attribute.name)) target->Set(attribute.name, *value);
        }
    }

 private:
    static constexpr int kFlags = O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC;

    const Object& from_;
    const Object& to_;
    std::string path_;
    std::string fat_path_;
};

}  // namespace

bool HasSidecar(const Object& object) {
    for (const MetadataPath& place : MetadataPaths(object)) {
        if (IsBesideThe(object, place.id) && !place.path.empty() && Exists(place.path)) return true;
    }
    return false;
}

bool HasMetadata(const Object& object) {
    if (object.path == "/") return false;
    if (HasSidecar(object)) return true;
    switch (VolumeKindOf(object.type)) {
        case VolumeKind::kAttribute: {
            const Object nowhere = {object.path, -1};
            const auto names = AttributeNames(object.path);
            return std::any_of(names.begin(), names.end(), [&](const std::string& name) {
                return TravelsAsMetadata(name, object, nowhere);
            });
        }
        case VolumeKind::kFileEA:
            return ::lgetxattr(object.path.c_str(), kNetatalkAttribute, nullptr, 0) >= 0;
        default:
            return false;
    }
}

void RequirePlace(const Object& from, const Object& to) {
    const char* place = "stream";
    switch (VolumeKindOf(to.type)) {
        case VolumeKind::kAttribute:
            return;
        case VolumeKind::kNone:
            throw NoStore(to);
        case VolumeKind::kDestinationOnly:
            if (from.keeping() != Keeping::kEaDirectory) throw NoStore(to);
            break;
        case VolumeKind::kAppleDouble:
            place = "appleDouble";
            break;
        case VolumeKind::kEADir:
        case VolumeKind::kFileEA:
            break;
    }
    if (!PathOf(to, place).empty()) return;
    throw Failure(kFailed, to.path, "its name or path is too long to have metadata there",
                  "use a shorter name");
}

void ReportNew(const std::string& path) {
    constexpr int kDirectoryAdded = 3;
    struct stat info;
    const bool directory = ::lstat(path.c_str(), &info) == 0 && S_ISDIR(info.st_mode);
    (void)MAVOIndex(path.c_str(), nullptr, directory ? kDirectoryAdded : kAdded);
    (void)MLIBMavoFileIndexAdd(path.c_str(), nullptr, kAdded);
}

void ReportRenamed(const std::string& from, const std::string& to) {
    constexpr int kRenamed = 4;
    (void)MAVOIndex(to.c_str(), from.c_str(), kRenamed);
    (void)MLIBMavoFileIndexAdd(to.c_str(), from.c_str(), kRenamed);
}

void CopyMetadata(const Object& from, const Object& to) {
    if (from.keeping() == Keeping::kNone || VolumeKindOf(to.type) == VolumeKind::kNone) {
        ReportNew(to.path);
        return;
    }
    const bool has_metadata = HasMetadata(from);
    if (!has_metadata && to.keeping() == Keeping::kAppleDouble &&
        (from.keeping() == Keeping::kAppleDouble || PathOf(to, "appleDouble").empty())) {
        // The library would run a program to copy what is not there, or miss a name for it.
        (void)EASetSmbArchive(to.path.c_str());
        ReportNew(to.path);
        return;
    }
    {
        const AppleDoubleTarget target(from, to);
        RunLibraryCopy(from, to);
        target.Complete();
    }
    if (!has_metadata) return;
    CompleteStream(from, to);
    if (to.keeping() != Keeping::kNone) CheckAttributes(from, to);
    CheckLegacyFolder(from, to);
}

void RenameMetadata(const Object& from, const Object& to) {
    const std::string apple_double =
        to.keeping() == Keeping::kAppleDouble ? PathOf(from, "appleDouble") : std::string();
    RemoveLinkedFolder(to);
    const ErrorMark mark;
    if (MAVOEARename(from.path.c_str(), to.path.c_str(), to.type, nullptr) != 0) {
        throw LibraryFailure(from.path, mark.Get());
    }
    // The library says nothing of what could not be moved here.
    if (apple_double.empty() || !Exists(apple_double)) return;
    throw Failure(kFailed, from.path, "its metadata could not be moved: " + Printable(apple_double),
                  "see whether it may be renamed");
}

void RemoveMetadata(const Object& object, IndexReport report) {
    const int told = report == IndexReport::kYes ? 1 : 0;
    EAIndexFlags flags = {told, told};
    RemoveLinkedFolder(object);
    const ErrorMark mark;
    bool removed = true;
    if (object.keeping() == Keeping::kXattr) {
        removed = EARemove(EA_FORM_FILE, object.path.c_str()) == 0;
        removed = EARemove(EA_FORM_FOLDER, object.path.c_str()) == 0 && removed;
    }
    removed = MAVOEARemove(object.path.c_str(), object.type, &flags) == 0 && removed;
    if (removed) return;
    const LibraryError error = mark.Get();
    // A name that can have no metadata has none.
    if (error.code == MAVOEA_ERR_NAME_TOO_LONG) return;
    if (error.code != 0) throw LibraryFailure(object.path, error);
    throw Failure(kFailed, object.path, "its metadata could not be removed",
                  "the system log has the cause");
}

void RemoveInodeMetadata(const Object& object) {
    const Object nowhere = {object.path, -1};
    for (const std::string& name : AttributeNames(object.path)) {
        if (!TravelsAsMetadata(name, object, nowhere)) continue;
        if (::lremovexattr(object.path.c_str(), name.c_str()) != 0 && errno != ENODATA) {
            throw SystemFailure(object.path, errno);
        }
    }
}

bool TravelsAsMetadata(const std::string& attribute, const Object& from, const Object& to) {
    if (attribute == kNetatalkAttribute || attribute == kFlushTimeAttribute) return true;
    if (from.keeping() != Keeping::kXattr || to.keeping() == Keeping::kXattr) return false;
    return attribute != attribute_word::kName && !attribute.starts_with("system.") &&
           !attribute.starts_with("security.") && !attribute.starts_with("trusted.");
}

}  // namespace mavoea::tool
