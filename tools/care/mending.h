// mavoea check --repair: what was found is mended where that loses nothing.
#ifndef MAVOEA_TOOLS_CARE_MENDING_H_
#define MAVOEA_TOOLS_CARE_MENDING_H_

#include <string>
#include <vector>

#include "tools/care/finding.h"
#include "tools/place/volume.h"

namespace mavoea::tool {

// What became of a finding.
struct Mended {
    bool done = false;
    std::string kept = {};      // the path of what was replaced, where that is kept
    std::string why = {};       // it is left
    std::string readable = {};  // of what is damaged
};

class MendingSink : public FindingSink {
 public:
    virtual void AddMended(const Finding& finding, const Mended& mended) = 0;
    // What was kept has gone, or, `why`, has not.
    virtual void AddRemoved(const std::string& path, const std::string& file,
                            const std::string& why) = 0;
};

// How findings of each kind are mended, or why they are not; a line each, for help.
std::string MendingText();
const char* HowMended(FindingKind kind);

enum class Replaced { kKept, kRemoved };

// Mends one finding after the other, and looks again: only what is not found any more is mended.
// What was replaced is kept until a run with Replaced::kRemoved has seen that the object has all
// that it holds. No Failure is thrown: each is said.
void MendObject(const Object& object, Replaced replaced, MendingSink* sink);
void MendDirectory(const DirectoryRef& directory, MendingSink* sink);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_CARE_MENDING_H_
