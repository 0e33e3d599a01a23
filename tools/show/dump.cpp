#include "tools/show/dump.h"

#include "tools/say/text.h"
#include "tools/show/entry_text.h"
#include "tools/show/fields.h"

namespace mavoea::tool {
namespace {

const char* FileKind(const Layout& layout) {
    if (layout.file_size == 0) return "empty file";
    if (!layout.header) return "too short a file";
    if (!layout.IsAppleDouble()) return "no AppleDouble file";
    return layout.HasAttributeArea() ? "EA stream" : "plain AppleDouble file";
}

std::string TextOf(ByteView bytes) { return {bytes.begin(), bytes.end()}; }

std::string RangeText(Range range) {
    return "offset " + std::to_string(range.offset) + "  length " + std::to_string(range.length);
}

// Private ids are known by their hexadecimal digits.
std::string IdText(EntryId id) {
    const auto number = static_cast<std::uint32_t>(id);
    return number > 0xFFFF ? HexNumber(number) : std::to_string(number);
}

void AddHeader(const Layout& layout, Fields* out) {
    const AppleDoubleHeader& header = *layout.header;
    out->Add("magic", HexNumber(header.magic));
    out->Add("version", HexNumber(header.version));
    out->Add("filler", HexDigits(header.filler) + " \"" + Printable(TextOf(header.filler)) + "\"");
    out->Add("entries", std::to_string(header.entry_count));
    for (std::size_t i = 0; i < layout.entries.size(); ++i) {
        const EntryDescriptor& entry = layout.entries[i];
        out->Line("  " + std::to_string(i) + "  id " + IdText(entry.id) + " (" +
                  EntryName(entry.id) + ")  " + RangeText(entry.data));
    }
    if (!layout.finder_info.empty()) out->Add("Finder info", HexDigits(layout.finder_info));
    for (const auto& [index, bytes] : layout.contents) {
        const EntryId id = layout.entries[index].id;
        out->Add(EntryName(id), EntryText(id, bytes));
    }
}

void AddAttributes(const Layout& layout, Fields* out) {
    const AttributeHeader& attributes = *layout.attributes;
    out->Add("pad", HexNumber(attributes.pad, 4));
    out->Add("attribute magic", HexNumber(attributes.magic));
    out->Add("debug tag", HexNumber(attributes.debug_tag));
    out->Add("total size", std::to_string(attributes.total_size));
    out->Add("data start", std::to_string(attributes.data.offset));
    out->Add("data length", std::to_string(attributes.data.length));
    out->Add("reserved", HexDigits(attributes.reserved));
    out->Add("flags", HexNumber(attributes.flags, 4));
    out->Add("attributes", std::to_string(attributes.count));
    for (std::size_t i = 0; i < layout.records.size(); ++i) {
        const Layout::Record& record = layout.records[i];
        out->Line("  " + std::to_string(i) + "  " + RangeText(record.fixed.value) + "  flags " +
                  HexNumber(record.fixed.flags, 4) + "  name size " +
                  std::to_string(record.fixed.name_size) + "  \"" + Printable(record.name()) +
                  "\"");
    }
}

Json RangeJson(Range range) {
    return Json::Object({{"offset", range.offset}, {"length", range.length}});
}

}  // namespace

std::string DumpText(const std::string& path, const Layout& layout, const Findings& findings,
                     const char* kind) {
    Fields out;
    out.Line(Printable(path) + ": " + (kind == nullptr ? FileKind(layout) : kind) + ", " +
             std::to_string(layout.file_size) + " bytes");
    if (layout.header) AddHeader(layout, &out);
    if (layout.attributes) AddAttributes(layout, &out);
    if (const auto fork = layout.FindEntry(EntryId::kResourceFork)) {
        const Range range = layout.entries[*fork].data;
        out.Add("resource fork", range.length == 0 ? "none" : RangeText(range));
    }
    out.AddFindings(findings);
    return out.Take();
}

Json DumpJson(const std::string& path, const Layout& layout, const Findings& findings,
              const char* kind) {
    Json json;
    json.SetText("file", path);
    json.Set("kind", kind == nullptr ? FileKind(layout) : kind);
    json.Set("size", layout.file_size);
    if (layout.header) {
        const AppleDoubleHeader& header = *layout.header;
        json.Set("header", Json::Object({{"magic", header.magic},
                                         {"version", header.version},
                                         {"filler", HexDigits(header.filler)},
                                         {"entryCount", header.entry_count}}));
        Json entries = Json::Array();
        for (std::size_t i = 0; i < layout.entries.size(); ++i) {
            const EntryDescriptor& entry = layout.entries[i];
            Json item = Json::Object({{"id", static_cast<std::uint32_t>(entry.id)},
                                      {"name", EntryName(entry.id)},
                                      {"offset", entry.data.offset},
                                      {"length", entry.data.length}});
            if (const auto contents = layout.contents.find(i); contents != layout.contents.end()) {
                AddEntryJson(entry.id, contents->second, &item);
            }
            entries.Add(std::move(item));
        }
        json.Set("entries", std::move(entries));
    }
    if (!layout.finder_info.empty()) json.Set("finderInfo", HexDigits(layout.finder_info));
    if (layout.attributes) {
        const AttributeHeader& attributes = *layout.attributes;
        json.Set("attributeHeader", Json::Object({{"pad", attributes.pad},
                                                  {"magic", attributes.magic},
                                                  {"debugTag", attributes.debug_tag},
                                                  {"totalSize", attributes.total_size},
                                                  {"dataStart", attributes.data.offset},
                                                  {"dataLength", attributes.data.length},
                                                  {"reserved", HexDigits(attributes.reserved)},
                                                  {"flags", attributes.flags},
                                                  {"count", attributes.count}}));
        Json list = Json::Array();
        for (const Layout::Record& record : layout.records) {
            Json entry;
            entry.SetText("name", record.name());
            entry.Set("offset", record.fixed.value.offset);
            entry.Set("length", record.fixed.value.length);
            entry.Set("flags", record.fixed.flags);
            entry.Set("nameSize", record.fixed.name_size);
            list.Add(std::move(entry));
        }
        json.Set("attributes", std::move(list));
    }
    if (const auto fork = layout.FindEntry(EntryId::kResourceFork)) {
        json.Set("resourceFork", RangeJson(layout.entries[*fork].data));
    }
    json.Set("notes", findings.notes);
    json.Set("violations", Fields::ViolationsJson(findings));
    return json;
}

}  // namespace mavoea::tool
