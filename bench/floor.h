// The floors: the work of the library's operations written by hand, with the fewest calls and the
// plainest copies. Nothing is checked that the work itself does not need.
#ifndef MAVOEA_BENCH_FLOOR_H_
#define MAVOEA_BENCH_FLOOR_H_

#include <cstddef>
#include <cstdint>
#include <span>
#include <string_view>

#include "platform/include/mavocore.h"

namespace mavoea::bench::floor {

// "<parent>/@eaDir/<name>@<kind>". A name of more than 242 bytes is shortened.
void StreamPath(const char* path, const char* kind, char* to);

// The same in one snprintf, of a path that has been split (and shortened) before.
void FormatStreamPath(const char* parent, const char* name, const char* kind, char* to);

// "<parent>/@eaDir".
void DirPath(const char* path, char* to);

// "<parent>/._<name>".
void AppleDoublePath(const char* path, char* to);

// How many of `names` are hidden directories', or hidden files': most are decided by their first
// byte.
int CountHiddenDirNames(std::span<const char* const> names);
int CountHiddenFiles(std::span<const char* const> names);

// How many have a ':'.
int CountNamesWithColon(std::span<const char* const> names);

// Opens the stream, reads header and table, finds `name` (its NUL not included) in the table, reads
// its value and closes. Returns the value's length, -1 on failure.
int ReadValue(const char* path, std::string_view name, std::uint8_t* to, std::size_t size);

// Opens the stream, reads header and table, pushes all names from where they stand and closes.
// Returns their number, -1 on failure.
int ListNames(const char* path, MLIBCSzList** list);

// One pwrite at `offset`, and an fsync.
bool WriteDurably(int fd, std::span<const std::uint8_t> bytes, std::int64_t offset = 0);

// Looks for the stream of an object: the file, the folder and the "._" file that it may be in.
// Whether there is none of them.
bool HasNoStream(const char* path);

// Opens the stream to write, making it where it is missing, locks and reads it, writes `bytes` in
// its place and syncs them, and closes it, which drops the lock.
bool LockAndReplace(const char* path, std::span<const std::uint8_t> bytes);

// Closes up over the first `value_size` bytes behind the head: reads what lies behind those into
// `whole`, which has the head before it and the new last value behind it, and writes all of that.
bool CloseUpAndWriteDurably(int fd, std::span<std::uint8_t> whole, std::size_t head_size,
                            std::size_t value_size);

// Lengthens the file and moves the last `length` bytes up by `by`, from the back in steps of
// 16 KiB; then WriteDurably() of `head`.
bool MoveUpAndWriteDurably(int fd, std::int64_t from, std::int64_t length, std::int64_t by,
                           std::span<const std::uint8_t> head);

}  // namespace mavoea::bench::floor

#endif  // MAVOEA_BENCH_FLOOR_H_
