// What Macs keep in attributes, put into words: a byte that chooses what a value is taken for, and
// the value. Nothing of it may be more than text to a terminal, or anything but UTF-8 in JSON.

#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

#include "fuzz/support/platform.h"
#include "tools/say/json.h"
#include "tools/say/text.h"
#include "tools/show/mac_attributes.h"
#include "tools/show/property_list.h"
#include "tools/store/content.h"

using namespace mavoea;
using namespace mavoea::tool;
using mavoea::fuzz::Fail;

namespace {

void CheckLine(const Json& json) {
    const std::string line = json.Line();
    std::string_view left = line;
    while (!left.empty()) {
        const std::uint32_t letter = TakeLetter(&left);
        if (letter == kNoLetter) Fail("JSON that is no UTF-8");
        if (letter < 0x20) Fail("JSON with a control character");
    }
}

void CheckTexts(const std::vector<std::string>& texts) {
    for (const std::string& text : texts) {
        if (text.find('\0') != std::string::npos) Fail("a NUL in a text");
    }
    Json json;
    json.Set("texts", texts);
    CheckLine(json);
}

void CheckList(const PropertyList& list) {
    CheckLine(list.AsJson());
    const auto texts = list.Texts();
    if (texts) CheckTexts(*texts);
    if (const auto text = list.Text()) {
        CheckTexts({*text});
        std::string reason;
        const auto again = PropertyList::Parse(EncodePropertyList(*text), &reason);
        // What is no UTF-8 is not written.
        Json json;
        json.SetText("text", *text);
        if (json.Line().find("textHex") == std::string::npos && (!again || again->Text() != text)) {
            Fail("another text: %s", reason.c_str());
        }
    }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    if (size == 0) return 0;
    const Content value(Bytes(data + 1, data + size));
    std::string reason;
    bool decoded = false;
    switch (data[0] % 5) {
        case 0:
            if (const auto list = DecodeList(value, &reason)) {
                decoded = true;
                CheckList(*list);
            }
            break;
        case 1:
            if (const auto comment = DecodeComment(value, &reason)) {
                decoded = true;
                CheckTexts({*comment});
            }
            break;
        case 2:
            decoded = DecodeTags(value, &reason).has_value();
            break;
        case 3:
            if (const auto urls = DecodeWhereFrom(value, &reason)) {
                decoded = true;
                CheckTexts(*urls);
            }
            break;
        default:
            if (const auto quarantine = DecodeQuarantine(value, &reason)) {
                decoded = true;
                Json json;
                json.SetText("agent", quarantine->agent);
                json.SetText("id", quarantine->id);
                json.Set("time", quarantine->time);
                CheckLine(json);
            }
    }
    if (!decoded && reason.empty()) Fail("no reason");
    if (!IsShownByTerminals(reason)) Fail("a reason with commands: %s", reason.c_str());
    return 0;
}
