#include "tools/show/object_info.h"

#include <sys/stat.h>

#include <algorithm>
#include <iomanip>
#include <iostream>

#include "tools/say/mac_text.h"
#include "tools/say/output.h"
#include "tools/say/text.h"
#include "tools/show/attributes.h"
#include "tools/show/dates.h"
#include "tools/show/entry_text.h"
#include "tools/show/finder_words.h"
#include "tools/show/mac_attributes.h"

namespace mavoea::tool {
namespace {

constexpr std::string_view kPropertyListPrefix = "com.apple.metadata:";

std::string Quoted(std::string_view text) { return '"' + Printable(text) + '"'; }

std::string BytesText(std::uint64_t size) {
    return std::to_string(size) + (size == 1 ? " byte" : " bytes");
}

// One object, as lines of a label and what there is to say, and as JSON: each part adds to both.
class Description {
 public:
    Description(const Object& object, const Metadata& metadata) : metadata_(metadata) {
        const auto info = object.place.Status();
        is_directory_ = info && S_ISDIR(info->st_mode);
        json_.SetText("path", object.path());
        json_.Set("kind", is_directory_                    ? "directory"
                          : info && S_ISREG(info->st_mode) ? "file"
                                                           : "other");
        json_.Set("volume", TypeJson(object.type));
        AddFinderInfo();
        AddComments();
        AddTags();
        AddWhereFrom();
        AddDates();
        AddQuarantine();
        AddMarks();
        AddFork();
        AddEntries();
        AddAttributes();
        SetStrays(object, metadata, &json_);
    }

    struct InfoLine {
        std::string label;
        std::string text;
    };
    const std::vector<InfoLine>& lines() const { return lines_; }
    const Json& json() const { return json_; }

 private:
    void Line(const std::string& label, const std::string& text) {
        lines_.push_back({label, text});
    }

    // ---- Finder info

    void AddFinderInfo() {
        if (!metadata_.finder_info || metadata_.finder_info->value.damaged()) return;
        const Bytes bytes = metadata_.finder_info->value.All();
        if (bytes.size() != kFinderInfoSize) return;
        const FinderInfoView view(bytes.begin(), kFinderInfoSize);
        Json json;
        if (is_directory_) {
            const FolderFinderInfo info = DecodeFolderFinderInfo(view);
            AddWindow(info, &json);
            AddItem(info.item, &json);
        } else {
            const FileFinderInfo info = DecodeFileFinderInfo(view);
            AddCode("type", info.type, &json);
            AddCode("creator", info.creator, &json);
            AddItem(info.item, &json);
        }
        json.Set("hex", HexDigits(bytes));
        json_.Set("finderInfo", std::move(json));
    }

    void AddCode(const char* name, const FourBytes& code, Json* json) {
        if (IsAllZero(code)) return;
        const std::string text = FourBytesText(code);
        Line(name, text);
        json->Set(name, text);
        json->Set(std::string(name) + "Hex", HexDigits(code));
    }

    static Json PointJson(FinderPoint point) {
        return Json::Object({{"across", Json(point.across)}, {"down", Json(point.down)}});
    }
    static std::string PointText(FinderPoint point) {
        return std::to_string(point.across) + " across, " + std::to_string(point.down) + " down";
    }

    void AddWindow(const FolderFinderInfo& info, Json* json) {
        if (info.window_begin != FinderPoint() || info.window_end != FinderPoint()) {
            Line("window", PointText(info.window_begin) + " to " + PointText(info.window_end));
            json->Set("window", Json::Object({{"from", PointJson(info.window_begin)},
                                              {"to", PointJson(info.window_end)}}));
        }
        if (info.scrolled != FinderPoint()) {
            Line("scrolled", PointText(info.scrolled));
            json->Set("scrolled", PointJson(info.scrolled));
        }
    }

    void AddItem(const FinderItem& item, Json* json) {
        const std::uint8_t label = item.label();
        if (label != 0) Line("label", LabelName(label));
        json->Set("label", LabelName(label));
        json->Set("labelNumber", label);
        const std::vector<std::string> names = FinderFlagNames(item.flags);
        if (!names.empty()) Line("flags", Joined(names));
        json->Set("flags", Json(names));
        json->Set("flagBits", item.flags);
        if (item.place != FinderPoint()) {
            Line("location", PointText(item.place));
            json->Set("location", PointJson(item.place));
        }
        if (item.extended_flags != 0) {
            Line("extended flags", HexNumber(item.extended_flags, 4));
            json->Set("extendedFlags", item.extended_flags);
        }
        if (item.put_away != 0) {
            Line("put away to", "folder " + std::to_string(item.put_away));
            json->Set("putAway", item.put_away);
        }
    }

