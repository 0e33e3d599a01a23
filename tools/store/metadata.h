// What is known of an object beside its data: one value, wherever it was read.
#ifndef MAVOEA_TOOLS_STORE_METADATA_H_
#define MAVOEA_TOOLS_STORE_METADATA_H_

#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "format/apple_double.h"
#include "tools/say/json.h"
#include "tools/say/messages.h"
#include "tools/store/content.h"

namespace mavoea::tool {

inline constexpr std::string_view kFinderInfoName = "com.apple.FinderInfo";
inline constexpr std::string_view kResourceForkName = "com.apple.ResourceFork";

// The Mac locked state: "1" or "0". It is in the list of what is locked only, and nowhere in a file
// under this name.
inline constexpr std::string_view kLockedName = "mavoea.locked";

enum class Kind { kAttribute, kFinderInfo, kResourceFork, kLocked };

// What in the AFP word says that a file is locked.
inline constexpr std::uint16_t kAfpLocking = kAfpNoWrite | kAfpNoRename | kAfpNoDelete;

constexpr Kind KindOf(std::string_view name) {
    if (name == kFinderInfoName) return Kind::kFinderInfo;
    if (name == kResourceForkName) return Kind::kResourceFork;
    if (name == kLockedName) return Kind::kLocked;
    return Kind::kAttribute;
}

// Something that did not, or will not, arrive, and why.
struct Missing {
    std::string item;  // "comment", "\"com.example.colour\"", ...
    std::string reason;
};

struct Metadata {
    struct Item {
        Content value;
        std::string holder;         // path of the file that has it
        std::string spelling = {};  // the attribute of that file, where it is not its name there
    };
    struct Attribute {
        std::string name;
        Content value;
        std::uint16_t flags = 0;
        std::string holder;
        std::string spelling = {};
    };
    // A file that another service keeps for the object in the EA directory, or what an earlier
    // version left there.
    struct ServiceFile {
        std::string name;  // "@KIND", "/NAME" in the folder of the object's name; "._" for that
        Content value;
        std::string holder;
    };

    std::vector<Attribute> attributes;  // in the order in which they are kept
    std::optional<Item> finder_info;    // 32 bytes, not all zero
    std::optional<Item> fork;           // not empty; it may be the words that stand for none
    std::map<EntryId, Item> entries;    // comment, dates, AFP word and all else that says something
    std::vector<ServiceFile> services;
    bool locked = false;
    bool hidden = false;
    bool archived = false;
    bool system = false;
    // In 100 ns from 1601-01-01 UTC, as Samba's clients have set it.
    std::optional<std::uint64_t> created = {};

    // Found beside the object, and no part of what is above: a second value of something, links
    // and pipes.
    struct Stray {
        std::string item;
        std::string reason;
        std::string holder;
        bool attribute = false;  // of a name that has another value elsewhere
        bool second = false;     // another value of something that is known
    };
    std::vector<Stray> strays;
    // What could not be looked at, or is damaged; the subject is the path of the file.
    std::vector<Failure> problems;
    // Files of earlier layouts that something above was read from.
    std::vector<std::string> earlier;

    // The files that all of it, or its attributes and its head, were read from; none when they hold
    // less than what is above, or more than one place has a part of it.
    WholeFile whole_apple_double;
    WholeFile whole_stream;
    WholeFile whole_resource;
    std::optional<Bytes> whole_record;

    // Whether anything is to be kept beside the object, or instead of it in its attributes.
    bool HasAny() const {
        return !attributes.empty() || finder_info || fork || !entries.empty() ||
               !services.empty() || !strays.empty() || !problems.empty() || whole_apple_double ||
               whole_stream || whole_resource || whole_record;
    }
    const Attribute* Find(std::string_view name) const;

    // For when something above is no longer what was read from them. Entries are in no stream.
    void ForgetFiles();
    void ForgetFilesOfEntries();

    // The attributes in the AFP file info; none when there is no such entry, or a damaged one.
    std::optional<std::uint16_t> AfpAttributes() const;
};

// How an item is called in messages: "Finder info", "\"colour\"".
std::string NameOfAttribute(const std::string& name);
std::string NameOfEntry(EntryId id);

// What of `wanted` is not in `found`, or is another value there. Throws Failure.
std::vector<Missing> WhatIsMissing(const Metadata& wanted, const Metadata& found);

// All that there is to name, each with that reason. Services' files are not among it.
std::vector<Missing> ItemsOf(const Metadata& metadata, const std::string& reason);

// Takes off what is called so.
void RemoveItems(const std::vector<Missing>& missing, Metadata* metadata);

Json MissingJson(const std::vector<Missing>& missing);

// "Finder info (it is not there), \"colour\" (it is not there)"; of very many the first only.
std::string Joined(const std::vector<Missing>& missing);

// Whether the bytes of an entry say anything: unknown dates and zeros do not, and neither does the
// lock, which is a state of its own.
bool SaysSomething(EntryId id, const Bytes& bytes);

// What two entries of file dates know together; none where they know different ones, or have
// another size.
std::optional<Bytes> JoinedDates(Bytes dates, const Bytes& others);
// Whether an entry says all that is wanted of it, without the lock. Dates may be known there that
// nobody has asked for.
bool SaysAll(EntryId id, const Bytes& there, const Bytes& wanted);

// An entry's bytes without the lock.
Bytes WithoutLock(EntryId id, Bytes bytes);

// Whether the fork is the words that stand for none. Throws Failure.
bool IsBlankFork(const Content& fork);

bool IsAllZero(ByteView bytes);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_STORE_METADATA_H_
