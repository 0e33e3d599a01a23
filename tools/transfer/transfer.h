// Objects on their way to another place: data, mode, owner, times, ACL, extended attributes and
// metadata, from and to volumes of any kind.
#ifndef MAVOEA_TOOLS_TRANSFER_TRANSFER_H_
#define MAVOEA_TOOLS_TRANSFER_TRANSFER_H_

#include <sys/stat.h>

#include <cstdint>
#include <functional>
#include <map>
#include <optional>
#include <string>
#include <utility>

#include "tools/place/volume.h"
#include "tools/store/sidecars.h"
#include "tools/transfer/file_data.h"

namespace mavoea::tool {

struct TransferOptions {
    // Told of data as it is copied, in bytes since the last call.
    std::function<void(std::uint64_t)> on_bytes = [](std::uint64_t) {};

    // Asked while data is copied. Once it is true, the object in hand is given up with a Failure,
    // and nothing of it stays.
    std::function<bool()> give_up = [] { return false; };

    // Told what people should know of an object with which nothing else is wrong.
    std::function<void(const std::string&)> on_note = [](const std::string&) {};

    // Whether WasCopied() will be asked, which takes memory for every file.
    bool remembers = false;
};

struct Leg;

// Carries one object after the other. What it has written it has read back and compared, byte by
// byte, when a member returns. Objects that are names of one file become names of one file.
// Symbolic links are not followed. All members throw Failure, whose text names the object; it is a
// Loss when all went well, but something of the metadata could not arrive: the text names each item
// and why.
class Transfer {
 public:
    explicit Transfer(TransferOptions options = {});

    // Copies an object that is no directory: a regular file, a symbolic link, or a special file,
    // which is made anew. What stands at `to`, no directory, is replaced, and so is its metadata.
    // Until the data is whole `to` is as it was; when only the metadata could not be copied, the
    // data is at `to` nevertheless.
    void CopyObject(const Place& from, const Place& to);

    // As CopyObject(), but the data is what reading `from` gives, be it a FIFO or a device.
    void CopyContents(const Place& from, const Place& to);

    // A directory is copied in two steps, with what is in it between them: made, if none is there,
    // so that its owner may write to it; then given its attributes, metadata and times, and what
    // services keep in its EA directory that belongs to no object.
    DirectoryRef MakeDirectory(const Place& from, const Place& to);
    void FinishDirectory(const Place& from, const Directory& inside, const Place& to,
                         const DirectoryRef& made);

    // Renames an object, metadata and all, over what is there. False when that takes a copy,
    // because the two are on different file systems or kinds of volumes; nothing has changed then.
    // After a Failure the object is where it was, unless something stood in its new place.
    bool Rename(const Place& from, const Place& to);

    // All that has been copied is on disk.
    void MakeDurable();

    // Whether a file is one that has been copied, and still what it was then.
    bool WasCopied(const struct stat& info) const;

 private:
    using FileId = std::pair<dev_t, ino_t>;

    Leg LegFor(const Place& from, const Place& to) const;
    void CopyFile(Leg* leg, bool stream);
    void CopyNode(Leg* leg);
    bool CopyName(Leg* leg);
    void NotePermissions(const Leg& leg, const std::optional<std::string>& problem) const;
    void Finish(Leg* leg);
    void NoteOrphan(const Leg& leg) const;
    void NoteCopied(const Leg& leg);
    void RequireNotMade(const Place& from, const Place& to) const;
    void RequireNoMetadata(const Place& from, const Place& to) const;
    void CopyLeftOvers(const Directory& inside, const DirectoryRef& made,
                       const Directory::Entry& entry);

    TransferOptions options_;
    DataWatch watch_;
    std::map<FileId, Place> first_names_;   // of files with several names, where they are copied to
    std::map<FileId, struct stat> copied_;  // files of sources
    std::map<FileId, std::string> made_;    // and of destinations
    bool made_apple_double_ = false;        // whether any of those has a name like "._x"
    std::map<dev_t, DirectoryRef> volumes_;
};

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_TRANSFER_TRANSFER_H_
