// mavoea cp and mavoea mv: objects, and their metadata with them.
#ifndef MAVOEA_TOOLS_MOVE_COPY_H_
#define MAVOEA_TOOLS_MOVE_COPY_H_

#include <optional>
#include <string>

#include "tools/say/job.h"

namespace mavoea::tool {

struct CopyOptions {
    JobOptions job;  // sources, and the destination as the last path when target_directory is unset
    std::optional<std::string> target_directory;
    bool no_target_directory = false;  // the destination is the new object itself
    bool allow_loss = false;           // mv: what did not arrive has been named, and may go
};

ExitStatus Copy(const CopyOptions& options);
ExitStatus Move(const CopyOptions& options);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_MOVE_COPY_H_
