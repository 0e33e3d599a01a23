#include "tools/cli/set_info.h"

#include <sys/stat.h>

#include <algorithm>
#include <cstdint>
#include <iostream>
#include <map>

#include "format/netatalk_record.h"
#include "tools/cli/opening.h"
#include "tools/place/dry_run.h"
#include "tools/say/mac_text.h"
#include "tools/say/output.h"
#include "tools/say/text.h"
#include "tools/show/dates.h"
#include "tools/show/finder_words.h"
#include "tools/show/mac_attributes.h"
#include "tools/store/encoding.h"
#include "tools/store/entries.h"
#include "tools/store/foreign/spelling.h"
#include "tools/store/reader.h"

namespace mavoea::tool {
namespace {

// Windows counts in 100 ns from 1601.
constexpr std::int64_t kFrom1601 = 11644473600;
constexpr std::uint64_t kTicks = 10000000;  // a second

// ---- The words ----------------------------------------------------------------------------------

struct InfoChange {
    std::optional<FourBytes> type;
    std::optional<FourBytes> creator;
    std::optional<std::uint8_t> label;
    FlagChange flags;
    std::optional<std::string> comment;
    std::optional<std::vector<Tag>> tags;
    std::vector<Tag> added_tags;
    std::vector<std::string> removed_tags;
    std::optional<std::int64_t> backed_up;  // in seconds from 1970-01-01 UTC
    std::optional<std::int64_t> created;

    bool ChangesTags() const { return tags || !added_tags.empty() || !removed_tags.empty(); }
    bool ChangesDates() const { return backed_up || created; }
};

Failure WrongWord(const std::string& option, const std::string& word, const std::string& cause,
                  const std::string& advice) {
    return {kFailed, option, '"' + Printable(word) + "\" " + cause, advice};
}

std::string NeedText(const std::string& option, const std::string& text) {
    if (IsUtf8(text)) return text;
    throw WrongWord(option, text, "is not UTF-8", "type it in a terminal that uses UTF-8");
}

std::optional<FourBytes> ToCode(const char* option, const std::optional<std::string>& text) {
    if (!text) return std::nullopt;
    const auto code = ParseFourBytes(*text);
    if (code) return code;
    throw WrongWord(option, *text, "does not make four bytes of Mac OS Roman",
                    "use four letters; \"\\x00\" stands for a byte, \"\\\\\" for a backslash");
}

std::uint8_t ToLabel(const char* option, const std::string& text) {
    const auto label = ParseLabel(text);
    if (label) return *label;
    throw WrongWord(option, text, "is no label",
                    "use none, grey, green, purple, blue, yellow, red, orange, or 0 to 7");
}

FlagChange ToFlags(const std::optional<std::string>& list) {
    if (!list) return {};
    std::string wrong;
    const auto change = ParseFinderFlags(*list, &wrong);
    if (!change) {
        throw WrongWord("--flags", wrong, "is no flag that can be set",
                        "use on-desk, shared, no-inits, inited, custom-icon, stationery, "
                        "name-locked, has-bundle, invisible or alias");
    }
    if ((change->set & change->cleared) != 0) {
        throw WrongWord("--flags", *list, "sets and clears the same flag", "name each once");
    }
    return *change;
}

// "Letters", "Letters:red": what is behind a colon and no colour belongs to the name.
Tag ToTag(const char* option, const std::string& text) {
    Tag tag = {NeedText(option, text)};
    if (const std::size_t colon = text.rfind(':'); colon != std::string::npos) {
        if (const auto label = ParseLabel(text.substr(colon + 1))) {
            tag = {text.substr(0, colon), *label};
        }
    }
    if (tag.name.empty() || tag.name.find('\n') != std::string::npos) {
        throw WrongWord(option, text, "is no name of a tag",
                        "use one line, as NAME or NAME:COLOUR");
    }
    return tag;
}

std::vector<Tag> ToTags(std::string_view list) {
    std::vector<Tag> tags;
    while (!list.empty()) {
        const std::string_view word = list.substr(0, list.find(','));
        tags.push_back(ToTag("--tags", std::string(word)));
        list.remove_prefix(std::min(list.size(), word.size() + 1));
    }
    return tags;
}

// AFP counts 32-bit seconds from 2000, the least of which is none.
bool IsAfpDate(std::int64_t date) {
    return date - kAfpEpoch <= INT32_MAX && date - kAfpEpoch > INT32_MIN;
}

std::optional<std::int64_t> ToDate(const char* option, const std::optional<std::string>& text) {
    if (!text) return std::nullopt;
    const auto date = ParseDate(*text);
    if (!date) {
        throw WrongWord(option, *text, "is no date", "use 2024-05-01T09:30:00Z, in UTC");
    }
    if (!IsAfpDate(*date)) {
        throw WrongWord(option, *text, "has no place among the dates of AFP",
                        "use one from 1931-12-14 to 2068-01-19");
    }
    return date;
}

InfoChange ToChange(const InfoOptions& options) {
    InfoChange change;
    change.type = ToCode("--type", options.type);
    change.creator = ToCode("--creator", options.creator);
    if (options.label) change.label = ToLabel("--label", *options.label);
    change.flags = ToFlags(options.flags);
    if (options.comment) change.comment = NeedText("--comment", *options.comment);
    if (options.tags) change.tags = ToTags(*options.tags);
    for (const std::string& tag : options.added_tags) {
        change.added_tags.push_back(ToTag("--tag", tag));
    }
    change.removed_tags = options.removed_tags;
    change.backed_up = ToDate("--backup-date", options.backed_up);
    change.created = ToDate("--created", options.created);
    const bool any = change.type || change.creator || change.label || options.flags ||
                     change.comment || change.ChangesTags() || change.ChangesDates();
    if (any) return change;
    throw Failure(kFailed, "set-info", "nothing is to be changed",
                  "mavoea set-info --help has the options");
}

// ---- One object ---------------------------------------------------------------------------------

// Mac OS Roman, as AFP clients have it, where that comes back as the same text; UTF-8 otherwise.
Bytes OldBytes(const std::string& text) {
    const auto roman = ToMacRoman(text);
    const std::string& bytes = roman && OldText(*roman) == text ? *roman : text;
    return {bytes.begin(), bytes.end()};
}

class InfoSetting {
 public:
    InfoSetting(const Object& object, const InfoChange& change)
        : object_(object), change_(change), changer_(OpenToChange(object)) {
        before_ = ReadMetadata(object_, Sidecars::Services::kLeaveOut);
        if (!before_.problems.empty()) throw Failure(before_.problems.front());
        PlanTags();
        PlanFinderInfo();
        PlanComment();
        if (change_.ChangesDates()) PlanDates();
        RequireRoom();
    }

