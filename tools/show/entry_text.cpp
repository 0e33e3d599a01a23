#include "tools/show/entry_text.h"

#include <array>
#include <cstdint>
#include <vector>

#include "tools/say/mac_text.h"
#include "tools/show/dates.h"
#include "util/bytes.h"

namespace mavoea::tool {
namespace {

// ---- File dates: four times, each in signed seconds since 2000-01-01 UTC ------------------------

constexpr std::size_t kDateSize = 4;
constexpr std::array<const char*, 4> kDateNames = {"created", "modified", "backedUp", "accessed"};
constexpr std::array<const char*, 4> kDateLabels = {"created", "modified", "backed up", "accessed"};

struct Date {
    std::int64_t seconds = 0;  // since 2000-01-01 UTC
    std::string time;
};

Date DecodeDate(std::uint32_t stored) {
    if (stored == kUnknownDate) return {static_cast<std::int32_t>(stored), "unknown"};
    const std::int64_t seconds = static_cast<std::int32_t>(stored);
    return {seconds, *DateText(kAfpEpoch + seconds)};
}

// As many as are there whole.
std::vector<Date> DecodeDates(ByteView bytes) {
    std::vector<Date> dates;
    for (std::size_t at = 0; at + kDateSize <= bytes.size() && dates.size() < kDateNames.size();
         at += kDateSize) {
        dates.push_back(DecodeDate(LoadBe32(&bytes[at])));
    }
    return dates;
}

// ---- AFP file info ------------------------------------------------------------------------------

struct AfpAttribute {
    std::uint16_t bit;
    const char* name;
};
constexpr AfpAttribute kAfpAttributes[] = {
    {kAfpInvisible, "invisible"}, {0x0002, "multi-user"},         {0x0004, "system"},
    {0x0008, "data fork open"},   {0x0010, "resource fork open"}, {kAfpNoWrite, "no write"},
    {0x0040, "backup needed"},    {kAfpNoRename, "no rename"},    {kAfpNoDelete, "no delete"},
    {0x0400, "no copy"}};

std::vector<std::string> AfpAttributeNames(std::uint16_t word) {
    std::vector<std::string> names;
    for (const AfpAttribute& attribute : kAfpAttributes) {
        if ((word & attribute.bit) != 0) names.emplace_back(attribute.name);
    }
    return names;
}

// ---- Which entry is what ------------------------------------------------------------------------

enum class Contents { kText, kDates, kAfpFileInfo, kBytes };

Contents ContentsOf(EntryId id, ByteView bytes) {
    switch (static_cast<std::uint32_t>(id)) {
        case 3:
        case 4:
        case 13:
            return Contents::kText;
        case 8:
            return bytes.size() >= kDateSize ? Contents::kDates : Contents::kBytes;
        case 14:
            return bytes.size() >= kAfpFileInfoSize ? Contents::kAfpFileInfo : Contents::kBytes;
        default:
            return Contents::kBytes;
    }
}

std::string TextOf(ByteView bytes) { return {bytes.begin(), bytes.end()}; }

std::string DateText(const Date& date) {
    return date.time + " (" + std::to_string(date.seconds) + ")";
}

}  // namespace

std::string AfpDateText(std::uint32_t stored) { return DateText(DecodeDate(stored)); }

std::string EntryText(EntryId id, const Bytes& bytes) {
    std::string text;
    switch (ContentsOf(id, bytes)) {
        case Contents::kText:
            return "\"" + Printable(TextOf(bytes)) + "\"";
        case Contents::kDates: {
            const std::vector<Date> dates = DecodeDates(bytes);
            for (std::size_t i = 0; i < dates.size(); ++i) {
                text +=
                    (i == 0 ? "" : ", ") + std::string(kDateLabels[i]) + ' ' + DateText(dates[i]);
            }
            return text;
        }
        case Contents::kAfpFileInfo: {
            const std::uint16_t word = LoadBe16(&bytes[kAfpAttributesOffset]);
            text = "attributes " + HexNumber(word, 4);
            const char* separator = ": ";
            for (const std::string& name : AfpAttributeNames(word)) {
                text += separator + name;
                separator = ", ";
            }
            return text;
        }
        case Contents::kBytes:
            break;
    }
    return HexDigits(bytes);
}

void AddEntryJson(EntryId id, const Bytes& bytes, Json* entry) {
    switch (ContentsOf(id, bytes)) {
        case Contents::kText:
            entry->SetText("text", TextOf(bytes));
            return;
        case Contents::kDates: {
            const std::vector<Date> dates = DecodeDates(bytes);
            Json json;
            for (std::size_t i = 0; i < dates.size(); ++i) {
                json.Set(kDateNames[i],
                         Json::Object({{"seconds", dates[i].seconds}, {"time", dates[i].time}}));
            }
            entry->Set("dates", std::move(json));
            return;
        }
        case Contents::kAfpFileInfo: {
            const std::uint16_t word = LoadBe16(&bytes[kAfpAttributesOffset]);
            entry->Set("attributes", word);
            entry->Set("attributeNames", AfpAttributeNames(word));
            return;
        }
        case Contents::kBytes:
            entry->Set("hex", HexDigits(bytes));
            return;
    }
}

}  // namespace mavoea::tool
