// What an EA stream or AppleDouble file says of itself, and whether that fits together.
#ifndef MAVOEA_TOOLS_STORE_LAYOUT_H_
#define MAVOEA_TOOLS_STORE_LAYOUT_H_

#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <vector>

#include "format/ea_stream.h"
#include "format/netatalk_record.h"
#include "tools/place/file.h"
#include "tools/store/record.h"

namespace mavoea::tool {

// What could be read; nothing of it has been checked. What is missing at an end was not in the
// file.
struct Layout {
    struct Record {
        std::uint64_t at = 0;  // its place in the file
        AttributeRecord fixed;
        std::string stored_name;  // name_size bytes, its NUL included

        // Up to the NUL.
        std::string name() const { return stored_name.c_str(); }
    };

    std::uint64_t file_size = 0;
    std::optional<AppleDoubleHeader> header;
    std::vector<EntryDescriptor> entries;  // up to header->entry_count
    Bytes finder_info;                     // 32 bytes, or none

    // The first bytes of names, comment, dates, AFP file info and netatalk's private entries, by
    // the index of the entry. Of more entries than a header should have, those of the first.
    static constexpr std::size_t kContentsMax = 64;
    std::map<std::size_t, Bytes> contents;

    std::optional<AttributeHeader> attributes;  // none in a plain AppleDouble file
    std::vector<Record> records;                // up to attributes->count

    bool IsAppleDouble() const { return header && header->magic == kAppleDoubleMagic; }

    // The entry of that kind, the last should there be several; none when there is none.
    std::optional<std::size_t> FindEntry(EntryId id) const;

    // Whether the Finder info entry spans an attribute area.
    bool HasAttributeArea() const;

    // Where the table of the attributes that could be read ends.
    std::uint64_t TableEnd() const;

    // Where everything but the resource fork ends, whether the file is that long or not.
    std::uint64_t EndBeforeFork() const;
};

// Whatever the file holds, it is read without failing and in memory bounded by the largest table;
// only a failing disk throws.
Layout ReadLayout(const File& file);
Layout ReadLayout(ByteView bytes);

struct Violation {
    std::string text;
    // Where it is, as far as one place can be named: the index of an entry or an attribute.
    std::optional<std::size_t> entry = {};
    std::optional<std::size_t> attribute = {};
};

struct Findings {
    std::vector<Violation> violations;  // of the layout's invariants
    std::vector<std::string> notes;     // unusual, but allowed
};
Findings CheckLayout(const Layout& layout);

// What keeps the library from taking the block for a netatalk record.
Findings CheckRecord(const Layout& block, RecordPlace place);

// "Finder info", "resource fork", ...; "unknown" for what neither Apple nor netatalk gave a
// meaning.
const char* EntryName(EntryId id);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_STORE_LAYOUT_H_