    // The names of what has been changed.
    std::vector<std::string> Run() {
        for (const auto& [name, value] : values_) {
            if (value.empty()) {
                (void)changer_->Remove(name);
            } else {
                changer_->Set(name, value);
                if (const auto note = NoteOfUnseen(object_, name, value.size())) Note(*note);
            }
        }
        std::vector<Missing> missing;
        if (ChangesEntries()) {
            Rehearsed::Forget();  // of the places of a value not all are rehearsed
            EntryChange entries(object_);
            Fill(&entries);
            missing = entries.Write();
        }
        if (!DryRun()) Compare(&missing);
        if (missing.empty()) return Names();
        throw Failure(kFailed, object_.path(), "not everything has arrived: " + Joined(missing),
                      "see what is there with: mavoea show PATH");
    }

 private:
    // ---- What is to be there

    Failure Undecoded(std::string_view name, const std::string& reason) const {
        return {kFailed, object_.path(),
                "its \"" + std::string(name) + "\" cannot be changed: " + reason,
                "remove it, or give all tags with --tags"};
    }

    // What stays is written as it was.
    std::vector<std::string> StoredTags() const {
        const Metadata::Attribute* const there = before_.Find(kTagsName);
        if (there == nullptr || change_.tags) return {};
        std::string reason;
        const auto list = DecodeList(there->value, &reason);
        const auto texts = list ? list->Texts() : std::nullopt;
        if (!texts) throw Undecoded(kTagsName, list ? "it is no array of texts" : reason);
        return *texts;
    }

    void PlanTags() {
        if (!change_.ChangesTags()) return;
        std::vector<std::string> stored = StoredTags();
        for (const Tag& tag : change_.tags.value_or(std::vector<Tag>())) {
            stored.push_back(StoredTag(tag));
        }
        const auto remove = [&](const std::string& name) {
            std::erase_if(stored,
                          [&](const std::string& one) { return ParseStoredTag(one).name == name; });
        };
        for (const std::string& name : change_.removed_tags) remove(name);
        for (const Tag& tag : change_.added_tags) {
            remove(tag.name);
            stored.push_back(StoredTag(tag));
        }
        PlanAttribute(kTagsName, stored.empty() ? Bytes() : EncodePropertyList(stored));
        label_of_tags_ = 0;
        for (const std::string& one : stored) {
            if (*label_of_tags_ == 0) label_of_tags_ = ParseStoredTag(one).label;
        }
    }

