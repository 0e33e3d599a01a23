// Opens whatever bytes as an EA stream, or begins a new one, and makes any sequence of operations
// on it, each compared with the model.
//
// The input: a byte whose lowest bit says whether the stream is new; otherwise the file's length,
// 16 bits, and its bytes; the rest are the choices.

#include <unistd.h>

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string>

#include "fuzz/support/platform.h"
#include "tests/support/stream_exercise.h"

namespace {

using namespace mavoea::fuzz;
using mavoea::test::StreamExercise;

constexpr int kMostSteps = 40;

// Choices from the input, as many bytes for each as its limit has.
class Choices {
 public:
    explicit Choices(std::span<const std::uint8_t> bytes) : left_(bytes) {}

    bool empty() const { return left_.empty(); }
    std::uint8_t Byte() {
        if (left_.empty()) return 0;
        const std::uint8_t byte = left_.front();
        left_ = left_.subspan(1);
        return byte;
    }
    unsigned Below(unsigned limit) {
        unsigned value = 0;
        for (unsigned most = limit - 1; most > 0; most >>= 8) value = value << 8 | Byte();
        return value % limit;
    }
    std::span<const std::uint8_t> Bytes(std::size_t count) {
        const auto bytes = left_.first(std::min(count, left_.size()));
        left_ = left_.subspan(bytes.size());
        return bytes;
    }

 private:
    std::span<const std::uint8_t> left_;
};

// The lowest descriptor that is free.
int NextDescriptor() {
    const int fd = dup(0);
    if (fd < 0) Fail("no descriptor is free");
    close(fd);
    return fd;
}

// What the library has allocated: each call's share, within bounds.
class Allocations {
 public:
    void Begin() { watch_.emplace(); }
    void End(std::size_t most) {
        if (watch_->largest() > most) {
            Fail("a block of %zu bytes was allocated, %zu are enough", watch_->largest(), most);
        }
        live_ += watch_->live();
        watch_.reset();
    }
    long live() const { return live_; }

 private:
    std::optional<AllocationWatch> watch_;
    long live_ = 0;
};

void Expect(const std::string& fault, const StreamExercise& exercise, int step) {
    if (!fault.empty()) Fail("step %d, %s: %s", step, exercise.last().c_str(), fault.c_str());
}

void Run(Choices choices, Allocations* allocations) {
    const bool fresh = (choices.Byte() & 1) != 0;
    const std::size_t size = fresh ? 0 : choices.Byte() * std::size_t{256} + choices.Byte();
    const std::span<const std::uint8_t> file = choices.Bytes(size);

    StreamExercise exercise({
        .below = [&](unsigned limit) { return choices.Below(limit); },
        .take_codes = TakeCodes,
        .before_call = [&] { allocations->Begin(); },
        .after_call = [&](std::size_t most) { allocations->End(most); },
    });
    Expect(exercise.Begin(file), exercise, 0);
    for (int step = 1; step <= kMostSteps && exercise.open() && !choices.empty(); ++step) {
        Expect(exercise.Step(), exercise, step);
    }
    Expect(exercise.End(), exercise, kMostSteps + 1);
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    const int descriptor = NextDescriptor();
    TakeCodes();
    Allocations allocations;
    Run(Choices({data, size}), &allocations);
    if (allocations.live() != 0) Fail("%ld blocks are left", allocations.live());
    if (NextDescriptor() != descriptor) Fail("a descriptor is left open");
    return 0;
}
