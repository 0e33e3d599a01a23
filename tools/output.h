// What the tool says: results on standard output, everything else on standard error.
#ifndef MAVOEA_TOOLS_OUTPUT_H_
#define MAVOEA_TOOLS_OUTPUT_H_

#include <string_view>

#include "tools/text.h"

namespace mavoea::tool {

void Print(const Json& json);

// "mavoea: " and the message, on standard error.
void Report(std::string_view message);

// Something that went well, and that people should know more of.
void Note(std::string_view message);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_OUTPUT_H_
