// A record of what is done of work on many objects, a line each, that outlives the run in whatever
// way that ends: a later one goes on where it stopped. docs/resuming.md has the format.
#ifndef MAVOEA_TOOLS_WALK_JOURNAL_H_
#define MAVOEA_TOOLS_WALK_JOURNAL_H_

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "tools/place/file.h"

namespace mavoea::tool {

// As somebody named it: a new file, or that of a run that has ended before its work.
struct LogFile {
    std::string path;
    bool resumes = false;
};

// Lines are written at once, by any process that has been forked since this was opened. Of the runs
// that write to it each is alone. All members throw Failure.
class Journal {
 public:
    // `work` says what is done, and to what: nobody goes on with the log of anything else. `remark`
    // is kept for who goes on.
    Journal(const LogFile& file, const std::string& work, const std::string& remark);

    bool resumed() const { return resumed_; }
    // Of the run that began it.
    const std::string& remark() const { return remark_; }

    // What came of something, if it is done. A log that was not resumed has nothing of the kind,
    // and none has what is called by no key.
    std::optional<std::string> Find(const std::string& key) const;

    // Something is done. A log that takes no more is one failure; from then on it stays as it is.
    void Add(const std::string& key, std::string_view result) const;

    // From time to time, when so many have been added: what was done until now, put on disk by
    // `sync`, will count after a loss of power as well.
    void NoteDone(std::uint64_t count, const std::function<void()>& sync);
    void Sync(const std::function<void()>& sync);

 private:
    void Begin(const std::string& work, const std::string& remark);
    void Resume(const std::string& work);
    void Read(const std::string& work);
    void Write(const std::string& text) const;

    std::unique_ptr<const File> file_;
    bool resumed_ = false;
    std::string remark_;
    mutable bool is_full_ = false;
    std::uint64_t done_ = 0;  // since it was synced
    // Of each line that counts a hash of its key, and where it is; sorted.
    std::vector<std::pair<std::uint64_t, std::uint64_t>> lines_;
};

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_WALK_JOURNAL_H_
