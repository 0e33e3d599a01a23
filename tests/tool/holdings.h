// What the files on disk hold for an object, put there and found there byte by byte, without the
// tool and the library.
#ifndef MAVOEA_TESTS_TOOL_HOLDINGS_H_
#define MAVOEA_TESTS_TOOL_HOLDINGS_H_

#include <cstdint>
#include <map>
#include <string>
#include <utility>
#include <vector>

#include "tests/support/stream_builder.h"
#include "tests/support/temp_dir.h"

namespace mavoea::test {

inline constexpr char kFinderInfoName[] = "com.apple.FinderInfo";
inline constexpr char kForkName[] = "com.apple.ResourceFork";
inline constexpr char kLockedName[] = "mavoea.locked";

inline constexpr char kRecordAttribute[] = "user.netatalk.Metadata";
inline constexpr char kMarksAttribute[] = "user.mavo.attributes";

// Bits of the marks.
inline constexpr std::uint32_t kArchiveMark = 0x01;
inline constexpr std::uint32_t kHiddenMarkBit = 0x04;
inline constexpr std::uint32_t kLockedMark = 0x20;

// Ids of AppleDouble entries.
enum EntryIds : std::uint32_t {
    kForkEntry = 2,
    kRealNameEntry = 3,
    kCommentEntry = 4,
    kDatesEntry = 8,
    kFinderInfoEntry = 9,
    kShortNameEntry = 13,
    kAfpInfoEntry = 14,
};
using Entries = std::vector<std::pair<std::uint32_t, Bytes>>;

// Where the metadata of an object lies, whatever the kind of its volume.
struct MetadataPaths {
    explicit MetadataPaths(const std::string& object);

    std::string apple_double;
    std::string ea_directory;
    std::string stream;  // of the shortened name, as the next
    std::string resource;
    std::string folder;  // the legacy one

    std::string OfKind(const std::string& kind) const;  // "@eaDir/NAME@KIND"
};

// How the name of an object begins the names of its files in an EA directory: as it is up to 242
// bytes, and else cut to these, with a check character at the end or before a short extension.
std::string ShortenedName(const std::string& name);

bool UsesAppleDouble(int type);  // types 0 and 5
bool UsesEaDirectory(int type);  // 1, 2, 3, 6, 10 and 12

// An AppleDouble file with these entries, one behind the other.
Bytes AppleDoubleOf(const Entries& entries);

// The same as a resource file. Of other entries than Finder info and fork it makes a record at its
// head, which takes 741 bytes and has the fork, the last of them, behind it.
Bytes ResourceFileOf(const Entries& entries);

// The record of 402 bytes. What is empty is zeros, and the comment has no length then.
struct RecordContents {
    Bytes finder_info = Repeat(0, 32);
    Bytes comment = {};
    Bytes dates = Repeat(0, 16);
    Bytes afp_info = Repeat(0, 4);
};
Bytes RecordOf(const RecordContents& contents);

// Sets an attribute of the file itself; aborts when that cannot be done.
void SetFileAttribute(const std::string& path, const std::string& name, const Bytes& value);
void SetMarks(const std::string& path, std::uint32_t marks);
Bytes FileAttribute(const std::string& path, const std::string& name);  // empty: none
std::uint32_t MarksOf(const std::string& path);

// Writes files of metadata; the EA directory and the legacy folder are made where they are missing.
void PutAppleDouble(const std::string& object, const Bytes& bytes);
void PutStream(const std::string& object, const Bytes& bytes);
void PutResource(const std::string& object, const Bytes& bytes);
void PutKind(const std::string& object, const std::string& kind, const Bytes& bytes);
void PutLegacy(const std::string& object, const std::string& name, const Bytes& bytes);

// What a file holds, nothing where there is none.
Bytes BytesIn(const std::string& path);

// All that is found, wherever it lies: several values where several places have one.
struct Holdings {
    std::map<std::string, Attribute> attributes;
    std::vector<Bytes> finder_infos;              // none of zeros
    std::vector<Bytes> forks;                     // none that is empty
    std::multimap<std::uint32_t, Bytes> entries;  // others than these two, and not empty
    std::map<std::string, Bytes> others;          // other services': "@KIND", "/NAME" in the folder
    std::uint32_t marks = 0;
    bool writable = false;  // some write bit is set

    bool HasAttribute(const Attribute& attribute) const;
    bool HasFinderInfo(const Bytes& value) const;
    bool HasFork(const Bytes& value) const;
    bool HasEntry(std::uint32_t id, const Bytes& value) const;
};

// What an object on a volume of that type has. Earlier layouts count where nothing newer is.
Holdings HoldingsOf(int type, const std::string& object);

}  // namespace mavoea::test

#endif  // MAVOEA_TESTS_TOOL_HOLDINGS_H_
