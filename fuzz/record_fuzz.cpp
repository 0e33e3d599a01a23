// The netatalk record: its parser, its readers from the attribute and from the resource file, and
// what writes it back. One input is a block, which is put in all of its places in turn.

#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cstddef>
#include <cstdint>

#include "adouble/ea_copy_lock.h"
#include "adouble/internal.h"
#include "fuzz/support/apple_double_model.h"
#include "fuzz/support/volume.h"
#include "include/mavoea.h"

namespace mavoea::fuzz {
namespace {

constexpr char kRecordName[] = "user.netatalk.Metadata";
constexpr char kTimeName[] = "user.mavo.filea.flushtime";
constexpr std::size_t kAttributeSize = 402;
constexpr std::size_t kHeadSize = 741;

struct Places {
    std::string object = Folder() + "/object";
    std::string ea_dir = Folder() + "/@eaDir";
    std::string resource = ea_dir + "/object@MavoResource";

    Places() {
        Put(object, {});
        if (mkdir(ea_dir.c_str(), 0777) != 0) Fail("no EA directory");
    }
};
const Places& At() {
    static const Places places;
    return places;
}

using Codes = std::vector<int>;

void Expect(const char* what, int result, const Codes& codes, int expected,
            const Codes& expected_codes) {
    if (result != expected) Fail("%s: %d, not %d", what, result, expected);
    if (codes == expected_codes) return;
    Fail("%s: %zu codes, the first 0x%X, not %zu, 0x%X", what, codes.size(),
         static_cast<unsigned>(codes.empty() ? 0 : codes[0]), expected_codes.size(),
         static_cast<unsigned>(expected_codes.empty() ? 0 : expected_codes[0]));
}

// ---- The parser by the format's rules -----------------------------------------------------------

struct Parsed {
    int code = 0;
    std::uint32_t magic = 0;
    std::uint32_t version = 0;
    std::array<Descriptor, 20> slots{};  // by the slot's number; their ids are not used
    std::array<std::uint8_t, 1024> data{};
};

std::size_t SlotOfId(std::uint32_t id) {
    switch (id) {
        case 0x80444556:
            return 16;
        case 0x80494E4F:
            return 17;
        case 0x8053594E:
            return 18;
        case 0x8053567E:
            return 19;
        default:
            return id < 16 ? id : 0;
    }
}

Parsed Parse(View block) {
    Parsed parsed;
    if (block.size() > parsed.data.size()) return {.code = 0xD00};
    std::copy(block.begin(), block.end(), parsed.data.begin());
    const View data = parsed.data;
    parsed.magic = Field32(data, 0);
    parsed.version = Field32(data, 4);
    if (parsed.magic != 0x00051607 || parsed.version != 0x00020000) {
        parsed.code = 0xA00;
        return parsed;
    }
    const unsigned count = Field16(data, 24);
    for (std::uint64_t at = 26; at < 26 + 12ULL * count; at += 12) {
        const bool whole = Holds(data, at, 12);
        const Descriptor entry = {Field32(data, at), Field32(data, at + 4), Field32(data, at + 8)};
        const std::size_t slot = whole ? SlotOfId(entry.id) : 0;
        if (whole) parsed.slots[slot] = entry;
        if (slot == 0 || entry.offset >= 1024 ||
            (slot != 2 && std::uint64_t{entry.offset} + entry.length > 1024)) {
            parsed.code = 0xD00;
            return parsed;
        }
    }
    return parsed;
}

void ExpectRecord(const char* what, const EAAdouble& record, const Parsed& expected) {
    if (record.magic != expected.magic || record.version != expected.version) {
        Fail("%s: magic or version", what);
    }
    for (std::size_t slot = 1; slot < 20; ++slot) {
        if (record.entries[slot].offset != expected.slots[slot].offset ||
            record.entries[slot].length != expected.slots[slot].length) {
            Fail("%s: slot %zu", what, slot);
        }
    }
    if (!std::equal(expected.data.begin(), expected.data.end(), record.data)) {
        Fail("%s: data", what);
    }
    for (const std::uint8_t byte : record.filler) {
        if (byte != 0) Fail("%s: filler", what);
    }
}

// The 32 bytes of Finder info of a record that has them behind its descriptors.
std::optional<View> FinderInfoOf(const Parsed& parsed) {
    const Descriptor& entry = parsed.slots[9];
    const std::size_t first = 26 + 12UL * Field16(parsed.data, 24);
    if (entry.offset < first || entry.length < 32 || entry.offset > 1024 - 32) return std::nullopt;
    return View(parsed.data).subspan(entry.offset, 32);
}

// Whether `stored` is what setting or clearing the lock makes of `block`: one byte of the AFP file
// info says so, where the record has that in order.
bool IsLocked(const std::optional<Bytes>& stored, View block, const Parsed& parsed, bool readable,
              int lock) {
    if (!stored || stored->size() != block.size()) return false;
    Bytes expected(block.begin(), block.end());
    const Descriptor& entry = parsed.slots[14];
    const std::size_t first = 26 + 12UL * Field16(parsed.data, 24);
    const std::size_t at = entry.offset + std::size_t{2};
    const std::size_t flushed = block.size() < kHeadSize ? kAttributeSize : kHeadSize;
    if (readable && entry.offset >= first && entry.length >= 4 && at < flushed) {
        expected[at] =
            static_cast<std::uint8_t>(lock == 1 ? expected[at] | 0xA0 : expected[at] & 0x5F);
    }
    return stored == expected;
}

// ---- One place after the other ------------------------------------------------------------------

void ParseBlock(View block, const Parsed& expected) {
    EAAdouble record = {};
    Call call("MAVOEAAdoubleRead");
    const int result = MAVOEAAdoubleRead(block.data(), static_cast<int>(block.size()), &record);
    const Codes codes = call.End(0);
    // An empty input need not have bytes anywhere; that is no block at all.
    if (block.data() == nullptr) return Expect("MAVOEAAdoubleRead", result, codes, -1, {0xD00});
    if (expected.code == 0) {
        Expect("MAVOEAAdoubleRead", result, codes, 0, {});
    } else {
        Expect("MAVOEAAdoubleRead", result, codes, -1, {expected.code});
    }
    ExpectRecord("MAVOEAAdoubleRead", record, expected);
}

void UseAttribute(View block, const Parsed& parsed, int lock) {
    const std::string& object = At().object;
    ClearAttributes();
    PutAttribute(object, kRecordName, block);

    bool complete = Field16(block, 24) == 8;
    for (const std::size_t slot : {4U, 8U, 9U, 14U, 16U, 17U, 18U, 19U}) {
        complete = complete && parsed.slots[slot].offset != 0;
    }
    const bool readable = block.size() == kAttributeSize && parsed.code == 0 && complete;
    Codes expected_codes;
    if (block.size() == kAttributeSize && parsed.code != 0) expected_codes.push_back(parsed.code);
    if (!readable) expected_codes.push_back(0xA00);

    EAAdouble record = {};
    {
        Call call("MAVOEAFileEAAdoubleRead");
        const int result = MAVOEAFileEAAdoubleRead(object.c_str(), &record);
        Expect("MAVOEAFileEAAdoubleRead", result, call.End(0), readable ? 0 : -1, expected_codes);
        if (block.size() == kAttributeSize) {
            ExpectRecord("MAVOEAFileEAAdoubleRead", record, parsed);
        }
    }
    {
        const Bytes untouched(32, 0xEE);
        Bytes finder_info = untouched;
        Call call("EAFileEAFSFinfoRead");
        const int result = EAFileEAFSFinfoRead(object.c_str(), finder_info.data());
        Expect("EAFileEAFSFinfoRead", result, call.End(0), readable ? 0 : -1, expected_codes);
        const auto expected = readable ? FinderInfoOf(parsed) : std::nullopt;
        if (finder_info != (expected ? Bytes(expected->begin(), expected->end()) : untouched)) {
            Fail("EAFileEAFSFinfoRead: Finder info");
        }
    }
    if (readable) {
        ClearAttributes();
        Call call("MAVOEAFileEAAdoubleFlush");
        const int result =
            MAVOEAFileEAAdoubleFlush(record.data, static_cast<int>(kAttributeSize), object.c_str());
        Expect("MAVOEAFileEAAdoubleFlush", result, call.End(0), 0, {});
        if (GetAttribute(object, kRecordName) != Bytes(block.begin(), block.end())) {
            Fail("MAVOEAFileEAAdoubleFlush: another record");
        }
    }
    {
        Call call("EAFileEAFSLockSet");
        const int result = EAFileEAFSLockSet(object.c_str(), lock);
        Expect("EAFileEAFSLockSet", result, call.End(0), readable ? 0 : -1, expected_codes);
        if (!IsLocked(GetAttribute(object, kRecordName), block, parsed, readable, lock)) {
            Fail("EAFileEAFSLockSet: another record");
        }
    }
}

void UseResourceFile(View block, const Parsed& head, int lock) {
    const std::string& object = At().object;
    const Bytes before(block.begin(), block.end());
    Put(At().resource, block);
    ClearAttributes();

    const bool there = block.size() >= kHeadSize;
    const int found = !there ? 1 : head.code == 0 ? 0 : -1;
    const Codes expected_codes = found < 0 ? Codes{head.code} : Codes{};
    EAAdouble record = {};
    {
        Call call("MAVOEAEADirAdoubleRead");
        const int result = MAVOEAEADirAdoubleRead(object.c_str(), &record);
        Expect("MAVOEAEADirAdoubleRead", result, call.End(MemoryFor(block.size())), found,
               expected_codes);
        if (there) ExpectRecord("MAVOEAEADirAdoubleRead", record, head);
    }
    if (found == 0) {
        // The flush keeps the descriptor that it opens.
        const int kept = NextDescriptor();
        Call call("MAVOEAEADirAdoubleFlush");
        const int result =
            MAVOEAEADirAdoubleFlush(record.data, static_cast<int>(kHeadSize), object.c_str());
        if (!CloseKept(kept, At().resource)) Fail("MAVOEAEADirAdoubleFlush: kept no descriptor");
        Expect("MAVOEAEADirAdoubleFlush", result, call.End(MemoryFor(block.size())), 0, {});
        if (Get(At().resource) != before) Fail("MAVOEAEADirAdoubleFlush: another file");
    }
    {
        const int kept = NextDescriptor();
        Call call("EAEADirFSLockSet");
        const int result = EAEADirFSLockSet(object.c_str(), lock);
        if (found == 0) (void)CloseKept(kept, At().resource);
        Expect("EAEADirFSLockSet", result, call.End(MemoryFor(block.size())), found < 0 ? -1 : 0,
               expected_codes);
        if (!IsLocked(Get(At().resource), before, head, found == 0, lock)) {
            Fail("EAEADirFSLockSet: another file");
        }
    }
}

// A fresh record, byte by byte.
Bytes FreshRecord(View finder_info) {
    static constexpr std::uint32_t kEntries[8][3] = {
        {4, 154, 0},          {8, 354, 16},         {9, 122, 32},         {14, 370, 4},
        {0x80444556, 374, 0}, {0x80494E4F, 382, 0}, {0x8053594E, 390, 0}, {0x8053567E, 398, 0}};
    Bytes block = {0, 5, 0x16, 7, 0, 2, 0, 0};
    block.resize(24);
    block.insert(block.end(), {0, 8});
    for (const auto& entry : kEntries) {
        for (const std::uint32_t field : entry) {
            for (int shift = 24; shift >= 0; shift -= 8) {
                block.push_back(static_cast<std::uint8_t>(field >> shift));
            }
        }
    }
    block.insert(block.end(), finder_info.begin(), finder_info.end());
    block.resize(kAttributeSize);
    return block;
}

// The Finder info of any resource file into the attribute, and any Finder info into the file.
void SyncFinderInfo(View block, View finder_info) {
    const std::string& object = At().object;
    const Bytes before(block.begin(), block.end());
    Put(At().resource, block);
    ClearAttributes();
    const OpenedStream opened = OpenStream(block);
    {
        Call call("MAVOEAFileEAFSFinfoEASync");
        const int result = MAVOEAFileEAFSFinfoEASync(object.c_str(), 0);
        const Codes codes = call.End(MemoryFor(block.size()));
        const auto stored = GetAttribute(object, kRecordName);
        const auto stamp = GetAttribute(object, kTimeName);
        if (opened.code != 0) {
            Expect("MAVOEAFileEAFSFinfoEASync", result, codes, -1, {opened.code});
            if (stored || stamp) Fail("MAVOEAFileEAFSFinfoEASync: stored all the same");
        } else {
            Expect("MAVOEAFileEAFSFinfoEASync", result, codes, 0, {});
            if (!stamp || stamp->size() != 4) Fail("MAVOEAFileEAFSFinfoEASync: no stamp");
            const Bytes expected =
                FreshRecord(opened.has_finder_info ? opened.finder_info : Bytes(32));
            if (stored != expected) Fail("MAVOEAFileEAFSFinfoEASync: another record");
        }
        if (Get(At().resource) != before) Fail("MAVOEAFileEAFSFinfoEASync: wrote to the file");
    }
    Call call("MAVOEAEADirFSFInfoWrite");
    const int result = MAVOEAEADirFSFInfoWrite(object.c_str(), finder_info.data());
    const Codes codes = call.End(MemoryFor(block.size()));
    const auto after = Get(At().resource);
    if (opened.code != 0) {
        Expect("MAVOEAEADirFSFInfoWrite", result, codes, -1, {opened.code});
        if (after != before) Fail("MAVOEAEADirFSFInfoWrite: wrote all the same");
        return;
    }
    if (before.empty()) {
        Bytes made = {0, 5, 0x16, 7, 0, 2, 0, 0};
        for (const char letter : std::string("Mac OS X        ")) {
            made.push_back(static_cast<std::uint8_t>(letter));
        }
        made.insert(made.end(), {0, 2, 0, 0, 0, 9, 0, 0, 0, 50, 0, 0, 0, 32});
        made.insert(made.end(), {0, 0, 0, 2, 0, 0, 0, 82, 0, 0, 0, 0});
        made.insert(made.end(), finder_info.begin(), finder_info.end());
        Expect("MAVOEAEADirFSFInfoWrite", result, codes, 0, {});
        if (after != made) Fail("MAVOEAEADirFSFInfoWrite: another new file");
        return;
    }
    const std::uint64_t first = std::min<std::uint64_t>(26 + 12ULL * Field16(block, 24), 50);
    if (opened.finder_info_offset < first) {  // over the header, or there is none
        Expect("MAVOEAEADirFSFInfoWrite", result, codes, -1, {0xD00});
        if (after != before) Fail("MAVOEAEADirFSFInfoWrite: wrote all the same");
        return;
    }
    Expect("MAVOEAEADirFSFInfoWrite", result, codes, 0, {});
    Bytes expected = before;
    std::copy(finder_info.begin(), finder_info.end(), expected.begin() + opened.finder_info_offset);
    if (after != expected) Fail("MAVOEAEADirFSFInfoWrite: another file");
}

// The attribute's Finder info into the resource file.
void SyncToFile(View block, const Parsed& parsed) {
    if (block.size() != kAttributeSize) return;
    unlink(At().resource.c_str());
    ClearAttributes();
    PutAttribute(At().object, kRecordName, block);
    Call call("EAFileEAFSFinfoFileSync");
    const int result = EAFileEAFSFinfoFileSync(At().object.c_str());
    const Codes codes = call.End(MemoryFor(block.size()));
    if ((result == 0) != codes.empty()) Fail("EAFileEAFSFinfoFileSync: result and codes");
    const auto made = Get(At().resource);
    const auto finder_info = FinderInfoOf(parsed);
    if ((result == 0 && finder_info) != made.has_value()) {
        Fail("EAFileEAFSFinfoFileSync: result and file");
    }
    if (!made) return;
    if (made->size() != 82) Fail("EAFileEAFSFinfoFileSync: %zu bytes", made->size());
    if (!std::equal(finder_info->begin(), finder_info->end(), made->begin() + 50)) {
        Fail("EAFileEAFSFinfoFileSync: Finder info");
    }
}

}  // namespace
}  // namespace mavoea::fuzz

using namespace mavoea::fuzz;

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* bytes, std::size_t size) {
    (void)At();
    const Descriptors descriptors;
    Input input(bytes, size);
    const int lock = input.U8() & 1;
    const Bytes finder_info(32, input.U8());
    const View block = input.Rest();

    const Parsed parsed = Parse(block);
    ParseBlock(block, parsed);
    UseAttribute(block, parsed, lock);
    UseResourceFile(block, Parse(block.first(std::min(block.size(), kHeadSize))), lock);
    SyncFinderInfo(block, finder_info);
    SyncToFile(block, parsed);
    return 0;
}
