// How far long work has come.
#ifndef MAVOEA_TOOLS_SAY_PROGRESS_H_
#define MAVOEA_TOOLS_SAY_PROGRESS_H_

#include <chrono>
#include <cstdint>
#include <optional>
#include <string>

namespace mavoea::tool {

// From here on all work says how far it is each so many seconds, in a line that stays, where no
// terminal has the one that is rewritten. 0: with each object.
void ReportProgressEach(std::chrono::seconds interval);

// From here on nobody is told anything: another process does that.
void SilenceProgress();

// One line on standard error, rewritten now and then, when that is a terminal. It goes away at the
// end of the scope. Lines that stay come when somebody asks for one by SIGUSR1, and in the interval
// that was asked for.
class Progress {
 public:
    // `kOnRequest`: work whose results are read on a terminal has no other line there.
    enum class Lines { kOnTerminal, kOnRequest };
    explicit Progress(const char* doing, Lines lines = Lines::kOnTerminal);
    ~Progress() { Clear(); }
    Progress(const Progress&) = delete;
    Progress& operator=(const Progress&) = delete;

    // Whether Show() may have something to say now: words cost more than many an object.
    bool wanted() const;

    // "DOING: STATUS, PATH"; lines that stay say how many objects that is each second, where it is
    // known how many have been `done`.
    void Show(const std::string& status, const std::string& path,
              std::optional<std::uint64_t> done = {});
    void Clear();

 private:
    using Clock = std::chrono::steady_clock;

    void Tell(const std::string& status, const std::string& path,
              std::optional<std::uint64_t> done);

    const char* doing_;
    bool on_;
    bool shown_ = false;
    Clock::time_point last_{};
    Clock::time_point begin_ = Clock::now();
    Clock::time_point told_ = begin_;
};

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_SAY_PROGRESS_H_
