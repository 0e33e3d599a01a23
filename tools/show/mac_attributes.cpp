#include "tools/show/mac_attributes.h"

#include <algorithm>
#include <charconv>

#include "tools/show/dates.h"

namespace mavoea::tool {
namespace {

constexpr const char* kNoText = "it is no text";
constexpr const char* kNoTexts = "it is no array of texts";

std::optional<std::uint64_t> ParseHexNumber(std::string_view text) {
    std::uint64_t number = 0;
    const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number, 16);
    if (error != std::errc() || end != text.data() + text.size()) return std::nullopt;
    return number;
}

std::string_view TakePart(std::string_view* text) {
    const std::string_view part = text->substr(0, text->find(';'));
    text->remove_prefix(std::min(text->size(), part.size() + 1));
    return part;
}

}  // namespace

std::optional<PropertyList> DecodeList(const Content& value, std::string* reason) {
    if (value.damaged()) {
        *reason = value.problem();
        return std::nullopt;
    }
    return PropertyList::Parse(value.Read(0, kPropertyListSizeMax + 1), reason);
}

std::optional<std::vector<std::string>> DecodeWhereFrom(const Content& value, std::string* reason) {
    const auto list = DecodeList(value, reason);
    if (!list) return std::nullopt;
    auto texts = list->Texts();
    if (!texts) *reason = kNoTexts;
    return texts;
}

std::optional<std::string> DecodeComment(const Content& value, std::string* reason) {
    const auto list = DecodeList(value, reason);
    if (!list) return std::nullopt;
    auto text = list->Text();
    if (!text) *reason = kNoText;
    return text;
}

std::optional<std::vector<Tag>> DecodeTags(const Content& value, std::string* reason) {
    const auto texts = DecodeWhereFrom(value, reason);
    if (!texts) return std::nullopt;
    std::vector<Tag> tags;
    for (const std::string& text : *texts) tags.push_back(ParseStoredTag(text));
    return tags;
}

std::optional<Quarantine> DecodeQuarantine(const Content& value, std::string* reason) {
    constexpr std::uint64_t kMost = 4096;
    *reason = value.problem();
    if (value.damaged()) return std::nullopt;
    *reason = "it is no quarantine of this kind";
    if (value.size() > kMost) return std::nullopt;
    const Bytes bytes = value.All();
    const std::string whole(bytes.begin(), bytes.end());
    std::string_view text = whole;
    const auto flags = ParseHexNumber(TakePart(&text));
    if (!flags) return std::nullopt;
    Quarantine quarantine{.flags = *flags};
    if (const std::string_view digits = TakePart(&text); !digits.empty()) {
        constexpr std::uint64_t kTimeMax = std::uint64_t{1} << 40;
        const auto seconds = ParseHexNumber(digits);
        if (!seconds || *seconds > kTimeMax) return std::nullopt;
        const auto time = DateText(static_cast<std::int64_t>(*seconds));
        if (!time) return std::nullopt;
        quarantine.time = *time;
    }
    quarantine.agent = TakePart(&text);
    quarantine.id = text;
    return quarantine;
}

}  // namespace mavoea::tool
