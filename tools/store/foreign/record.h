// netatalk's record of an object, in the attribute that netatalk and Samba keep it in.
#ifndef MAVOEA_TOOLS_STORE_FOREIGN_RECORD_H_
#define MAVOEA_TOOLS_STORE_FOREIGN_RECORD_H_

#include <cstdint>
#include <map>
#include <optional>
#include <string>

#include "format/apple_double.h"
#include "tools/place/dialect.h"
#include "tools/place/directory.h"
#include "tools/store/layout.h"

namespace mavoea::tool {

// Why smbd does not take the block for a record, in words; none when it does. Of what it cannot
// parse it removes, as the superuser, what is no longer than a record, and ignores the rest.
std::optional<std::string> WhySmbdRefuses(const Layout& record);

// What is changed is stored by Store() only. All members throw Failure.
class ForeignRecord {
 public:
    // Of an object without a record, one that says nothing.
    static ForeignRecord Read(const Inode& object);
    ForeignRecord() = default;

    // Empty where it has none.
    const Bytes& Entry(EntryId id) const;
    // It fits.
    void Set(EntryId id, Bytes bytes);

    // netatalk's own entries aside.
    bool SaysAnything() const;

    // Never one that smbd would remove. A record that says nothing is stored only where there is
    // one already. `created`: when the object was made, in 100 ns from 1601-01-01, where its DOS
    // attributes do not say so yet.
    void Store(const Inode& object, const Dialect& dialect,
               std::optional<std::uint64_t> created = {}) const;

 private:
    Bytes Encode(const Bytes& dates) const;

    std::map<EntryId, Bytes> entries_;
    bool there_ = false;
};

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_STORE_FOREIGN_RECORD_H_
