// Objects on their way to another place: data, mode, owner, times, ACL, extended attributes and
// metadata, from and to volumes of any kind.
#ifndef MAVOEA_TOOLS_TRANSFER_H_
#define MAVOEA_TOOLS_TRANSFER_H_

#include <sys/stat.h>

#include <cstdint>
#include <functional>
#include <map>
#include <string>
#include <utility>

#include "tools/file_data.h"
#include "tools/volume.h"

namespace mavoea::tool {

struct TransferOptions {
    // Told of data as it is copied, in bytes since the last call.
    std::function<void(std::uint64_t)> on_bytes = [](std::uint64_t) {};

    // Asked while data is copied. Once it is true, the object in hand is given up with a Failure,
    // and nothing of it stays.
    std::function<bool()> give_up = [] { return false; };

    // Told what people should know of an object with which nothing else is wrong.
    std::function<void(const std::string&)> on_note = [](const std::string&) {};
};

// Carries one object after the other. Objects that are names of one file become names of one file.
// Paths are absolute, without a trailing '/'; symbolic links at their ends are not followed. All
// members throw Failure, whose text names the object.
class Transfer {
 public:
    explicit Transfer(TransferOptions options = {});

    // Copies an object that is no directory: a regular file, a symbolic link, or a special file,
    // which is made anew. What stands at `to`, no directory, is replaced, and so is its metadata.
    // Until the data is whole `to` is as it was; when only the metadata could not be copied, the
    // data is at `to` nevertheless.
    void CopyObject(const std::string& from, const std::string& to);

    // As CopyObject(), but the data is what reading `from` gives, be it a FIFO or a device.
    void CopyContents(const std::string& from, const std::string& to);

    // A directory is copied in two steps, with what is in it between them: made, if none is there,
    // so that its owner may write to it; then given its attributes, metadata and times. True when
    // it was made.
    bool MakeDirectory(const std::string& from, const std::string& to);
    void FinishDirectory(const std::string& from, const std::string& to);

    // Renames an object, metadata and all, over what is there. False when that takes a copy,
    // because the two are on different file systems or kinds of volumes; nothing has changed then.
    // After a Failure the object is where it was, unless something stood in its new place.
    bool Rename(const std::string& from, const std::string& to);

 private:
    // One object under way.
    struct Leg {
        Object from;
        Object to;
        struct stat info;  // of the source
    };

    static Leg LegFor(const std::string& from, const std::string& to);
    void CopyFile(Leg* leg, bool stream);
    void CopyNode(const Leg& leg);
    bool CopyName(const Leg& leg);
    void CopyInode(const Leg& leg, const std::string& to);
    static void Finish(const Leg& leg);

    TransferOptions options_;
    DataWatch watch_;
    std::map<std::pair<dev_t, ino_t>, std::string> copies_;  // of files with several names
};

// Whether it is kept as metadata of another object in the same directory: "@eaDir" and "._" files.
bool IsMetadataName(const std::string& name, const struct stat& info);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_TRANSFER_H_
