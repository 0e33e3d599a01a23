// What cp, mv and rm have in common: questions, counts, progress, what is said at the end.
#ifndef MAVOEA_TOOLS_SAY_JOB_H_
#define MAVOEA_TOOLS_SAY_JOB_H_

#include <cstdint>
#include <string>
#include <vector>

#include "tools/say/messages.h"
#include "tools/say/output.h"
#include "tools/say/progress.h"

namespace mavoea::tool {

// What is done about objects that would be lost: the last of -i, -f and -n.
enum class Consent { kUsual, kAsk, kForce, kNever };

struct JobOptions {
    std::vector<std::string> paths;
    bool recursive = false;
    Consent consent = Consent::kUsual;
    bool verbose = false;
    bool json = false;
};

class Job {
 public:
    // "copying" and "copied". Starts to watch for interrupts.
    Job(const char* doing, const char* done, const JobOptions& options);

    // Whether standard input says yes, to a question on standard error. False when it ends, or
    // when the work is interrupted.
    bool Ask(const std::string& question);
    // The same for something that is `writable`, or that another user, or nobody, may write to.
    bool MayBeLost(bool writable, const std::string& question);

    void AddDone(const std::string& path, const std::string& line);
    void AddSkipped() { ++skipped_; }
    void AddBytes(std::uint64_t bytes);
    void AddFailure(const std::string& path, const Failure& failure);
    void AddNote(const std::string& note) { notes_.push_back(note); }

    void ShowProgress(const std::string& path);

    bool stopped() const;  // nothing more is to be begun
    std::uint64_t failures() const { return failures_.size(); }
    std::uint64_t skipped() const { return skipped_; }

    // Says what became of it all. kSuccess, the gravest status of the failures, or 128 and the
    // number of the signal.
    ExitStatus Finish();

 private:
    std::string Counts() const;
    void PrintText() const;
    void PrintJson() const;

    const char* doing_;
    const char* done_word_;
    const JobOptions& options_;
    Progress progress_;
    std::string path_;  // in hand
    std::uint64_t done_ = 0;
    std::uint64_t skipped_ = 0;
    std::uint64_t bytes_ = 0;
    bool has_bytes_ = false;
    std::vector<std::string> lines_;  // --verbose, for --json
    std::vector<std::string> notes_;
    std::vector<FailedObject> failures_;
    ExitStatus status_ = kSuccess;
};

// 'NAME', for a line of --verbose or a question.
std::string Quoted(const std::string& path);

// "directory", "regular file", "symbolic link", ...
const char* NameOfType(unsigned mode);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_SAY_JOB_H_
