#include "tools/store/apple_double_reader.h"

#include <fcntl.h>

#include "format/ea_stream.h"
#include "format/netatalk_record.h"
#include "tools/say/text.h"
#include "tools/store/layout.h"
#include "tools/store/locking.h"

namespace mavoea::tool {
namespace {

constexpr const char* kLook = "look at it with: mavoea dump FILE";
constexpr const char* kLookAtRecord = "look at it with: mavoea dump --record PATH";

// netatalk's own entries name the file that they are in, and mean nothing in another.
bool IsPrivate(EntryId id) {
    return SlotOf(static_cast<std::uint32_t>(id)) >= Slot::kPrivateDevice;
}

class FileReader {
 public:
    FileReader(std::shared_ptr<const File> file, Metadata* metadata)
        : file_(std::move(file)),
          origin_({file_->path()}),
          layout_(ReadLayout(*file_)),
          metadata_(*metadata),
          gathering_(metadata) {}

    void Read() {
        if (layout_.file_size == 0) return;  // made, and not written yet
        if (!layout_.IsAppleDouble()) {
            return Problem("no AppleDouble file",
                           "move it away, or look at it with: mavoea dump FILE");
        }
        const AppleDoubleHeader& header = *layout_.header;
        if (header.version != kAppleDoubleVersion2) {
            return Problem("its AppleDouble version is " + HexNumber(header.version) + ", not " +
                               HexNumber(kAppleDoubleVersion2),
                           kLook);
        }
        if (layout_.entries.size() < header.entry_count) Damaged("its descriptors pass");
        if (header.entry_count > kStreamDescriptorMax) {
            Problem("damaged: it declares " + std::to_string(header.entry_count) + " entries",
                    kLook);
        }
        ReadFinderInfo();
        ReadAttributes();
        ReadFork();
        ReadEntries();
    }

 private:
    void Problem(const std::string& cause, const char* advice) {
        metadata_.problems.emplace_back(kFailed, file_->path(), cause, advice, Fault::kDamage);
    }
    void Damaged(const std::string& what) {
        Problem("damaged: " + what + " the end of the file", kLook);
    }

    // What passes the file's end is there all the same, so that nobody takes it for missing.
    Content Stretch(Range range, const std::string& passes) {
        Content value(file_, range.offset, range.length);
        if (value.damaged()) Damaged(passes);
        return value;
    }

    void ReadFinderInfo() {
        const auto index = layout_.FindEntry(EntryId::kFinderInfo);
        if (!index || layout_.entries[*index].data.length == 0) return;
        Range range = layout_.entries[*index].data;
        if (range.length < kFinderInfoSize) {
            return gathering_.AddStray("Finder info", "it has fewer bytes than it should", origin_);
        }
        range.length = kFinderInfoSize;
        gathering_.AddFinderInfo(Stretch(range, "its Finder info passes"), origin_);
    }

    void ReadAttributes() {
        if (!layout_.HasAttributeArea()) return;
        if (!layout_.attributes || layout_.attributes->magic != kAttributeMagic) {
            return gathering_.AddStray("what is behind the Finder info", "it is of no known kind",
                                       origin_);
        }
        if (layout_.records.size() < layout_.attributes->count) {
            Damaged("its attribute table passes");
        }
        std::uint64_t total = 0;
        for (const Layout::Record& record : layout_.records) {
            const std::string name = record.name();
            if (name.empty() || name.size() >= kNameSizeMax) {
                Problem("damaged: an attribute has no name", kLook);
                continue;
            }
            const std::string passes = "attribute " + NameOfAttribute(name) + " passes";
            // Values that share bytes could make much of little.
            total += record.fixed.value.length;
            const bool shared = total > layout_.file_size && record.fixed.value.length > 0;
            if (shared) Damaged(passes);
            Content value =
                shared ? Content::Damaged(record.fixed.value.length,
                                          "it passes the end of " + Printable(file_->path()))
                       : Stretch(record.fixed.value, passes);
            gathering_.AddAttribute({name, std::move(value), record.fixed.flags, file_->path()});
        }
    }

    void ReadFork() {
        const auto index = layout_.FindEntry(EntryId::kResourceFork);
        if (!index || layout_.entries[*index].data.length == 0) return;
        gathering_.AddFork(Stretch(layout_.entries[*index].data, "its resource fork passes"),
                           origin_);
    }

    void ReadEntries() {
        for (std::size_t i = 0; i < layout_.entries.size(); ++i) {
            const EntryDescriptor& entry = layout_.entries[i];
            const bool known = entry.id == EntryId::kFinderInfo ||
                               entry.id == EntryId::kResourceFork || entry.id == EntryId::kNone;
            if (known || entry.data.length == 0 || IsPrivate(entry.id)) continue;
            if (layout_.FindEntry(entry.id) != i) continue;
            gathering_.AddEntry(entry.id, Stretch(entry.data, "an entry passes"), origin_);
        }
    }

    std::shared_ptr<const File> file_;
    Origin origin_;
    Layout layout_;
    Metadata& metadata_;
    Gathering gathering_;
};

}  // namespace

void ReadFile(std::shared_ptr<const File> file, Metadata* metadata) {
    FileReader(std::move(file), metadata).Read();
}

WholeFile ReadFound(const Sidecars::Found& found, Metadata* metadata) {
    WholeFile file;
    Noting(metadata, [&] {
        file = found.file ? found.file : found.directory->FindFile(found.name, O_RDONLY);
        if (!file) return;
        if (!file->keeps_contents()) {
            LockFile(*file, Access::kRead);
            (void)file->KeepContents(kSmallFile);
        }
        ReadFile(file, metadata);
    });
    return file;
}

void ReadRecord(const Bytes& block, const Origin& origin, Metadata* metadata) {
    const Layout layout = ReadLayout(ByteView(block));
    if (!CheckRecord(layout, RecordPlace::kAttribute).violations.empty()) {
        throw Failure(kFailed, origin.holder, "its netatalk record is damaged", kLookAtRecord,
                      Fault::kDamage);
    }
    const auto bytes = [&](Range range) {
        const ByteView part = ByteView(block).subspan(range.offset, range.length);
        return Content(Bytes(part.begin(), part.end()));
    };
    Gathering gathering(metadata);
    for (const EntryDescriptor& entry : layout.entries) {
        const Range range = entry.data;
        if (range.length == 0 || range.end() > block.size() || IsPrivate(entry.id)) continue;
        if (entry.id == EntryId::kFinderInfo) {
            if (range.length < kFinderInfoSize) continue;
            gathering.AddFinderInfo(bytes({range.offset, std::uint32_t{kFinderInfoSize}}), origin);
        } else if (Content value = bytes(range); !IsAllZero(value.All())) {
            gathering.AddEntry(entry.id, std::move(value), origin);
        }
    }
}

}  // namespace mavoea::tool
