// mavoea carry: the metadata of objects onto copies of them that another program has made.
#ifndef MAVOEA_TOOLS_MOVE_CARRY_H_
#define MAVOEA_TOOLS_MOVE_CARRY_H_

#include <string>

#include "tools/say/job.h"
#include "tools/say/messages.h"

namespace mavoea::tool {

struct CarryOptions {
    JobOptions job;  // the source is the only path
    std::string destination;
};

// Nothing else of the copies changes. Goes on after a failure; kSuccess when all has arrived.
ExitStatus Carry(const CarryOptions& options);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_MOVE_CARRY_H_