    static std::string Joined(const std::vector<std::string>& words) {
        std::string text;
        for (const std::string& word : words) text += (text.empty() ? "" : ", ") + word;
        return text;
    }

    // ---- What Macs keep in attributes

    // Runs `use` with what `decode` makes of the attribute. What cannot be decoded is shown among
    // the other attributes.
    template <class Decode, class Use>
    void WithAttribute(std::string_view name, Decode decode, Use use) {
        const Metadata::Attribute* const attribute = metadata_.Find(name);
        if (attribute == nullptr) return;
        std::string reason;
        const auto decoded = decode(attribute->value, &reason);
        if (!decoded) {
            undecoded_[attribute] = reason;
            return;
        }
        shown_.push_back(attribute);
        use(*decoded);
    }

    void AddComments() {
        std::optional<std::string> comment;
        WithAttribute(kCommentName, DecodeComment, [&](const std::string& text) {
            comment = text;
            Line("comment", Quoted(text));
            json_.SetText("comment", text);
        });
        const auto entry = metadata_.entries.find(EntryId::kComment);
        if (entry == metadata_.entries.end() || !IsShort(entry->second.value)) return;
        const Bytes bytes = entry->second.value.All();
        const std::string text =
            OldText({reinterpret_cast<const char*>(bytes.data()), bytes.size()});
        shown_entries_.push_back(EntryId::kComment);
        json_.SetText("afpComment", text);
        if (!comment) Line("comment", Quoted(text));
        if (comment && *comment != text) Line("AFP comment", Quoted(text));
    }

    void AddTags() {
        WithAttribute(kTagsName, DecodeTags, [&](const std::vector<Tag>& tags) {
            std::string text;
            Json json = Json::Array();
            for (const Tag& tag : tags) {
                text += (text.empty() ? "" : ", ") + Quoted(tag.name);
                if (tag.label != 0) text += std::string(" (") + LabelName(tag.label) + ')';
                Json one;
                one.SetText("name", tag.name);
                one.Set("colour", LabelName(tag.label));
                one.Set("colourNumber", tag.label);
                json.Add(std::move(one));
            }
            Line("tags", text);
            json_.Set("tags", std::move(json));
        });
    }

    void AddWhereFrom() {
        WithAttribute(kWhereFromName, DecodeWhereFrom, [&](const std::vector<std::string>& places) {
            for (const std::string& place : places) Line("where from", Printable(place));
            json_.Set("whereFrom", Json(places));
        });
    }

    void AddQuarantine() {
        WithAttribute(kQuarantineName, DecodeQuarantine, [&](const Quarantine& quarantine) {
            std::string text = "flags " + HexNumber(quarantine.flags, 4);
            for (const std::string& part : {quarantine.time, quarantine.agent, quarantine.id}) {
                if (!part.empty()) text += ", " + Printable(part);
            }
            Line("quarantine", text);
            Json json;
            json.Set("flags", quarantine.flags);
            if (!quarantine.time.empty()) json.Set("time", quarantine.time);
            json.SetText("agent", quarantine.agent);
            json.SetText("id", quarantine.id);
            json_.Set("quarantine", std::move(json));
        });
    }

    // ---- Dates, marks, entries

    void AddDates() {
        Json json;
        bool any = false;
        const auto add = [&](const char* label, const char* key, const std::string& time) {
            Line(label, time);
            json.Set(key, time);
            any = true;
        };
        const auto entry = metadata_.entries.find(EntryId::kFileDates);
        if (entry != metadata_.entries.end() && IsShort(entry->second.value)) {
            struct Field {
                const char* label;
                const char* key;
            };
            constexpr Field kFields[] = {{"created", "created"},
                                         {"modified", "modified"},
                                         {"backed up", "backedUp"},
                                         {"accessed", "accessed"}};
            const Bytes bytes = entry->second.value.All();
            std::size_t at = 0;
            for (const Field& field : kFields) {
                if (at + sizeof kUnknownDate > bytes.size()) break;
                const std::uint32_t stored = LoadBe32(&bytes[at]);
                at += sizeof kUnknownDate;
                if (stored == kUnknownDate) continue;
                add(field.label, field.key,
                    *DateText(kAfpEpoch + static_cast<std::int32_t>(stored)));
            }
            shown_entries_.push_back(EntryId::kFileDates);
        }
        if (metadata_.created) {
            const auto time = WindowsDateText(*metadata_.created);
            add("created for SMB", "createdForSmb",
                time.value_or(std::to_string(*metadata_.created)));
        }
        if (any) json_.Set("dates", std::move(json));
    }

