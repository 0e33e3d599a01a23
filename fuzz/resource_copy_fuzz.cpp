// The copy between volumes of every two types, whose readers meet resource files, "._" files,
// streams and extended attributes of any contents. One input is a source's metadata.

#include <fcntl.h>
#include <string.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <iterator>
#include <string_view>

#include "fuzz/support/apple_double_model.h"
#include "fuzz/support/volume.h"
#include "include/mavoea.h"
#include "tests/support/mac_files.h"
#include "tests/support/record_builder.h"

namespace mavoea::fuzz {
namespace {

constexpr char kFinderInfoName[] = "com.apple.FinderInfo";
constexpr char kForkName[] = "com.apple.ResourceFork";
constexpr char kRecordName[] = "user.netatalk.Metadata";
constexpr char kTimeName[] = "user.mavo.filea.flushtime";

// One end of a copy: an object and where its metadata may lie.
struct End {
    explicit End(const std::string& name)
        : directory(Folder() + "/" + name),
          object(directory + "/object"),
          fork(object + "#rsrc"),
          apple_double(directory + "/._object"),
          ea_dir(directory + "/@eaDir"),
          resource(ea_dir + "/object@MavoResource"),
          stream(ea_dir + "/object@MavoEAStream"),
          folder(ea_dir + "/object"),
          other(folder + "/MAVOThumb") {
        if (mkdir(directory.c_str(), 0777) != 0) Fail("no directory");
    }

    // The object alone is left, and an EA directory if asked for.
    void Renew(bool with_ea_dir) const {
        Empty(directory);
        Put(object, {});
        if (with_ea_dir && mkdir(ea_dir.c_str(), 0777) != 0) Fail("no EA directory");
    }