    void PlanAttribute(std::string_view name, Bytes value) {
        if (value.size() > kPropertyListSizeMax) {
            throw Failure(kFailed, object_.path(),
                          "its \"" + std::string(name) + "\" would have more than 65536 bytes",
                          "use a shorter text");
        }
        const Metadata::Attribute* const there = before_.Find(name);
        const bool same = there == nullptr
                              ? value.empty()
                              : !there->value.damaged() && there->value.size() == value.size() &&
                                    there->value.All() == value;
        if (!same) values_[std::string(name)] = std::move(value);
    }

    void PlanFinderInfo() {
        const auto label = change_.label ? change_.label : label_of_tags_;
        const bool changes = change_.type || change_.creator || label ||
                             (change_.flags.set | change_.flags.cleared) != 0;
        if (!changes) return;
        Bytes bytes = before_.finder_info ? before_.finder_info->value.All() : Bytes();
        const Bytes old = bytes;
        bytes.resize(kFinderInfoSize);
        const FinderInfoView view(bytes.begin(), kFinderInfoSize);
        FinderInfoBytes made{};
        const auto info = object_.place.Status();
        if (info && S_ISDIR(info->st_mode)) {
            if (change_.type || change_.creator) {
                throw Failure(kFailed, object_.path(), "a directory has no type and no creator",
                              "name files only");
            }
            FolderFinderInfo folder = DecodeFolderFinderInfo(view);
            ChangeItem(label, &folder.item);
            made = EncodeFinderInfo(folder);
        } else {
            FileFinderInfo file = DecodeFileFinderInfo(view);
            if (change_.type) file.type = *change_.type;
            if (change_.creator) file.creator = *change_.creator;
            ChangeItem(label, &file.item);
            made = EncodeFinderInfo(file);
        }
        Bytes value(made.begin(), made.end());
        if (IsAllZero(value)) value.clear();
        if (value != old) values_[std::string(kFinderInfoName)] = std::move(value);
    }

    void ChangeItem(std::optional<std::uint8_t> label, FinderItem* item) const {
        item->flags =
            static_cast<std::uint16_t>((item->flags | change_.flags.set) & ~change_.flags.cleared);
        if (label) item->SetLabel(*label);
    }

    // Records, and resource files whose head is one, have a comment that AFP clients see. One that
    // is there elsewhere must not go on to say something else.
    bool KeepsComment() const {
        if (before_.entries.contains(EntryId::kComment)) return true;
        if (const Dialect* const dialect = object_.dialect()) {
            return dialect->finder_info == Dialect::FinderInfo::kRecord;
        }
        return object_.keeping() == Keeping::kEaDirectory;
    }

    void PlanComment() {
        if (!change_.comment) return;
        const std::string& text = *change_.comment;
        PlanAttribute(kCommentName, text.empty() ? Bytes() : EncodePropertyList(text));
        if (KeepsComment()) PlanEntry(EntryId::kComment, OldBytes(text));
    }

    void PlanEntry(EntryId id, Bytes value) {
        const auto there = before_.entries.find(id);
        const bool same = there == before_.entries.end() ? value.empty()
                                                         : !there->second.value.damaged() &&
                                                               there->second.value.All() == value;
        if (!same) entries_[id] = std::move(value);
    }

    // Samba keeps the time of creation among its own attributes, and takes a record without one for
    // made in 2068.
    void PlanDates() {
        const Dialect* const dialect = object_.dialect();
        const bool is_samba =
            dialect != nullptr && dialect->marks == Dialect::Marks::kDosAttributes;
        Bytes dates = DatesBefore();
        std::optional<std::int64_t> created = change_.created;
        if (is_samba) {
            if (created) created_ = static_cast<std::uint64_t>(*created + kFrom1601) * kTicks;
            const bool has_record = LoadBe32(dates.data()) != kUnknownDate;
            const bool in_stream =
                dialect->finder_info == Dialect::FinderInfo::kStream && WillHaveFinderInfo();
            if (!has_record && (in_stream || !change_.backed_up)) {
                created.reset();
                if (!change_.backed_up) return;
            } else if (!has_record) {
                created = CreationForRecord();
            }
        }
        PutDate(created, 0, &dates);
        PutDate(change_.backed_up, kBackupDateOffset, &dates);
        PlanEntry(EntryId::kFileDates, std::move(dates));
    }

    bool WillHaveFinderInfo() const {
        const auto planned = values_.find(std::string(kFinderInfoName));
        return planned == values_.end() ? before_.finder_info.has_value()
                                        : !planned->second.empty();
    }

    Bytes DatesBefore() const {
        const auto there = before_.entries.find(EntryId::kFileDates);
        Bytes dates = there == before_.entries.end() ? Bytes() : there->second.value.All();
        for (std::size_t at = dates.size() / sizeof kUnknownDate * sizeof kUnknownDate;
             at < kFileDatesSize; at += sizeof kUnknownDate) {
            dates.resize(at + sizeof kUnknownDate);
            StoreBe32(kUnknownDate, &dates[at]);
        }
        return dates;
    }

