#include "tools/say/colour.h"

#include <unistd.h>

#include <cstdlib>
#include <string_view>

namespace mavoea::tool {
namespace {

bool g_used = false;

// Empty where it is not set.
std::string_view FromEnvironment(const char* name) {
    const char* const text = std::getenv(name);  // NOLINT(concurrency-mt-unsafe): one thread
    return text == nullptr ? std::string_view() : text;
}

bool IsWanted() {
    const std::string_view terminal = FromEnvironment("TERM");
    return FromEnvironment("NO_COLOR").empty() && !terminal.empty() && terminal != "dumb" &&
           ::isatty(STDOUT_FILENO) == 1;
}

const char* CodeOf(Colour colour) {
    switch (colour) {
        case Colour::kRed:
            return "\x1b[31m";
        case Colour::kGreen:
            return "\x1b[32m";
        case Colour::kYellow:
            break;
    }
    return "\x1b[33m";
}

}  // namespace

void UseColour(const std::string& when) {
    g_used = when == "always" || (when == "auto" && IsWanted());
}

std::string Coloured(Colour colour, const std::string& text) {
    return g_used ? CodeOf(colour) + text + "\x1b[0m" : text;
}

}  // namespace mavoea::tool
