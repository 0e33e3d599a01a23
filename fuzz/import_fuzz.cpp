// AppleDouble files from anywhere: the check of a "._" file, opening it as a stream, counting,
// rewriting it, moving its attributes into a stream, repairing a resource file. One input is one
// such file, which goes through all of that.

#include <fcntl.h>
#include <string.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <string_view>

#include "fuzz/support/apple_double_model.h"
#include "fuzz/support/volume.h"
#include "include/mavoea.h"
#include "ops/ea_copy_adouble.h"
#include "platform/include/mavocore.h"
#include "stream/internal.h"
#include "tests/support/mac_files.h"
#include "tests/support/stream_builder.h"

namespace mavoea::fuzz {
namespace {

struct Places {
    std::string object = Folder() + "/object";
    std::string apple_double = Folder() + "/._object";
    std::string nameless = Folder() + "/._";
    std::string copy = Folder() + "/copy";
    std::string ea_dir = Folder() + "/@eaDir";
    std::string resource = ea_dir + "/object@MavoResource";
    std::string temporary = resource + "Tmp";
    std::string stream = ea_dir + "/object@MavoEAStream";

    Places() {
        if (mkdir(ea_dir.c_str(), 0777) != 0) Fail("no EA directory");
    }
};
const Places& At() {
    static const Places places;
    return places;
}

// What an input says beside the file.
struct Choices {
    enum class Stream { kMissing, kEmpty, kFilled, kInput };

    bool companion;
    Stream stream;
    bool old_copy;  // something longer is where the rewritten file goes
    int mode;       // of EACopyAdoubleV2() when it copies the file as it is