    void AddMarks() {
        std::vector<std::string> marks;
        if (metadata_.locked) marks.emplace_back("locked");
        if (metadata_.hidden) marks.emplace_back("hidden");
        if (metadata_.archived) marks.emplace_back("archive");
        if (metadata_.system) marks.emplace_back("system");
        if (!marks.empty()) Line("marks", Joined(marks));
        json_.Set("marks", Json(marks));
    }

    void AddFork() {
        if (!metadata_.fork) return;
        const std::uint64_t size = metadata_.fork->value.size();
        Line("resource fork", BytesText(size));
        json_.Set("resourceFork", Json::Object({{"size", Json(size)}}));
    }

    static bool IsShort(const Content& value) {
        constexpr std::uint64_t kMost = 1024;
        return !value.damaged() && value.size() <= kMost;
    }

    void AddEntries() {
        Json json = Json::Array();
        bool any = false;
        for (const auto& [id, item] : metadata_.entries) {
            if (std::find(shown_entries_.begin(), shown_entries_.end(), id) !=
                shown_entries_.end()) {
                continue;
            }
            Json one;
            one.Set("name", NameOfEntry(id));
            one.Set("size", item.value.size());
            if (IsShort(item.value)) {
                const Bytes bytes = item.value.All();
                Line(NameOfEntry(id), EntryText(id, bytes));
                AddEntryJson(id, bytes, &one);
            } else {
                Line(NameOfEntry(id), BytesText(item.value.size()));
            }
            json.Add(std::move(one));
            any = true;
        }
        if (any) json_.Set("entries", std::move(json));
    }

    // ---- All other attributes

    static std::string ListText(const PropertyList& list) {
        if (const auto text = list.Text()) return Quoted(*text);
        return Printable(list.AsJson().Line());
    }

    void AddAttributes() {
        Json json = Json::Array();
        for (const Metadata::Attribute& attribute : metadata_.attributes) {
            if (std::find(shown_.begin(), shown_.end(), &attribute) != shown_.end()) continue;
            Json one;
            one.SetText("name", attribute.name);
            one.Set("size", attribute.value.size());
            AddAttribute(attribute, &one);
            json.Add(std::move(one));
        }
        json_.Set("attributes", std::move(json));
    }

    void AddAttribute(const Metadata::Attribute& attribute, Json* json) {
        const std::string label = Printable(attribute.name);
        std::string reason;
        if (const auto known = undecoded_.find(&attribute); known != undecoded_.end()) {
            reason = known->second;
        } else if (attribute.name.starts_with(kPropertyListPrefix)) {
            if (const auto list = DecodeList(attribute.value, &reason)) {
                Line(label, ListText(*list));
                json->Set("value", list->AsJson());
                return;
            }
        } else {
            return Line(label, BytesText(attribute.value.size()));
        }
        Line(label, BytesText(attribute.value.size()) + ", not decoded: " + reason);
        json->Set("undecoded", reason);
    }

    const Metadata& metadata_;
    bool is_directory_ = false;
    std::vector<InfoLine> lines_;
    Json json_;
    std::vector<const Metadata::Attribute*> shown_;
    std::map<const Metadata::Attribute*, std::string> undecoded_;
    std::vector<EntryId> shown_entries_;
};

void PrintLines(const std::vector<Description::InfoLine>& lines) {
    constexpr std::size_t kWidthMost = 24;
    std::size_t width = 0;
    for (const auto& line : lines) {
        if (line.label.size() <= kWidthMost) width = std::max(width, line.label.size());
    }
    for (const auto& line : lines) {
        std::cout << std::left << std::setw(static_cast<int>(width)) << line.label << std::right
                  << "  " << line.text << '\n';
    }
}

}  // namespace

ExitStatus Show(const TreeOptions& options) {
    const auto look = [&](const Object& object, const std::string& shown, const Metadata& metadata,
                          const std::function<void()>& separate) {
        const Description description(object, metadata);
        if (options.json) {
            std::cout << description.json().Line() << '\n';
            return;
        }
        if (description.lines().empty() && options.recursive) return;
        if (options.recursive || options.paths.several()) {
            separate();
            std::cout << Printable(shown) << ":\n";
        }
        PrintLines(description.lines());
        TellStrays(object, metadata);
    };
    return LookAtObjects("showing", options, look);
}

}  // namespace mavoea::tool
