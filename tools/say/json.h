// JSON, as the tool prints it. Debian's library holds it, behind a pointer: that library's header
// takes a compiler longer than all else that the tool is made of, and one unit is enough to read
// it.
#ifndef MAVOEA_TOOLS_SAY_JSON_H_
#define MAVOEA_TOOLS_SAY_JSON_H_

#include <concepts>
#include <cstddef>
#include <cstdint>
#include <initializer_list>
#include <memory>
#include <nlohmann/json_fwd.hpp>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace mavoea::tool {

// One value. An object's members stay in the order in which they were set.
class Json {
 public:
    using Member = std::pair<std::string_view, Json>;

    Json();  // null
    // NOLINTBEGIN(google-explicit-constructor): what JSON can hold is JSON
    Json(bool value);
    Json(const char* text);
    Json(std::nullptr_t) = delete;
    Json(std::string_view text);
    Json(const std::string& text);
    Json(const std::vector<std::string>& texts);
    Json(double number);  // null where it is no number
    template <std::unsigned_integral Number>
    Json(Number number) : Json(std::in_place, std::uint64_t{number}) {}
    template <std::signed_integral Number>
    Json(Number number) : Json(std::in_place, std::int64_t{number}) {}
    // NOLINTEND(google-explicit-constructor)
    Json(const Json& other);
    Json(Json&& other) noexcept;
    ~Json();

    static Json Array();
    static Json Object(std::initializer_list<Member> members);

    // Makes an object of a null.
    void Set(std::string_view key, Json value);

    // Text of which nobody knows that it is UTF-8. What is none gets U+FFFD in its place, and all
    // bytes are in the member `key` + "Hex" besides.
    void SetText(const std::string& key, std::string_view text);

    // To the end of an array.
    void Add(Json value);

    // Two blanks a level, without a line feed at the end; U+FFFD for what is no UTF-8.
    std::string Text() const;
    // The same in one line.
    std::string Line() const;
    // An object's line without the braces, for one that is written piece by piece; of a null
    // nothing.
    std::string Members() const;

 private:
    Json(std::in_place_t, std::uint64_t number);
    Json(std::in_place_t, std::int64_t number);

    std::unique_ptr<nlohmann::ordered_json> value_;
};

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_SAY_JSON_H_
