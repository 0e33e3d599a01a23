#include "tools/exchange/import.h"

#include <fcntl.h>

#include <cerrno>
#include <ctime>
#include <iostream>
#include <memory>

#include "tools/exchange/archive.h"
#include "tools/exchange/taking_over.h"
#include "tools/place/dry_run.h"
#include "tools/say/output.h"
#include "tools/say/text.h"
#include "tools/store/foreign/detection.h"
#include "tools/store/sidecars.h"
#include "tools/store/writer.h"
#include "tools/transfer/pending.h"

namespace mavoea::tool {
namespace {

std::string Joined(const std::vector<std::string>& words) {
    std::string text;
    for (const std::string& word : words) text += (text.empty() ? "" : ", ") + word;
    return text;
}

// ---- Data ---------------------------------------------------------------------------------------

// What has become of the data of an object: of one that was there nothing, where it was the same.
enum class DataDone { kNone, kSame, kMade, kReplaced };

const char* NameOf(DataDone done) {
    switch (done) {
        case DataDone::kNone:
            break;
        case DataDone::kSame:
            return "same";
        case DataDone::kMade:
            return "made";
        case DataDone::kReplaced:
            return "replaced";
    }
    return "none";
}

// A name out of a file that anybody may have made: it leads nowhere else, and is no metadata's.
void RequireHarmless(const std::string& name, const std::string& source) {
    constexpr std::size_t kMost = 255;
    const char* why = nullptr;
    if (name.empty()) {
        why = "it holds no name";
    } else if (name == "." || name == ".." || name.find('/') != std::string::npos ||
               name.find('\0') != std::string::npos) {
        why = "the name in it is none that a file could have";
    } else if (name.size() > kMost) {
        why = "the name in it is too long";
    } else if (name == kEaDirName || name.starts_with("._") || IsTemporaryName(name)) {
        why = "the name in it is that of metadata";
    }
    if (why == nullptr) return;
    throw Failure(kFailed, source, why, "name the new file: mavoea import FILE DIR/NAME");
}

// Where the archive goes: into a directory under its own name, if it makes files.
Place TargetOf(const Archive& archive, const std::string& source, const Place& named) {
    const auto info = named.Status();
    if (!archive.data || !info || !S_ISDIR(info->st_mode)) return named;
    RequireHarmless(archive.name, source);
    return {named.Open(), archive.name};
}

void Fill(const std::shared_ptr<const File>& file, const Content& data) {
    (void)WriteTo(*file, 0, data);
    if (!FirstDifference(data, Content(file, 0, data.size()))) return;
    throw Failure(kFailed, file->path(), "what was written is not what is read back",
                  "check the disk");
}

void MakeFile(const Object& object, const Archive& archive) {
    // Whatever is in the way of its metadata is told before there is an object.
    (void)WriterFor(object);
    RequirePlace(object);
    RequireDeclared(object);
    if (const Sidecars beside = Sidecars::Find(object, Sidecars::Services::kFind); beside.Any()) {
        throw Failure(kFailed, object.path(), "metadata of an object that has gone is in its place",
                      "see what it is with: mavoea clean DIR");
    }
    if (DryRun()) {
        const int error = WhyNoNewFile(*object.place.directory);
        if (error != 0) throw SystemFailure(object.path(), error);
        return;
    }
    constexpr mode_t kReadAndWrite = 0666;
    TemporaryFile temporary(object.place, kReadAndWrite);
    const std::shared_ptr<const File>& file = temporary.shared_file();
    Fill(file, *archive.data);
    if (archive.modified) {
        const timespec modified = {.tv_sec = static_cast<std::time_t>(*archive.modified),
                                   .tv_nsec = 0};
        Inode::Of(file)->SetTimes({modified, modified});
    }
    file->Sync();
    temporary.GiveToNewTarget();
    object.place.directory->Sync();
}

// Writes into the file, which keeps its owner, its rights and all that it has besides.
void ReplaceData(const Object& object, const Content& data) {
    const auto file = object.place.directory->FindFile(object.place.name, O_RDWR);
    if (!file) throw SystemFailure(object.path(), ENOENT);
    // Others may have made it a name of a file that they may not write to.
    if (file->Status().st_nlink > 1) {
        throw Failure(kFailed, object.path(), "it has several names, and its data is another",
                      "remove it first");
    }
    if (DryRun()) return;
    file->Reserve(0, data.size());
    Fill(file, data);
    file->Resize(data.size());
    file->Sync();
}

bool HasData(const Object& object, const Content& data) {
    const auto file = object.place.directory->FindFile(object.place.name, O_RDONLY);
    if (!file) throw SystemFailure(object.path(), ENOENT);
    return file->Size() == data.size() && !FirstDifference(data, Content(file, 0, data.size()));
}

DataDone PutData(const Object& object, const Archive& archive, bool replaces) {
    if (!archive.data) return DataDone::kNone;
    if (!object.place.Status()) {
        MakeFile(object, archive);
        return DataDone::kMade;
    }
    if (HasData(object, *archive.data)) return DataDone::kSame;
    if (!replaces) {
        throw Failure(
            kFailed, object.path(),
            std::string("its data is not that of the ") + NameOf(archive.format) + " file",
            "replace it with: mavoea import --data, or name another path");
    }
    ReplaceData(object, *archive.data);
    return DataDone::kReplaced;
}

// ---- What is said -------------------------------------------------------------------------------

void PrintText(const std::string& path, const Archive& archive, DataDone done) {
    const Metadata& metadata = archive.metadata;
    std::vector<std::string> words;
    if (done == DataDone::kMade || done == DataDone::kReplaced) {
        words.push_back("data of " + std::to_string(archive.data->size()) + " bytes");
    }
    if (const std::size_t count = metadata.attributes.size(); count > 0) {
        words.push_back(std::to_string(count) + (count == 1 ? " attribute" : " attributes"));
    }
    if (metadata.finder_info) words.emplace_back("Finder info");
    if (metadata.fork) {
        words.push_back("resource fork of " + std::to_string(metadata.fork->value.size()) +
                        " bytes");
    }
    for (const auto& [id, item] : metadata.entries) words.push_back(NameOfEntry(id));
    if (metadata.locked) words.emplace_back("locked state");
    if (words.empty()) words.emplace_back("nothing to take over");
    std::cout << Printable(path) << ": " << Joined(words) << '\n';
}

Json ImportJson(const std::string& source, const std::string& path, const Archive& archive,
                DataDone done, const TakingOver* import) {
    const Metadata& metadata = archive.metadata;
    Json json;
    json.SetText("path", path);
    if (archive.format == ArchiveFormat::kAppleDouble) json.SetText("appleDouble", source);
    json.SetText("file", source);
    json.Set("format", NameOf(archive.format));
    json.Set("data", NameOf(done));
    Json attributes = Json::Array();
    for (const Metadata::Attribute& attribute : metadata.attributes) {
        Json entry;
        entry.SetText("name", attribute.name);
        entry.Set("size", attribute.value.size());
        attributes.Add(std::move(entry));
    }
    json.Set("attributes", std::move(attributes));
    json.Set("finderInfo", metadata.finder_info.has_value());
    json.Set("resourceFork", metadata.fork ? metadata.fork->value.size() : 0);
    json.Set("notTakenOver",
             MissingJson(import == nullptr ? std::vector<Missing>() : import->missing()));
    SetMessages(json, "failures",
                import == nullptr ? std::vector<std::string>() : import->failures());
    return json;
}

// A link at the end of its path is not followed: others may have put it there.
std::shared_ptr<const File> OpenSource(const std::string& path) {
    const Place place = PlaceOf(path, Shown::kWhole);
    if (auto file = place.directory->FindFile(place.name, O_RDONLY)) return file;
    throw SystemFailure(path, ENOENT);
}

}  // namespace

ExitStatus Import(const ImportOptions& options) {
    const Place named = PlaceOf(options.path, Shown::kWhole);
    const auto there = named.Status();
    const bool inside = there && S_ISDIR(there->st_mode);
    Archive archive =
        ReadArchive(OpenSource(options.file), inside ? named.Open() : named.directory);
    if (!archive.data && options.replaces_data) {
        throw Failure(kFailed, options.file, "it holds no data", "leave --data out");
    }
    SortOut(&archive.metadata);
    const Place target = TargetOf(archive, options.file, named);
    const auto info = target.Status();
    if (!info && !archive.data) throw SystemFailure(options.path, ENOENT);
    const Object object = ObjectAt(target, info ? &*info : nullptr);
    std::optional<TakingOver> on_object;
    if (info) {
        SettleNamed(object);
        on_object.emplace(object);
    }
    const DataDone done = PutData(object, archive, options.replaces_data);
    if (DryRun() && done == DataDone::kMade) {
        // There is no object yet that could tell what it takes.
        if (options.json) {
            Print(ImportJson(options.file, object.path(), archive, done, nullptr));
        } else {
            PrintText(object.path(), archive, done);
        }
        return kSuccess;
    }
    if (!on_object) on_object.emplace(object);
    TakingOver& import = *on_object;
    import.Run(archive.metadata);
    if (options.json) {
        Print(ImportJson(options.file, object.path(), archive, done, &import));
    } else if (import.failures().empty()) {
        PrintText(object.path(), archive, done);
    }
    for (const std::string& note : import.notes()) Note(note);
    for (const std::string& failure : import.failures()) Report(failure);
    return import.status();
}

}  // namespace mavoea::tool
