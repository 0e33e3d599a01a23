#include "tools/exchange/export.h"

#include <unistd.h>

#include <algorithm>
#include <cctype>
#include <cerrno>
#include <iostream>

#include "tools/exchange/archiving.h"
#include "tools/place/dry_run.h"
#include "tools/say/output.h"
#include "tools/say/text.h"
#include "tools/store/reader.h"
#include "tools/store/sidecars.h"

namespace mavoea::tool {
namespace {

constexpr const char* kStandardOutput = "-";
constexpr mode_t kReadAndWrite = 0666;

ArchiveFormat FormatNamed(const std::string& word) {
    for (const ArchiveFormat format : {ArchiveFormat::kAppleDouble, ArchiveFormat::kAppleSingle,
                                       ArchiveFormat::kMacBinary, ArchiveFormat::kBinHex}) {
        std::string name = NameOf(format);
        std::transform(name.begin(), name.end(), name.begin(),
                       [](unsigned char c) { return static_cast<char>(std::tolower(c)); });
        if (name == word) return format;
    }
    throw Failure(kFailed, word, "no format of that name",
                  "use appledouble, applesingle, macbinary or binhex");
}

// What is to go into the file. Throws Failure for what cannot be read.
std::shared_ptr<const Inode> OpenFor(ArchiveFormat format, const Object& object) {
    if (format == ArchiveFormat::kAppleDouble) return Inode::Open(object.place);
    auto inode = Inode::OpenToRead(object.place);
    if (!S_ISREG(inode->info().st_mode)) {
        throw Failure(kFailed, object.path(),
                      std::string("it has no data that ") + NameOf(format) + " could hold",
                      "use --format appledouble");
    }
    if (!inode->file()) throw SystemFailure(object.path(), EACCES);
    return inode;
}

Archive ArchiveOf(const Object& object, const Inode& inode, const Sidecars& sidecars,
                  ArchiveFormat format) {
    Archive archive = {.format = format, .name = object.place.name};
    if (format != ArchiveFormat::kAppleDouble) {
        archive.data = Content(inode.file(), 0, inode.file()->Size());
        archive.modified = inode.info().st_mtim.tv_sec;
    }
    archive.metadata = ReadMetadata(object, inode, sidecars);
    if (!archive.metadata.problems.empty()) throw Failure(archive.metadata.problems.front());
    return archive;
}

void WriteToOutput(const Archive& archive) {
    if (archive.format != ArchiveFormat::kBinHex && ::isatty(STDOUT_FILENO) == 1) {
        throw Failure(kFailed, "standard output", "a terminal cannot show this format",
                      "name a file, or lead the output into one");
    }
    if (DryRun()) return;
    WriteArchive(archive, [](ByteView bytes) {
        std::cout.write(reinterpret_cast<const char*>(bytes.data()),
                        static_cast<std::streamsize>(bytes.size()));
        if (!std::cout) {
            throw Failure(kFailed, "standard output", "it could not be written",
                          "free some space, or write it elsewhere");
        }
    });
}

// Failure where the file must not come.
void RequireFree(const Place& target, const Object& object, const Sidecars& sidecars, bool force) {
    const auto there = target.Status();
    if (!there) return;
    if (!force) {
        throw Failure(kFailed, target.path(), "it is there already",
                      "replace it with: mavoea export --force, or name another file");
    }
    if (!S_ISREG(there->st_mode)) {
        throw Failure(kFailed, target.path(), "not a regular file", "name another file");
    }
    const auto files = sidecars.Files();
    const bool own = std::any_of(files.begin(), files.end(), [&](const Sidecars::Found& found) {
        return SameFile(found.info, *there);
    });
    if (own || SameFile(StatusOf(object.place), *there)) {
        throw Failure(kFailed, target.path(), "it is the object's own", "name another file");
    }
}

void RequireSame(const Archive& wanted, const Archive& found, const File& file) {
    const bool same_data =
        !wanted.data || (found.data && !FirstDifference(*wanted.data, *found.data));
    const auto missing = WhatIsMissing(wanted.metadata, found.metadata);
    if (same_data && found.format == wanted.format && missing.empty()) return;
    throw Failure(kFailed, file.path(),
                  "what was written is not what is read back" +
                      (missing.empty() ? std::string() : ": " + Joined(missing)),
                  "see whether somebody changes the object, and check the disk");
}

// Who may read the object may read it, as a copy.
void WriteToFile(const Archive& archive, const Place& target, mode_t mode, bool force) {
    if (DryRun()) {
        const int error = WhyNoNewFile(*target.directory);
        if (error != 0) throw SystemFailure(target.path(), error);
        return;
    }
    TemporaryFile temporary(target, mode & kReadAndWrite);
    const std::shared_ptr<const File>& file = temporary.shared_file();
    std::uint64_t end = 0;
    WriteArchive(archive, [&](ByteView bytes) {
        file->Write(end, bytes);
        end += bytes.size();
    });
    RequireSame(archive, ReadArchive(file, target.directory), *file);
    file->Sync();
    if (force) {
        temporary.GiveToTarget();
    } else {
        temporary.GiveToNewTarget();
    }
    target.directory->Sync();
}

Json ExportJson(const ExportOptions& options, const Object& object, const Archive& archive,
                const std::vector<Missing>& missing) {
    Json json;
    json.SetText("path", object.path());
    json.SetText("file", options.file);
    json.Set("format", options.format);
    if (archive.data) json.Set("dataFork", archive.data->size());
    json.Set("missing", MissingJson(missing));
    return json;
}

}  // namespace

ExitStatus Export(const ExportOptions& options) {
    const ArchiveFormat format = FormatNamed(options.format);
    const bool to_output = options.file == kStandardOutput;
    if (to_output && options.json) {
        throw Failure(kFailed, "--json", "standard output cannot have both the file and JSON",
                      "name a file");
    }
    const Object object = FindObject(options.path);
    const Sidecars sidecars = Sidecars::Find(object, Sidecars::Services::kFind);
    std::optional<Place> target;
    if (!to_output) {
        target = PlaceOf(options.file, Shown::kWhole);
        RequireFree(*target, object, sidecars, options.force);
    }
    const auto inode = OpenFor(format, object);
    Archive archive = ArchiveOf(object, *inode, sidecars, format);
    std::vector<Missing> missing;
    FitArchive(&archive, &missing);
    if (to_output) {
        WriteToOutput(archive);
    } else {
        WriteToFile(archive, *target, inode->info().st_mode, options.force);
    }
    if (options.verbose && !options.json && !to_output) {
        std::cout << Printable(object.path()) << ": exported to " << Printable(options.file)
                  << '\n';
    }
    if (options.json) Print(ExportJson(options, object, archive, missing));
    if (missing.empty()) return kSuccess;
    throw Loss(kFailed, object.path(),
               "not all of its metadata arrived at " +
                   (to_output ? "standard output" : Printable(target->path())) + ": " +
                   Joined(missing),
               "see what it is with: mavoea list -l PATH");
}

}  // namespace mavoea::tool
