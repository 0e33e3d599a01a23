// Changing entries of an object, its comment and its dates, which no changer knows: what holds them
// is written anew, with all else that is in it.
#ifndef MAVOEA_TOOLS_STORE_ENTRIES_H_
#define MAVOEA_TOOLS_STORE_ENTRIES_H_

#include <cstdint>
#include <set>
#include <string>
#include <vector>

#include "tools/place/volume.h"
#include "tools/store/metadata.h"
#include "tools/store/rewriting.h"

namespace mavoea::tool {

// All members throw Failure, and nothing has been written then.
class EntryChange {
 public:
    // Failure where something of what the object has cannot be read, or would not be written again.
    explicit EntryChange(const Object& object);

    // Empty where there is none.
    Bytes Old(EntryId id) const;
    // No bytes take it away.
    void Set(EntryId id, Bytes value);
    // As of Metadata::created; only volumes of which marks say it have a place for that.
    void SetCreated(std::uint64_t created);

    // An attribute that the object will have by the time that it is written.
    void Expect(const std::string& name, const Bytes& value);

    // What of the change has no place. Failure where writing would lose anything else.
    std::vector<Missing> Fit() const;
    // Writes what fits and reads it back. Returns what has no place, or did not arrive. With
    // nothing set nothing is written.
    std::vector<Missing> Write() const;

 private:
    Fitting FitChange() const;

    const Object object_;
    Metadata wanted_;
    std::set<EntryId> changed_;
    bool changes_created_ = false;
};

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_STORE_ENTRIES_H_
