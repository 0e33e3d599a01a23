// Putting what is known of an object into each kind of place. A writer can say beforehand what its
// place cannot hold; what it wrote it has read back, byte for byte, before it has a name.
#ifndef MAVOEA_TOOLS_STORE_WRITER_H_
#define MAVOEA_TOOLS_STORE_WRITER_H_

#include <set>
#include <string>
#include <vector>

#include "tools/store/encoding.h"
#include "tools/store/metadata.h"
#include "tools/store/sidecars.h"

namespace mavoea::tool {

struct Written {
    // What could not be written, though the place could have held it.
    std::vector<Missing> missing;
    // Files of the source of which every byte is there.
    std::set<std::string> whole;
    // What lies beside the object now. Files that were written are known by what was read back.
    Sidecars beside;
};

// Whether what has been written is on disk when a writer returns, or is left to who syncs the
// volume once for many objects.
enum class Durability { kNow, kLater };

// What becomes of files beside the object that are not written anew.
enum class Old { kRemoved, kKept };

// Which of a stream and a resource file gets its name first. Attributes that are in the resource
// file must not go from there before they are in the stream; once that is there, nobody looks into
// what earlier versions kept.
enum class First { kStream, kResource };

struct WriteOptions {
    Durability durability = Durability::kNow;
    Old old = Old::kRemoved;
    First first = First::kStream;
    std::optional<mode_t> mode = {};  // that the object will have, if it is not yet the one it has

    // The object has just been made by this process: it has no marks yet.
    bool is_new = false;
};

class Writer {
 public:
    virtual ~Writer() = default;

    // What the place of `to` can hold of it; all else is added to *missing. Changes nothing.
    virtual Metadata Fit(Metadata metadata, const Object& to,
                         std::vector<Missing>* missing) const = 0;

    // Puts what fits beside `to`, an object that is there and open as `inode`, and in its record,
    // over what is there. Its marks are set. Throws Failure; what was there is then there still, or
    // gone, but never half of anything.
    Written Write(const Object& to, const Inode& inode, const Metadata& fitting,
                  const WriteOptions& options) const;

    // What of it an object that would be there has no room for itself.
    std::vector<Missing> WithoutRoom(const Inode& foreseen, const Metadata& fitting) const;

 protected:
    // A file to be written.
    struct Part {
        std::optional<Sidecars::Found> Sidecars::*place;
        std::string kind;  // "@KIND" in the EA directory; empty for the "._" file
        Pieces pieces;
        WholeFile whole;  // of the source: every byte of it is in the pieces
    };
    // The stream first, if there is one.
    virtual std::vector<Part> PartsOf(const Metadata& fitting) const = 0;

    // What is kept with the object itself: after its files, or before, where they may hold what is
    // to be kept there from now on.
    virtual void WriteToObject(const Inode&, const Metadata&, Written*) const {}
    virtual bool WritesObjectFirst() const { return false; }

 private:
    // What a dry run can say of it.
    Written Foresee(const Object& to, const Inode& inode, const Metadata& fitting,
                    const Sidecars& old, const std::vector<Part>& parts) const;
};

// For volumes of a type; Failure for those that keep nothing.
const Writer& WriterFor(const Object& object);

// Failure when another process is changing any of the object's metadata files.
void RequireUnlocked(const Sidecars& sidecars);

// Failure when an object of such a name can have no metadata.
void RequirePlace(const Object& to);

// Removes those of `files` that are still what was found; files first, then directories that are
// empty. Throws Failure when some of it is left.
void RemoveFiles(const std::vector<Sidecars::Found>& files);

// Removes the object's folder and the EA directory where nothing is left in them.
void RemoveEmptyDirectories(const Object& object, const Sidecars& sidecars);

// Removes everything that lies beside an object, and nothing of another one's. Throws Failure when
// some of it is left.
void RemoveSidecars(const Object& object, const Sidecars& sidecars);

// Copies what belongs to no object into the EA directory of `directory`, to the same place there.
// False when something of its name, or an object that it would belong to, is there.
bool CopyLeftOver(const LeftOver& file, const DirectoryRef& directory);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_STORE_WRITER_H_
