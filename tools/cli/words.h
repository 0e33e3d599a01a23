// What may stand on a command line, for those who complete it.
#ifndef MAVOEA_TOOLS_CLI_WORDS_H_
#define MAVOEA_TOOLS_CLI_WORDS_H_

#include <string>
#include <vector>

namespace mavoea::tool {

struct OptionWords {
    enum class Value { kNone, kNext, kBehindEquals };  // where its value stands

    std::vector<std::string> spellings;  // "-r", "--recursive"
    std::string what;                    // empty: another spelling of the one before
    std::string value;                   // what it is called: "FILE"
    Value takes;
};

struct CommandWords {
    std::string name;
    std::string what;
    std::vector<OptionWords> options;
    std::vector<std::string> operands;  // what they are called; there may be more like the last
};

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_CLI_WORDS_H_
