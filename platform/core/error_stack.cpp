// The error stack: one ring of records per thread, in the thread's own storage, so that a failure
// can be recorded when memory has run out and no thread sees another's.

#include "platform/core/error_stack.h"

#include <array>

#include "platform/include/mavocore.h"

namespace mavoea::core {
namespace {

struct ErrorStack {
    std::array<ErrorRecord, kErrorStackSize> ring;
    std::size_t next;   // where the next record goes
    std::size_t depth;  // records held
};

constinit thread_local ErrorStack stack = {};

}  // namespace

std::size_t ErrorStackDepth() { return stack.depth; }

ErrorRecord ErrorStackAt(std::size_t depth) {
    if (depth >= stack.depth) return {};
    return stack.ring[(stack.next + kErrorStackSize - 1 - depth) % kErrorStackSize];
}

}  // namespace mavoea::core

using namespace mavoea::core;

void MLIBCErrSetEx(int code, const char* file, int line) {
    stack.ring[stack.next] = {code, file == nullptr ? "" : file, line};
    stack.next = (stack.next + 1) % kErrorStackSize;
    if (stack.depth < kErrorStackSize) ++stack.depth;
}

int MLIBCErrGet() { return ErrorStackAt(0).code; }
const char* MLIBCErrorGetFile() { return ErrorStackAt(0).file; }
int MLIBCErrorGetLine() { return ErrorStackAt(0).line; }
