// mavoea plan: what a conversion would meet. Nothing changes by it.
#ifndef MAVOEA_TOOLS_MOVE_PLAN_H_
#define MAVOEA_TOOLS_MOVE_PLAN_H_

#include <optional>
#include <string>

#include "tools/move/convert.h"
#include "tools/say/messages.h"

namespace mavoea::tool {

struct PlanOptions {
    ConvertOptions conversion;
    std::optional<std::string> file = {};  // to which it is written, for ConvertAsPlanned()
    bool force = false;                    // over what is there
};

// Says object by object what would not arrive, or be refused, or be replaced, and then what there
// is in all. kSuccess where everything would arrive, kUnsound where somebody has to decide first,
// kFailed where something could not be looked at.
ExitStatus PlanConversion(const PlanOptions& options);

// Does what was planned, in that manner. A Failure when the file is none of a plan, or the source
// has changed since.
ExitStatus ConvertAsPlanned(const std::string& file, ConvertOptions manner);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_MOVE_PLAN_H_
