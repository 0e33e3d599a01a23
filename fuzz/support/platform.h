// What fuzz targets see of the library's surroundings: the codes that it recorded, the descriptors
// that are open, the memory that it took.
//
// The platform library is the host's, but for its error stack, which here keeps every record, and
// for the EA directory's ACL, which is not set. The system log is swallowed.
#ifndef MAVOEA_FUZZ_SUPPORT_PLATFORM_H_
#define MAVOEA_FUZZ_SUPPORT_PLATFORM_H_

#include <cstddef>
#include <vector>

namespace mavoea::fuzz {

// The codes recorded since the last time, oldest first.
std::vector<int> TakeCodes();

// Whether `code` is one of those that mavoea.h lists.
bool IsKnownCode(int code);

// Says what went wrong, as printf does, and ends the process for the fuzzer to keep the input.
[[noreturn]] void Fail(const char* format, ...) __attribute__((format(printf, 1, 2)));

// How many descriptors this process has open.
int OpenDescriptors();

// The allocations made by all of the process while it is alive; one at a time.
class AllocationWatch {
 public:
    AllocationWatch();
    ~AllocationWatch();
    AllocationWatch(const AllocationWatch&) = delete;
    AllocationWatch& operator=(const AllocationWatch&) = delete;

    std::size_t largest() const;  // in bytes
    std::size_t total() const;    // all added up, in bytes
    long live() const;            // blocks allocated less blocks freed
};

}  // namespace mavoea::fuzz

#endif  // MAVOEA_FUZZ_SUPPORT_PLATFORM_H_
