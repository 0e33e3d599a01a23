// BinHex 4.0: a Mac's file as text. From Yves Lempereur's description and RFC 1741; all integers
// are big-endian.
//
// Behind a line that says so, and between two ':', each character tells six bits. Of the bytes that
// these make, 0x90 and a count say how often the byte before stands there in a row, 0x90 and a zero
// say 0x90. What comes out is
//
//   size  field
//      1  n            1 to 63
//      n  name         Mac OS Roman
//      1  0
//      8  type and creator
//      2  Finder flags
//      4  data fork's length
//      4  resource fork's length
//      2  checksum of all that, see crc16.h
//     ..  data fork, and its checksum of 2 bytes
//     ..  resource fork, and its checksum of 2 bytes
#ifndef MAVOEA_FORMAT_BIN_HEX_H_
#define MAVOEA_FORMAT_BIN_HEX_H_

#include <array>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string_view>

#include "format/apple_double.h"
#include "format/crc16.h"

namespace mavoea {

inline constexpr std::string_view kBinHexLine = "(This file must be converted with BinHex 4.0)";
inline constexpr std::size_t kBinHexNameMax = 63;

struct BinHexHead {
    std::array<char, kBinHexNameMax> name_bytes{};
    std::uint8_t name_size = 0;
    std::array<std::uint8_t, 10> finder_info{};  // its first bytes: type, creator, flags
    std::uint32_t data_length = 0;
    std::uint32_t resource_length = 0;

    std::string_view name() const { return {name_bytes.data(), name_size}; }
};

// Reads a text, which stays where it is, from front to back: the head, then as many bytes as it
// says of the data fork, EndPart(), those of the resource fork, EndPart().
class BinHexReader {
 public:
    // What stands in front of the line is passed over.
    explicit BinHexReader(ByteView text);

    // None of a text that is none, or is damaged.
    std::optional<BinHexHead> ReadHead();

    // Fills all of `to`; false where the text is damaged or over.
    [[nodiscard]] bool Read(ByteSpan to);

    // Whether what was read since the last part's end has the checksum that follows.
    [[nodiscard]] bool EndPart();

 private:
    std::optional<std::uint8_t> Packed();
    std::optional<std::uint8_t> Unpacked();

    ByteView left_;
    std::uint32_t bits_ = 0;
    unsigned bit_count_ = 0;
    std::optional<std::uint8_t> last_;  // what a run repeats
    unsigned repeats_ = 0;
    std::uint16_t crc_ = 0;
};

// Writes a text, in the same order. `put` takes a character at a time.
template <class Put>
class BinHexWriter {
 public:
    explicit BinHexWriter(Put put) : put_(put) {}

    // False, and nothing is written, of a name that has no place.
    [[nodiscard]] bool WriteHead(const BinHexHead& head);
    void Write(ByteView bytes);
    void EndPart();
    void EndText();

 private:
    static constexpr std::size_t kLineSize = 64;

    void PutLine(char c);
    void PutByte(std::uint8_t byte);
    void PutRun();

    Put put_;
    std::size_t column_ = 0;
    std::uint32_t bits_ = 0;
    unsigned bit_count_ = 0;
    std::uint8_t last_ = 0;
    unsigned run_ = 0;  // how many of `last_` are still to be written
    std::uint16_t crc_ = 0;
};

// ---- The writer ---------------------------------------------------------------------------------

inline constexpr std::string_view kBinHexDigits =
    "!\"#$%&'()*+,-012345689@ABCDEFGHIJKLMNPQRSTUVXYZ[`abcdefhijklmpqr";
static_assert(kBinHexDigits.size() == 64);
inline constexpr std::uint8_t kBinHexRun = 0x90;
inline constexpr std::size_t kBinHexHeadMax = 1 + kBinHexNameMax + 1 + 10 + 4 + 4;

template <class Put>
bool BinHexWriter<Put>::WriteHead(const BinHexHead& head) {
    if (head.name_size < 1 || head.name_size > kBinHexNameMax) return false;
    for (const char c : kBinHexLine) put_(c);
    put_('\n');
    PutLine(':');
    std::array<std::uint8_t, kBinHexHeadMax> bytes{};
    BeWriter out(bytes);
    out.U8(head.name_size);
    for (const char c : head.name()) out.U8(static_cast<std::uint8_t>(c));
    out.U8(0);
    out.Copy(head.finder_info);
    out.U32(head.data_length);
    out.U32(head.resource_length);
    Write(ByteView(bytes).first(kBinHexHeadMax - kBinHexNameMax + head.name_size));
    EndPart();
    return true;
}

template <class Put>
void BinHexWriter<Put>::Write(ByteView bytes) {
    crc_ = Crc16(bytes, crc_);
    for (const std::uint8_t byte : bytes) {
        if (run_ != 0 && byte == last_ && run_ < UINT8_MAX) {
            ++run_;
            continue;
        }
        PutRun();
        last_ = byte;
        run_ = 1;
    }
}

template <class Put>
void BinHexWriter<Put>::EndPart() {
    std::array<std::uint8_t, 2> bytes{};
    StoreBe16(crc_, bytes.data());
    Write(bytes);  // which brings the checksum back to 0
}

template <class Put>
void BinHexWriter<Put>::EndText() {
    PutRun();
    run_ = 0;
    if (bit_count_ != 0) PutLine(kBinHexDigits[bits_ << (6 - bit_count_) & 63]);
    PutLine(':');
    put_('\n');
}

template <class Put>
void BinHexWriter<Put>::PutLine(char c) {
    if (column_ == kLineSize) {
        put_('\n');
        column_ = 0;
    }
    put_(c);
    ++column_;
}

template <class Put>
void BinHexWriter<Put>::PutByte(std::uint8_t byte) {
    bits_ = bits_ << 8 | byte;
    bit_count_ += 8;
    while (bit_count_ >= 6) {
        bit_count_ -= 6;
        PutLine(kBinHexDigits[bits_ >> bit_count_ & 63]);
    }
}

template <class Put>
void BinHexWriter<Put>::PutRun() {
    // A run takes two bytes more than the byte itself.
    const unsigned singles = run_ > 3 ? 1 : run_;
    for (unsigned i = 0; i < singles; ++i) {
        PutByte(last_);
        if (last_ == kBinHexRun) PutByte(0);
    }
    if (singles < run_) {
        PutByte(kBinHexRun);
        PutByte(static_cast<std::uint8_t>(run_));
    }
}

}  // namespace mavoea

#endif  // MAVOEA_FORMAT_BIN_HEX_H_
