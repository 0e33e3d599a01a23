// The extended attributes in which other programs keep what is known of an object.
#ifndef MAVOEA_TOOLS_STORE_FOREIGN_SPELLING_H_
#define MAVOEA_TOOLS_STORE_FOREIGN_SPELLING_H_

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "tools/place/dialect.h"
#include "tools/place/directory.h"
#include "tools/place/volume.h"

namespace mavoea::tool {

// netatalk's record, as netatalk and Samba call it.
inline constexpr char kRecordAttribute[] = "user.org.netatalk.Metadata";
// The stream that is a fork to Samba's clients.
inline constexpr std::string_view kAfpResourceStream = "AFP_Resource";

struct Spelling {
    enum class Datum { kRecord, kAfpInfo, kFinderInfo, kFork, kAttribute };

    std::string attribute;  // of the object: "user.DosStream.colour:$DATA"
    Datum datum;
    std::string name = {};  // of an attribute: "colour"
    bool has_nul = false;   // behind the value
    bool own = false;       // the dialect's; otherwise another program has left it
    bool certain = true;    // the name alone says that it is such a program's

    // The bytes that are meant; those of larger ones go on in further attributes. None when it has
    // gone. Throws Failure.
    std::optional<Bytes> Value(const AttributeSource& source) const;
};

// What an attribute of an object means in a dialect; none when it is nothing of the kind, or the
// continuation of another.
std::optional<Spelling> SpellingOf(const std::string& attribute, const Dialect& dialect);

// All that an object of such attributes has, the dialect's own first.
std::vector<Spelling> SpellingsAmong(const std::vector<std::string>& attributes,
                                     const Dialect& dialect);
std::vector<Spelling> SpellingsOf(const AttributeSource& source, const Dialect& dialect);

// How the dialect spells an attribute of that name; none where it would mean something else, or is
// too long.
std::optional<Spelling> SpellAttribute(const std::string& name, const Dialect& dialect);
// The same for the Finder info, outside of a record, and for the fork.
Spelling SpellFinderInfo(const Dialect& dialect);
Spelling SpellFork(const Dialect& dialect);

// Where a stream's value goes on that begins in `attribute`; `extent` from 1.
std::string NameOfExtent(std::string_view attribute, unsigned extent);

// Whether another program keeps metadata in an attribute of that name, values that go on included:
// in that dialect, or in any.
bool IsForeign(const std::string& attribute, const Dialect& dialect);
bool IsForeignInAny(const std::string& attribute);

// Stores it. A Failure that names the limit where the file system has no room for it.
void Store(const Inode& inode, const Spelling& spelling, Bytes value);
// What is to be told of an attribute that has been stored and that clients do not see all the same.
std::optional<std::string> NoteOfUnseen(const Object& object, const std::string& name,
                                        std::uint64_t size);
// False: there was none.
bool Drop(const Inode& inode, const Spelling& spelling);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_STORE_FOREIGN_SPELLING_H_
