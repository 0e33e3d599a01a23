#include "tools/contents.h"

#include <algorithm>
#include <string_view>

#include "tools/messages.h"

namespace mavoea::tool {
namespace {

constexpr const char* kLook = "look at it with: mavoea dump FILE";

class ContentsReader {
 public:
    ContentsReader(const File& file, const Layout& layout) : file_(file), layout_(layout) {}

    Contents Read() {
        if (!layout_.IsAppleDouble()) throw Refuse("no AppleDouble file");
        const AppleDoubleHeader& header = *layout_.header;
        if (header.version != kAppleDoubleVersion2) {
            throw Refuse("its AppleDouble version is " + HexNumber(header.version) + ", not " +
                         HexNumber(kAppleDoubleVersion2));
        }
        if (layout_.entries.size() < header.entry_count) throw Damaged("its descriptors");
        ReadFinderInfo();
        ReadAttributes();
        ReadFork();
        NameOthers();
        return std::move(contents_);
    }

 private:
    Failure Refuse(const std::string& why) const { return {kFailed, file_.path(), why, kLook}; }
    Failure Damaged(const std::string& what) const {
        return Refuse("damaged: " + what + (what.ends_with('s') ? " pass" : " passes") +
                      " the end of the file");
    }

    Bytes ReadRange(Range range, const std::string& what) const {
        if (range.length == 0) return {};
        if (range.end() > layout_.file_size) throw Damaged(what);
        Bytes bytes = file_.Read(range.offset, range.length);
        if (bytes.size() != range.length) throw Damaged(what);
        return bytes;
    }

    void ReadFinderInfo() {
        const auto index = layout_.FindEntry(EntryId::kFinderInfo);
        if (!index) return;
        Range range = layout_.entries[*index].data;
        if (range.length == 0) return;
        if (range.length < kFinderInfoSize) {
            contents_.others.emplace_back("a Finder info of fewer bytes than it has");
            return;
        }
        range.length = kFinderInfoSize;
        Bytes bytes = ReadRange(range, "its Finder info");
        const bool any =
            std::any_of(bytes.begin(), bytes.end(), [](auto byte) { return byte != 0; });
        if (any) contents_.finder_info = std::move(bytes);
    }

    void ReadAttributes() {
        if (!layout_.HasAttributeArea()) return;
        if (!layout_.attributes || layout_.attributes->magic != kAttributeMagic) {
            contents_.others.emplace_back("bytes behind the Finder info");
            return;
        }
        if (layout_.records.size() < layout_.attributes->count) {
            throw Damaged("its attribute table");
        }
        // Values that share bytes could make much of little.
        std::uint64_t total = 0;
        for (const Layout::Record& record : layout_.records) {
            const std::string name = record.name();
            const std::string what = "attribute \"" + Printable(name) + "\"";
            if (name.empty() || name.size() >= kNameSizeMax) {
                throw Refuse("damaged: an attribute has no name");
            }
            total += record.fixed.value.length;
            if (total > layout_.file_size) throw Damaged(what);
            Bytes value = ReadRange(record.fixed.value, what);
            std::erase_if(contents_.attributes,
                          [&](const Contents::Attribute& other) { return other.name == name; });
            contents_.attributes.push_back({name, std::move(value)});
        }
    }

    void ReadFork() {
        const auto index = layout_.FindEntry(EntryId::kResourceFork);
        if (!index) return;
        Bytes bytes = ReadRange(layout_.entries[*index].data, "its resource fork");
        if (!bytes.empty() && !IsBlankFork(bytes)) contents_.fork = std::move(bytes);
    }

    void NameOthers() {
        for (const EntryDescriptor& entry : layout_.entries) {
            const bool taken =
                entry.id == EntryId::kFinderInfo || entry.id == EntryId::kResourceFork;
            if (taken || entry.data.length == 0) continue;
            std::string name = EntryName(entry.id);
            if (name == "unknown") {
                name = "entry of id " + HexNumber(static_cast<std::uint32_t>(entry.id));
            }
            contents_.others.push_back(std::move(name));
        }
    }

    const File& file_;
    const Layout& layout_;
    Contents contents_;
};

}  // namespace

bool IsBlankFork(const Bytes& fork) {
    if (fork.size() <= kBlankForkTextOffset + kBlankForkText.size()) return false;
    return std::equal(
        kBlankForkText.begin(), kBlankForkText.end(), fork.begin() + kBlankForkTextOffset,
        [](char c, std::uint8_t byte) { return static_cast<std::uint8_t>(c) == byte; });
}

Contents ReadContents(const File& file, const Layout& layout) {
    return ContentsReader(file, layout).Read();
}

}  // namespace mavoea::tool
