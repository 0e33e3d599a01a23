// An open directory: everything on disk is reached through one, by a name in it, and never through
// a symbolic link. Paths are for people to read.
#ifndef MAVOEA_TOOLS_PLACE_DIRECTORY_H_
#define MAVOEA_TOOLS_PLACE_DIRECTORY_H_

#include <sys/stat.h>

#include <cstdint>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <vector>

#include "tools/place/attribute_source.h"
#include "tools/place/file.h"
#include "tools/say/messages.h"

namespace mavoea::tool {

class Directory;
using DirectoryRef = std::shared_ptr<const Directory>;

// All members throw Failure. Names are those of entries: without a '/', but for "." in the root.
class Directory : public std::enable_shared_from_this<Directory> {
 public:
    // The directory that somebody named; the kernel follows what links there are on the way.
    // `shown` is how people call it from here on, and `location` where it is, for whoever decides
    // by absolute paths.
    static DirectoryRef Open(const std::string& path, const std::string& shown,
                             const std::string& location);

    // One that another process has handed over with its descriptor, which is this one's from here
    // on. `location` is less than its own where that could not be named. `is_new`: that process has
    // made it.
    static DirectoryRef Adopt(int fd, const std::string& shown, const std::string& location,
                              bool has_location, bool is_new);

    // A directory in this one. Null when nothing is there; a Failure when it is something else, a
    // symbolic link too.
    DirectoryRef FindIn(const std::string& name) const;
    DirectoryRef OpenIn(const std::string& name) const;  // a Failure when nothing is there, too
    // `shown` is how people call it, where it is not this one's path and the name.
    DirectoryRef OpenIn(const std::string& name, const std::string& shown) const;

    // The directory in which this one was found, which has been closed since. A Failure when this
    // one has come into another than the one that had that status.
    DirectoryRef OpenAbove(const struct stat& former) const;

    // FindIn(), which keeps the last one open for who asks again. Where this one has been listed it
    // is looked at once: like the list, it stays what it was then.
    DirectoryRef FindAgain(const std::string& name) const;
    // Has it looked at once more.
    void Forget(const std::string& name) const;

    // Made with that mode, less the umask, and owned by this process; a Failure when anything is
    // there.
    DirectoryRef MakeIn(const std::string& name, mode_t mode) const;

    // A directory in this one that one process at a time may have open in this way: it is locked
    // until it is closed, or its process ends in whatever way. Null when nothing is there; with
    // `busy` set to true when another process has it.
    DirectoryRef LockIn(const std::string& name, bool* busy) const;

    int fd() const { return file_.fd(); }  // of a kind that reads and changes nothing by itself
    // For people. Empty for the working directory, whose entries have no other path than a name.
    std::string path() const { return PathOf("."); }
    std::string PathOf(const std::string& name) const;
    // What is too deep for any path to name has the location of the nearest directory above it that
    // can be named.
    const std::string& location() const { return *names_->location; }
    std::string LocationOf(const std::string& name) const;
    bool HasLocation(const std::string& name) const;
    bool has_location() const { return names_->has_location; }
    struct stat Status() const;
    // Whether this work has made it: all that is in it has come since.
    bool is_new() const { return is_new_; }
    // Whether it is one that a dry run would have made. No descriptor leads to it.
    bool foreseen() const { return on_disk_ != nullptr; }
    // Itself, or the one that is there in which it would be.
    const Directory& OnDisk() const { return on_disk_ ? *on_disk_ : *this; }

    // For calls that take a path: it leads through this descriptor, whatever has become of the
    // directory's name.
    std::string ProcPath() const;
    std::string ProcPath(const std::string& name) const;

    struct Entry {
        std::string name;
        mode_t type;  // S_IFREG, S_IFDIR, ...
        bool noted_as_metadata = false;
    };
    // All but "." and "..", sorted by name, as it is at the time.
    std::vector<Entry> Entries() const;
    // The same as it was when this was first asked, or since it was last forgotten, or when this
    // process made it.
    const std::vector<Entry>& EntriesAtFirst() const;
    void ForgetEntries() const { first_.reset(); }
    // Of what, when it was listed, had that name; 0 for what did not, or where nobody has asked.
    mode_t TypeAtFirst(const std::string& name) const;
    bool listed() const { return first_ != nullptr; }

    // The names in it that begin so, with those that this process has put there since; sorted.
    std::vector<std::string> NamesAtFirst(const std::string& prefix) const;

    // False where such a list says that nothing of that name is there, and this process has put
    // nothing there since. It says so of no name that the file system could take for another's.
    bool MayHave(const std::string& name) const;
    // Whether such a list shows that only what has the very letters can have that name.
    bool TellsApart(const std::string& name) const;
    // Has(), by the list where it can tell.
    bool HadAtFirst(const std::string& name) const;
    // Says that this process has put something there. Members that do so, and temporary files, say
    // it themselves.
    void NoteCome(const std::string& name) const;

