#include "tools/say/output.h"

#include <iostream>

namespace mavoea::tool {
namespace {

constexpr const char* kOwnName = "mavoea";

std::string& Name() {
    static std::string name = kOwnName;
    return name;
}

}  // namespace

void SpeakAs(const std::string& program) { Name() = program; }

bool SpeaksAsAnother() { return Name() != kOwnName; }

const std::string& Speaker() { return Name(); }

void Print(const Json& json) { std::cout << json.Text() << '\n'; }

void SetMessages(Json& json, const char* key, const std::vector<std::string>& messages) {
    Json list = Json::Array();
    for (const std::string& message : messages) {
        Json item;
        item.SetText("message", message);
        list.Add(std::move(item));
    }
    json.Set(key, std::move(list));
}

void SetFailures(Json& json, const std::vector<FailedObject>& failures) {
    Json list = Json::Array();
    for (const FailedObject& failed : failures) {
        Json item;
        item.SetText("path", failed.path);
        item.SetText("message", failed.message);
        list.Add(std::move(item));
    }
    json.Set("failures", std::move(list));
}

void Report(std::string_view message) {
    std::cout.flush();  // What was found before comes first.
    std::cerr << Speaker() << ": " << message << '\n';
}

void Report(const Failure& failure) {
    Report(SpeaksAsAnother() ? std::string_view{failure.brief()}
                             : std::string_view{failure.what()});
}

void Note(std::string_view message) { Report("note: " + std::string(message)); }

}  // namespace mavoea::tool
