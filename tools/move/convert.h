// mavoea convert: a copy on a volume of another kind, compared with what was copied.
#ifndef MAVOEA_TOOLS_MOVE_CONVERT_H_
#define MAVOEA_TOOLS_MOVE_CONVERT_H_

#include <optional>
#include <string>

#include "tools/place/volume.h"
#include "tools/say/messages.h"
#include "tools/walk/crew.h"
#include "tools/walk/journal.h"

namespace mavoea::tool {

struct ConvertOptions {
    std::string source = {};
    std::string destination = {};  // of the copy itself; its parent is there
    std::string type = {};         // of the destination's volume, as --volume takes it
    bool recursive = false;
    bool json = false;
    bool verbose = false;  // what is converted is said
    CrewSize crew = {};
    std::optional<LogFile> log = {};  // of what is done
};

// What is copied, and to where.
struct ConversionEnds {
    Object source;
    Place destination;
    int type = -1;  // of the destination's volume, as it is read
};
// Declares the destination's type. Throws Failure where there can be no conversion.
ConversionEnds EndsOf(const ConvertOptions& options);

// Nothing is removed from the source. Goes on after a failure; kSuccess when nothing failed and
// nothing differs, otherwise the gravest status; 128 and the signal's number when interrupted.
ExitStatus Convert(const ConvertOptions& options);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_MOVE_CONVERT_H_