    std::string directory, object, fork, apple_double, ea_dir, resource, stream, folder, other;
};
struct Ends {
    End src{"src"};
    End dst{"dst"};
};
const Ends& At() {
    static const Ends ends;
    return ends;
}

enum class Kind { kAppleDouble, kAttribute, kEADir, kFileEA, kOther };

Kind KindOf(int type) {
    switch (type) {
        case 0:
        case 5:
            return Kind::kAppleDouble;
        case 1:
        case 3:
        case 6:
        case 10:
            return Kind::kEADir;
        case 2:
            return Kind::kFileEA;
        case 7:
            return Kind::kAttribute;
        default:
            return Kind::kOther;
    }
}

// What is at the destination already: a resource or "._" file, and a stream.
const test::MacFile& OldFile() {
    static const test::MacFile& file =
        *new test::MacFile(test::ClassicFile(test::Pattern(32, 1), test::Pattern(300, 2)));
    return file;
}
const Bytes& OldStream() {
    static const Bytes& stream =
        *new Bytes(test::StreamImage{.attributes = {{"a", test::Pattern(5, 3)}}}.Build());
    return stream;
}

// The source, and how it is copied.
struct Case {
    int src_type, dst_type;
    Kind src, dst;
    int move;
    bool with_copier, carry, old_files, more;  // `more`: another file, a netatalk record
    std::optional<Bytes> resource, stream;     // on AppleDouble volumes both are the "._" file
    Attributes attributes;                     // of an object that has real ones
    Bytes fork;                                // the same
};

Case Decode(Input input) {
    static constexpr int kSources[] = {0, 5, 1, 3, 6, 10, 2, 7};
    static constexpr int kDestinations[] = {0, 5, 1, 3, 6, 10, 2, 7, 12, 4};
    Case read{};
    read.src_type = kSources[input.U8() % std::size(kSources)];
    read.dst_type = kDestinations[input.U8() % std::size(kDestinations)];
    read.src = KindOf(read.src_type);
    read.dst = KindOf(read.dst_type);
    const unsigned flags = input.U8();
    read.move = static_cast<int>(flags & 3) % 3;
    read.with_copier = (flags & 4) != 0;
    read.carry = (flags & 8) != 0;
    const bool has_resource = (flags & 16) != 0;
    const bool has_stream = (flags & 32) != 0;
    read.old_files = (flags & 64) != 0;
    read.more = (flags & 128) != 0;
    const std::size_t resource_size = input.U16();
    Input resource(input.Take(resource_size));
    if (read.src != Kind::kAttribute) {
        const View bytes = resource.Rest();
        if (has_resource) read.resource.emplace(bytes.begin(), bytes.end());
        const View rest = input.Rest();
        if (has_stream) read.stream.emplace(rest.begin(), rest.end());
        if (read.src == Kind::kAppleDouble) read.stream = read.resource;
        return read;
    }
    if (has_resource) {
        const View finder_info = resource.Take(resource.U8());
        read.attributes[kFinderInfoName].assign(finder_info.begin(), finder_info.end());
    }
    const View fork = resource.Rest();
    read.fork.assign(fork.begin(), fork.end());
    while (has_stream && !input.empty()) {
        const View name = input.Take(std::max<std::size_t>(input.U8(), 1));
        const View value = input.Take(input.U16());
        const std::string text(name.begin(), std::find(name.begin(), name.end(), 0));
        if (text.empty() || text == kForkName || read.attributes.size() > 200) continue;
        read.attributes[text].assign(value.begin(), value.end());
    }
    return read;
}

void Build(const Case& given) {
    const auto& [src, dst] = At();
    ClearAttributes();
    src.Renew(given.src == Kind::kEADir || given.src == Kind::kFileEA || given.more);
    dst.Renew(given.old_files);
    if (given.src == Kind::kAppleDouble) {
        if (given.resource) Put(src.apple_double, *given.resource);
    } else if (given.src != Kind::kAttribute) {
        if (given.resource) Put(src.resource, *given.resource);
        if (given.stream) Put(src.stream, *given.stream);
    }
    for (const auto& [name, value] : given.attributes) PutAttribute(src.object, name, value);
    if (!given.fork.empty()) {
        PutAttribute(src.object, kForkName, {});  // which only lists it
        Put(src.fork, given.fork);
    }
    if (given.more) {
        if (given.src == Kind::kFileEA) {
            PutAttribute(src.object, kRecordName, test::AttributeRecord());
        }
        if (mkdir(src.folder.c_str(), 0777) != 0) Fail("no folder");
        Put(src.other, test::Pattern(100, 5));
    }
    Put(dst.fork, {});  // Every file has one, empty or not, where there are any.
    if (given.old_files) {
        Put(dst.resource, OldFile().bytes);
        Put(dst.stream, OldStream());
        Put(dst.apple_double, OldFile().bytes);
    }
}

int CopyHere(const char* from, const char* to) {
    const auto bytes = Get(from);
    if (!bytes) return -1;
    Put(to, *bytes);
    return 0;
}

// ---- What must come of it -----------------------------------------------------------------------

// `bytes` written over what `old` has, which is not cut.
Bytes Over(Bytes bytes, const Bytes& old) {
    if (bytes.size() < old.size()) {
        bytes.insert(bytes.end(), old.begin() + static_cast<std::ptrdiff_t>(bytes.size()),
                     old.end());
    }
    return bytes;
}

View ForkOf(const Bytes& rewritten) { return View(rewritten).subspan(82); }
View FinderInfoOf(const Bytes& rewritten) { return View(rewritten).subspan(50, 32); }

// Whether a rewritten file's fork is there as far as the file says.
bool ForkIsWhole(const Bytes& rewritten) {
    for (const std::size_t at : {26U, 38U}) {
        if (Field32(rewritten, at) == 2)
            return Field32(rewritten, at + 8) == ForkOf(rewritten).size();
    }
    return false;
}

bool Same(View left, View right) {
    return std::equal(left.begin(), left.end(), right.begin(), right.end());
}

void ExpectContents(const char* what, const std::optional<Bytes>& file, View finder_info, View fork,
                    const Attributes& attributes) {
    if (!file) Fail("%s: no file", what);
    const auto contents = test::ReadMacFile(*file);
    if (!contents) Fail("%s: does not fit together", what);
    if (!Same(contents->finder_info, finder_info)) Fail("%s: Finder info", what);
    if (!Same(contents->fork, fork)) Fail("%s: fork", what);
    if (contents->attributes != attributes) Fail("%s: attributes", what);
}

void ExpectRecordWith(View finder_info) {
    const auto record = GetAttribute(At().dst.object, kRecordName);
    if (!record || record->size() != 402) Fail("no record at the destination");
    if (!Same(View(*record).subspan(122, 32), finder_info)) Fail("record: Finder info");
    const auto stamp = GetAttribute(At().dst.object, kTimeName);
    if (!stamp || stamp->size() != 4) Fail("no flush time at the destination");
}

void ExpectResult(int result, bool works) {
    if ((result == 0) != works) Fail("MAVOEACopyEx: %d", result);
}

const Bytes kNoFinderInfo(32);

void ToAttributes(const Case& given, int result) {
    bool works = true;
    Attributes expected;
    if (given.stream) {
        const OpenedStream opened = OpenStream(*given.stream);
        works = opened.code == 0;
        for (const TableEntry& entry : opened.table) {
            const bool in_file =
                entry.length == 0 || Holds(*given.stream, entry.offset, entry.length);
            works = works && in_file && !entry.name.empty();
            if (!in_file) continue;
            const View value = entry.length == 0
                                   ? View()
                                   : View(*given.stream).subspan(entry.offset, entry.length);
            expected[entry.name].assign(value.begin(), value.end());
        }
    }
    if (given.resource) {
        const View file = *given.resource;
        const auto descriptors = DescriptorsOf(file);
        works = works && file.size() >= 26 && Field32(file, 4) == 0x00020000 && descriptors &&
                (descriptors->size() == 2 || descriptors->size() == 13);
        Descriptor finder_info;
        Descriptor fork;
        for (const Descriptor& entry : descriptors.value_or(std::vector<Descriptor>())) {
            if (entry.id == 9) finder_info = entry;
            if (entry.id == 2) fork = entry;
        }
        works = works && finder_info.offset != 0 && fork.offset != 0 &&
                (fork.length == 0 || Holds(file, fork.offset, fork.length)) &&
                Holds(file, finder_info.offset, 32);
        if (works) {
            const View info = file.subspan(finder_info.offset, 32);
            expected[kFinderInfoName].assign(info.begin(), info.end());
            if (fork.length != 0) {
                const View bytes = file.subspan(fork.offset, fork.length);
                expected[kForkName].assign(bytes.begin(), bytes.end());
            }
        }
    }
    ExpectResult(result, works);
    if (!works) return;
    for (const auto& [name, value] : expected) {
        const auto found =
            name == kForkName ? Get(At().dst.fork) : GetAttribute(At().dst.object, name);
        if (found != value) Fail("attribute \"%s\" at the destination", name.c_str());
    }
}

void ToAppleDouble(const Case& given, int result) {
    const auto after = Get(At().dst.apple_double);
    std::optional<Bytes> made;
    if (given.old_files) made = OldFile().bytes;
    Bytes finder_info = given.old_files ? OldFile().contents.finder_info : kNoFinderInfo;
    Bytes fork = given.old_files ? OldFile().contents.fork : Bytes();
    if (given.resource && !given.resource->empty()) {
        const auto rewritten = Rewritten(*given.resource);
        if (!rewritten) {
            ExpectResult(result, false);
            if (after && after != made) Fail("half a \"._\" file stays");
            return;
        }
        // Other magics are kept, and a tail of an older file may lie behind a fork that is short.
        if (Field32(*rewritten, 0) != 0x00051607 || !ForkIsWhole(*rewritten)) return;
        made = Over(*rewritten, made.value_or(Bytes()));
        finder_info.assign(FinderInfoOf(*rewritten).begin(), FinderInfoOf(*rewritten).end());
        fork.assign(ForkOf(*rewritten).begin(), ForkOf(*rewritten).end());
    }
    const Bytes none;
    const Bytes& stream = given.stream ? *given.stream : none;
    const OpenedStream header = OpenStreamHeader(stream);
    const OpenedStream opened = OpenStream(stream);
    Attributes attributes;
    const int failures = Import(stream, opened.table, &attributes);
    const bool works =
        header.code == 0 && (header.attribute_count == 0 || (opened.code == 0 && failures == 0));
    ExpectResult(result, works);
    if (!works) return;
    if (header.attribute_count == 0) {
        if (after != made) Fail("another \"._\" file");
    } else {
        ExpectContents("the \"._\" file", after, finder_info, fork, attributes);
    }
}

void FromAppleDouble(const Case& given, int result) {
    const Bytes old = given.old_files ? OldFile().bytes : Bytes();
    Bytes finder_info = given.old_files ? OldFile().contents.finder_info : kNoFinderInfo;
    bool works = true;
    if (given.resource) {
        const auto rewritten = Rewritten(*given.resource);
        const OpenedStream header = OpenStreamHeader(*given.resource);
        const OpenedStream opened = OpenStream(*given.resource);
        Attributes attributes;
        if (given.old_files) attributes["a"] = test::Pattern(5, 3);
        const int failures = Import(*given.resource, opened.table, &attributes);
        works = (given.resource->empty() || rewritten) && header.code == 0 &&
                (header.attribute_count == 0 || (opened.code == 0 && failures == 0));
        if (!given.resource->empty() && !rewritten && Get(At().dst.resource).value_or(old) != old) {
            Fail("half a resource file stays");
        }
        if (works && rewritten) {
            if (Get(At().dst.resource) != Over(*rewritten, old)) Fail("another resource file");
            finder_info.assign(FinderInfoOf(*rewritten).begin(), FinderInfoOf(*rewritten).end());
        }
        if (works && header.attribute_count != 0) {
            ExpectContents("the stream", Get(At().dst.stream), kNoFinderInfo, {}, attributes);
        }
    }
    ExpectResult(result, works);
    if (works && given.dst == Kind::kFileEA) ExpectRecordWith(finder_info);
}

// In how many bytes a file differs from what it should be.
std::size_t Differences(const std::optional<Bytes>& file, const Bytes& expected) {
    if (!file || file->size() != expected.size()) return expected.size() + 2;
    std::size_t count = 0;
    for (std::size_t i = 0; i < expected.size(); ++i) count += (*file)[i] != expected[i] ? 1 : 0;
    return count;
}

void BetweenEADirs(const Case& given, int result) {
    const auto& dst = At().dst;
    const bool rewrites = given.src == Kind::kEADir && given.dst == Kind::kFileEA;
    if (rewrites) {
        if (!given.resource) return ExpectResult(result, true);
        const auto rewritten = Rewritten(*given.resource);
        ExpectResult(result, rewritten || given.resource->empty());
        if (result != 0) return;
        const Bytes old = given.old_files ? OldFile().bytes : Bytes();
        if (rewritten && Get(dst.resource) != Over(*rewritten, old)) Fail("another resource file");
        if (rewritten) ExpectRecordWith(FinderInfoOf(*rewritten));
    } else {
        ExpectResult(result, true);
        // The lock is carried as well, in one byte of a netatalk record.
        if (given.resource && Differences(Get(dst.resource), *given.resource) > 1) {
            Fail("resource file");
        }
    }
    if (given.stream && Get(dst.stream) != given.stream) Fail("stream");
}

void FromAttributes(const Case& given, int result) {
    const auto& dst = At().dst;
    Attributes named = given.attributes;
    const auto info = named.find(kFinderInfoName);
    const bool has_info = info != named.end();
    const Bytes value = has_info ? info->second : Bytes();
    if (given.dst == Kind::kAttribute) {
        ExpectResult(result, true);
        for (const auto& [name, bytes] : given.attributes) {
            if (GetAttribute(dst.object, name) != bytes) Fail("attribute \"%s\"", name.c_str());
        }
        if (!given.fork.empty() && Get(dst.fork) != given.fork) Fail("fork");
        return;
    }
    if (has_info) named.erase(info);
    const bool has_file = has_info || !given.fork.empty();
    const bool to_apple_double = given.dst == Kind::kAppleDouble;
    bool works = !to_apple_double || has_file || named.empty() || given.old_files;
    for (const auto& [name, bytes] : named) works = works && name.size() <= 254;
    ExpectResult(result, works);
    if (!works) return;

    Bytes finder_info = value;
    finder_info.resize(32);
    if (to_apple_double) {
        if (has_file) {
            ExpectContents("the \"._\" file", Get(dst.apple_double), finder_info, given.fork,
                           named);
        }
        return;
    }
    Bytes expected = test::Hex(
        "00 05 16 07  00 02 00 00 'MAVONICS        ' 00 02"
        "00 00 00 09  00 00 00 32  00 00 00 20  00 00 00 02  00 00 00 52  00*4");
    test::PutU32(expected, 46, given.fork.size());
    expected.resize(std::max<std::size_t>(
        {84, 50 + value.size(), given.fork.empty() ? 0 : 82 + given.fork.size()}));
    std::copy(value.begin(), value.end(), expected.begin() + 50);
    std::copy(given.fork.begin(), given.fork.end(), expected.begin() + 82);
    if (has_file && Get(dst.resource) != expected) Fail("resource file");
    if (!named.empty()) ExpectContents("the stream", Get(dst.stream), kNoFinderInfo, {}, named);
    if (given.dst == Kind::kFileEA) {
        ExpectRecordWith(has_file          ? finder_info
                         : given.old_files ? OldFile().contents.finder_info
                                           : kNoFinderInfo);
    }
}

// The source when its resource file has been brought into step with its netatalk record, as most
// copies from such volumes begin; nothing where that cannot be done.
std::optional<Case> Synced(const Case& given) {
    const bool syncs = given.src == Kind::kFileEA && given.more && given.dst != Kind::kFileEA;
    if (!syncs) return given;
    Case synced = given;
    const Bytes finder_info = test::Pattern(32, 0x40);  // the record's
    if (!given.resource || given.resource->empty()) {
        synced.resource = test::ClassicFile(finder_info, {}).bytes;
        const Bytes filler = test::Ascii("Mac OS X        ");
        std::copy(filler.begin(), filler.end(), synced.resource->begin() + 8);
        return synced;
    }
    const OpenedStream opened = OpenStream(*given.resource);
    const std::size_t head = 26 + 12UL * Field16(*given.resource, 24);
    if (opened.code != 0 || opened.finder_info_offset < std::min<std::size_t>(head, 50)) return {};
    std::copy(finder_info.begin(), finder_info.end(),
              synced.resource->begin() + opened.finder_info_offset);
    return synced;
}

void ExpectOutcome(const Case& original, int result) {
    const bool from_ea_dir = original.src == Kind::kEADir || original.src == Kind::kFileEA;
    if (original.dst == Kind::kOther && !(from_ea_dir && original.dst_type == 12)) return;
    const auto synced = Synced(original);
    if (!synced) return ExpectResult(result, false);
    const Case& given = *synced;
    if (given.src == Kind::kFileEA && given.more && given.dst != Kind::kFileEA && result == 0 &&
        GetAttribute(At().src.object, kRecordName).has_value() != (given.move == 0)) {
        Fail("the source's record");
    }
    if (given.src == Kind::kAttribute) return FromAttributes(given, result);
    if (given.dst == Kind::kAttribute) return ToAttributes(given, result);
    if (from_ea_dir && given.dst == Kind::kAppleDouble) return ToAppleDouble(given, result);
    if (from_ea_dir) return BetweenEADirs(given, result);
    if (given.dst != Kind::kAppleDouble) return FromAppleDouble(given, result);
    ExpectResult(result, true);
    if (given.resource && Get(At().dst.apple_double) != given.resource) Fail("\"._\" file");
}

// What is left of the source.
void ExpectSource(const Case& given, int result) {
    const auto& src = At().src;
    if (given.dst == Kind::kOther || given.src == Kind::kAttribute) return;
    if (given.src == Kind::kFileEA && given.more) return;
    const bool one_file = given.src == Kind::kAppleDouble;
    const auto resource = Get(one_file ? src.apple_double : src.resource);
    const auto stream = one_file ? resource : Get(src.stream);
    if (given.move == 0 && (resource != given.resource || stream != given.stream)) {
        Fail("a copy changed its source");
    }
    // An EA directory is copied without its stream where it has no resource file.
    const bool nothing = given.src == Kind::kEADir && given.dst == Kind::kFileEA && !given.resource;
    if (given.move != 0 && result == 0 && !nothing && (resource || stream)) {
        Fail("a move left its source");
    }
}

}  // namespace
}  // namespace mavoea::fuzz

