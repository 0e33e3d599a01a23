// Colour in what is said on standard output, where it says something: findings and differences.
#ifndef MAVOEA_TOOLS_SAY_COLOUR_H_
#define MAVOEA_TOOLS_SAY_COLOUR_H_

#include <string>

namespace mavoea::tool {

enum class Colour { kRed, kGreen, kYellow };

// "always", "never", or "auto": on a terminal that is not called dumb, unless NO_COLOR says
// anything. Nothing is coloured before.
void UseColour(const std::string& when);

// The text, for people already, in that colour, if any is used.
std::string Coloured(Colour colour, const std::string& text);

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_SAY_COLOUR_H_
