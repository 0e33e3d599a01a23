// How far long work has come, for people at a terminal.
#ifndef MAVOEA_TOOLS_SAY_PROGRESS_H_
#define MAVOEA_TOOLS_SAY_PROGRESS_H_

#include <chrono>
#include <string>

namespace mavoea::tool {

// One line on standard error, rewritten now and then, when that is a terminal; nothing anywhere
// else. It goes away at the end of the scope.
class Progress {
 public:
    explicit Progress(const char* doing);
    ~Progress() { Clear(); }
    Progress(const Progress&) = delete;
    Progress& operator=(const Progress&) = delete;

    // "DOING: STATUS, PATH".
    void Show(const std::string& status, const std::string& path);
    void Clear();

 private:
    const char* doing_;
    bool on_;
    bool shown_ = false;
    std::chrono::steady_clock::time_point last_{};
};

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_SAY_PROGRESS_H_
