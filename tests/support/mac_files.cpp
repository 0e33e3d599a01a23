#include "tests/support/mac_files.h"

#include <stdlib.h>

#include <algorithm>
#include <filesystem>
#include <utility>

#include "tests/support/stream_builder.h"

namespace mavoea::test {
namespace {

const Bytes& BlankForkText() {
    static const Bytes& text = *new Bytes(Ascii("This resource fork intentionally left blank   "));
    return text;
}

Bytes Big32(std::uint64_t value) {
    Bytes bytes(4);
    PutU32(bytes, 0, value);
    return bytes;
}

Bytes Descriptor(std::uint32_t id, std::size_t offset, std::size_t length) {
    return Big32(id) + Big32(offset) + Big32(length);
}

Bytes Part(const Bytes& bytes, std::size_t at, std::size_t length) {
    if (at > bytes.size() || length > bytes.size() - at) abort();
    const auto begin = bytes.begin() + static_cast<std::ptrdiff_t>(at);
    return Bytes(begin, begin + static_cast<std::ptrdiff_t>(length));
}

// Overwrites what is there; the file must be long enough.
void Put(Bytes* file, std::size_t at, const Bytes& bytes) {
    if (at > file->size() || bytes.size() > file->size() - at) abort();
    std::copy(bytes.begin(), bytes.end(), file->begin() + static_cast<std::ptrdiff_t>(at));
}

}  // namespace

Bytes MacFile::ForkInUse() const {
    const Bytes& fork = contents.fork;
    if (fork.size() > 62 && Part(fork, 16, 46) == BlankForkText()) return {};
    return fork;
}

void PrintTo(const MacFile& file, std::ostream* out) { *out << file.layout; }

Bytes BlankFork() {
    // A header (data at 256, map at 256, no data, 30 bytes of map), the area for the system's and
    // the application's own use, and the map: the header again, next map, file, attributes, type
    // list at 28, name list at 30, number of types less 1.
    return Hex("00 00 01 00  00 00 01 00  00 00 00 00  00 00 00 1E") + BlankForkText() +
           Repeat(0, 194) +
           Hex("00 00 01 00  00 00 01 00  00 00 00 00  00 00 00 1E"
               "00 00 00 00  00 00  00 00  00 1C  00 1E  FF FF");
}

MacFile MacSidecar(MacContents contents) {
    std::size_t data_start = 120;
    std::size_t data_length = 0;
    for (const auto& [name, value] : contents.attributes) {
        data_start += RecordSize(name.size() + 1);
        data_length += value.size();
    }
    const std::size_t fork_at = std::max(kMacForkAt, data_start + data_length);

    Bytes file = Hex("00 05 16 07  00 02 00 00 'Mac OS X        ' 00 02") +
                 Descriptor(9, 50, fork_at - 50) + Descriptor(2, fork_at, contents.fork.size()) +
                 contents.finder_info + Hex("00 00 'ATTR' 00 12 34 56") + Big32(fork_at) +
                 Big32(data_start) + Big32(data_length) + Repeat(0, 12) + Hex("00 00 00 00");
    PutU16(file, 118, static_cast<std::uint32_t>(contents.attributes.size()));
    std::size_t value_at = data_start;
    for (const auto& [name, value] : contents.attributes) {
        Bytes record = Big32(value_at) + Big32(value.size()) + Hex("00 00") +
                       Bytes{static_cast<std::uint8_t>(name.size() + 1)} + Ascii(name);
        record.resize(RecordSize(name.size() + 1));
        file = std::move(file) + record;
        value_at += value.size();
    }
    for (const auto& [name, value] : contents.attributes) file = std::move(file) + value;
    file.resize(fork_at);
    file = std::move(file) + contents.fork;
    return {"a Mac's sidecar", std::move(file), std::move(contents)};
}

MacFile MacSidecarWithBlankFork(MacContents contents) {
    contents.fork = BlankFork();
    MacFile file = MacSidecar(std::move(contents));
    file.layout = "a Mac's sidecar with a blank fork";
    return file;
}

MacFile ClassicFile(const Bytes& finder_info, const Bytes& fork) {
    return {"the classic two entries",
            Hex("00 05 16 07  00 02 00 00  00*16  00 02") + Descriptor(9, 50, 32) +
                Descriptor(2, 82, fork.size()) + finder_info + fork,
            {{}, finder_info, fork}};
}

MacFile ThirteenEntryFile(const Bytes& finder_info, const Bytes& fork) {
    // 182 bytes of head; then Finder info at 214 among the entries; the fork at 262.
    return {"thirteen entries",
            Hex("00 05 16 07  00 02 00 00 'Macintosh       ' 00 0D") +
                Descriptor(2, 262, fork.size()) +  // resource fork
                Descriptor(3, 182, 6) +            // name
                Descriptor(4, 188, 0) +            // comment
                Descriptor(5, 188, 0) +            // icon
                Descriptor(6, 188, 0) +            // colour icon
                Descriptor(8, 188, 16) +           // file dates
                Descriptor(10, 204, 4) +           // Macintosh file info
                Descriptor(11, 246, 8) +           // ProDOS file info
                Descriptor(12, 254, 2) +           // MS-DOS file info
                Descriptor(13, 208, 6) +           // short name
                Descriptor(14, 256, 4) +           // AFP file info
                Descriptor(9, 214, 32) +           // Finder info
                Descriptor(15, 260, 2) +           // directory id
                Ascii("object") + Repeat(0x22, 16) + Repeat(0x33, 4) + Ascii("OBJECT") +
                finder_info + Repeat(0x44, 8) + Repeat(0x55, 2) + Repeat(0x66, 4) +
                Repeat(0x77, 2) + fork,
            {{}, finder_info, fork}};
}

MacFile NetatalkFile(const Bytes& finder_info, const Bytes& fork) {
    Bytes file = Hex("00 05 16 07  00 02 00 00 'Netatalk        ' 00 0D") +
                 Descriptor(3, 182, 6) +                     // name, room for 255
                 Descriptor(4, 437, 7) +                     // comment, room for 200
                 Descriptor(8, 637, 16) +                    // file dates
                 Descriptor(9, 653, 32) +                    // Finder info
                 Descriptor(15, 685, 4) +                    // directory id
                 Descriptor(14, 689, 4) +                    // AFP file info
                 Descriptor(13, 693, 0) +                    // short name, room for 12
                 Descriptor(11, 705, 8) +                    // ProDOS file info
                 Descriptor(0x80444556, 713, 8) +            // private: device
                 Descriptor(0x80494E4F, 721, 8) +            // inode
                 Descriptor(0x8053594E, 729, 8) +            // sync
                 Descriptor(0x8053567E, 737, 4) +            // id
                 Descriptor(2, kNetatalkHead, fork.size());  // resource fork
    file.resize(kNetatalkHead);
    Put(&file, 182, Ascii("object"));
    Put(&file, 437, Ascii("comment"));
    Put(&file, 637, Repeat(0x11, 16));
    Put(&file, 653, finder_info);
    Put(&file, 685, Hex("00 00 00 02  00 00 00 20"));
    Put(&file, 713, Pattern(28, 0x70));
    return {"netatalk's head", std::move(file) + fork, {{}, finder_info, fork}};
}

std::vector<MacFile> AllMacFiles() {
    const std::map<std::string, Bytes> attributes = {
        {"com.apple.FinderComment", Pattern(700, 3)},
        {"com.apple.empty", {}},
        {"com.apple.quarantine", Ascii("0083;00000000;;")},
        {"x", Pattern(1, 4)},
        {"\xC3\xA4rger/\xE2\x82\xAC", Ascii("a name of more than ASCII")},
    };
    std::vector<MacFile> files = {
        MacSidecar({attributes, Pattern(32, 1), Pattern(40000, 2)}),
        MacSidecar({{}, Pattern(32, 5), Ascii("resource fork")}),
        MacSidecar({{{"large", Pattern(100000, 6)}}, Pattern(32, 7), Pattern(300, 8)}),
        MacSidecarWithBlankFork({attributes, Pattern(32, 9), {}}),
        MacSidecarWithBlankFork({}),
        ClassicFile(Pattern(32, 10), Pattern(40000, 11)),
        ClassicFile(Pattern(32, 12), BlankFork()),
        ClassicFile(Pattern(32, 13), {}),
        ThirteenEntryFile(Pattern(32, 14), Pattern(16385, 15)),
        NetatalkFile(Pattern(32, 16), Pattern(20000, 17)),
        NetatalkFile(Pattern(32, 18), {}),
    };
    files[1].layout += " without attributes";
    files[2].layout += " with more than its room";
    files[4].layout += " and nothing else";
    files[6].layout += " with a blank fork";
    files[7].layout += " without a fork";
    files[10].layout += " without a fork";
    return files;
}

std::map<std::uint32_t, Bytes> EntriesOf(const Bytes& bytes) {
    std::map<std::uint32_t, Bytes> entries;
    const std::size_t end = 26 + std::size_t{12} * U16At(bytes, 24);
    for (std::size_t at = 26; at < end; at += 12) {
        const std::uint32_t id = U32At(bytes, at);
        const std::uint32_t length = U32At(bytes, at + 8);
        constexpr std::uint32_t kPrivate = 0x80000000;
        if (id == 2 || id == 9 || id >= kPrivate || length == 0) continue;
        entries[id] = Part(bytes, U32At(bytes, at + 4), length);
    }
    return entries;
}

std::optional<MacContents> ReadMacFile(const Bytes& bytes) {
    const auto holds = [&bytes](std::uint64_t at, std::uint64_t length) {
        return at <= bytes.size() && length <= bytes.size() - at;
    };
    if (!holds(0, 26) || U32At(bytes, 0) != 0x00051607) return std::nullopt;
    const std::size_t count = U16At(bytes, 24);
    if (!holds(26, 12 * count)) return std::nullopt;

    MacContents contents;
    std::size_t finder_length = 0;
    for (std::size_t at = 26; at < 26 + 12 * count; at += 12) {
        const std::uint32_t id = U32At(bytes, at);
        const std::uint32_t offset = U32At(bytes, at + 4);
        const std::uint32_t length = U32At(bytes, at + 8);
        if (id != 9 && id != 2) continue;
        if (!holds(offset, length)) return std::nullopt;
        if (id == 2) contents.fork = Part(bytes, offset, length);
        if (id != 9) continue;
        if (length < 32) return std::nullopt;
        contents.finder_info = Part(bytes, offset, 32);
        finder_length = length;
    }

    if (finder_length < 70 || !holds(84, 36) || U32At(bytes, 84) != 0x41545452) return contents;
    std::size_t at = 120;
    for (std::size_t left = U16At(bytes, 118); left > 0; --left) {
        if (!holds(at, 11) || !holds(at + 11, bytes[at + 10]) || bytes[at + 10] == 0) {
            return std::nullopt;
        }
        const std::size_t name_length = bytes[at + 10];
        const Bytes name = Part(bytes, at + 11, name_length - 1);
        const std::uint32_t offset = U32At(bytes, at);
        const std::uint32_t length = U32At(bytes, at + 4);
        if (!holds(length == 0 ? 0 : offset, length)) return std::nullopt;
        contents.attributes[std::string(name.begin(), name.end())] =
            length == 0 ? Bytes() : Part(bytes, offset, length);
        at += RecordSize(name_length);
    }
    return contents;
}

std::vector<SampleFile> SampleFiles() {
    namespace fs = std::filesystem;
    std::vector<SampleFile> samples;
    if (!fs::is_directory(MAVOEA_SHARED_DATA)) return samples;
    for (const auto& entry : fs::recursive_directory_iterator(MAVOEA_SHARED_DATA)) {
        if (!entry.is_regular_file() || entry.path().extension() != ".bin") continue;
        Bytes bytes = ReadFile(entry.path().string());
        std::optional<MacContents> contents = ReadMacFile(bytes);
        samples.push_back({fs::relative(entry.path(), MAVOEA_SHARED_DATA).string(),
                           std::move(bytes), std::move(contents)});
    }
    std::ranges::sort(samples, {}, &SampleFile::name);
    return samples;
}

}  // namespace mavoea::test
