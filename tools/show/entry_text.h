// What is in an AppleDouble entry, for people and for programs.
#ifndef MAVOEA_TOOLS_SHOW_ENTRY_TEXT_H_
#define MAVOEA_TOOLS_SHOW_ENTRY_TEXT_H_

#include <cstdint>
#include <string>

#include "format/apple_double.h"
#include "tools/say/json.h"
#include "tools/say/text.h"

namespace mavoea::tool {

// A date in an AppleDouble file, with its seconds: "unknown (-2147483648)".
std::string AfpDateText(std::uint32_t stored);

// On one line. `bytes` may be fewer than the entry should have.
std::string EntryText(EntryId id, const Bytes& bytes);

// Adds "text", "dates", "attributes" and "attributeNames", or "hex" to the entry's object.
void AddEntryJson(EntryId id, const Bytes& bytes, Json* entry);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_SHOW_ENTRY_TEXT_H_
