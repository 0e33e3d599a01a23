// A stream's layout: what its rewrites start from, and the bytes that they put on disk.
#ifndef MAVOEA_STREAM_LAYOUT_H_
#define MAVOEA_STREAM_LAYOUT_H_

#include <cstdint>
#include <utility>

#include "format/ea_stream.h"
#include "include/mavoea.h"
#include "util/owned.h"
#include "util/unit.h"

namespace mavoea {

inline StreamHeader LoadHeader(const EASHandle& h) { return DecodeStreamHeader(h.header); }
inline void StoreHeader(const StreamHeader& header, EASHandle* h) {
    EncodeStreamHeader(header, h->header);
}

// The attributes in use, from the header's count.
std::span<EASEntry> Attributes(const EASHandle& h);

// The index of the last attribute of that name, -1 when there is none.
int FindAttribute(const EASHandle& h, const char* name);

// Where the table of h's attributes ends.
std::uint64_t TableEnd(const EASHandle& h);

// Whether the table, and where `data` says that the values lie, fit together: values must lie one
// behind the other in table order; between table and values there may be a gap.
enum class Fit {
    kNot,
    kBarEmpty,  // but an empty value has an offset that its place does not call for
    kAll,
};
Fit FitTogether(const EASHandle& h, Range data);

// What a rewrite starts from: h's header and the file's size, once offsets, lengths and counts have
// been found to fit together and to lie in the file. Empty values, whose offset means nothing, are
// given the one that their place calls for. 0, or -1 after recording 0xA00 for `unit`.
struct Survey {
    StreamHeader header;
    std::uint64_t file_size = 0;
};
int SurveyTable(EASHandle* h, const Unit& unit, Survey* found, int line = __builtin_LINE());

// Where the resource fork lies, and how many of its bytes are there. 0, or -1 after recording 0xA00
// for `unit`: it does not lie where the layout puts it, and would be moved from a guess; or as
// EASGetRForkRange().
int SurveyFork(EASHandle* h, const Survey& survey, const Unit& unit, Range* fork,
               int line = __builtin_LINE());

// Both, for what moves the fork.
inline int SurveyStream(EASHandle* h, const Unit& unit, Survey* survey, Range* fork,
                        int line = __builtin_LINE()) {
    if (SurveyTable(h, unit, survey, line) != 0) return -1;
    return SurveyFork(h, *survey, unit, fork, line);
}

// The room that a file needs to grow, taken before anything in it changes: a rewrite that a full
// volume stops half-way would cost what the file had. Given back when it goes out of scope, unless
// the rewrite has made it the file's.
class Room {
 public:
    Room() = default;
    ~Room();
    Room(const Room&) = delete;
    Room& operator=(const Room&) = delete;

    // Takes it from `from` to `to`. 0, or -1 after recording 0xB00 for `unit`, with errno ENOSPC,
    // EDQUOT or EFBIG; volumes that cannot reserve are gone on with.
    int Reserve(int fd, std::uint64_t from, std::uint64_t to, const Unit& unit,
                int line = __builtin_LINE());

    void Keep() { fd_ = -1; }

 private:
    int fd_ = -1;  // of the file that has some behind its end
};

// Whether a value of that length can be told by results.
constexpr bool IsValueLength(std::uint64_t length) { return std::in_range<int>(length); }

// Whether attributes that end there leave a fork of that length within a stream's 32-bit offsets.
bool FitsStream(std::uint64_t total_size, std::uint32_t fork_length);

// Streams up to this size, their fork left out, are rewritten whole: a part would cost as much, and
// one write within a page is never seen half-way.
constexpr std::uint64_t kSmallStream = std::uint64_t{1} << 16;

// A stream's bytes before its resource fork, put together in memory before anything on disk
// changes: header, table, values.
class StreamImage {
 public:
    explicit StreamImage(std::uint64_t end) : StreamImage(0, 0, end) {}

    // Without the values from `from`, where they begin, to `to`: they are as they are on disk.
    StreamImage(std::uint64_t from, std::uint64_t to, std::uint64_t end)
        : kept_(to - from),
          behind_(to),
          end_(end),
          bytes_(Owned<std::uint8_t>::Allocate(end - kept_)) {}

    bool ok() const { return static_cast<bool>(bytes_); }  // false: out of memory
    std::uint8_t* At(std::uint64_t offset) const {
        return bytes_.get() + (offset < behind_ ? offset : offset - kept_);
    }

    // Leaves out what lies behind `end`.
    void Cut(std::uint64_t end) { end_ = end; }

    // Makes `header` h's, with the sizes that follow from its data, and puts it and h's table into
    // the image. What lies between table and values is cleared. The values of the table have moved
    // up by `moved` bytes, which its offsets then do, too.
    void PutHead(StreamHeader header, EASHandle* h, std::uint32_t moved = 0);

    // Where values are kept, the others are written before header and table: no record changes but
    // for the last one's length.
    void PutValuesFirst() { values_first_ = true; }

    // Writes the image: all at once, or, where values are kept, header and table, unless the file
    // has them, and the other values. 0, or -1 after recording 0xB00: for the header's unit when
    // not even header and table could be written, for `unit` otherwise.
    int Write(int fd, const Unit& unit, int line = __builtin_LINE()) const;

 private:
    ByteView all() const { return {bytes_.get(), static_cast<std::size_t>(end_ - kept_)}; }
    ByteView head() const { return all().first(static_cast<std::size_t>(head_size_)); }
    int WriteHead(int fd) const;
    int WriteValues(int fd, const Unit& unit, int line) const;

    std::uint64_t kept_;    // values, in bytes
    std::uint64_t behind_;  // those, in the file
    std::uint64_t end_;
    Owned<std::uint8_t> bytes_;
    std::uint64_t head_size_ = 0;
    bool values_first_ = false;
};

// MAVOEASUpdateEntry() for a stream that has been surveyed, in its two steps. The first reads the
// values into a `to` that is large enough, and records failures for its own unit. The second
// changes memory: what it changes in the header is in *header, for the caller to store.
int GatherValues(const EASHandle& h, Range data, unsigned index, std::uint8_t* to, bool remove);
void MoveEntry(EASHandle* h, StreamHeader* header, unsigned index, bool remove);

// How much shorter MAVOEASUpdateEntry() makes the table when it removes a record. Computed in 8
// bits, which is too little for names of more than 240 bytes: a gap of 256 bytes then stays between
// table and values. Streams in the field have it, so it is kept.
constexpr std::uint32_t RemovedRecordSize(std::uint8_t name_size) {
    return RecordSize(name_size) & 0xFC;
}
static_assert(RemovedRecordSize(241) == RecordSize(241) && RemovedRecordSize(242) == 0);

}  // namespace mavoea

#endif  // MAVOEA_STREAM_LAYOUT_H_
