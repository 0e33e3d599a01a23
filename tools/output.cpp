#include "tools/output.h"

#include <iostream>

namespace mavoea::tool {

void Print(const Json& json) {
    std::cout << json.dump(2, ' ', false, Json::error_handler_t::replace) << '\n';
}

void Report(std::string_view message) {
    std::cout.flush();  // What was found before comes first.
    std::cerr << "mavoea: " << message << '\n';
}

void Note(std::string_view message) { Report("note: " + std::string(message)); }

}  // namespace mavoea::tool
