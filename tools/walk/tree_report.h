// What became of many objects: progress, counts, notes and failures.
#ifndef MAVOEA_TOOLS_WALK_TREE_REPORT_H_
#define MAVOEA_TOOLS_WALK_TREE_REPORT_H_

#include <array>
#include <cstdint>
#include <string>
#include <vector>

#include "tools/place/directory.h"
#include "tools/say/messages.h"
#include "tools/say/output.h"
#include "tools/say/progress.h"

namespace mavoea::tool {

// What became of an object.
enum class Outcome { kDone, kCurrent, kNothing };

// What people should know of an object with which nothing is wrong.
using Notes = std::vector<std::string>;

class TreeReport {
 public:
    // In the progress line and the summary: "upgrading", "converted", "already current", "nothing
    // to convert". Null where an outcome cannot be.
    struct Words {
        const char* doing;
        const char* done;
        const char* current;
        const char* nothing;
    };
    // Whether each outcome is told, in the words of the summary: at once, or in the JSON.
    enum class Each { kNotTold, kTold, kInJson };
    static Each EachOf(bool verbose, bool json) {
        if (!verbose) return Each::kNotTold;
        return json ? Each::kInJson : Each::kTold;
    }
    explicit TreeReport(const Words& words, Each each = Each::kNotTold)
        : words_(words), progress_(words.doing), each_(each) {}

    // Shows how far it is on standard error, when that is a terminal.
    void Show(const Place& place);
    void ClearProgress() { progress_.Clear(); }

    void Add(const std::string& path, Outcome outcome);
    void AddFailure(const std::string& path, const Failure& failure) {
        AddFailure(path, failure.status(), failure.what());
    }
    void AddFailure(const std::string& path, ExitStatus status, const std::string& message);
    Notes* notes() { return &notes_; }

    // The counts are on standard output, and notes and failures on standard error. kSuccess when
    // nothing failed, otherwise the gravest status.
    ExitStatus Finish(bool json);

 private:
    std::uint64_t Total() const { return counts_[0] + counts_[1] + counts_[2]; }
    std::string StatusText() const;
    std::array<const char*, 3> WordsByOutcome() const;
    void PrintText() const;
    void PrintJson() const;

    const Words words_;
    Progress progress_;
    const Each each_;
    std::vector<std::string> lines_;         // for the JSON
    std::array<std::uint64_t, 3> counts_{};  // by Outcome
    Notes notes_;
    std::vector<FailedObject> failures_;
    ExitStatus status_ = kSuccess;
};

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_WALK_TREE_REPORT_H_