    // The type of the volume that what is in it is on, unless that is a directory; kept for who
    // asks again.
    struct VolumeType {
        int type;
        bool declared;
    };
    std::optional<VolumeType>& volume_type() const { return volume_type_; }

    // Where, in or above it, Samba keeps streams as files; empty: nowhere. Kept for who asks again.
    std::optional<std::string>& depot() const { return depot_; }

    // Of what such a list has: somebody has looked into it, and it is metadata of an object.
    void NoteMetadata(const std::string& name) const;
    bool IsNotedAsMetadata(const std::string& name) const;

    // None when nothing of that name is there.
    std::optional<struct stat> StatusOf(const std::string& name) const;
    bool Has(const std::string& name) const { return StatusOf(name).has_value(); }
    // Whether it is there and has no extended attribute of any kind. False where nobody can tell.
    bool HasWithoutAttributes(const std::string& name) const;

    // The name under which a file is listed that is found under `name`, which may be spelled
    // otherwise; `name` itself where it is listed.
    std::string NameOf(const struct stat& info, const std::string& name) const;

    // A regular file in it. Null when nothing is there; a Failure for anything but a regular file.
    // Reading leaves access times alone where that may be.
    std::shared_ptr<const File> FindFile(const std::string& name, int flags) const;

    // False when nothing of that name is there any more. A directory goes with all that is in it.
    bool Remove(const std::string& name) const;
    // False when it is not there any more; a directory is a Failure.
    bool RemoveFile(const std::string& name) const;
    // False when it is not there any more, or not empty.
    bool RemoveEmpty(const std::string& name) const;

    // Over what is there.
    void Rename(const std::string& name, const Directory& to, const std::string& new_name) const;
    // False when something is there.
    bool RenameToNew(const std::string& name, const Directory& to,
                     const std::string& new_name) const;

    // A descriptor of its own that can be read and changed.
    File Reopened() const;

    // What has been made, renamed and removed in it is on disk.
    void Sync() const;
    // So is everything else that has been written to its file system.
    void SyncVolume() const;

 private:
    // What a directory is called. Its path is put together only when somebody is to read it: in a
    // deep tree those of all levels would take more than there is memory.
    struct Names {
        ~Names();

        std::shared_ptr<Names> above;  // null for what somebody named
        std::string name;
        std::string shown;  // empty where it is the path of the one above and the name
        std::shared_ptr<const std::string> location;
        bool has_location = true;
    };

    Directory(int fd, std::shared_ptr<Names> names)
        : file_(fd, std::string()), names_(std::move(names)) {}
    DirectoryRef FindIn(const std::string& name, const std::string& shown) const;
    DirectoryRef Foresee(const std::string& name, const std::string& shown,
                         const struct stat& info) const;
    std::shared_ptr<Names> NamesOf(const std::string& name, const std::string& shown) const;
    int OpenToRead() const;
    std::vector<Entry> EntriesOnDisk() const;
    void BeginEmpty() const;
    std::optional<bool> ListTells(const std::string& name) const;
    bool TellsCasesApart() const;
    bool Lists(const std::string& name) const;
    Entry* FirstOf(const std::string& name) const;

    File file_;  // its path is not used
    std::shared_ptr<Names> names_;
    DirectoryRef on_disk_;            // null: this one is
    struct stat foreseen_info_ = {};  // where it is not
    mutable std::unique_ptr<std::vector<Entry>> first_;
    mutable std::set<std::string> later_;  // has come by this process since
    mutable bool is_new_ = false;
    mutable std::optional<bool> tells_cases_apart_;
    mutable DirectoryRef kept_;
    mutable std::optional<VolumeType> volume_type_;
    mutable std::optional<std::string> depot_;
};

// An object, or where one is to be: an open directory and a name there.
struct Place {
    DirectoryRef directory;
    std::string name;
    // How people call it, where it is not the directory's path and the name.
    std::string shown = {};

    std::string path() const { return shown.empty() ? directory->PathOf(name) : shown; }
    std::string location() const { return directory->LocationOf(name); }
    DirectoryRef Open() const { return directory->OpenIn(name, shown); }
    std::optional<struct stat> Status() const { return directory->StatusOf(name); }
    // Whether this process may write to it; links may always be written to.
    bool Writable() const;
};

// Of what is there; a Failure when nothing is.
struct stat StatusOf(const Place& place);

// Whether its directory lists the very name. Where case does not matter a file is found under
// others, too.
bool IsListed(const Place& place);

Failure HasBecomeAnother(const Place& place);

// When it was made, in nanoseconds since 1970; 0 where the file system does not say. No call
// changes it, and so it tells a file from a later one of the same inode number.
std::uint64_t BirthOf(const Place& place);

// An object's own descriptor. It says nothing of what the name leads to later.
class Inode final : public AttributeSource {
 public:
    // Null when nothing is there. Throws Failure.
    static std::shared_ptr<const Inode> Find(const Place& place);
    static std::shared_ptr<const Inode> Open(const Place& place);  // a Failure when nothing is
    // The same, but a regular file is opened for reading if it may be read.
    static std::shared_ptr<const Inode> OpenToRead(const Place& place);
    // The file behind an open descriptor, shared with the caller.
    static std::shared_ptr<const Inode> Of(const std::shared_ptr<const File>& file);
    // The same with a descriptor of its own.
    static std::shared_ptr<const Inode> Of(const File& file);
    // One that would be there: without attributes, until it is given some, which nothing on disk
    // notices.
    static std::shared_ptr<const Inode> Foresee(const Place& place, const struct stat& info);

