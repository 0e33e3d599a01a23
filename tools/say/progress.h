// How far long work has come.
#ifndef MAVOEA_TOOLS_SAY_PROGRESS_H_
#define MAVOEA_TOOLS_SAY_PROGRESS_H_

#include <chrono>
#include <cstdint>
#include <functional>
#include <optional>
#include <string>

namespace mavoea::tool {

// From here on all work says how far it is each so many seconds, in a line that stays, where no
// terminal has the one that is rewritten. 0: with each object.
void ReportProgressEach(std::chrono::seconds interval);

// From here on it is also said of how many objects that is, and when the rest will be done, as soon
// as `total` knows; asked each time that something is said.
void ExpectTotal(std::function<std::optional<std::uint64_t>()> total);

// From here on nobody is told anything: another process does that.
void SilenceProgress();

// "812 bytes", "1.5 GiB".
std::string SizeText(std::uint64_t size);

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
    // known how many have been `done`. `of_total`: how many of those that are expected, where that
    // is another number.
    void Show(const std::string& status, const std::string& path,
              std::optional<std::uint64_t> done = {}, std::optional<std::uint64_t> of_total = {});
    void Clear();

 private:
    using Clock = std::chrono::steady_clock;

    void Tell(const std::string& status, const std::string& path,
              std::optional<std::uint64_t> done);
    std::string Share(std::optional<std::uint64_t> done) const;

    const char* doing_;
    bool on_;
    bool shown_ = false;
    Clock::time_point last_{};
    Clock::time_point begin_ = Clock::now();
    Clock::time_point told_ = begin_;
};

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_SAY_PROGRESS_H_
