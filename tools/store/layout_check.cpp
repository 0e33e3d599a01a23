// The invariants of the layout, one function for each part of the file. Values are 64-bit, so that
// no sum of stored fields wraps.

#include <algorithm>
#include <map>
#include <set>

#include "tools/say/text.h"
#include "tools/store/layout.h"

namespace mavoea::tool {
namespace {

std::string Number(std::uint64_t value) { return std::to_string(value); }

// "bytes 50 to 81", for a range that is not empty.
std::string Span(Range range) {
    return "bytes " + Number(range.offset) + " to " + Number(range.end() - 1);
}

class Checker {
 public:
    explicit Checker(const Layout& layout) : layout_(layout) {}

    Findings Run() {
        if (layout_.file_size == 0) {
            Note("the file is empty: a new stream, to which nothing has been written");
            return findings_;
        }
        if (!CheckHeader()) return findings_;
        CheckEntries();
        CheckOverlaps();
        if (layout_.HasAttributeArea()) CheckAttributeArea();
        CheckTail();
        return findings_;
    }

 private:
    void Violation(std::string text) { findings_.violations.push_back({std::move(text)}); }
    void EntryViolation(std::size_t index, const std::string& text) {
        findings_.violations.push_back({EntryText(index) + ": " + text, index});
    }
    void RecordViolation(std::size_t index, const std::string& text) {
        findings_.violations.push_back({RecordText(index) + ": " + text, {}, index});
    }
    void Note(std::string text) { findings_.notes.push_back(std::move(text)); }

    std::string EntryText(std::size_t index) const {
        return "entry " + Number(index) + " (" + EntryName(layout_.entries[index].id) + ")";
    }

    std::string RecordText(std::size_t index) const {
        return "attribute " + Number(index) + " \"" + Printable(layout_.records[index].name()) +
               "\"";
    }

    // False when there is nothing to be said of the rest.
    bool CheckHeader() {
        if (!layout_.header) {
            Violation("the file ends inside its header: " + Number(layout_.file_size) + " of " +
                      Number(AppleDoubleHeader::kSize) + " bytes");
            return false;
        }
        const AppleDoubleHeader& header = *layout_.header;
        if (!layout_.IsAppleDouble()) {
            Violation("the magic is " + HexNumber(header.magic) + ", not " +
                      HexNumber(kAppleDoubleMagic) + ": no AppleDouble file");
            return false;
        }
        if (header.version != kAppleDoubleVersion2) {
            Violation("the version is " + HexNumber(header.version) + ", not " +
                      HexNumber(kAppleDoubleVersion2));
        }
        if (header.entry_count > kStreamDescriptorMax) {
            Violation(Number(header.entry_count) + " entries are declared; a stream of more than " +
                      Number(kStreamDescriptorMax) + " is not opened");
        }
        if (layout_.entries.size() < header.entry_count) {
            Violation("the file ends inside its descriptors: " + Number(layout_.entries.size()) +
                      " of " + Number(header.entry_count) + " are there");
        }
        return true;
    }

    void CheckEntries() {
        std::set<EntryId> seen;
        const std::uint64_t head_end = DescriptorsEnd(layout_.header->entry_count);
        for (std::size_t i = 0; i < layout_.entries.size(); ++i) {
            const EntryDescriptor& entry = layout_.entries[i];
            if (!seen.insert(entry.id).second) {
                EntryViolation(i, "the same kind a second time, which hides the first");
            }
            if (entry.id == EntryId::kFinderInfo && entry.data.length < kFinderInfoSize) {
                EntryViolation(
                    i, Number(entry.data.length) + " bytes, fewer than " + Number(kFinderInfoSize));
            }
            if (entry.data.length == 0) continue;
            if (entry.data.offset < head_end) {
                EntryViolation(i, Span(entry.data) + " begin inside the header, which ends at " +
                                      Number(head_end));
            }
            if (entry.data.end() > layout_.file_size) {
                EntryViolation(i, Span(entry.data) + " pass the end of the file at " +
                                      Number(layout_.file_size));
            }
        }
        for (const EntryId id : {EntryId::kFinderInfo, EntryId::kResourceFork}) {
            if (!layout_.FindEntry(id)) Note(std::string("no ") + EntryName(id) + " entry");
        }
    }

