// What a check of what is known of objects may find: a code for each kind, which stays the same for
// ever, and what it means.
#ifndef MAVOEA_TOOLS_CARE_FINDING_H_
#define MAVOEA_TOOLS_CARE_FINDING_H_

#include <cstdint>
#include <optional>
#include <string>

#include "tools/say/json.h"
#include "tools/say/messages.h"
#include "tools/store/layout.h"

namespace mavoea::tool {

enum class FindingKind {
    kDamagedStream,
    kDamagedAppleDouble,
    kDamagedResourceFile,
    kDamagedRecord,
    kDamagedAttribute,
    kNoFile,
    kOtherRights,
    kDanglingMetadata,
    kDanglingServiceFile,
    kEmptyEaDirectory,
    kSharedNames,
    kEarlierLayout,
    kStrandedMetadata,
    kMisplacedMetadata,
    kMisplacedAttributes,
    kLeftTemporaryFile,
    kUnfinishedRename,
    kUnfinishedMove,
    kUnfinishedRepair,
    kDifferingValues,
    kSmbdIgnoresFile,
    kSmbdOverridesFinderInfo,
    kSmbdRefusesRecord,
    kSmbdCutsValue,
    kMacIgnoresFile,
    kUndeclaredMetadata,
};
inline constexpr std::size_t kFindingKinds =
    static_cast<std::size_t>(FindingKind::kUndeclaredMetadata) + 1;

// "damaged-stream".
const char* CodeOf(FindingKind kind);

// All codes with their meanings, a line each, for help.
std::string FindingCodes();

struct Finding {
    FindingKind kind;
    std::string path;  // of the object; of what has none, its own
    std::string detail;
    std::string file = {};  // that it is in, where that is not at `path`

    // Where in the file, as far as that is known.
    std::optional<std::uint64_t> entry = {};  // the index of a descriptor
    std::optional<std::uint32_t> id = {};     // of that entry
    std::string attribute = {};               // the name of an attribute in the file
    std::optional<Range> range = {};          // of the entry or the attribute's value
    std::optional<std::uint64_t> size = {};   // of the file, or another program's attribute

    // "PATH: CODE: DETAIL", one line whatever is in them.
    std::string Text() const;
    Json AsJson() const;
};

// A violation with its place.
Finding FindingOf(FindingKind kind, const std::string& path, const std::string& file,
                  const Layout& layout, const Violation& violation);

// Where findings go, and what could not be looked at.
class FindingSink {
 public:
    virtual ~FindingSink() = default;

    virtual void Add(const Finding& finding) = 0;
    // A Failure of Fault::kInUse is no fault of anybody.
    virtual void AddFailure(const Failure& failure) = 0;
    // What a repair has replaced is kept there, with which nothing is wrong either.
    virtual void AddKept(const std::string& path, const std::string& file) = 0;
};

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_CARE_FINDING_H_
