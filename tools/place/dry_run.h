// A dry run: all is looked at and decided as it would be, and what would be written is not. Who
// writes asks here, next to the call that does it.
#ifndef MAVOEA_TOOLS_PLACE_DRY_RUN_H_
#define MAVOEA_TOOLS_PLACE_DRY_RUN_H_

#include <sys/stat.h>

#include <map>
#include <memory>
#include <optional>
#include <string>

#include "tools/place/directory.h"

namespace mavoea::tool {

// From here on nothing is changed, for the rest of the process.
void BeginDryRun();
bool DryRun();

// What the calls of these names would fail with, as far as that can be known without them: an
// errno, 0 for none.
int WhyNoAttribute(const Inode& inode, const std::string& name, std::size_t size);
int WhyNoMode(const Inode& inode);
int WhyNoNewFile(const Directory& directory);
int WhyNoRemoval(const Place& place);
int WhyNoWriting(const Place& place);

// What a dry run would have put into directories and taken out of them. Who looks into one by the
// members of Directory finds it so.
class Foreseen {
 public:
    struct Entry {
        std::optional<struct stat> info = {};  // none: it would be gone
        // What would be in it: what is in this file, or in that one; none where nobody asks.
        std::shared_ptr<const File> contents = {};
        DirectoryRef contents_in = {};
        std::string contents_name = {};
        bool is_apple_double = false;  // which is all that anybody asks of it
        bool holds_entries = false;    // a directory that comes with what is in it

        // Null where that is not known.
        std::shared_ptr<const File> Open(int flags) const;
    };
    using Entries = std::map<std::string, Entry>;

    // Null for what is as it is on disk.
    static const Entry* Find(const Directory& directory, const std::string& name);
    static const Entries* In(const Directory& directory);

    // `from` is what it would be a copy of.
    static void Come(const Place& place, const struct stat& info, const Place* from = nullptr);
    // A "._" file.
    static void ComeAppleDouble(const Place& place);
    // A directory that is there, from another place.
    static void ComeDirectory(const Place& place, const struct stat& info, bool holds_entries);
    // A file in memory that would get that name.
    static void Come(const Place& place, const std::shared_ptr<const File>& file);
    static void Go(const Directory& directory, const std::string& name);
    // A directory with all that was in it.
    static void GoWithAll(const Directory& directory, const std::string& name);
    // Whether one is gone, under whatever name it was found.
    static bool HasGone(const struct stat& directory);

    // Whether a directory would have been given what it is a copy of.
    static void NoteFinished(const struct stat& directory);
    static bool IsFinished(const struct stat& directory);

    // From here on all is as it is on disk.
    static void ForgetAll();

    // Of something new there, with a number that nothing has.
    static struct stat StatusOfNew(const Directory& directory, mode_t mode);
};

// What would have been made of the attributes of the object in hand, by a dry run or of one that is
// foreseen, so that later steps find what they would. Of another object nothing is known any more.
class Rehearsed {
 public:
    // Null for what is as it is on disk.
    static const std::optional<Bytes>* Find(const Inode& inode, const std::string& name);
    // From here on what is there is seen.
    static void Forget();
    // Whether the file system has room for it beside the object's others, as far as that is known.
    static bool HasRoom(const Inode& inode, const std::string& name, std::size_t size);
    // Without a value it goes.
    static void Note(const Inode& inode, const std::string& name, std::optional<Bytes> value);
};

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_PLACE_DRY_RUN_H_