    static void PutDate(const std::optional<std::int64_t>& date, std::size_t at, Bytes* dates) {
        if (date) StoreBe32(static_cast<std::uint32_t>(*date - kAfpEpoch), &(*dates)[at]);
    }

    std::int64_t CreationForRecord() const {
        if (change_.created) return *change_.created;
        if (before_.created) {
            const auto seconds = static_cast<std::int64_t>(*before_.created / kTicks) - kFrom1601;
            if (IsAfpDate(seconds)) return seconds;
        }
        throw Failure(kFailed, object_.path(),
                      "its record would have a backup date and none of creation, which Samba takes "
                      "for one in 2068",
                      "give it one with --created");
    }

    // ---- Writing and comparing

    bool ChangesEntries() const { return !entries_.empty() || created_; }

    void Fill(EntryChange* change) const {
        for (const auto& [id, value] : entries_) change->Set(id, value);
        if (created_) change->SetCreated(*created_);
    }

    // Whether it all has a place is asked before anything has changed.
    void RequireRoom() const {
        if (!ChangesEntries()) return;
        EntryChange change(object_);
        Fill(&change);
        for (const auto& [name, value] : values_) {
            if (KindOf(name) == Kind::kAttribute && !value.empty()) change.Expect(name, value);
        }
        const std::vector<Missing> missing = change.Fit();
        if (missing.empty()) return;
        throw Failure(kFailed, object_.path(), "there is no place for " + Joined(missing),
                      "nothing has been changed");
    }

    void Compare(std::vector<Missing>* missing) const {
        const Metadata found = ReadMetadata(object_, Sidecars::Services::kLeaveOut);
        Metadata wanted;
        wanted.locked = before_.locked;
        const auto gone = [&](bool is_there, const std::string& item) {
            if (is_there) missing->push_back({item, "it is there still"});
        };
        for (const auto& [name, value] : values_) {
            if (KindOf(name) == Kind::kFinderInfo) {
                if (value.empty()) gone(found.finder_info.has_value(), "Finder info");
                if (!value.empty()) wanted.finder_info = Metadata::Item{Content(value), {}};
            } else if (value.empty()) {
                gone(found.Find(name) != nullptr, NameOfAttribute(name));
            } else {
                // Its flags are its own.
                const Metadata::Attribute* const there = found.Find(name);
                const std::uint16_t flags = there == nullptr ? std::uint16_t{0} : there->flags;
                wanted.attributes.push_back({name, Content(value), flags, {}});
            }
        }
        const std::vector<Missing> differing = WhatIsMissing(wanted, found);
        missing->insert(missing->end(), differing.begin(), differing.end());
    }

    std::vector<std::string> Names() const {
        std::vector<std::string> names;
        for (const auto& [name, value] : values_) names.push_back(name);
        for (const auto& [id, value] : entries_) names.push_back(NameOfEntry(id));
        if (created_) names.emplace_back("creation time");
        return names;
    }

    const Object object_;
    const InfoChange& change_;
    std::unique_ptr<Changer> changer_;
    Metadata before_;
    std::map<std::string, Bytes> values_;  // empty: it goes
    std::map<EntryId, Bytes> entries_;     // the same
    std::optional<std::uint64_t> created_;
    std::optional<std::uint8_t> label_of_tags_;
};

std::string ChangedText(const std::vector<std::string>& names) {
    if (names.empty()) return "nothing to change";
    std::string text;
    for (const std::string& name : names) {
        text += (text.empty() ? "changed " : ", ") + Printable(name);
    }
    return text;
}

}  // namespace

ExitStatus SetInfo(const SetInfoOptions& options) {
    const InfoChange change = ToChange(options.info);
    ExitStatus status = kSuccess;
    const auto fail = [&](const Failure& failure) {
        Report(failure);
        status = std::max(status, failure.status());
    };
    Json list = Json::Array();
    PathReader reader(options.paths, fail);
    while (const auto path = reader.Next()) {
        try {
            const Object object = FindObject(*path);
            const std::vector<std::string> changed = InfoSetting(object, change).Run();
            if (options.verbose && !options.json) {
                std::cout << Printable(object.path()) << ": " << ChangedText(changed) << '\n';
            }
            Json entry;
            entry.SetText("path", object.path());
            entry.Set("changed", Json(changed));
            list.Add(std::move(entry));
        } catch (const Failure& failure) {
            fail(failure);
        }
    }
    if (options.json) Print(list);
    return status;
}

}  // namespace mavoea::tool
