// What Finder info says, in words, and words as what they say there.
#ifndef MAVOEA_TOOLS_SHOW_FINDER_WORDS_H_
#define MAVOEA_TOOLS_SHOW_FINDER_WORDS_H_

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "format/finder_info.h"

namespace mavoea::tool {

// A type or creator: Mac OS Roman as UTF-8, with "\x00" for what cannot be printed and "\\" for a
// backslash; and the other way, none where that does not make four bytes.
std::string FourBytesText(const FourBytes& code);
std::optional<FourBytes> ParseFourBytes(std::string_view text);

// A text that people may write into metadata of old kinds: UTF-8, otherwise Mac OS Roman.
std::string OldText(std::string_view bytes);

// "none", "grey", ... of the 8 labels; and of a name or a number.
const char* LabelName(std::uint8_t label);
std::optional<std::uint8_t> ParseLabel(std::string_view text);

// "on-desk", "invisible", ... of the flags that are set; the label is not among them.
std::vector<std::string> FinderFlagNames(std::uint16_t flags);

// What a list as "invisible,-stationery" sets and clears.
struct FlagChange {
    std::uint16_t set = 0;
    std::uint16_t cleared = 0;
};
// None where a word is no flag, which is `wrong` then.
std::optional<FlagChange> ParseFinderFlags(std::string_view list, std::string* wrong);

// A tag as Macs keep it: its name and, behind a line feed, the digit of its colour if it has one.
struct Tag {
    std::string name;
    std::uint8_t label = 0;  // its colour
};
Tag ParseStoredTag(std::string_view text);
std::string StoredTag(const Tag& tag);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_SHOW_FINDER_WORDS_H_
