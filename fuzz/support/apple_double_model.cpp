#include "fuzz/support/apple_double_model.h"

#include <algorithm>
#include <string_view>

namespace mavoea::fuzz {
namespace {

constexpr std::string_view kBlankText = "This resource fork intentionally left blank   ";

void Append(Bytes* to, View bytes) { to->insert(to->end(), bytes.begin(), bytes.end()); }

void Append32(Bytes* to, std::uint32_t value) {
    for (int shift = 24; shift >= 0; shift -= 8) {
        to->push_back(static_cast<std::uint8_t>(value >> shift));
    }
}

// What the file has of a range.
View Part(View file, std::uint64_t at, std::uint64_t length) {
    if (at >= file.size()) return {};
    return file.subspan(at, std::min<std::uint64_t>(length, file.size() - at));
}

bool IsBlank(View file, const Descriptor& fork) {
    const View text = Part(file, std::uint64_t{fork.offset} + 16, kBlankText.size());
    return fork.length > 62 && text.size() == kBlankText.size() &&
           std::equal(text.begin(), text.end(), kBlankText.begin());
}

}  // namespace

bool Holds(View bytes, std::uint64_t at, std::uint64_t length) {
    return at <= bytes.size() && length <= bytes.size() - at;
}

std::uint32_t Field32(View bytes, std::uint64_t at) {
    std::uint32_t value = 0;
    for (std::uint64_t i = at; i < at + 4; ++i) {
        value = value << 8 | (i < bytes.size() ? bytes[i] : 0U);
    }
    return value;
}

std::uint16_t Field16(View bytes, std::uint64_t at) {
    return static_cast<std::uint16_t>(Field32(bytes, at) >> 16);
}

std::optional<std::vector<Descriptor>> DescriptorsOf(View file) {
    const std::size_t count = Field16(file, 24);
    if (!Holds(file, 0, 26 + 12 * count)) return std::nullopt;
    std::vector<Descriptor> found;
    for (std::size_t at = 26; at < 26 + 12 * count; at += 12) {
        found.push_back({Field32(file, at), Field32(file, at + 4), Field32(file, at + 8)});
    }
    return found;
}

std::optional<Bytes> Rewritten(View file) {
    const auto descriptors = DescriptorsOf(file);
    if (!descriptors || Field32(file, 4) != 0x00020000) return std::nullopt;
    if (descriptors->size() != 2 && descriptors->size() != 13) return std::nullopt;

    Bytes made(file.begin(), file.begin() + 24);
    Append(&made, Bytes{0, 2});
    const Descriptor* finder_info = nullptr;
    const Descriptor* fork = nullptr;
    std::uint32_t fork_length = 0;
    for (const Descriptor& entry : *descriptors) {
        if (entry.id != 9 && entry.id != 2) continue;
        const Descriptor** const seen = entry.id == 9 ? &finder_info : &fork;
        if (*seen != nullptr) return std::nullopt;
        *seen = &entry;
        if (entry.id == 2) fork_length = IsBlank(file, entry) ? 0 : entry.length;
        Append32(&made, entry.id);
        Append32(&made, entry.id == 9 ? 50 : 82);
        Append32(&made, entry.id == 9 ? 32 : fork_length);
    }
    if (finder_info == nullptr || fork == nullptr) return std::nullopt;
    Append(&made, Part(file, finder_info->offset, 32));
    made.resize(82);
    Append(&made, Part(file, fork->offset, fork_length));
    return made;
}

OpenedStream OpenStreamHeader(View file) {
    OpenedStream opened;
    if (file.empty()) {
        opened.finder_info_offset = 50;
        opened.has_finder_info = true;
        return opened;
    }
    constexpr int kBadArgument = 0xD00;
    constexpr int kRead = 0xA00;
    if (!Holds(file, 0, 26)) return {.code = kRead};
    if (Field16(file, 24) > 13) return {.code = kBadArgument};
    const auto descriptors = DescriptorsOf(file);
    if (!descriptors) return {.code = kRead};
    Descriptor finder_info;
    for (const Descriptor& entry : *descriptors) {
        if (entry.id == 9) finder_info = entry;
    }
    opened.has_finder_info = finder_info.id == 9;
    opened.finder_info_offset = finder_info.offset;
    if (!Holds(file, finder_info.offset, 32)) return {.code = kRead};
    std::copy_n(file.begin() + finder_info.offset, 32, opened.finder_info.begin());
    if (finder_info.length == 32) return opened;
    if (!Holds(file, 82, 38)) return {.code = kRead};
    opened.attribute_count = Field16(file, 118);
    return opened;
}

OpenedStream OpenStream(View file) {
    OpenedStream opened = OpenStreamHeader(file);
    std::uint64_t at = 120;
    for (unsigned i = 0; i < opened.attribute_count; ++i) {
        if (!Holds(file, at, 11) || !Holds(file, at + 11, file[at + 10])) return {.code = 0xA00};
        const std::uint64_t name_size = file[at + 10];
        const View name = file.subspan(at + 11, name_size);
        opened.table.push_back({{name.begin(), std::find(name.begin(), name.end(), 0)},
                                Field32(file, at),
                                Field32(file, at + 4)});
        at += (name_size + 14) / 4 * 4;
    }
    return opened;
}

int Import(View file, const std::vector<TableEntry>& table, Attributes* to) {
    int failures = 0;
    for (const TableEntry& entry : table) {
        const bool in_file = entry.length == 0 || Holds(file, entry.offset, entry.length);
        if (!in_file || entry.name.size() > 254) {
            ++failures;
            continue;
        }
        const View bytes = entry.length == 0 ? View() : file.subspan(entry.offset, entry.length);
        (*to)[entry.name] = Bytes(bytes.begin(), bytes.end());
    }
    return failures;
}

}  // namespace mavoea::fuzz
