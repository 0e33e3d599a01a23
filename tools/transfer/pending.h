// What a rename is about to put into a directory lies in a directory of its own there before, so
// that whoever comes after a run that was killed can tell to which object it belongs.
//
// An object and the files of its metadata can only be renamed one by one. So each directory that is
// to have some of them has a pending directory meanwhile, ".mavoea-<inode>-<mark>": that of an
// object with this inode number whose name and time of birth make the mark. In it lies, under the
// names that the directory around it is to have:
//
//     NAME            a second name (hard link) of a file of the object's metadata, which keeps its
//                     old name until all is done
//     moved/NAME      what has no other name: folders, files where there are no hard links, and an
//                     object that takes another spelling of its name
//     replaced/NAME   metadata that the object has until another takes its place
//     dropped/NAME    metadata of nobody, that was in the way
//
// and the steps of a rename are these, in this order:
//
//     1. NAME and moved/NAME are made, of the object under its new name;
//     2. what lies under these names becomes replaced/NAME of the object that is being replaced, or
//        dropped/NAME where there is none;
//     3. the object is renamed;
//     4. NAME and moved/NAME go to their places;
//     5. replaced/NAME, dropped/NAME and the old names go, and the pending directory.
//
// Before each of the calls that this takes the same question has the right answer: is the object of
// the pending directory there, by name, inode and birth? Then all in it is its metadata and goes to
// its place. If it is not, the second names go, for the old ones are there; what was replaced goes,
// for its object has gone; and what was moved stays, until the rename is tried again.
//
// The inode alone does not say which of an object's hard links is meant, and file systems give the
// number of a removed file to the next one: hence name and birth. While a run works it holds the
// lock of the pending directory, and nobody else touches it.
#ifndef MAVOEA_TOOLS_TRANSFER_PENDING_H_
#define MAVOEA_TOOLS_TRANSFER_PENDING_H_

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "tools/place/volume.h"

namespace mavoea::tool {

// Which object a pending directory is for. No object has inode 0: what lies in that goes back to
// where it was, see Nobody().
struct PendingOwner {
    ino_t inode;
    std::uint64_t mark;  // of the name in the upper half, of the birth in the lower one

    // An object that has that name, or will have it. Of two names of one file that become one, what
    // the name stands for depends on how many there are: `links`, when it is for the object.
    static PendingOwner Of(const std::string& name, ino_t inode, std::uint64_t birth,
                           nlink_t links = 0);
    static std::optional<PendingOwner> Parse(std::string_view name);
    // Nobody, for what is about to be removed and may have to go back: another one at each call.
    static PendingOwner Nobody();
    std::string Name() const;

    bool operator==(const PendingOwner&) const = default;

    bool IsCalled(const std::string& name) const;
    // Whether the object is there.
    bool IsAt(const Place& place) const;
};

// A pending directory, locked.
class Pending {
 public:
    enum class Part { kSecondNames, kMoved, kReplaced, kDropped };
    struct Entry {
        DirectoryRef in;
        std::string name;
        Part part;
    };

    // Null where the disk is full. Throws Failure.
    static std::unique_ptr<Pending> Make(const DirectoryRef& holder, const PendingOwner& owner);
    // Null when there is none; with `busy` set to true when another process works with it.
    static std::unique_ptr<Pending> Find(const DirectoryRef& holder, const PendingOwner& owner,
                                         bool* busy);

    const PendingOwner& owner() const { return owner_; }
    const DirectoryRef& holder() const { return holder_; }
    std::string path() const { return holder_->PathOf(owner_.Name()); }

    // A second name for a file; false with errno where it cannot have one.
    bool TryToLink(const Place& file, const std::string& new_name) const;
    void Move(Part part, const Place& from, const std::string& new_name);

    std::vector<Entry> Entries() const;
    // The directory of a part, made where it is missing.
    const DirectoryRef& DirectoryOf(Part part);

    // Removes all that is in it, or all that has been moved to a part.
    void Clear() const;
    void Clear(Part part);
    // Removes the directories. False when something is left in them.
    bool Remove() const;

 private:
    Pending(DirectoryRef holder, DirectoryRef directory, const PendingOwner& owner)
        : holder_(std::move(holder)), directory_(std::move(directory)), owner_(owner) {}

    DirectoryRef holder_;
    DirectoryRef directory_;
    PendingOwner owner_;
    std::vector<std::pair<Part, DirectoryRef>> parts_;
};

// Brings renames into `directory` that were cut short to their end, and removes temporary files
// that have been left in it or its EA directory; what other processes work with is left to them.
// With a name, only renames of the object that has that name now, or gets it by this. False when
// there were none. Throws Failure, also when other metadata has come to the place of some that is
// pending.
bool SettlePending(const DirectoryRef& directory, const std::optional<std::string>& name = {});

// The same for one that is in `directory` or in its EA directory, `holder`, and has been looked at
// twice. False when something of it has to stay.
bool SettlePendingDirectory(const DirectoryRef& directory, const DirectoryRef& holder,
                            const PendingOwner& owner);

// The same for one object that is there; a Failure when another process works with it. False when
// there was nothing to do.
bool SettleObject(const Place& object, const struct stat& info);
void SettleNamed(const Object& object);

// Whether an entry of a directory, or of its EA directory, has been left by a rename that was cut
// short: no process works with it.
bool IsLeftPending(const DirectoryRef& holder, const Directory::Entry& entry);

// Undoes the rename of an object that was cut short before the object had its new name: what was
// moved gets its old name again. A Failure when another process works with it.
void UndoPending(const Place& from, const Place& to, const PendingOwner& owner);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_TRANSFER_PENDING_H_
