// What Macs keep in attributes of certain names. Each decoder gives the reason where a value is
// something else, and throws Failure where it cannot be read.
#ifndef MAVOEA_TOOLS_SHOW_MAC_ATTRIBUTES_H_
#define MAVOEA_TOOLS_SHOW_MAC_ATTRIBUTES_H_

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "tools/show/finder_words.h"
#include "tools/show/property_list.h"
#include "tools/store/content.h"

namespace mavoea::tool {

inline constexpr std::string_view kCommentName = "com.apple.metadata:kMDItemFinderComment";
inline constexpr std::string_view kTagsName = "com.apple.metadata:_kMDItemUserTags";
inline constexpr std::string_view kWhereFromName = "com.apple.metadata:kMDItemWhereFroms";
inline constexpr std::string_view kQuarantineName = "com.apple.quarantine";

std::optional<PropertyList> DecodeList(const Content& value, std::string* reason);

std::optional<std::string> DecodeComment(const Content& value, std::string* reason);
std::optional<std::vector<Tag>> DecodeTags(const Content& value, std::string* reason);

// Where a file has been fetched from: URLs.
std::optional<std::vector<std::string>> DecodeWhereFrom(const Content& value, std::string* reason);

// "flags;seconds;agent;id": flags and seconds since 1970 are hexadecimal digits, and each part from
// the second on may be missing.
struct Quarantine {
    std::uint64_t flags = 0;
    std::string time = {};  // empty: none
    std::string agent = {};
    std::string id = {};
};
std::optional<Quarantine> DecodeQuarantine(const Content& value, std::string* reason);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_SHOW_MAC_ATTRIBUTES_H_
