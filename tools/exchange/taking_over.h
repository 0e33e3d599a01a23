// Metadata from elsewhere onto an object that is there.
#ifndef MAVOEA_TOOLS_EXCHANGE_TAKING_OVER_H_
#define MAVOEA_TOOLS_EXCHANGE_TAKING_OVER_H_

#include <memory>
#include <string>
#include <vector>

#include "tools/place/volume.h"
#include "tools/say/messages.h"
#include "tools/store/change.h"
#include "tools/store/metadata.h"

namespace mavoea::tool {

// Before metadata is taken over that somebody has put together: Finder info and fork have entries
// of their own, and count as attributes where those are empty. What says nothing goes; an attribute
// whose name means something else becomes a stray.
void SortOut(Metadata* metadata);

// Values replace those of the same name, and what is not among them stays on the object. A part
// that cannot be stored does not keep the others from it. What has been written has been read back.
class TakingOver {
 public:
    // Throws Failure. `object` outlives it.
    explicit TakingOver(const Object& object) : object_(object), changer_(OpenChanger(object)) {}

    // Once, with what has been sorted out. Throws Failure where nothing can be taken over.
    void Run(const Metadata& metadata);

    const std::vector<std::string>& notes() const { return notes_; }
    // What the object's volume has no place for, or is not there after all.
    const std::vector<Missing>& missing() const { return missing_; }
    // All that was not taken over, in words for people, and as items.
    const std::vector<std::string>& failures() const { return failures_; }
    const std::vector<Missing>& lost() const { return lost_; }
    ExitStatus status() const { return status_; }

 private:
    // Of an attribute, Finder info or the fork.
    struct Value {
        std::string name;
        const Content* content;
    };

    void Miss(const std::string& item, const std::string& reason);
    void Lock();
    void SetValues(const Metadata& metadata);
    bool Set(const Value& value);
    void AddRest(const Metadata& taken);
    void AddSet(const Metadata& taken, Metadata* there) const;
    bool Merge(const Metadata& taken, Metadata* wanted) const;
    void RequireOwnService(const std::string& name) const;

    const Object& object_;
    std::unique_ptr<Changer> changer_;
    std::vector<std::string> notes_;
    std::vector<Missing> missing_;
    std::vector<std::string> failures_;
    std::vector<Missing> lost_;
    ExitStatus status_ = kSuccess;
};

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_EXCHANGE_TAKING_OVER_H_
