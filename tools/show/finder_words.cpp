#include "tools/show/finder_words.h"

#include <algorithm>
#include <array>
#include <iterator>

#include "tools/say/mac_text.h"
#include "tools/say/text.h"

namespace mavoea::tool {
namespace {

constexpr std::array<const char*, 8> kLabels = {"none", "grey",   "green", "purple",
                                                "blue", "yellow", "red",   "orange"};

struct FinderFlag {
    std::uint16_t bit;
    const char* name;
};
constexpr FinderFlag kFinderFlags[] = {
    {kFinderOnDesk, "on-desk"},         {kFinderShared, "shared"},
    {kFinderNoInits, "no-inits"},       {kFinderInited, "inited"},
    {kFinderCustomIcon, "custom-icon"}, {kFinderStationery, "stationery"},
    {kFinderNameLocked, "name-locked"}, {kFinderHasBundle, "has-bundle"},
    {kFinderInvisible, "invisible"},    {kFinderAlias, "alias"}};

// What an escape at the beginning of `text` means, which is taken off; none where it is none.
std::optional<char> TakeEscape(std::string_view* text) {
    if (text->starts_with("\\\\")) {
        text->remove_prefix(2);
        return '\\';
    }
    if (!text->starts_with("\\x") || text->size() < 4) return std::nullopt;
    const auto byte = ParseHex(text->substr(2, 2));
    if (!byte || byte->size() != 1) return std::nullopt;
    text->remove_prefix(4);
    return static_cast<char>(byte->front());
}

}  // namespace

std::string FourBytesText(const FourBytes& code) {
    return Printable(FromMacRoman({reinterpret_cast<const char*>(code.data()), code.size()}));
}

std::optional<FourBytes> ParseFourBytes(std::string_view text) {
    std::string bytes;
    while (!text.empty()) {
        if (text.front() == '\\') {
            const auto escaped = TakeEscape(&text);
            if (!escaped) return std::nullopt;
            bytes += *escaped;
            continue;
        }
        const std::string_view plain = text.substr(0, text.find('\\'));
        const auto roman = ToMacRoman(plain);
        if (!roman) return std::nullopt;
        bytes += *roman;
        text.remove_prefix(plain.size());
    }
    FourBytes code{};
    if (bytes.size() != code.size()) return std::nullopt;
    std::copy(bytes.begin(), bytes.end(), code.begin());
    return code;
}

std::string OldText(std::string_view bytes) {
    return IsUtf8(bytes) ? std::string(bytes) : FromMacRoman(bytes);
}

const char* LabelName(std::uint8_t label) { return kLabels[label & 7U]; }

std::optional<std::uint8_t> ParseLabel(std::string_view text) {
    if (text.size() == 1 && text.front() >= '0' && text.front() <= '7') {
        return static_cast<std::uint8_t>(text.front() - '0');
    }
    if (text == "gray") text = "grey";
    const auto* const found = std::find(kLabels.begin(), kLabels.end(), text);
    if (found == kLabels.end()) return std::nullopt;
    return static_cast<std::uint8_t>(found - kLabels.begin());
}

std::vector<std::string> FinderFlagNames(std::uint16_t flags) {
    std::vector<std::string> names;
    for (const FinderFlag& flag : kFinderFlags) {
        if ((flags & flag.bit) != 0) names.emplace_back(flag.name);
    }
    return names;
}

std::optional<FlagChange> ParseFinderFlags(std::string_view list, std::string* wrong) {
    FlagChange change;
    for (bool more = true; more;) {
        const std::size_t comma = list.find(',');
        more = comma != std::string_view::npos;
        const std::string_view word = list.substr(0, comma);
        if (more) list.remove_prefix(comma + 1);
        const bool clears = word.starts_with('-');
        const auto* const flag =
            std::find_if(std::begin(kFinderFlags), std::end(kFinderFlags),
                         [&](const auto& one) { return one.name == word.substr(clears ? 1 : 0); });
        if (flag == std::end(kFinderFlags)) {
            *wrong = word;
            return std::nullopt;
        }
        std::uint16_t& into = clears ? change.cleared : change.set;
        into = static_cast<std::uint16_t>(into | flag->bit);
    }
    return change;
}

Tag ParseStoredTag(std::string_view text) {
    const std::size_t end = text.rfind('\n');
    if (end == std::string_view::npos || end + 2 != text.size()) return {std::string(text)};
    const char digit = text.back();
    if (digit < '0' || digit > '7') return {std::string(text)};
    return {std::string(text.substr(0, end)), static_cast<std::uint8_t>(digit - '0')};
}

std::string StoredTag(const Tag& tag) {
    if (tag.label == 0) return tag.name;
    return tag.name + '\n' + static_cast<char>('0' + tag.label);
}

}  // namespace mavoea::tool
