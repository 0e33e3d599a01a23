// How other programs keep metadata: Samba, netatalk, and those that copy attributes as they are.
#ifndef MAVOEA_TOOLS_PLACE_DIALECT_H_
#define MAVOEA_TOOLS_PLACE_DIALECT_H_

#include <string_view>

namespace mavoea::tool {

// One way of it. All of it lies in extended attributes of the object, but for forks beside it.
struct Dialect {
    enum class FinderInfo { kRecord, kStream, kAttribute };
    enum class Names { kStream, kPlain, kPlainWithNul };
    enum class Fork { kAppleDouble, kAttribute };
    enum class Marks { kDosAttributes, kRecord, kHost };

    std::string_view name;     // as a volume table has it
    std::string_view program;  // whose it is, for people
    std::string_view title;    // and how it keeps it
    FinderInfo finder_info;    // in netatalk's record, Samba's "AFP_AfpInfo", or its own attribute
    Names names;  // "user.DosStream.NAME:$DATA", "user.NAME", the same with a NUL behind
    Fork fork;    // in a "._" file, or an attribute
    Marks marks;  // who says what is locked, hidden, archived
};

// Null for types that are the platform's.
const Dialect* DialectOf(int type);

// The one in which all that has a name of such programs' has a meaning.
const Dialect& AnyDialect();

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_PLACE_DIALECT_H_
