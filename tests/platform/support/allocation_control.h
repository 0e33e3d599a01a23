// Allocations that fail to order. They are those of the code under test and of the test itself, not
// those that the C library makes on its own.
#ifndef MAVOEA_TESTS_PLATFORM_SUPPORT_ALLOCATION_CONTROL_H_
#define MAVOEA_TESTS_PLATFORM_SUPPORT_ALLOCATION_CONTROL_H_

namespace mavoea::test {

// Makes the nth allocation from here on (counted from 1) fail with ENOMEM. Ends with its scope; one
// at a time, in one thread.
class FailNthAllocation {
 public:
    explicit FailNthAllocation(int nth);
    ~FailNthAllocation();
    FailNthAllocation(const FailNthAllocation&) = delete;
    FailNthAllocation& operator=(const FailNthAllocation&) = delete;

    bool fired() const;
};

// Allocations by this thread since it began.
unsigned long long AllocationCount();

}  // namespace mavoea::test

#endif  // MAVOEA_TESTS_PLATFORM_SUPPORT_ALLOCATION_CONTROL_H_
