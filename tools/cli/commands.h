// What the tool does; results go to standard output.
#ifndef MAVOEA_TOOLS_CLI_COMMANDS_H_
#define MAVOEA_TOOLS_CLI_COMMANDS_H_

#include "tools/cli/command_line.h"
#include "tools/say/messages.h"

namespace mavoea::tool {

// Throws Failure for whatever ends the work; what ends it for one of several paths is reported
// instead, and the others are still looked at.
ExitStatus Run(const Options& options);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_CLI_COMMANDS_H_
