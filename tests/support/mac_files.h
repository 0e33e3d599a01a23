// AppleDouble files as Macs and netatalk write them, and as anybody's are read: byte by byte,
// without the library.
#ifndef MAVOEA_TESTS_SUPPORT_MAC_FILES_H_
#define MAVOEA_TESTS_SUPPORT_MAC_FILES_H_

#include <cstdint>
#include <map>
#include <optional>
#include <ostream>
#include <string>
#include <vector>

#include "tests/support/temp_dir.h"

namespace mavoea::test {

// What metadata a file carries. An attribute's value may be empty.
struct MacContents {
    std::map<std::string, Bytes> attributes = {};
    Bytes finder_info = Repeat(0, 32);
    Bytes fork = {};

    bool operator==(const MacContents&) const = default;
};

// An AppleDouble file and what is in it. The fork is what the file holds, be it the 286 bytes that
// only say that it is blank.
struct MacFile {
    std::string layout;
    Bytes bytes;
    MacContents contents;

    // The fork as a rewritten file has it: none where it only says that it is blank.
    Bytes ForkInUse() const;
};
void PrintTo(const MacFile& file, std::ostream* out);

// Where a Mac puts the fork when the attributes leave room before it.
inline constexpr std::size_t kMacForkAt = 0x0EE2;

// Netatalk's classic head, behind which its files have the fork.
inline constexpr std::size_t kNetatalkHead = 741;

// The 286 bytes of a resource fork without resources, as Macs write one where a file has none.
Bytes BlankFork();

// A Mac's "._" file: Finder info entry from 50 up to the fork, over an attribute area of 3810 bytes
// in all (more where the attributes need more).
MacFile MacSidecar(MacContents contents);

// The same with BlankFork().
MacFile MacSidecarWithBlankFork(MacContents contents);

// The classic file of two entries: Finder info at 50, fork at 82.
MacFile ClassicFile(const Bytes& finder_info, const Bytes& fork);

// Thirteen entries of the ids that the format itself names, fork first, Finder info last but one.
MacFile ThirteenEntryFile(const Bytes& finder_info, const Bytes& fork);

// Netatalk's thirteen entries, four of them of its private ids: a head of 741 bytes, then the fork.
MacFile NetatalkFile(const Bytes& finder_info, const Bytes& fork);

// One of each layout and some of their variants, each with contents of its own.
std::vector<MacFile> AllMacFiles();

// What an AppleDouble file holds, by the format's own rules: entries by their descriptors, wherever
// they are; attributes where the Finder info entry is longer than 32 bytes and an "ATTR" header
// says so. Nothing when it is none, or anything in it lies outside the file; without a Finder info
// or fork entry those are zeros and empty.
std::optional<MacContents> ReadMacFile(const Bytes& bytes);

// The entries of an AppleDouble file by their ids, without Finder info and fork, without empty ones
// and without netatalk's private ones. None lies outside the file.
std::map<std::uint32_t, Bytes> EntriesOf(const Bytes& bytes);

// A file that another program wrote, and what ReadMacFile() finds in it.
struct SampleFile {
    std::string name;  // of folder and file
    Bytes bytes;
    std::optional<MacContents> contents;
};

// The sample files beside the project, ordered by name; none where they are not at hand.
std::vector<SampleFile> SampleFiles();

inline constexpr char kNoSampleFiles[] =
    "there are no sample files at ../shared/data from the project's root";

}  // namespace mavoea::test

#endif  // MAVOEA_TESTS_SUPPORT_MAC_FILES_H_
