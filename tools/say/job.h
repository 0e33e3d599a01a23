// What cp, mv and rm have in common: questions, counts, progress, what is said at the end.
#ifndef MAVOEA_TOOLS_SAY_JOB_H_
#define MAVOEA_TOOLS_SAY_JOB_H_

#include <sys/stat.h>

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "tools/say/messages.h"
#include "tools/say/output.h"
#include "tools/say/progress.h"

namespace mavoea::tool {

struct JobOptions {
    std::vector<std::string> paths;
    std::optional<std::string> list = {};  // names them in place of `paths`, but for a destination
    bool recursive = false;
    bool verbose = false;
    bool json = false;

    bool several() const { return list.has_value() || paths.size() > 1; }
    // Then it answers no questions.
    bool lists_on_input() const { return list == "-"; }
};

class Job {
 public:
    // "copying" and "copied". Starts to watch for interrupts.
    Job(const char* doing, const char* done, const JobOptions& options);

    // Whether standard input says yes, to a question on standard error. False when it ends, or
    // when the work is interrupted, or when it has the paths.
    bool Ask(const std::string& question);

    // A line for those who want to see what is done.
    void Say(const std::string& line);

    void AddDone() { ++done_; }
    void AddSkipped() { ++skipped_; }
    void AddBytes(std::uint64_t bytes);
    // Says it at once.
    void AddFailure(const std::string& path, const Failure& failure);
    void AddNote(const std::string& note);
    // A note that the commands of coreutils have as well, in their words.
    void AddWarning(const std::string& warning);

    // Whether ShowProgress() may have something to say now.
    bool wants_progress() const { return progress_.wanted(); }
    void ShowProgress(const std::string& path);

    bool stopped() const;  // nothing more is to be begun
    std::uint64_t failures() const { return failures_; }
    std::uint64_t skipped() const { return skipped_; }

    // Says what became of it all. kSuccess; kRefused when anything failed; kFailed when only
    // metadata did not arrive; or 128 and the number of the signal.
    ExitStatus Finish();

 private:
    std::string Counts() const;
    void PrintJson() const;

    const char* doing_;
    const char* done_word_;
    const JobOptions& options_;
    Progress progress_;
    std::string path_;  // in hand
    std::uint64_t done_ = 0;
    std::uint64_t skipped_ = 0;
    std::uint64_t bytes_ = 0;
    std::uint64_t failures_ = 0;
    bool has_bytes_ = false;
    std::vector<std::string> lines_;  // all three for --json
    std::vector<std::string> notes_;
    std::vector<FailedObject> failed_;
    ExitStatus status_ = kSuccess;
};

// 'NAME', for a line of --verbose or a question.
std::string Quoted(const std::string& path);

// "directory", "regular file", "regular empty file", "symbolic link", ...
const char* NameOfType(const struct stat& info);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_SAY_JOB_H_
