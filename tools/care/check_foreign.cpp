#include "tools/care/check_foreign.h"

#include <algorithm>
#include <optional>

#include "format/afp_info.h"
#include "format/netatalk_record.h"
#include "format/samba_stream.h"
#include "tools/say/text.h"
#include "tools/store/acceptance.h"
#include "tools/store/foreign/apple_double.h"
#include "tools/store/foreign/record.h"
#include "tools/store/foreign/spelling.h"
#include "tools/store/metadata.h"
#include "tools/store/record.h"

namespace mavoea::tool {
namespace {

bool IsSambas(const Dialect* program) {
    return program != nullptr && program->marks == Dialect::Marks::kDosAttributes;
}

class AttributesCheck {
 public:
    AttributesCheck(const Object& object, const Dialect* program, const Inode& inode,
                    const std::vector<std::string>& names, FindingSink* sink)
        : record_(program != nullptr                     ? kRecordAttribute
                  : object.kind() == VolumeKind::kFileEA ? kNetatalkAttribute
                                                         : ""),
          program_(program),
          inode_(inode),
          names_(names),
          sink_(*sink) {}

    bool Run() {
        for (const std::string& name : names_) {
            if (name == record_) CheckRecordIn(name);
            if (IsSambas(program_)) CheckStream(name);
        }
        return damaged_;
    }

 private:
    void Add(FindingKind kind, const std::string& name, const std::string& detail,
             std::uint64_t size) const {
        Finding finding = {kind, inode_.path(), Printable(name) + ": " + detail};
        finding.attribute = name;
        finding.size = size;
        sink_.Add(finding);
    }

    void CheckRecordIn(const std::string& name) {
        const auto block = inode_.Attribute(name);
        if (!block) return;
        const Layout layout = ReadLayout(ByteView(*block));
        for (const Violation& one : CheckRecord(layout, RecordPlace::kAttribute).violations) {
            Finding finding =
                FindingOf(FindingKind::kDamagedRecord, inode_.path(), {}, layout, one);
            finding.detail = name + ": " + finding.detail;
            if (finding.attribute.empty()) finding.attribute = name;
            sink_.Add(finding);
            damaged_ = true;
        }
        const bool smbds =
            IsSambas(program_) && program_->finder_info == Dialect::FinderInfo::kRecord;
        if (!smbds) return;
        if (const auto why = WhySmbdRefuses(layout)) {
            Add(FindingKind::kSmbdRefusesRecord, name,
                *why + (block->size() > kAttributeBlockSize ? ": smbd ignores it"
                                                            : ": smbd removes it at the next look"),
                block->size());
        }
    }

    bool Has(const std::string& name) const {
        return std::find(names_.begin(), names_.end(), name) != names_.end();
    }

    // A stream, with what it goes on in.
    void CheckStream(const std::string& name) {
        const auto stream = DecodeStreamAttribute(name);
        if (!stream || stream->extent > 0) return;
        const auto value = inode_.Attribute(name);
        if (!value) return;
        const auto damaged = [&](const std::string& what) {
            Add(FindingKind::kDamagedAttribute, name, what, value->size());
            damaged_ = true;
        };
        const auto decoded = DecodeStreamValue(*value);
        if (!decoded) return damaged("it has no bytes, with which Samba cannot open it");
        if (stream->name.text() == kAfpInfoStream) {
            if (!DecodeAfpInfo(decoded->bytes)) damaged("it is none that Samba takes");
            return;
        }
        const bool goes_on = decoded->extents > 0 && Has(NameOfExtent(name, 1));
        if (decoded->extents > 0 && !goes_on) {
            Add(FindingKind::kSmbdCutsValue, name, "it does not end with a NUL", value->size());
        }
        for (unsigned extent = 2; goes_on && extent <= decoded->extents; ++extent) {
            if (!Has(NameOfExtent(name, extent))) {
                damaged("part " + std::to_string(extent) + " of " +
                        std::to_string(decoded->extents) + " is missing");
            }
        }
    }

    std::string_view record_;  // the attribute that holds one; empty: none does
    const Dialect* program_;
    const Inode& inode_;
    const std::vector<std::string>& names_;
    FindingSink& sink_;
    bool damaged_ = false;
};

// Of a file with attributes, or a fork that stands for none, smbd makes one of its own.
bool OverridesFinderInfo(const File& file, const Layout& layout) {
    if (!IsMacs(file) || layout.HasAttributeArea()) return false;
    const auto fork = layout.FindEntry(EntryId::kResourceFork);
    const Range range = layout.entries[*fork].data;
    const Bytes start = file.Read(range.offset, std::min<std::uint64_t>(range.length, kSmallFile));
    return !IsBlankFork(Content(start));
}

}  // namespace

bool CheckAttributes(const Object& object, const Dialect* program, const Inode& inode,
                     const std::vector<std::string>& names, FindingSink* sink) {
    return AttributesCheck(object, program, inode, names, sink).Run();
}

void CheckAcceptance(const Dialect* program, const std::string& path, const File& file,
                     const Layout& layout, FindingSink* sink) {
    const auto add = [&](FindingKind kind, const std::string& detail) {
        Finding finding = {kind, path, detail, file.path()};
        finding.size = layout.file_size;
        sink->Add(finding);
    };
    if (const auto why = WhyMacIgnores(layout)) add(FindingKind::kMacIgnoresFile, *why);
    if (!IsSambas(program) || program->fork != Dialect::Fork::kAppleDouble) return;
    if (const auto why = WhySmbdIgnores(layout)) {
        add(FindingKind::kSmbdIgnoresFile, *why);
    } else if (OverridesFinderInfo(file, layout)) {
        add(FindingKind::kSmbdOverridesFinderInfo,
            "a Mac has written it, and smbd finds nothing in it to convert");
    }
}

}  // namespace mavoea::tool
