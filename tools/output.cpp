#include "tools/output.h"

#include <iostream>
#include <nlohmann/json.hpp>

namespace mavoea::tool {

void Print(const Json& json) {
    std::cout << json.dump(2, ' ', false, Json::error_handler_t::replace) << '\n';
}

void SetMessages(Json& json, const char* key, const std::vector<std::string>& messages) {
    Json list = Json::array();
    for (const std::string& message : messages) {
        Json item;
        SetText(item, "message", message);
        list.push_back(std::move(item));
    }
    json[key] = std::move(list);
}

void SetFailures(Json& json, const std::vector<FailedObject>& failures) {
    Json list = Json::array();
    for (const FailedObject& failed : failures) {
        Json item;
        SetText(item, "path", failed.path);
        SetText(item, "message", failed.message);
        list.push_back(std::move(item));
    }
    json["failures"] = std::move(list);
}

void Report(std::string_view message) {
    std::cout.flush();  // What was found before comes first.
    std::cerr << "mavoea: " << message << '\n';
}

void Note(std::string_view message) { Report("note: " + std::string(message)); }

}  // namespace mavoea::tool