    explicit Choices(std::uint8_t bits)
        : companion((bits & 1) != 0),
          stream(static_cast<Stream>(bits >> 1 & 3)),
          old_copy((bits & 8) != 0),
          mode((bits & 16) != 0 ? kCopy : kCopyChecked) {}
};

// The stream that attributes are moved into: one of its names is a likely one.
const test::StreamImage& FilledStream() {
    static const test::StreamImage& image = *new test::StreamImage{
        .attributes = {{"kept", test::Pattern(20, 1)}, {"a", test::Pattern(5, 2), 7}},
        .fork = test::Pattern(50, 3),
        .finder_info = test::Pattern(32, 4)};
    return image;
}

Bytes DestinationBytes(const Choices& choices, View file) {
    static const Bytes filled = FilledStream().Build();
    if (choices.stream == Choices::Stream::kFilled) return filled;
    if (choices.stream == Choices::Stream::kInput) return Bytes(file.begin(), file.end());
    return {};
}

// What a stream that the library has written must hold: those attributes, and all else as before.
void ExpectStream(const char* what, const Bytes& stream, const Choices& choices,
                  const Attributes& attributes) {
    if (stream.empty()) {
        if (!attributes.empty()) Fail("%s: an empty stream", what);
        return;
    }
    const auto contents = test::ReadMacFile(stream);
    if (!contents) Fail("%s: the stream does not fit together", what);
    if (contents->attributes != attributes) Fail("%s: other attributes", what);
    const test::MacContents none;
    const bool filled = choices.stream == Choices::Stream::kFilled;
    if (contents->finder_info != (filled ? FilledStream().finder_info : none.finder_info) ||
        contents->fork != (filled ? FilledStream().fork : none.fork)) {
        Fail("%s: Finder info or fork", what);
    }
}

Attributes AttributesBefore(const Choices& choices) {
    Attributes before;
    if (choices.stream == Choices::Stream::kFilled) {
        for (const auto& attribute : FilledStream().attributes) {
            before[attribute.name] = attribute.value;
        }
    }
    return before;
}

void ExpectCode(const char* what, bool failed, const std::vector<int>& codes) {
    if (failed && codes.empty()) Fail("%s: failed with no code", what);
    if (!failed && !codes.empty()) Fail("%s: a code 0x%X on success", what, unsigned(codes[0]));
}

// ---- One operation after the other --------------------------------------------------------------

void CheckFile(const std::string& path, View file, int expected) {
    constexpr std::uint8_t kMagic[] = {0, 5, 0x16, 7};
    if (file.size() < 4 || !std::equal(kMagic, kMagic + 4, file.begin())) expected = -3;
    Call call("MAVOEACheckADFile");
    const int result = MAVOEACheckADFile(path.c_str());
    ExpectCode("MAVOEACheckADFile", false, call.End(MemoryFor(file.size())));
    if (result != expected) Fail("MAVOEACheckADFile: %d, not %d", result, expected);
}

void Check(View file, const Choices& choices) {
    if (choices.companion) {
        Put(At().object, {});
    } else {
        unlink(At().object.c_str());
    }
    Put(At().apple_double, file);
    CheckFile(At().apple_double, file, choices.companion ? 0 : -4);
    Put(At().nameless, file);
    CheckFile(At().nameless, file, -4);
    Call call("MAVOEACheckADFile");
    const int result = MAVOEACheckADFile(At().object.c_str());
    ExpectCode("MAVOEACheckADFile", false, call.End(MemoryFor(0)));
    if (result != -2) Fail("MAVOEACheckADFile: %d for another name", result);
}

// Whether the entry that a search for its name finds is this one: the last.
bool IsLast(const std::vector<TableEntry>& table, std::size_t index) {
    return std::none_of(table.begin() + static_cast<std::ptrdiff_t>(index) + 1, table.end(),
                        [&](const TableEntry& entry) { return entry.name == table[index].name; });
}

// As "._" files are read: opened through the library, counted, then every attribute.
void Read(View file) {
    const OpenedStream header = OpenStreamHeader(file);
    const OpenedStream expected = OpenStream(file);
    std::vector<int> expected_codes;
    if (header.code != 0) expected_codes.push_back(header.code);
    if (expected.code != 0) expected_codes.push_back(expected.code);

    Call call("reading a stream");
    const int fd = MAVOEAOpen(EA_FORM_FILE, At().object.c_str(), MAVOEA_KIND_STREAM, O_RDONLY,
                              EA_PLACE_APPLEDOUBLE);
    if (fd < 0) Fail("MAVOEAOpen: there is a \"._\" file");
    const int count = EASGetEntryCount(fd);
    if (count != (header.code != 0 ? -1 : static_cast<int>(header.attribute_count))) {
        Fail("EASGetEntryCount: %d", count);
    }
    EASHandle* const h = MAVOEASOpen(fd, F_RDLCK);
    if ((h == nullptr) != (expected.code != 0)) Fail("MAVOEASOpen: handle or not");
    int refused = 0;
    for (std::size_t i = 0; i < expected.table.size(); ++i) {
        const TableEntry& entry = expected.table[i];
        const char* const name = entry.name.c_str();
        if (entry.name != h->entries[i].name) Fail("MAVOEASOpen: name %zu", i);
        if (!IsLast(expected.table, i)) continue;
        if (MAVOEASSearch(h, name) != static_cast<int>(i)) Fail("MAVOEASSearch: \"%s\"", name);
        std::uint8_t bytes[64];
        const int got = MAVOEASRead(h, name, bytes, sizeof bytes, 0);
        const std::uint32_t want = std::min<std::uint32_t>(entry.length, sizeof bytes);
        if (want != 0 && !Holds(file, entry.offset, want)) {
            if (got >= 0) Fail("MAVOEASRead: %d bytes of none", got);
            ++refused;
        } else if (got != static_cast<int>(want) ||
                   (want != 0 && memcmp(bytes, file.data() + entry.offset, want) != 0)) {
            Fail("MAVOEASRead: %d bytes of \"%s\"", got, name);
        }
    }
    if (h != nullptr && MAVOEASClose(h) != 0) Fail("MAVOEASClose");
    close(fd);
    const std::vector<int> codes = call.End(MemoryFor(file.size()));
    expected_codes.insert(expected_codes.end(), static_cast<std::size_t>(refused), 0xA00);
    if (codes != expected_codes) Fail("reading a stream: other codes");
}

void Rewrite(View file, const Choices& choices) {
    const Bytes old(choices.old_copy ? 6000 : 0, 0xAB);
    if (choices.old_copy) {
        Put(At().copy, old);
    } else {
        unlink(At().copy.c_str());
    }
    Call call("EACopyAdoubleV2");
    const int result = EACopyAdoubleV2(At().apple_double.c_str(), At().copy.c_str(), kRewrite);
    if (!call.End(MemoryFor(file.size())).empty()) Fail("EACopyAdoubleV2: records none");
    const auto made = Get(At().copy);
    const auto expected = Rewritten(file);

    if (file.empty()) {
        if (result != 0) Fail("EACopyAdoubleV2: %d for an empty file", result);
        if (made != (choices.old_copy ? std::optional(old) : std::nullopt)) {
            Fail("EACopyAdoubleV2: wrote for an empty file");
        }
        return;
    }
    if ((result == 0) != expected.has_value()) Fail("EACopyAdoubleV2: %d", result);
    if (expected) {
        Bytes whole = *expected;
        if (whole.size() < old.size()) whole.insert(whole.end(), old.size() - whole.size(), 0xAB);
        if (made != whole) Fail("EACopyAdoubleV2: another file");
        struct stat info;
        if (lstat(At().copy.c_str(), &info) != 0 || (info.st_mode & 07777) != 0777) {
            Fail("EACopyAdoubleV2: mode");
        }
        return;
    }
    const std::uint32_t version = Field32(file, 4);
    const bool refused = file.size() >= 26 && version != 0x00020000;
    if (result != (refused ? -1 : -5)) Fail("EACopyAdoubleV2: %d", result);
    // What was not begun is left alone, what was is taken away.
    if (made.has_value() != (choices.old_copy && (refused || file.size() < 26))) {
        Fail("EACopyAdoubleV2: a file after %d", result);
    }
}

void CopyUnchanged(View file, const Choices& choices) {
    Call call("EACopyAdoubleV2");
    const int result = EACopyAdoubleV2(At().apple_double.c_str(), At().copy.c_str(), choices.mode);
    if (!call.End(kAnyMemory).empty()) Fail("EACopyAdoubleV2: records none");
    if (result != 0) Fail("EACopyAdoubleV2: %d for a copy", result);
    if (Get(At().copy) != Bytes(file.begin(), file.end())) Fail("EACopyAdoubleV2: another copy");
}

void MoveAttributes(View file, const Choices& choices) {
    const Bytes before = DestinationBytes(choices, file);
    const int from = MemoryFile(file);
    const int to = MemoryFile(before);
    Call call("EASWriteToFd");
    const int result = EASWriteToFd(from, to);
    const auto codes = call.End(kAnyMemory);
    const Bytes source_after = GetAll(from);
    const Bytes after = GetAll(to);
    close(from);
    close(to);

    ExpectCode("EASWriteToFd", result != 0, codes);
    if (source_after != Bytes(file.begin(), file.end())) Fail("EASWriteToFd: wrote to the source");
    const OpenedStream source = OpenStream(file);
    if (source.code != 0) {
        if (result != -1 || after != before) Fail("EASWriteToFd: %d without a stream", result);
        return;
    }
    if (source.table.empty() && after != before) Fail("EASWriteToFd: wrote nothing's worth");
    if (choices.stream == Choices::Stream::kInput)
        return;  // What it makes of that, it must survive.
    Attributes expected = AttributesBefore(choices);
    const int failures = Import(file, source.table, &expected);
    if (result != (failures == 0 ? 0 : -1 - failures)) {
        Fail("EASWriteToFd: %d after %d failures", result, failures);
    }
    ExpectStream("EASWriteToFd", after, choices, expected);
}

void Repair(View file, const Choices& choices) {
    const Bytes bytes(file.begin(), file.end());
    const Bytes before = DestinationBytes(choices, file);
    Put(At().resource, file);
    if (choices.stream == Choices::Stream::kMissing) {
        unlink(At().stream.c_str());
    } else {
        Put(At().stream, before);
    }
    // Anybody may have left one.
    if (choices.old_copy) Put(At().temporary, bytes);
    unlink(At().apple_double.c_str());  // or the stream would be made of it

    Call call("MAVOEAFixErrorAD");
    const int result = MAVOEAFixErrorAD(At().object.c_str());
    const auto codes = call.End(kAnyMemory);
    if (IsThere(At().temporary)) Fail("MAVOEAFixErrorAD: left its temporary file");
    const auto rewritten = Rewritten(file);
    const auto resource = Get(At().resource);
    const OpenedStream source = OpenStream(file);
    const auto after = Get(At().stream);

    if (result == 0 && !codes.empty()) Fail("MAVOEAFixErrorAD: a code on success");
    if (result != 0 && result != -1) Fail("MAVOEAFixErrorAD: %d", result);
    if (resource != (result == 0 && rewritten ? rewritten : std::optional(bytes))) {
        Fail("MAVOEAFixErrorAD: resource file after %d", result);
    }
    if (result == -1 && rewritten && codes.empty()) Fail("MAVOEAFixErrorAD: failed with no code");
    if (choices.stream == Choices::Stream::kInput) return;
    const unsigned counted = OpenStreamHeader(file).attribute_count;
    if (!file.empty() && !rewritten) {
        if (result != -1) Fail("MAVOEAFixErrorAD: repaired what is no such file");
        return;
    }
    Attributes expected = AttributesBefore(choices);
    const int failures = Import(file, source.table, &expected);
    const bool works =
        OpenStreamHeader(file).code == 0 && (counted == 0 || (source.code == 0 && failures == 0));
    if (result != (works ? 0 : -1)) Fail("MAVOEAFixErrorAD: %d", result);
    ExpectStream("MAVOEAFixErrorAD", after.value_or(Bytes()), choices, expected);
}

}  // namespace
}  // namespace mavoea::fuzz

using namespace mavoea::fuzz;

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* bytes, std::size_t size) {
    (void)At();
    const Descriptors descriptors;
    Input input(bytes, size);
    const Choices choices(input.U8());
    const View file = input.Rest();

    VolumeType() = 1;
    Check(file, choices);
    Read(file);
    Rewrite(file, choices);
    CopyUnchanged(file, choices);
    MoveAttributes(file, choices);
    Repair(file, choices);
    return 0;
}