    const std::string& path() const override { return file_->path(); }
    // That calls on open files take; -1 when there is none.
    int fd() const { return by_path_ ? -1 : file_->fd(); }
    // To be read; null when it has not been opened for that.
    std::shared_ptr<const File> file() const { return by_path_ ? nullptr : file_; }
    const struct stat& info() const { return info_; }  // when it was opened
    struct stat Status() const {
        return foreseen_ ? info_ : file_->Status();
    }
    bool foreseen() const { return foreseen_; }

    // Whether it is a regular file or a directory, which alone have attributes and marks.
    bool HoldsContents() const;

    // For calls that take a path and follow links: it leads to this file and to no other.
    std::string ProcPath() const;

    // Extended attributes. A file system without any has none.
    std::vector<std::string> AttributeNames() const override;
    std::optional<Bytes> Attribute(const std::string& name) const override;
    void SetAttribute(const std::string& name, ByteView value) const;
    bool RemoveAttribute(const std::string& name) const;  // false: there was none

    void SetMode(mode_t mode) const;
    // False with errno.
    bool TrySetOwner(uid_t owner, gid_t group) const;
    void SetTimes(const timespec (&times)[2]) const;  // of access and modification

    // Its data and attributes are on disk. For files that can be read and directories.
    void Sync() const;

 private:
    Inode(std::shared_ptr<const File> file, bool by_path)
        : file_(std::move(file)), by_path_(by_path), info_(file_->Status()) {}
    Inode(std::shared_ptr<const File> file, const struct stat& foreseen)
        : file_(std::move(file)), by_path_(true), foreseen_(true), info_(foreseen) {}

    std::shared_ptr<const File> file_;
    bool by_path_;           // the descriptor only says which file it is, and takes no calls
    bool foreseen_ = false;  // it is that of a directory where it would be
    struct stat info_;
};

// A file on its way to a target, which goes away at the end of its scope unless it has been given
// to it. It has no name until then; where the file system needs one, it is one that nothing else in
// the directory has, and is locked (flock) while it is open: what has such a name and no lock has
// been left by a run that was killed. Without a mode only its owner may read it before.
class TemporaryFile {
 public:
    explicit TemporaryFile(const Place& target, mode_t mode = S_IRUSR | S_IWUSR);
    ~TemporaryFile();
    TemporaryFile(const TemporaryFile&) = delete;
    TemporaryFile& operator=(const TemporaryFile&) = delete;

    const File& file() const { return *file_; }
    // The same, for who needs it longer.
    const std::shared_ptr<const File>& shared_file() const { return file_; }

    // The target is replaced in one step. A Failure when somebody has put another file under the
    // temporary name.
    void GiveToTarget();
    // A Failure when the target is there by now.
    void GiveToNewTarget();

 private:
    void MakeInMemory(mode_t mode);
    bool MakeNameless(mode_t mode);
    bool LinkTo(const std::string& name) const;
    void NeedName();
    template <class Use>
    void TryNames(Use use) const;
    void RequireTarget() const;

    const Place target_;
    std::shared_ptr<const File> file_;
    std::string name_;  // empty: it has none, or it has the target's
};

// How all names begin that only this tool gives, for a time.
inline constexpr std::string_view kOwnPrefix = ".mavoea-";
// Of files that say which object is being moved to another file system.
inline constexpr std::string_view kMovingPrefix = ".mavoea-moving-";

// The prefix and eight random letters and digits.
std::string TemporaryName();
bool IsTemporaryName(std::string_view name);

// Whether what has a temporary name has been left by a run that was killed: nobody holds its lock.
// Links and special files have none, nor can a file be told from one that is about to lose its
// temporary name and has another; they count when they have been there for a minute. Directories
// never do. Throws Failure.
bool IsAbandoned(const Directory& directory, const std::string& name);
// Removes it if it has been. False: it has not, or is gone.
bool RemoveAbandoned(const Directory& directory, const std::string& name);

// Failure for recursive work of the superuser where no path leads through a descriptor: what other
// users put in the way could not be told from what was named.
void RequireDescriptorPaths();

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_PLACE_DIRECTORY_H_
