// An open directory: everything on disk is reached through one, by a name in it, and never through
// a symbolic link. Paths are for people to read.
#ifndef MAVOEA_TOOLS_PLACE_DIRECTORY_H_
#define MAVOEA_TOOLS_PLACE_DIRECTORY_H_

#include <sys/stat.h>

#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "tools/place/file.h"

namespace mavoea::tool {

class Directory;
using DirectoryRef = std::shared_ptr<const Directory>;

// All members throw Failure. Names are those of entries: without a '/', but for "." in the root.
class Directory : public std::enable_shared_from_this<Directory> {
 public:
    // The directory that somebody named; the kernel follows what links there are on the way.
    // `shown` is how it is called from here on.
    static DirectoryRef Open(const std::string& path, const std::string& shown);

    // A directory in this one. Null when nothing is there; a Failure when it is something else, a
    // symbolic link too.
    DirectoryRef FindIn(const std::string& name) const;
    DirectoryRef OpenIn(const std::string& name) const;  // a Failure when nothing is there, too

    // FindIn(), which keeps the last one open for who asks again: what it has listed stays known.
    DirectoryRef FindAgain(const std::string& name) const;

    // Made with mode 0700, and owned by this process; a Failure when anything is there.
    DirectoryRef MakeIn(const std::string& name) const;

    int fd() const { return file_.fd(); }  // of a kind that reads and changes nothing by itself
    const std::string& path() const { return file_.path(); }
    std::string PathOf(const std::string& name) const;
    struct stat Status() const {
        return file_.Status();
    }

    // For calls that take a path: it leads through this descriptor, whatever has become of the
    // directory's name.
    std::string ProcPath() const;
    std::string ProcPath(const std::string& name) const;

    struct Entry {
        std::string name;
        mode_t type;  // S_IFREG, S_IFDIR, ...
    };
    // All but "." and "..", sorted by name, as it is at the time.
    std::vector<Entry> Entries() const;
    // The same as it was when this was first asked.
    const std::vector<Entry>& EntriesAtFirst() const;

    // None when nothing of that name is there.
    std::optional<struct stat> StatusOf(const std::string& name) const;
    bool Has(const std::string& name) const { return StatusOf(name).has_value(); }

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

    // A descriptor of its own that can be read and changed.
    File Reopened() const;

    // What has been made, renamed and removed in it is on disk.
    void Sync() const;
    // So is everything else that has been written to its file system.
    void SyncVolume() const;

 private:
    explicit Directory(File file) : file_(std::move(file)) {}

    File file_;
    mutable std::unique_ptr<std::vector<Entry>> first_;
    mutable DirectoryRef kept_;
};

// An object, or where one is to be: an open directory and a name there.
struct Place {
    DirectoryRef directory;
    std::string name;

    std::string path() const { return directory->PathOf(name); }
    std::optional<struct stat> Status() const { return directory->StatusOf(name); }
    // Whether this process may write to it; links may always be written to.
    bool Writable() const;
};

// Of what is there; a Failure when nothing is.
struct stat StatusOf(const Place& place);

// An object's own descriptor. It says nothing of what the name leads to later.
class Inode {
 public:
    // Null when nothing is there. Throws Failure.
    static std::shared_ptr<const Inode> Find(const Place& place);
    static std::shared_ptr<const Inode> Open(const Place& place);  // a Failure when nothing is
    // The file behind an open descriptor, of which the caller keeps his own.
    static std::shared_ptr<const Inode> Of(const File& file);

    const std::string& path() const { return file_.path(); }  // for people
    const struct stat& info() const { return info_; }         // when it was opened
    struct stat Status() const {
        return file_.Status();
    }

    // Whether it is a regular file or a directory, which alone have attributes and marks.
    bool HoldsContents() const;

    // For calls that take a path and follow links: it leads to this file and to no other.
    std::string ProcPath() const;

    // Extended attributes. A file system without any has none.
    std::vector<std::string> AttributeNames() const;
    std::optional<Bytes> Attribute(const std::string& name) const;
    void SetAttribute(const std::string& name, ByteView value) const;
    bool RemoveAttribute(const std::string& name) const;  // false: there was none

    void SetMode(mode_t mode) const;
    // False with errno.
    bool TrySetOwner(uid_t owner, gid_t group) const;
    void SetTimes(const timespec (&times)[2]) const;  // of access and modification

 private:
    Inode(File file, const struct stat& info) : file_(std::move(file)), info_(info) {}

    File file_;
    struct stat info_;
};

// A file of a name that nothing else in its directory has, and that it has until it is given
// another; it goes away at the end of its scope. Only its owner may read it before.
class TemporaryFile {
 public:
    explicit TemporaryFile(const Place& target);
    ~TemporaryFile();
    TemporaryFile(const TemporaryFile&) = delete;
    TemporaryFile& operator=(const TemporaryFile&) = delete;

    const File& file() const { return file_; }

    // The target is replaced in one step. A Failure when somebody has put another file under the
    // temporary name.
    void GiveToTarget();
    // A Failure when the target is there by now.
    void GiveToNewTarget();

 private:
    void RequireTarget() const;

    Place target_;
    std::string name_;
    File file_;
    bool made_ = true;
};

// ".mavoea-" and random letters.
std::string TemporaryName();

// Failure for recursive work of the superuser where no path leads through a descriptor: what other
// users put in the way could not be told from what was named.
void RequireDescriptorPaths();

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_PLACE_DIRECTORY_H_
