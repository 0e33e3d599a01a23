// What the tool says: results on standard output, everything else on standard error.
#ifndef MAVOEA_TOOLS_SAY_OUTPUT_H_
#define MAVOEA_TOOLS_SAY_OUTPUT_H_

#include <string>
#include <string_view>
#include <vector>

#include "tools/say/json.h"
#include "tools/say/messages.h"

namespace mavoea::tool {

void Print(const Json& json);

// An object with which something went wrong, and what.
struct FailedObject {
    std::string path;
    std::string message;
};

// What every summary ends with: the "notes", and "failures" by path and message.
void SetMessages(Json& json, const char* key, const std::vector<std::string>& messages);
void SetFailures(Json& json, const std::vector<FailedObject>& failures);

// The name under which the tool speaks from here on: that of a command in whose place it runs,
// which gives no advice. "mavoea" until then.
void SpeakAs(const std::string& program);
bool SpeaksAsAnother();
const std::string& Speaker();

// "mavoea: " and the message, on standard error.
void Report(std::string_view message);
void Report(const Failure& failure);

// Something that went well, and that people should know more of.
void Note(std::string_view message);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_SAY_OUTPUT_H_
