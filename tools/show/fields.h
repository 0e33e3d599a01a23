// The text of a dump: a field a line, then what is to be said of them.
#ifndef MAVOEA_TOOLS_SHOW_FIELDS_H_
#define MAVOEA_TOOLS_SHOW_FIELDS_H_

#include <algorithm>
#include <string>
#include <string_view>

#include "tools/say/json.h"
#include "tools/store/layout.h"

namespace mavoea::tool {

class Fields {
 public:
    // Names are padded to the widest.
    void Add(std::string_view name, const std::string& value) {
        constexpr std::size_t kWidth = 16;
        std::string padded(name);
        padded.resize(std::max(kWidth, name.size() + 1), ' ');
        text_ += padded + value + '\n';
    }
    void Line(const std::string& line) { text_ += line + '\n'; }
    void AddFindings(const Findings& findings) {
        for (const std::string& note : findings.notes) Line("note: " + note);
        for (const Violation& violation : findings.violations) Line("violation: " + violation.text);
    }

    std::string Take() { return std::move(text_); }

    static Json ViolationsJson(const Findings& findings) {
        Json list = Json::Array();
        for (const Violation& violation : findings.violations) list.Add(violation.text);
        return list;
    }

 private:
    std::string text_;
};

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_SHOW_FIELDS_H_
