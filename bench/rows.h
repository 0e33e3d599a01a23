// What is measured: rows of one piece of work each, done by the library and by hand.
#ifndef MAVOEA_BENCH_ROWS_H_
#define MAVOEA_BENCH_ROWS_H_

#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "tests/support/temp_dir.h"

namespace mavoea::bench {

// Does the work so many times. It owns the files and buffers that it works on.
using Work = std::function<void(std::int64_t times)>;

// Prepares the work, does it, and checks that what it did is what it says. Throws
// std::runtime_error otherwise.
using Prepare = std::function<Work()>;

struct Row {
    std::string work;
    std::string where;  // "memory", "disk", "tmpfs"
    double aim;         // at most so many times the floor
    Prepare library;
    Prepare floor;
    // Whether a disk is waited for: then elapsed time counts, otherwise the processor's, which
    // other processes do not add to.
    bool waits = false;
    // How often the work is done in one go; 0: as often as a measurement takes.
    std::int64_t batch = 0;
    // How many such goes make one measurement, where doing it later costs more than at first.
    int goes = 1;
    // The work uses up what it was prepared for: every go gets its own, of one batch.
    bool consumes = false;
};

// A directory on a filesystem to measure on.
struct Place {
    std::string name;
    bool durable = false;  // fsync has something to wait for
    std::shared_ptr<test::TempDir> directory;

    std::string NewPath() const;  // of a file that does not exist
};

void AddPathRows(std::vector<Row>* rows);
void AddNameRows(std::vector<Row>* rows);
// `fast` is where a row is prepared or checked that is not about the filesystem.
void AddListRows(const Place& fast, std::vector<Row>* rows);
void AddStreamRows(const Place& place, const Place& fast, std::vector<Row>* rows);
void AddForkRows(const Place& place, std::vector<Row>* rows);
void AddObjectRows(const Place& place, std::vector<Row>* rows);

// Throws std::runtime_error, which names `what` and errno, unless `held`.
void Require(bool held, const std::string& what);

// Work that calls `once`, without a call through a pointer in between.
template <class Once>
Work Repeat(Once once) {
    return [once](std::int64_t times) mutable {
        for (; times > 0; --times) once();
    };
}

// An open descriptor; closed when its last owner goes.
class File {
 public:
    File(const std::string& path, int flags);
    ~File();
    File(const File&) = delete;
    File& operator=(const File&) = delete;

    int fd() const { return fd_; }
    test::Bytes Read(std::int64_t offset, std::size_t size) const;  // fewer where the file ends
    std::int64_t Size() const;

 private:
    int fd_;
};

}  // namespace mavoea::bench

#endif  // MAVOEA_BENCH_ROWS_H_