    void CheckOverlaps() {
        std::vector<std::size_t> order;
        for (std::size_t i = 0; i < layout_.entries.size(); ++i) {
            if (layout_.entries[i].data.length > 0) order.push_back(i);
        }
        std::stable_sort(order.begin(), order.end(), [this](std::size_t a, std::size_t b) {
            return layout_.entries[a].data.offset < layout_.entries[b].data.offset;
        });
        std::size_t furthest = 0;  // of `order`: the entry that reaches furthest so far
        for (std::size_t i = 1; i < order.size(); ++i) {
            const Range before = layout_.entries[order[furthest]].data;
            const Range range = layout_.entries[order[i]].data;
            if (range.offset < before.end()) {
                EntryViolation(order[i], Span(range) + " overlap " + EntryText(order[furthest]) +
                                             ", " + Span(before));
            }
            if (range.end() > before.end()) furthest = i;
        }
    }

    void CheckAttributeArea() {
        if (!layout_.attributes) {
            Violation("the file ends inside its attribute header");
            return;
        }
        if (layout_.attributes->magic != kAttributeMagic) {
            Violation("the attribute header's magic is " + HexNumber(layout_.attributes->magic) +
                      ", not " + HexNumber(kAttributeMagic) + ": its attributes are not read");
            return;
        }
        CheckSizes();
        CheckTable();
        CheckValues();
        CheckFork();
    }

    void CheckSizes() {
        const AttributeHeader& attributes = *layout_.attributes;
        const std::uint64_t data_end = attributes.data.end();
        const Range finder_info = layout_.entries[*layout_.FindEntry(EntryId::kFinderInfo)].data;
        if (finder_info.offset != kFinderInfoOffset) {
            Note("the Finder info is at " + Number(finder_info.offset) + ", not at " +
                 Number(kFinderInfoOffset) + "; a rewrite moves it there");
        }
        if (finder_info.end() != attributes.total_size) {
            Violation("the Finder info entry ends at " + Number(finder_info.end()) +
                      ", not at the total size " + Number(attributes.total_size));
        }
        if (attributes.total_size < data_end) {
            Violation("the total size " + Number(attributes.total_size) +
                      " is less than the values' end at " + Number(data_end));
        } else if (attributes.total_size > data_end) {
            Note(Number(attributes.total_size - data_end) +
                 " unused bytes between the values and the total size");
        }
        if (attributes.total_size > layout_.file_size) {
            Violation("the total size " + Number(attributes.total_size) +
                      " passes the end of the file at " + Number(layout_.file_size));
        }
    }

    void CheckTable() {
        const AttributeHeader& attributes = *layout_.attributes;
        if (layout_.records.size() < attributes.count) {
            Violation(
                "the file ends inside its attribute table: " + Number(layout_.records.size()) +
                " of " + Number(attributes.count) + " records are there");
        }
        const std::uint64_t table_end = layout_.TableEnd();
        if (attributes.data.offset < table_end) {
            Violation("the values begin at " + Number(attributes.data.offset) +
                      ", inside the attribute table, which ends at " + Number(table_end));
        } else if (attributes.data.offset > table_end) {
            Note(Number(attributes.data.offset - table_end) +
                 " unused bytes between the attribute table and the values");
        }
        std::map<std::string, std::size_t> seen;
        for (std::size_t i = 0; i < layout_.records.size(); ++i) {
            const Layout::Record& record = layout_.records[i];
            const std::string& name = record.stored_name;
            if (name.empty() || name.back() != '\0') {
                RecordViolation(i, "the name does not end with a NUL");
            } else if (record.name().size() + 1 != name.size()) {
                RecordViolation(i, "a NUL inside the name");
            } else if (name.size() == 1) {
                RecordViolation(i, "the name is empty");
            }
            const auto [first, is_new] = seen.emplace(record.name(), i);
            if (!is_new) {
                RecordViolation(
                    i, "the same name as attribute " + Number(first->second) + ", which it hides");
            }
        }
    }

    void CheckValues() {
        const AttributeHeader& attributes = *layout_.attributes;
        std::uint64_t next = attributes.data.offset;
        for (std::size_t i = 0; i < layout_.records.size(); ++i) {
            const Range value = layout_.records[i].fixed.value;
            if (value.length == 0) continue;  // The offset of an empty value means nothing.
            if (value.offset != next) {
                RecordViolation(i, "the value is at " + Number(value.offset) + ", not at " +
                                       Number(next) + " behind the one before");
            }
            if (value.end() > layout_.file_size) {
                RecordViolation(i, "the value, " + Span(value) +
                                       ", passes the end of the file at " +
                                       Number(layout_.file_size));
            }
            next += value.length;
        }
        if (layout_.records.size() == attributes.count && next != attributes.data.end()) {
            Violation("the values' lengths add up to " + Number(next - attributes.data.offset) +
                      ", the data length is " + Number(attributes.data.length));
        }
    }

