// mavoea --complete WORD...: what the last word of a command line may become. The scripts in
// tools/completions ask it; it is in no help.
#ifndef MAVOEA_TOOLS_CLI_COMPLETION_H_
#define MAVOEA_TOOLS_CLI_COMPLETION_H_

#include <span>

namespace mavoea::tool {

// `words` are those behind "mavoea", the one to be completed last. The first line says what else
// may stand there: "files", "directories" or "words" for nothing else. Each other line is a word,
// in which nothing means anything to a terminal, and behind a tab what it is. It only looks, says
// nothing of what cannot be looked at, and takes two seconds at most. Returns the exit status.
int Complete(std::span<const char* const> words);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_CLI_COMPLETION_H_
