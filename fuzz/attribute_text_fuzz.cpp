// Extended attributes as text: lines of it, and bytes that become values and names. One input is
// taken for all of them.

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

#include "format/attribute_text.h"
#include "fuzz/support/platform.h"

using namespace mavoea;
using mavoea::fuzz::Fail;

namespace {

using Bytes = std::vector<std::uint8_t>;

// What comes out; a byte behind the room that the text allows is watched by the sanitizer.
template <class Decode>
DecodedText Decoded(Decode decode, std::string_view text, Bytes* bytes) {
    bytes->assign(text.size(), 0);
    const DecodedText decoded = decode(text, *bytes);
    if (decoded.size > text.size()) Fail("%zu bytes of %zu", decoded.size, text.size());
    bytes->resize(decoded.size);
    return decoded;
}

void CheckWriting(const Bytes& bytes) {
    for (const auto encoding : {TextEncoding::kText, TextEncoding::kHex, TextEncoding::kBase64}) {
        std::string text;
        TextValueWriter writer(encoding, [&](std::string_view part) { text += part; });
        const std::size_t half = bytes.size() / 2;
        writer.Write(ByteView(bytes).first(half));
        writer.Write(ByteView(bytes).subspan(half));
        writer.End();
        Bytes again;
        const DecodedText decoded = Decoded(DecodeTextValue, text, &again);
        if (decoded.problem != nullptr) Fail("a value that was written: %s", decoded.problem);
        if (decoded.encoding != encoding || again != bytes) Fail("another value");
        if (text.find('\n') != text.npos || text.find('\r') != text.npos) Fail("a line's end");
    }
}

void CheckName(TextName kind, const Bytes& name) {
    std::string text;
    PutTextName(kind, {reinterpret_cast<const char*>(name.data()), name.size()},
                [&](std::string_view part) { text += part; });
    Bytes again;
    const DecodedText decoded = Decoded(DecodeTextName, text, &again);
    if (decoded.problem != nullptr || again != name) Fail("another name");
    if (kind == TextName::kAttribute && text.find('=') != text.npos) Fail("an '=' in a name");
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    const std::string input(data, data + size);
    CheckWriting(Bytes(data, data + size));
    for (std::size_t at = 0; at <= input.size();) {
        const std::size_t end = std::min(input.find('\n', at), input.size());
        const AttributeTextLine line =
            ParseAttributeTextLine(std::string_view(input).substr(at, end - at));
        at = end + 1;
        Bytes bytes;
        if (Decoded(DecodeTextName, line.name, &bytes).problem == nullptr) {
            CheckName(TextName::kPath, bytes);
            CheckName(TextName::kAttribute, bytes);
        }
        if (Decoded(DecodeTextValue, line.value, &bytes).problem == nullptr) CheckWriting(bytes);
    }
    TextChoice choice;
    choice.Add({data, size});
    if (choice.Best() == TextEncoding::kText && size > 0 && data[size - 1] == 0) Fail("a NUL");
    return 0;
}
