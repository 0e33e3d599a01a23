#include "tests/platform/support/allocation_control.h"

#include <errno.h>

#include <cstddef>

namespace {

thread_local int allocations_until_failure = 0;  // 0: none fails
thread_local bool failed = false;
thread_local unsigned long long allocations = 0;

bool MustFail() {
    ++allocations;
    if (allocations_until_failure == 0 || --allocations_until_failure != 0) return false;
    failed = true;
    errno = ENOMEM;
    return true;
}

}  // namespace

extern "C" {

// Names that the linker's --wrap makes.
void* __real_malloc(std::size_t size);
void* __real_reallocarray(void* block, std::size_t count, std::size_t size);

void* __wrap_malloc(std::size_t size) { return MustFail() ? nullptr : __real_malloc(size); }

void* __wrap_reallocarray(void* block, std::size_t count, std::size_t size) {
    return MustFail() ? nullptr : __real_reallocarray(block, count, size);
}

}  // extern "C"

namespace mavoea::test {

FailNthAllocation::FailNthAllocation(int nth) {
    failed = false;
    allocations_until_failure = nth;
}
FailNthAllocation::~FailNthAllocation() { allocations_until_failure = 0; }
bool FailNthAllocation::fired() const { return failed; }

unsigned long long AllocationCount() { return allocations; }

}  // namespace mavoea::test
