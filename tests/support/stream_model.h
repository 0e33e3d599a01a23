// What an EA stream holds and what each operation on it comes to, worked out on plain vectors: the
// model that streams are compared with, in memory and byte for byte on disk.
#ifndef MAVOEA_TESTS_SUPPORT_STREAM_MODEL_H_
#define MAVOEA_TESTS_SUPPORT_STREAM_MODEL_H_

#include <array>
#include <cstddef>
#include <cstdint>
#include <span>
#include <string>
#include <vector>

#include "include/mavoea.h"
#include "tests/support/temp_dir.h"

namespace mavoea::test {

// What a call is to end in.
struct Outcome {
    int result = 0;
    int code = 0;         // recorded, alone; 0: none is
    int error = 0;        // errno; 0: whatever it is
    bool unsure = false;  // either done or refused, with nothing on disk changed
};

struct ModelAttribute {
    std::string name;  // as many bytes as the record counts, a NUL at the end as a rule
    std::uint16_t flags = 0;
    std::uint32_t offset = 0;  // of the value, as the record has it
    std::uint32_t length = 0;
    Bytes value = {};  // while the model is exact
};

// One stream and the one handle on it.
class StreamModel {
 public:
    // The handle that MAVOEASOpen() makes of such a file. The lock is always granted.
    StreamModel(Bytes file, int lock_type);

    // The code with which the file is refused; 0 when it is opened.
    int refused() const { return refused_; }

    // Whether offsets, lengths and counts fit together, so that the model knows every byte that a
    // change puts on disk. If not it knows what reading gives, and changes are unsure.
    bool exact() const { return exact_; }

    Outcome Search(const std::string& name) const;
    Outcome Enum(std::vector<std::string>* names) const;
    // `found` receives the bytes that are read.
    Outcome Read(const std::string& name, unsigned size, unsigned offset, Bytes* found) const;
    Outcome Write(const std::string& name, std::span<const std::uint8_t> data, unsigned offset,
                  int flags);
    Outcome Remove(const std::string& name);
    Outcome Truncate(const std::string& name, unsigned length);
    Outcome AllocEntry(int count);
    Outcome WriteHeader();
    Outcome WriteFinderInfo();
    Outcome LockSet(int lock_type);

    // `gathered` receives what is then in the caller's buffer. What the model and the handle hold
    // is ahead of the file until WriteHeader() and PutValues().
    Outcome UpdateEntry(unsigned index, unsigned size, bool remove, Bytes* gathered);
    void PutValues();  // the caller has written them at data_start()

    // The caller has put these into the handle's header.
    void SetFinderInfo(std::span<const std::uint8_t> bytes);
    // The caller has put the fork's length into the handle's header, its bytes at the end of the
    // values, where he has ended the file.
    void PutFork(Bytes fork);

    // How file and handle differ from the model; empty when they agree. Where several things may
    // be on disk, those that are become the model's. The handle is compared while the model is
    // exact, and when it has just been opened.
    std::string CompareFile(const Bytes& found);
    std::string CompareHandle(const EASHandle& handle) const;

    // With a model that is not exact: how the handle's attributes differ, names and values, from
    // what they were, had the one change been made to them. `values` are those of the handle.
    struct Contents {
        std::vector<std::string> names;
        std::vector<Bytes> values;
        bool known = false;  // all values lie in the file, and are few bytes
    };
    Contents ContentsNow() const;

    const Bytes& file() const { return file_; }
    const std::vector<ModelAttribute>& attributes() const { return attributes_; }
    int lock_type() const { return lock_type_; }
    std::uint64_t data_start() const;
    std::uint64_t data_length() const;
    std::uint64_t total_size() const { return data_start() + data_length(); }
    // Whether nothing is missing: all of the fork is in the file, both descriptors are there and
    // names have their ends.
    bool whole() const;
    std::uint32_t finder_offset() const;
    unsigned descriptor_count() const;

    // The last attribute of that name, -1 when there is none.
    int Find(const std::string& name) const;

 private:
    enum class ForkIs { kMoved, kLeft };

    int Load();
    bool FitsTogether();
    std::uint64_t TableEnd() const;
    void LayOut();  // offsets and header from what the stream holds
    void PutHead();
    void Rewrite(ForkIs fork);
    void Put(std::uint64_t at, std::span<const std::uint8_t> bytes);
    void FindFork();

    int refused_ = 0;
    bool exact_ = false;
    int lock_type_;
    int capacity_ = 0;
    std::array<std::uint8_t, 120> header_{};
    std::vector<ModelAttribute> attributes_;
    std::uint64_t gap_ = 0;  // unused bytes between table and values
    std::uint64_t fork_start_ = 0;
    std::uint32_t fork_length_ = 0;  // as the header has it
    Bytes fork_;                     // as much of it as is in the file

    Bytes file_;
    // The file may be this much shorter or longer than file_.
    std::uint64_t size_least_ = 0;
    std::uint64_t size_most_ = 0;
};

// What is wrong with the layout of a stream that has been written: sizes that do not add up, values
// that do not follow one another, names without an end, lengths that pass the end of the file.
// Empty when nothing is.
std::string LayoutFault(const Bytes& file);

}  // namespace mavoea::test

#endif  // MAVOEA_TESTS_SUPPORT_STREAM_MODEL_H_
