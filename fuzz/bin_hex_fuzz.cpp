// BinHex texts from anywhere, and files that are made such texts: one input is taken for either.

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

#include "format/bin_hex.h"
#include "fuzz/support/platform.h"

using namespace mavoea;
using mavoea::fuzz::Fail;

namespace {

std::string Pack(const BinHexHead& head, ByteView data, ByteView fork) {
    std::string text;
    BinHexWriter writer([&](char c) { text += c; });
    if (!writer.WriteHead(head)) Fail("no head");
    writer.Write(data);
    writer.EndPart();
    writer.Write(fork);
    writer.EndPart();
    writer.EndText();
    return text;
}

// A fork, piece by piece, as far as the text goes.
bool ReadFork(BinHexReader& reader, std::uint32_t length, std::vector<std::uint8_t>* fork) {
    std::array<std::uint8_t, 256> piece;
    for (std::uint32_t left = length; left != 0;) {
        const auto size = static_cast<std::uint32_t>(std::min<std::size_t>(left, piece.size()));
        const ByteSpan to(piece.data(), size);
        if (!reader.Read(to)) return false;
        fork->insert(fork->end(), to.begin(), to.end());
        left -= size;
    }
    return reader.EndPart();
}

struct File {
    BinHexHead head;
    std::vector<std::uint8_t> data;
    std::vector<std::uint8_t> fork;
};

bool Unpack(ByteView text, File* file) {
    BinHexReader reader(text);
    const auto head = reader.ReadHead();
    if (!head) return false;
    file->head = *head;
    return ReadFork(reader, head->data_length, &file->data) &&
           ReadFork(reader, head->resource_length, &file->fork);
}

void ExpectPackedAndBack(const File& file) {
    const std::string text = Pack(file.head, file.data, file.fork);
    File again;
    if (!Unpack({reinterpret_cast<const std::uint8_t*>(text.data()), text.size()}, &again)) {
        Fail("a text that cannot be read");
    }
    if (again.head.name() != file.head.name() || again.head.finder_info != file.head.finder_info ||
        again.data != file.data || again.fork != file.fork) {
        Fail("another file");
    }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    File file;
    if (Unpack({data, size}, &file)) ExpectPackedAndBack(file);

    File made;
    made.head.name_size = 1;
    made.head.name_bytes[0] = 'n';
    const auto half = static_cast<std::ptrdiff_t>(size / 2);
    made.data.assign(data, data + half);
    made.fork.assign(data + half, data + size);
    made.head.data_length = static_cast<std::uint32_t>(made.data.size());
    made.head.resource_length = static_cast<std::uint32_t>(made.fork.size());
    ExpectPackedAndBack(made);
    return 0;
}
