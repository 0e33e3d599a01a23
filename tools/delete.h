// mavoea rm: objects, and their metadata with them.
#ifndef MAVOEA_TOOLS_DELETE_H_
#define MAVOEA_TOOLS_DELETE_H_

#include <string>

#include "tools/job.h"

namespace mavoea::tool {

ExitStatus Delete(const JobOptions& options);

// Removes what has been moved elsewhere, a directory with all that is in it. Throws Failure; what
// is metadata of no object keeps its directory, because it has been carried nowhere.
void DeleteMoved(const std::string& path);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_DELETE_H_
