#include "tools/say/json.h"

#include <nlohmann/json.hpp>

#include "tools/say/text.h"

namespace mavoea::tool {
namespace {

using Value = nlohmann::ordered_json;

std::string Dump(const Value& value, int indent) {
    return value.dump(indent, ' ', false, Value::error_handler_t::replace);
}

}  // namespace

Json::Json() : value_(std::make_unique<Value>()) {}
Json::Json(bool value) : value_(std::make_unique<Value>(value)) {}
Json::Json(const char* text) : value_(std::make_unique<Value>(text)) {}
Json::Json(std::string_view text) : value_(std::make_unique<Value>(text)) {}
Json::Json(const std::string& text) : value_(std::make_unique<Value>(text)) {}
Json::Json(const std::vector<std::string>& texts) : value_(std::make_unique<Value>(texts)) {}
Json::Json(double number) : value_(std::make_unique<Value>(number)) {}
Json::Json(std::in_place_t, std::uint64_t number) : value_(std::make_unique<Value>(number)) {}
Json::Json(std::in_place_t, std::int64_t number) : value_(std::make_unique<Value>(number)) {}
Json::Json(const Json& other) : value_(std::make_unique<Value>(*other.value_)) {}
Json::Json(Json&& other) noexcept = default;
Json::~Json() = default;

Json Json::Array() {
    Json array;
    *array.value_ = Value::array();
    return array;
}

Json Json::Object(std::initializer_list<Member> members) {
    Json object;
    *object.value_ = Value::object();
    for (const auto& [key, value] : members) object.Set(key, value);
    return object;
}

void Json::Set(std::string_view key, Json value) {
    (*value_)[std::string(key)] = std::move(*value.value_);
}

void Json::SetText(const std::string& key, std::string_view text) {
    const auto made = Value::parse(Dump(text, -1)).get<std::string>();
    Set(key, made);
    if (made != text) {
        Set(key + "Hex",
            HexDigits({reinterpret_cast<const std::uint8_t*>(text.data()), text.size()}));
    }
}

void Json::Add(Json value) { value_->push_back(std::move(*value.value_)); }

std::string Json::Text() const { return Dump(*value_, 2); }
std::string Json::Line() const { return Dump(*value_, -1); }

std::string Json::Members() const {
    if (value_->is_null()) return {};
    const std::string line = Line();
    return line.substr(1, line.size() - 2);
}

}  // namespace mavoea::tool
