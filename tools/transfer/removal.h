// Objects that go, and their metadata with them.
#ifndef MAVOEA_TOOLS_TRANSFER_REMOVAL_H_
#define MAVOEA_TOOLS_TRANSFER_REMOVAL_H_

#include <functional>
#include <optional>
#include <string>
#include <vector>

#include "tools/place/volume.h"
#include "tools/say/messages.h"
#include "tools/store/sidecars.h"

namespace mavoea::tool {

// Of what was found, what may go. What may not stays, and is a Failure.
struct MayGo {
    std::function<bool(const struct stat&)> was_carried = {};  // null: everything may
    Sidecars::IsKnown was_metadata = {};

    explicit operator bool() const { return was_carried != nullptr; }
    bool operator()(const struct stat& info) const { return was_carried(info); }
};

// Removes an object that is no directory, then what lies beside it. With `alone` false another
// object of its directory that would have the same metadata goes as well. Throws Failure.
void RemoveObject(const Object& object, bool alone, const MayGo& may_go = {});

// Removes a directory in which no object is left, with its EA directory, and what lies beside it.
// Throws Failure.
void RemoveEmptyDirectory(const Object& object, bool alone, const MayGo& may_go = {});

// Whether what has been looked at earlier in a dry run has taken it away.
bool WouldBeGone(const Place& place);

// Removes trees: what is in a directory before the directory itself. A directory in which something
// had to stay is left without another word.
//
// No depth takes more than the names of what is left in each directory: those far above are closed,
// and opened again by "..", if they are still what they were.
class TreeRemoval {
 public:
    explicit TreeRemoval(MayGo may_go = {}) : may_go_(std::move(may_go)) {}
    virtual ~TreeRemoval() = default;

    // Removes an object with all that is below it, and goes on after what fails or is thrown below.
    void RemoveTree(const Place& named, const struct stat& info);

    // EA directories in which nothing is left go when all in their directory has been looked at:
    // that of what was named when this is called.
    void Tidy();

 protected:
    enum class Answer { kYes, kNo };

    // Nothing more is to be begun.
    virtual bool Stopped() const { return false; }

    // Nothing is wrong with what is not there any more.
    virtual bool MayBeGone() const { return !at_top(); }

    // `empty`: no object is in it, and what is agreed to is its removal.
    virtual Answer MayEnter(const Place& /*place*/, const struct stat& /*info*/, bool /*empty*/) {
        return Answer::kYes;
    }
    virtual Answer MayRemove(const Place& /*place*/, mode_t /*type*/) { return Answer::kYes; }

    virtual void Removed(const Place& /*place*/, mode_t /*type*/) {}
    virtual void Fail(const std::string& path, const Failure& failure) = 0;

    // Whether what is in hand is what was named.
    bool at_top() const { return levels_.empty(); }

 private:
    // A directory that is being emptied.
    struct Level {
        std::string name;
        struct stat info;
        DirectoryRef inside;  // null while it is closed
        std::vector<Directory::Entry> entries = {};
        std::size_t next = 0;
        int error = 0;                 // why it could not be listed
        bool agreed = false;           // its own removal
        bool left = false;             // something in it stays, and so does it
        bool untidy = false;           // nothing may be left in its EA directory
        std::optional<int> type = {};  // of the volume that files in it are on
    };

    template <class Work>
    void Guard(const Place& place, Work work);
    void Go();
    void Enter(const Place& place);
    void Leave();
    void RemoveFile(const Place& place);
    Object FileAt(const Place& place);
    Place PlaceOfLast() const;
    void Close();
    void NoteUntidy(bool untidy);
    void StayAbove();

    MayGo may_go_;
    Place named_;
    bool untidy_ = false;  // where it was
    std::vector<Level> levels_;
};

// Removes an object with all that is below it, which has been carried elsewhere: only what has, and
// is still what it was then. Calls `removed` for each that has gone, with its type, and `fail` for
// what stays; what is above it stays as well. Whether nothing did.
bool RemoveCarried(const Place& named, const struct stat& info, const MayGo& was_carried,
                   const std::function<void(const Place& place, mode_t type)>& removed,
                   const std::function<void(const std::string& path, const Failure&)>& fail);

// What people are told of an object that has gone, as by rm.
std::string RemovalLine(const Place& place, mode_t type);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_TRANSFER_REMOVAL_H_