    void CheckFork() {
        const auto index = layout_.FindEntry(EntryId::kResourceFork);
        if (!index) return;
        const Range fork = layout_.entries[*index].data;
        const std::uint32_t total_size = layout_.attributes->total_size;
        if (fork.offset == total_size) return;
        const std::string text = "the resource fork is at " + Number(fork.offset) +
                                 ", not at the total size " + Number(total_size);
        if (fork.length == 0) {
            Note(text + "; it is empty");
        } else {
            Violation(text);
        }
    }

    void CheckTail() {
        std::uint64_t end = layout_.EndBeforeFork();
        if (const auto fork = layout_.FindEntry(EntryId::kResourceFork)) {
            end = std::max(end, layout_.entries[*fork].data.end());
        }
        if (layout_.file_size > end) {
            Note(Number(layout_.file_size - end) + " bytes behind all that the file declares");
        }
    }

    const Layout& layout_;
    Findings findings_;
};

void CheckRecordEntries(const Layout& block, Findings* findings) {
    std::set<EntryId> seen;
    const auto violation = [&](std::size_t index, const std::string& text) {
        findings->violations.push_back(
            {"entry " + Number(index) + " (" + EntryName(block.entries[index].id) + "): " + text,
             index});
    };
    for (std::size_t i = 0; i < block.entries.size(); ++i) {
        const EntryDescriptor& entry = block.entries[i];
        const Slot slot = SlotOf(static_cast<std::uint32_t>(entry.id));
        if (slot == Slot::kNone) {
            violation(i, "the id " + HexNumber(static_cast<std::uint32_t>(entry.id)) +
                             " has no place in a record");
        } else if (!AcceptableEntry(slot, entry.data)) {
            violation(i, "it passes the record's " + Number(kRecordDataSize) + " bytes");
        }
        if (!seen.insert(entry.id).second) {
            violation(i, "the same kind a second time, which hides the first");
        }
        if (entry.id == EntryId::kFinderInfo && entry.data.length < kFinderInfoSize) {
            violation(i,
                      Number(entry.data.length) + " bytes, fewer than " + Number(kFinderInfoSize));
        }
    }
}

// The record of an attribute has all entries that a fresh one has, and no other.
void CheckComplete(const Layout& block, Findings* findings) {
    if (block.header->entry_count != kFreshRecord.size()) {
        findings->violations.push_back({Number(block.header->entry_count) +
                                        " entries are declared, not " +
                                        Number(kFreshRecord.size())});
    }
    for (const RecordEntry& entry : kFreshRecord) {
        const auto id = static_cast<EntryId>(entry.id);
        const auto index = block.FindEntry(id);
        if (!index || block.entries[*index].data.offset == 0) {
            findings->violations.push_back({std::string("no ") + EntryName(id) + " entry"});
        }
    }
}

}  // namespace

Findings CheckLayout(const Layout& layout) { return Checker(layout).Run(); }

Findings CheckRecord(const Layout& block, RecordPlace place) {
    Findings findings;
    const std::size_t size =
        place == RecordPlace::kAttribute ? kAttributeBlockSize : kResourceHeadSize;
    if (block.file_size != size) {
        findings.violations.push_back(
            {"it has " + Number(block.file_size) + " bytes, not " + Number(size)});
    }
    if (!block.IsAppleDouble()) {
        findings.violations.push_back({"no AppleDouble block"});
        return findings;
    }
    if (block.header->version != kAppleDoubleVersion2) {
        findings.violations.push_back({"the version is " + HexNumber(block.header->version) +
                                       ", not " + HexNumber(kAppleDoubleVersion2)});
    }
    if (block.entries.size() < block.header->entry_count) {
        findings.violations.push_back(
            {"it ends inside its descriptors: " + Number(block.entries.size()) + " of " +
             Number(block.header->entry_count) + " are there"});
    }
    CheckRecordEntries(block, &findings);
    if (place == RecordPlace::kAttribute) CheckComplete(block, &findings);
    return findings;
}

}  // namespace mavoea::tool
