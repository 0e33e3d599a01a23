// The calling thread's error stack, for tests: the public calls show only its top.
#ifndef MAVOEA_PLATFORM_CORE_ERROR_STACK_H_
#define MAVOEA_PLATFORM_CORE_ERROR_STACK_H_

#include <cstddef>

namespace mavoea::core {

// Records that a thread's stack holds at most.
inline constexpr std::size_t kErrorStackSize = 64;

struct ErrorRecord {
    int code = 0;
    const char* file = "";
    int line = 0;
};

// Records on the calling thread's stack, and the record `depth` below its top (0 is the top); one
// of no error when there is none so deep.
std::size_t ErrorStackDepth();
ErrorRecord ErrorStackAt(std::size_t depth);

}  // namespace mavoea::core

#endif  // MAVOEA_PLATFORM_CORE_ERROR_STACK_H_
