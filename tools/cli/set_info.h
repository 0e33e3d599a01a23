// mavoea set-info: Finder info, comment, tags and dates of objects.
#ifndef MAVOEA_TOOLS_CLI_SET_INFO_H_
#define MAVOEA_TOOLS_CLI_SET_INFO_H_

#include <array>
#include <optional>
#include <string>
#include <vector>

#include "tools/place/paths.h"
#include "tools/say/messages.h"

namespace mavoea::tool {

// As they were typed.
struct InfoOptions {
    std::optional<std::string> type, creator, label, flags, comment, tags, backed_up, created;
    std::vector<std::string> added_tags, removed_tags;

    std::array<std::optional<std::string>*, 8> Texts() {
        return {&type, &creator, &label, &flags, &comment, &tags, &backed_up, &created};
    }
};

// Changes one object after the other and goes on after a failure. kSuccess when all that was asked
// for has been read back from all of them; otherwise the gravest status. Words that mean nothing,
// and nothing to change, are a Failure before anything is looked at.
struct SetInfoOptions {
    NamedPaths paths;
    InfoOptions info;
    bool verbose = false;  // says of each object what has been changed
    bool json = false;
};
ExitStatus SetInfo(const SetInfoOptions& options);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_CLI_SET_INFO_H_
