// One of the processes of a crew, and what lies between it and the first one: a socket on which
// each tells the other that it is its turn, and memory that both see. What is there outlives a
// worker that dies.
#ifndef MAVOEA_TOOLS_WALK_WORKER_H_
#define MAVOEA_TOOLS_WALK_WORKER_H_

#include <array>
#include <atomic>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "tools/walk/crew.h"

namespace mavoea::tool {

struct WorkArea {
    static constexpr std::size_t kErrandsMost = 64;  // at a time
    static constexpr std::size_t kResultsSize = std::size_t{1} << 18;

    // How far it is: errands that are done, and bytes of `results` that count. One word, which all
    // processors write in one step.
    class State {
     public:
        constexpr State() = default;
        constexpr State(std::size_t done, std::size_t size)
            : word_(static_cast<std::uint32_t>(done << kSizeBits | size)) {}
        constexpr std::size_t done() const { return word_ >> kSizeBits; }
        constexpr std::size_t size() const { return word_ & ((1U << kSizeBits) - 1); }

     private:
        static constexpr unsigned kSizeBits = 20;
        static_assert(kResultsSize < (1U << kSizeBits) && kErrandsMost < (1U << (32 - kSizeBits)));

        std::uint32_t word_ = 0;
    };
    std::atomic<State> state;
    static_assert(std::atomic<State>::is_always_lock_free);

    std::array<char, std::size_t{1} << 20> request;
    std::array<char, kResultsSize> results;
};

// What comes of errands. What is told may come in several parts.
enum class ResultKind : std::uint8_t { kOutput, kError, kPart, kTold, kFailure, kLeftEaDirectory };

// A turn, with descriptors of directories when errands come along.
enum class Turn : char { kWork = 'W', kGoOn = 'G', kEnd = 'E', kDone = 'D', kFull = 'F' };
bool SendTurn(int socket, Turn turn, const std::vector<int>& descriptors = {});
// None when the other one has gone.
std::optional<Turn> ReceiveTurn(int socket, std::vector<int>* descriptors = nullptr);
// As many as come along with one turn.
inline constexpr std::size_t kDescriptorsMost = 16;

// Errands in bytes. A directory is named by a number: one that the worker had for its last request
// is not sent once more.
struct Request {
    std::string bytes = {};
    std::vector<DirectoryRef> directories = {};
    std::vector<int> descriptors = {};
};
Request RequestOf(const std::vector<Errand>& errands, std::size_t first,
                  const std::vector<DirectoryRef>& former);

// As what an errand stands in a journal.
std::string KeyOf(const Errand& errand);

using DoErrand = std::function<bool(const Errand&, const Tell&)>;

// What comes of an errand that this process does, in bytes.
struct Recorded {
    std::string results;
    bool done = false;
};
Recorded Record(const Errand& errand, const DoErrand& work);

// Works until it is told that this is the end, or the first process has gone.
[[noreturn]] void WorkAsTold(int socket, WorkArea* area, const DoErrand& work,
                             const Journal* journal);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_WALK_WORKER_H_