using namespace mavoea::fuzz;

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* bytes, std::size_t size) {
    const auto& [src, dst] = At();
    const Descriptors descriptors;
    const Case given = Decode(Input(bytes, size));
    Build(given);
    VolumeType() = given.dst_type;
    std::string path = dst.object;

    const int next = NextDescriptor();
    Call call("MAVOEACopyEx");
    const int result =
        MAVOEACopyEx(src.object.c_str(), path.data(), given.move, given.carry ? 1 : 0,
                     given.src_type, given.dst_type, 1, 1, given.with_copier ? CopyHere : nullptr);
    // Setting the lock of a netatalk record in a resource file keeps the descriptor of that.
    if (given.dst == Kind::kEADir || given.dst == Kind::kOther) (void)CloseKept(next, dst.resource);
    const auto codes = call.End(kAnyMemory);

    if (result > 0) Fail("MAVOEACopyEx: %d", result);
    if (path != dst.object) Fail("MAVOEACopyEx: changed the destination's path");
    const bool converts = given.resource && !given.resource->empty() && !Rewritten(*given.resource);
    if (result < 0 && codes.empty() && !converts)
        Fail("MAVOEACopyEx: failed with no code, %d from type %d to %d", result, given.src_type,
             given.dst_type);
    ExpectOutcome(given, result);
    ExpectSource(given, result);
    // A lock that cannot be carried, which records a code, is the end of it.
    const bool carries = given.src != Kind::kAppleDouble && given.dst != Kind::kAppleDouble &&
                         given.dst != Kind::kOther;
    if (result == 0 && codes.empty() && given.more && carries) {
        if (Get(dst.other) != mavoea::test::Pattern(100, 5)) Fail("the EA directory's other file");
        if (IsThere(src.folder) != (given.move == 0)) Fail("the source's other files");
    }
    for (const End* end : {&src, &dst}) {
        struct stat info;
        if (lstat(end->object.c_str(), &info) != 0 || info.st_size != 0) Fail("an object changed");
    }
    return 0;
}
