#include "tools/care/finding.h"

#include <algorithm>
#include <array>
#include <string_view>

#include "tools/say/colour.h"
#include "tools/say/text.h"

namespace mavoea::tool {
namespace {

struct KindText {
    FindingKind kind;
    const char* code;  // scripts look for it: it never changes
    const char* meaning;
};
constexpr KindText kKindTexts[] = {
    {FindingKind::kDamagedStream, "damaged-stream", "an EA stream violates its layout"},
    {FindingKind::kDamagedAppleDouble, "damaged-appledouble", "a \"._\" file violates its layout"},
    {FindingKind::kDamagedResourceFile, "damaged-resource-file",
     "a resource file violates its layout"},
    {FindingKind::kDamagedRecord, "damaged-record", "a netatalk record violates its layout"},
    {FindingKind::kDamagedAttribute, "damaged-attribute",
     "another program's attribute is incomplete, or of the wrong size"},
    {FindingKind::kNoFile, "no-file", "a link or the like stands in the place of metadata"},
    {FindingKind::kOtherRights, "other-rights",
     "metadata has another owner, mode or ACL than its object"},
    {FindingKind::kDanglingMetadata, "dangling-metadata", "metadata whose object is gone"},
    {FindingKind::kDanglingServiceFile, "dangling-service-file",
     "another service's file whose object is gone"},
    {FindingKind::kEmptyEaDirectory, "empty-ea-directory", "an EA directory without any use"},
    {FindingKind::kSharedNames, "shared-names",
     "two objects whose long names shorten to one in the EA directory"},
    {FindingKind::kEarlierLayout, "earlier-layout", "metadata in the layout of an earlier version"},
    {FindingKind::kStrandedMetadata, "stranded-metadata",
     "a legacy folder's file beside what has taken its place"},
    {FindingKind::kMisplacedMetadata, "misplaced-metadata",
     "metadata where volumes of the type have none"},
    {FindingKind::kMisplacedAttributes, "misplaced-attributes",
     "attributes in a resource file, in place of the EA stream"},
    {FindingKind::kLeftTemporaryFile, "left-temporary-file",
     "a temporary file that a run left when it was cut short"},
    {FindingKind::kUnfinishedRename, "unfinished-rename", "a rename that was cut short"},
    {FindingKind::kUnfinishedMove, "unfinished-move",
     "a move to here that is under way or was cut short"},
    {FindingKind::kUnfinishedRepair, "unfinished-repair",
     "a copy of a resource file by a repair that was cut short"},
    {FindingKind::kDifferingValues, "differing-values",
     "two places have different values of one thing"},
    {FindingKind::kSmbdIgnoresFile, "smbd-ignores-file", "a \"._\" file that smbd does not read"},
    {FindingKind::kSmbdOverridesFinderInfo, "smbd-overrides-finder-info",
     "a Mac's \"._\" file whose Finder info replaces the clients' at every open"},
    {FindingKind::kSmbdRefusesRecord, "smbd-refuses-record",
     "a netatalk record that smbd removes or ignores"},
    {FindingKind::kSmbdCutsValue, "smbd-cuts-value",
     "a stream without its final NUL, of which clients miss the last byte"},
    {FindingKind::kMacIgnoresFile, "mac-ignores-file", "a \"._\" file that Macs do not read"},
    {FindingKind::kUndeclaredMetadata, "undeclared-metadata",
     "another program's metadata where nobody has declared its type"},
};
static_assert(std::size(kKindTexts) == kFindingKinds);

constexpr bool AreInOrder() {
    for (std::size_t i = 0; i < std::size(kKindTexts); ++i) {
        if (static_cast<std::size_t>(kKindTexts[i].kind) != i) return false;
    }
    return true;
}
static_assert(AreInOrder());

std::string Number(std::uint64_t value) { return std::to_string(value); }

}  // namespace

const char* CodeOf(FindingKind kind) { return kKindTexts[static_cast<std::size_t>(kind)].code; }

std::string FindingCodes() {
    std::size_t width = 0;
    for (const KindText& one : kKindTexts) {
        width = std::max(width, std::string_view(one.code).size());
    }
    std::string text = "Findings, a line each: \"PATH: KIND: DETAIL\". Their kinds:\n";
    for (const KindText& one : kKindTexts) {
        std::string code = one.code;
        code.resize(width + 2, ' ');
        text += "  " + code + one.meaning + '\n';
    }
    return text +
           "Exit status: 0 sound; 1 something was found; 2 something could not be looked at.\n"
           "Without --repair nothing is changed.";
}

std::string Finding::Text() const {
    std::string text = Printable(path) + ": " + Coloured(Colour::kRed, CodeOf(kind)) + ": ";
    if (!file.empty() && file != path) text += Printable(file) + ": ";
    text += detail;
    std::string place;
    const auto add = [&](const std::string& part) { place += (place.empty() ? "" : ", ") + part; };
    if (id) add("id " + (*id > 0xFFFF ? HexNumber(*id) : Number(*id)));
    if (range) add("offset " + Number(range->offset) + ", length " + Number(range->length));
    if (size) add("size " + Number(*size));
    return place.empty() ? text : text + " (" + place + ')';
}

Json Finding::AsJson() const {
    Json json;
    json.SetText("path", path);
    json.Set("kind", CodeOf(kind));
    json.SetText("detail", detail);
    if (!file.empty()) json.SetText("file", file);
    if (entry) json.Set("entry", *entry);
    if (id) json.Set("id", *id);
    if (!attribute.empty()) json.SetText("attribute", attribute);
    if (range) {
        json.Set("offset", range->offset);
        json.Set("length", range->length);
    }
    if (size) json.Set("size", *size);
    return json;
}

Finding FindingOf(FindingKind kind, const std::string& path, const std::string& file,
                  const Layout& layout, const Violation& violation) {
    Finding finding = {kind, path, violation.text, file};
    finding.size = layout.file_size;
    if (violation.entry) {
        const EntryDescriptor& entry = layout.entries[*violation.entry];
        finding.entry = *violation.entry;
        finding.id = static_cast<std::uint32_t>(entry.id);
        finding.range = entry.data;
    } else if (violation.attribute) {
        const Layout::Record& record = layout.records[*violation.attribute];
        finding.attribute = record.name();
        finding.range = record.fixed.value;
    }
    return finding;
}

}  // namespace mavoea::tool
