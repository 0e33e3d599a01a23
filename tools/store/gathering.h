// What is known of an object, put together from one place after the other.
#ifndef MAVOEA_TOOLS_STORE_GATHERING_H_
#define MAVOEA_TOOLS_STORE_GATHERING_H_

#include <string>

#include "tools/store/metadata.h"

namespace mavoea::tool {

// Where something was read: a file, and an attribute of it.
struct Origin {
    std::string holder;
    std::string spelling = {};
};

// "/srv/share/._a"; "/srv/share/a (user.DosStream.colour:$DATA)".
std::string WhereText(const std::string& holder, const std::string& spelling);

// What is known already stays, and another value of it is a stray.
class Gathering {
 public:
    explicit Gathering(Metadata* metadata) : metadata_(*metadata) {}

    // 32 bytes; all zero says nothing.
    void AddFinderInfo(Content value, const Origin& origin);
    // An empty one says nothing, and one that stands for none gives way to any other.
    void AddFork(Content value, const Origin& origin);
    // The lock is kept as it is; what else says nothing is left out. Dates that are known in one
    // place only count.
    void AddEntry(EntryId id, Content value, const Origin& origin);
    // Of two of one name in one file the last is meant.
    void AddAttribute(Metadata::Attribute attribute);

    void AddStray(const std::string& item, const std::string& reason, const Origin& origin);

 private:
    void Take(std::optional<Metadata::Item>* item, const std::string& name, Content value,
              const Origin& origin);

    Metadata& metadata_;
};

// Runs `work`, which throws what is wrong in one place.
template <class Work>
void Noting(Metadata* metadata, Work work) {
    try {
        work();
    } catch (const Failure& failure) {
        metadata->problems.push_back(failure);
    }
}

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_STORE_GATHERING_H_
