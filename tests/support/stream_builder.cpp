#include "tests/support/stream_builder.h"

#include <cstdlib>

namespace mavoea::test {
namespace {

void CheckRange(std::size_t at, std::size_t size, std::size_t limit) {
    if (at > limit || limit - at < size) abort();
}

void Add16(Bytes* out, std::uint32_t value) {
    out->push_back(static_cast<std::uint8_t>(value >> 8 & 0xFF));
    out->push_back(static_cast<std::uint8_t>(value & 0xFF));
}

void Add32(Bytes* out, std::uint32_t value) {
    Add16(out, value >> 16);
    Add16(out, value);
}

void Add(Bytes* out, const Bytes& bytes) { out->insert(out->end(), bytes.begin(), bytes.end()); }

void AddDescriptor(Bytes* out, std::uint32_t id, std::uint32_t offset, std::size_t length) {
    Add32(out, id);
    Add32(out, offset);
    Add32(out, static_cast<std::uint32_t>(length));
}

}  // namespace

std::uint16_t U16At(std::span<const std::uint8_t> bytes, std::size_t at) {
    CheckRange(at, 2, bytes.size());
    return static_cast<std::uint16_t>(bytes[at] << 8 | bytes[at + 1]);
}

std::uint32_t U32At(std::span<const std::uint8_t> bytes, std::size_t at) {
    CheckRange(at, 4, bytes.size());
    return std::uint32_t{U16At(bytes, at)} << 16 | U16At(bytes, at + 2);
}

void PutU16(std::span<std::uint8_t> bytes, std::size_t at, std::uint32_t value) {
    CheckRange(at, 2, bytes.size());
    bytes[at] = static_cast<std::uint8_t>(value >> 8 & 0xFF);
    bytes[at + 1] = static_cast<std::uint8_t>(value & 0xFF);
}

void PutU32(std::span<std::uint8_t> bytes, std::size_t at, std::uint64_t value) {
    CheckRange(at, 4, bytes.size());
    PutU16(bytes, at, static_cast<std::uint32_t>(value >> 16 & 0xFFFF));
    PutU16(bytes, at + 2, static_cast<std::uint32_t>(value & 0xFFFF));
}

Bytes Pattern(std::size_t count, std::uint8_t seed) {
    Bytes bytes(count);
    for (std::size_t i = 0; i < count; ++i) {
        bytes[i] = static_cast<std::uint8_t>(i % 251 + i / 251 * 7 + seed * 31u + 1);
    }
    return bytes;
}

std::uint32_t RecordSize(std::size_t name_length) {
    std::size_t size = 11 + name_length;
    while (size % 4 != 0) ++size;
    return static_cast<std::uint32_t>(size);
}

std::uint32_t StreamImage::TableSize() const {
    return static_cast<std::uint32_t>(RecordAt(attributes.size()) - kTableAt);
}

std::uint32_t StreamImage::DataLength() const {
    std::size_t length = 0;
    for (const Attribute& attribute : attributes) length += attribute.value.size();
    return static_cast<std::uint32_t>(length);
}

std::size_t StreamImage::RecordAt(std::size_t index) const {
    std::size_t at = kTableAt;
    for (std::size_t i = 0; i < index; ++i) at += RecordSize(attributes[i].name.size() + 1);
    return at;
}

std::uint32_t StreamImage::ValueAt(std::size_t index) const {
    std::size_t at = DataStart();
    for (std::size_t i = 0; i < index; ++i) at += attributes[i].value.size();
    return static_cast<std::uint32_t>(at);
}

Bytes StreamImage::Build() const {
    Bytes out;
    out.reserve(End());
    Add32(&out, magic);
    Add32(&out, version);
    Add(&out, filler);
    Add16(&out, descriptor_count);
    if (fork_first) AddDescriptor(&out, 2, TotalSize(), fork.size());
    AddDescriptor(&out, 9, kFinderInfoAt, TotalSize() - kFinderInfoAt);
    if (!fork_first) AddDescriptor(&out, 2, TotalSize(), fork.size());
    Add(&out, finder_info);
    Add16(&out, pad);
    Add(&out, attribute_magic);
    Add32(&out, debug_tag);
    Add32(&out, TotalSize());
    Add32(&out, DataStart());
    Add32(&out, DataLength());
    Add(&out, reserved);
    Add16(&out, flags);
    Add16(&out, static_cast<std::uint32_t>(attributes.size()));
    if (out.size() != kTableAt) abort();

    std::size_t value_at = DataStart();
    for (const Attribute& attribute : attributes) {
        const std::size_t record_at = out.size();
        Add32(&out, static_cast<std::uint32_t>(value_at));
        Add32(&out, static_cast<std::uint32_t>(attribute.value.size()));
        Add16(&out, attribute.flags);
        out.push_back(static_cast<std::uint8_t>(attribute.name.size() + 1));
        Add(&out, Ascii(attribute.name));
        out.push_back(0);
        while ((out.size() - record_at) % 4 != 0) out.push_back(0);
        value_at += attribute.value.size();
    }
    out.resize(out.size() + gap);
    for (const Attribute& attribute : attributes) Add(&out, attribute.value);
    out.resize(out.size() + slack);
    Add(&out, fork);
    return out;
}

Bytes PlainAppleDouble(const Bytes& finder_info, const Bytes& fork, unsigned count) {
    const std::uint32_t finder_at = 26 + 12 * count;
    Bytes out;
    Add32(&out, 0x00051607);
    Add32(&out, 0x00020000);
    out.resize(24);
    Add16(&out, count);
    AddDescriptor(&out, 9, finder_at, 32);
    AddDescriptor(&out, 2, finder_at + 32, fork.size());
    for (unsigned i = 2; i < count; ++i) {
        AddDescriptor(&out, 0x100 + i, static_cast<std::uint32_t>(finder_at + 32 + fork.size()), 0);
    }
    Add(&out, finder_info);
    Add(&out, fork);
    return out;
}

}  // namespace mavoea::test
