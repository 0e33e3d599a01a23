// Names of extended attributes in which Samba may keep streams, and names of streams. One input is
// taken for either.

#include <cstddef>
#include <cstdint>
#include <string>

#include "format/samba_stream.h"
#include "fuzz/support/platform.h"

using namespace mavoea;
using mavoea::fuzz::Fail;

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    const std::string input(data, data + size);
    if (const auto stream = DecodeStreamAttribute(input)) {
        const std::string_view name = stream->name.text();
        if (name.empty() || name.size() > input.size()) Fail("a name of %zu bytes", name.size());
        if (const auto attribute = EncodeStreamAttribute(name)) {
            const auto again = DecodeStreamAttribute(attribute->text());
            if (!again || again->extent != 0 || again->name.text() != name) Fail("another name");
        }
    }
    if (const auto attribute = EncodeStreamAttribute(input)) {
        if (attribute->text().size() > kXattrNameMax) Fail("a name that the kernel refuses");
        const auto stream = DecodeStreamAttribute(attribute->text());
        if (!stream) Fail("a stream that is none");
        // A private character stands for the plain one already.
        if (input.find("\xEF\x80") == std::string::npos && stream->name.text() != input) {
            Fail("another stream");
        }
    }
    const auto value = DecodeStreamValue({data, size});
    if (value.has_value() != (size != 0)) Fail("a value of %zu bytes", size);
    if (value && (value->bytes.data() != data || value->bytes.size() != size - 1)) {
        Fail("another value");
    }
    return 0;
}
