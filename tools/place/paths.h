// The paths that a command is given: its arguments, or those that a file lists.
#ifndef MAVOEA_TOOLS_PLACE_PATHS_H_
#define MAVOEA_TOOLS_PLACE_PATHS_H_

#include <cstddef>
#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <vector>

#include "tools/place/file.h"
#include "tools/say/messages.h"

namespace mavoea::tool {

struct NamedPaths {
    std::vector<std::string> arguments;
    // In place of arguments, the file that lists them with a NUL behind each; "-": standard input.
    std::optional<std::string> list = {};

    bool several() const { return list.has_value() || arguments.size() > 1; }
    const std::string& front() const { return arguments.front(); }  // where there is one argument
};

// Hands out one path after the other. A list is read as it comes, and never held as a whole: find
// may still be writing it, and it may be longer than memory.
class PathReader {
 public:
    // `fail` is told of each name that is no path, which is left out, and of a list that cannot be
    // read, which ends there. `wait` is called before a list is waited for: whoever writes it may
    // do so as well, for what came of the paths so far. `paths` must outlive this.
    PathReader(
        const NamedPaths& paths, std::function<void(const Failure&)> fail,
        std::function<void()> wait = [] {})
        : paths_(paths), fail_(std::move(fail)), wait_(std::move(wait)) {}

    // None at the end, and as soon as the work is interrupted while a list is waited for.
    std::optional<std::string> Next();

 private:
    std::optional<std::string> NextInList();
    bool Fill();
    std::string Called() const;

    const NamedPaths& paths_;
    std::function<void(const Failure&)> fail_;
    std::function<void()> wait_;
    std::size_t next_ = 0;  // of the arguments
    std::optional<File> file_;
    std::string buffer_;
    std::size_t at_ = 0;        // how much of that has been handed out
    std::uint64_t number_ = 0;  // of the name in hand
    bool ended_ = false;
};

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_PLACE_PATHS_H_
