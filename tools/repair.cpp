#include "tools/repair.h"

#include <sys/stat.h>

#include <optional>

#include "include/mavoea.h"
#include "tools/apple_double_file.h"
#include "tools/contents.h"
#include "tools/messages.h"
#include "tools/sidecar.h"
#include "tools/stream_file.h"
#include "tools/upgrade.h"

namespace mavoea::tool {
namespace {

constexpr const char* kLook = "look at it with: mavoea dump FILE";

// The rewritten file has Finder info and resource fork only.
void RefuseToLose(const Layout& layout, const Contents& contents, const std::string& path) {
    if (!contents.others.empty()) {
        throw Failure(kFailed, path, "a repair would lose its " + contents.others.front(),
                      "move the file away if that is no loss");
    }
    const std::uint16_t count = layout.header->entry_count;
    if (count != 2 && count != 13) {
        throw Failure(
            kFailed, path,
            "it has " + std::to_string(count) + " entries; only files of 2 or 13 can be repaired",
            kLook);
    }
    for (const EntryId id : {EntryId::kFinderInfo, EntryId::kResourceFork}) {
        if (layout.FindEntry(id)) continue;
        throw Failure(kFailed, path, std::string("it has no entry for a ") + EntryName(id), kLook);
    }
}

// What the resource file wrongly holds; none when it is as it should be, or missing.
std::optional<Contents> ReadStrayAttributes(const std::string& path) {
    struct stat info;
    if (::lstat(path.c_str(), &info) != 0) {
        if (errno == ENOENT || errno == ENOTDIR) return std::nullopt;
        throw SystemFailure(path, errno);
    }
    if (!S_ISREG(info.st_mode)) {
        throw Failure(kFailed, path, "not a regular file", "move it away");
    }
    const File file = File::OpenToRead(path);
    const FileLock lock(file, Access::kRead);
    const Layout layout = ReadLayout(file);
    RequireAppleDouble(layout, path);
    if (!layout.attributes || layout.attributes->magic != kAttributeMagic ||
        layout.attributes->count == 0) {
        return std::nullopt;
    }
    Contents contents = ReadContents(file, layout);
    RefuseToLose(layout, contents, path);
    return contents;
}

// In the stream, a value that was longer keeps its old end.
void CutToLength(const Object& object, const Contents& contents) {
    const Sidecar sidecar = {object.path, MAVOEA_KIND_STREAM, EA_PLACE_EADIR};
    const auto stream = StreamFile::Open(sidecar, Access::kCreate);
    for (const Contents::Attribute& attribute : contents.attributes) {
        if (stream->Get(attribute.name) != attribute.value) {
            stream->Set(attribute.name, attribute.value);
        }
    }
}

Outcome RepairObject(const Object& object) {
    const std::string path = Sidecar{object.path, MAVOEA_KIND_RESOURCE, EA_PLACE_EADIR}.Path();
    const std::optional<Contents> stray = ReadStrayAttributes(path);
    if (!stray) return Outcome::kNothing;
    const ErrorMark mark;
    if (MAVOEAFixErrorAD(object.path.c_str()) != 0) {
        const LibraryError error = mark.Get();
        if (error.code != 0 || error.error != 0) throw LibraryFailure(path, error);
        throw Failure(kFailed, path, "it could not be repaired", "the system log has the cause");
    }
    CutToLength(object, *stray);
    return Outcome::kDone;
}

}  // namespace

ExitStatus Repair(const TreeOptions& options) {
    const Task task = {.doing = "repairing",
                       .done = "repaired",
                       .current = nullptr,
                       .nothing = "with nothing to repair",
                       .check = RequireEaDirectory,
                       .work = [](const Object& object, Notes*) { return RepairObject(object); }};
    return RunOnTree(options, task);
}

}  // namespace mavoea::tool
