// Objects on their way to another place: data, mode, owner, times, ACL, extended attributes and
// metadata, from and to volumes of any kind.
#ifndef MAVOEA_TOOLS_TRANSFER_TRANSFER_H_
#define MAVOEA_TOOLS_TRANSFER_TRANSFER_H_

#include <sys/stat.h>

#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <utility>
#include <vector>

#include "tools/place/volume.h"
#include "tools/store/sidecars.h"
#include "tools/transfer/file_data.h"
#include "tools/transfer/manner.h"

namespace mavoea::tool {

// What becomes of the metadata of a directory that is there and gets that of another: it goes, as
// that of files does; or it stays, and gets what the other one has; or only what it has not itself.
enum class Merging { kReplaces, kAdds, kKeeps };

struct TransferOptions {
    DataWatch watch = {};

    // Told what people should know of an object with which nothing else is wrong.
    std::function<void(const std::string&)> on_note = [](const std::string&) {};

    Manner manner = {};
    Merging merging = Merging::kReplaces;

    // Whether WasCopied() will be asked, which takes a little memory for every file.
    bool remembers = false;
};

// Of which files further names become names of the first one's copy: of none, of those that have
// several, or of all, which can be reached by several links.
enum class Links { kNone, kSeveral, kAll };

struct Leg;

// Carries one object after the other. What it has written it has read back and compared, byte by
// byte, when a member returns. Symbolic links are not followed. All members throw Failure, whose
// text names the object; it is Incomplete when the data is at `to`, and something of the metadata
// is not: the text names each item and why.
class Transfer {
 public:
    explicit Transfer(TransferOptions options = {});

    // Copies an object that is no directory: a regular file, a symbolic link, or a special file,
    // which is made anew. What stands at `to`, no directory, is replaced, and so is its metadata.
    // Until the data is whole `to` is as it was. `type`: what has been seen at `from`, S_IFREG for
    // instance; what that is not is not opened to be read.
    void CopyObject(const Place& from, mode_t type, const Place& to, Links links);

    // As CopyObject(), but the data is all that can be read from `source`, a FIFO or a device. It
    // has no metadata.
    void CopyContents(const Place& from, const File& source, const Place& to);

    // Writes into the regular file at `to` what is in the one at `from`, or can be read from
    // `source`, and gives it that one's metadata.
    void Overwrite(const Place& from, const File* source, const Place& to, const File& target,
                   Links links);

    // What can be read from one into the other, and nothing else. Either of them is no regular
    // file.
    void CopyStream(const File& source, const File& target);

    // What is at `to` is as good as a copy: it becomes a name of what another name of the file was
    // copied to, or others become names of it.
    void TakeForCopy(const Place& from, const Place& to, Links links);

    // Gives an object that is there, no directory, the metadata of `from`, and nothing else.
    void CarryMetadata(const Place& from, const Place& to);

    // One more name for the file at `from`.
    void LinkObject(const Place& from, const Place& to);

    // A symbolic link.
    void MakeLink(const std::string& text, const Place& to);

    // A directory is copied in two steps, with what is in it between them: made, if none is there,
    // so that its owner may write to it; then given its attributes, metadata and times, and what
    // services keep in its EA directory that belongs to no object. `is_new`: it was not there.
    DirectoryRef MakeDirectory(const Place& from, const Place& to);
    void FinishDirectory(const Place& from, const Directory& inside, const Place& to,
                         const DirectoryRef& made, bool is_new);

    // Renames an object, metadata and all, over what is there. False when that takes a copy,
    // because the two are on different file systems or kinds of volumes; nothing has changed then.
    // After a Failure the object is where it was, unless something stood in its new place.
    bool Rename(const Place& from, const Place& to);

    // Failure when what is at `to` is metadata of another object there, or keeps that of several:
    // it is nothing to be replaced, backed up or left alone as an object.
    void RequireNoMetadataAt(const Place& to, const Place& from) const;
    // Failure when this has just made what is at `to`.
    void RequireNotMade(const Place& from, const Place& to) const;
    // Whether `to` is a symbolic link that this has made.
    bool HasMadeLink(const Place& to) const;

    // That other transfers copy into one directory at the same time, what of that could meet this
    // one's work not among it. What was made before no other one asks for.
    void ForgetMade();

    // All that has been copied is on disk.
    void MakeDurable();

    // Whether a file is one that has been copied, and still what it was then.
    bool WasCopied(const struct stat& info);
    // The same, and as the "._" file of the object of that name.
    bool WasMetadata(const std::string& object, const struct stat& info);

 private:
    using FileId = std::pair<dev_t, ino_t>;

    // Where the first name of a file was copied to, and what that file was.
    struct FirstName {
        Place to;
        struct stat source;
        Place from;
    };

    Leg LegFor(const Place& from, const Place& to) const;
    Leg LegOf(const Place& from, const std::shared_ptr<const Inode>& source, const Place& to) const;
    Leg LegWithoutMetadata(const Place& from, const File& source, const Place& to) const;
    void CopyFile(Leg* leg, const File* stream);
    void CopyBytes(const File& source, bool stream, const File& target);
    void ForeseeBytes(const File* source) const;
    void CopyNode(Leg* leg);
    void MakeNode(Leg* leg) const;
    bool CopyName(Leg* leg, Links links);
    void RememberName(const Leg& leg, Links links);
    void CopyInodeTo(const Leg& leg, int source, int target) const;
    void MergeInto(Leg* leg) const;
    void Finish(Leg* leg);
    void NoteOrphan(const Leg& leg) const;
    void NoteUnseen(const Leg& leg) const;
    void NoteCopied(const Leg& leg);
    void Remember(std::uint64_t hash);
    bool Remembers(std::uint64_t hash);
    void NoteMade(const Place& to, const struct stat& info);
    std::optional<std::string> NameOfMade(const Place& to) const;
    void RequireMayCome(const Leg& leg) const;
    void RequireNoMetadata(const Place& from, const Object& target) const;
    void CopyLeftOvers(const Directory& inside, const DirectoryRef& made,
                       const Directory::Entry& entry);

    TransferOptions options_;
    FileData data_;
    std::map<FileId, FirstName> first_names_;
    std::vector<std::uint64_t> copied_;  // of each file of sources a hash of what it was
    bool sorted_ = true;                 // that
    // In each directory that is not new, and not finished, what has been made in it.
    std::map<const Directory*, std::map<FileId, std::string>> made_;
    std::set<FileId> made_links_;
    bool made_apple_double_ = false;  // whether any of those has a name like "._x"
    std::map<dev_t, DirectoryRef> volumes_;
};

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_TRANSFER_TRANSFER_H_
