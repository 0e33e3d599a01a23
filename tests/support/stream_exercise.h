// Operations chosen one after the other, made on a stream through the library and on its model,
// and compared after each.
#ifndef MAVOEA_TESTS_SUPPORT_STREAM_EXERCISE_H_
#define MAVOEA_TESTS_SUPPORT_STREAM_EXERCISE_H_

#include <cstddef>
#include <cstdint>
#include <functional>
#include <optional>
#include <span>
#include <string>
#include <vector>

#include "include/mavoea.h"
#include "tests/support/stream_model.h"

namespace mavoea::test {

class StreamExercise {
 public:
    struct Surroundings {
        std::function<unsigned(unsigned limit)> below;  // the choices: 0 to limit - 1
        std::function<std::vector<int>()> take_codes;   // recorded since the last time
        // Around each call into the library, which may allocate blocks of `most` bytes.
        std::function<void()> before_call = {};
        std::function<void(std::size_t most)> after_call = {};
    };

    explicit StreamExercise(Surroundings surroundings);
    ~StreamExercise();
    StreamExercise(const StreamExercise&) = delete;
    StreamExercise& operator=(const StreamExercise&) = delete;

    // Each returns what went wrong; empty when nothing did.
    std::string Begin(std::span<const std::uint8_t> file);  // ... and open a stream of these bytes
    std::string Step();                                     // one operation, while open()
    std::string End();                                      // close, if it is open

    // Not when the last opening was refused, as it was to be.
    bool open() const { return handle_ != nullptr; }

    // The last operation, for messages.
    const std::string& last() const { return last_; }

 private:
    std::string Open();
    std::string Reopen();
    std::string Check(int result, int error, const Outcome& outcome);
    std::string CheckFile();
    std::string CheckLock();
    std::string AfterChange(const Outcome& outcome, int result);
    std::string AfterUnsure(const StreamModel::Contents& expected, bool done);

    std::string DoSearch();
    std::string DoEnum();
    std::string DoRead();
    std::string DoWrite();
    std::string DoRemove();
    std::string DoTruncate();
    std::string DoAllocEntry();
    std::string DoWriteHeader();
    std::string DoWriteFinderInfo();
    std::string DoPutFork();
    std::string DoUpdateEntry();
    std::string DoLocks();
    std::string DoBadArguments();

    unsigned Below(unsigned limit) { return around_.below(limit); }
    std::string SomeName();
    std::span<const std::uint8_t> SomeBytes();
    unsigned SomeSize();
    const Bytes& FileBytes();  // until it is asked for again
    void Refill(std::span<const std::uint8_t> bytes) const;

    // Makes the call, within bounds; errno_ is what it left.
    template <class Function>
    auto Call(std::size_t bytes, Function function);

    Surroundings around_;
    int fd_ = -1;
    int other_fd_ = -1;  // the same file, opened again: asks about the lock
    EASHandle* handle_ = nullptr;
    std::optional<StreamModel> model_;
    Bytes file_bytes_;
    int errno_ = 0;
    std::string last_;
};

}  // namespace mavoea::test

#endif  // MAVOEA_TESTS_SUPPORT_STREAM_EXERCISE_H_
