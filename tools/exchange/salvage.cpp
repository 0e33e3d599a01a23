#include "tools/exchange/salvage.h"

#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <iostream>
#include <set>
#include <vector>

#include "tools/place/dry_run.h"
#include "tools/place/volume.h"
#include "tools/say/output.h"
#include "tools/say/text.h"
#include "tools/store/gathering.h"
#include "tools/store/reader.h"

namespace mavoea::tool {
namespace {

constexpr const char* kManifest = "manifest.json";

// A name that no shell, and no other system, takes for anything else: "%2F" and the like for all
// that is not a letter, a digit or one of "._-".
std::string Escaped(const std::string& name) {
    constexpr std::string_view kPlain =
        "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789._-";
    std::string escaped;
    for (const char c : name) {
        if (kPlain.find(c) != std::string_view::npos) {
            escaped += c;
        } else {
            escaped += '%' + HexNumber(static_cast<std::uint8_t>(c), 2).substr(2);
        }
    }
    return escaped;
}

// What was written: one file.
struct Salvaged {
    std::string item;  // for people
    std::string name;  // of an attribute
    std::string file;  // in the directory
    std::string from;
    std::uint64_t size;
    std::uint64_t of;
};

class Rescue {
 public:
    explicit Rescue(const Place& target) : target_(target) {
        if (!DryRun()) {
            directory_ = target.directory->MakeIn(target.name, S_IRWXU);
        } else if (target.Status()) {
            throw SystemFailure(target.path(), EEXIST);
        } else if (const int error = WhyNoNewFile(*target.directory)) {
            throw SystemFailure(target.path(), error);
        }
    }

    void Write(const Metadata& metadata) {
        for (const Metadata::Attribute& one : metadata.attributes) {
            Write(NameOfAttribute(one.name), "attribute." + Escaped(one.name), one.value,
                  WhereText(one.holder, one.spelling), one.name);
        }
        if (const auto& info = metadata.finder_info) {
            Write("Finder info", "FinderInfo", info->value, info->holder);
        }
        if (const auto& fork = metadata.fork) {
            Write("resource fork", "ResourceFork", fork->value, fork->holder);
        }
        for (const auto& [id, item] : metadata.entries) {
            const std::string number = std::to_string(static_cast<std::uint32_t>(id));
            Write(NameOfEntry(id), "entry." + number, item.value, item.holder);
        }
        for (const Metadata::ServiceFile& one : metadata.services) {
            Write(NameOfAttribute(one.name) + " of another service", "service." + Escaped(one.name),
                  one.value, one.holder);
        }
        if (metadata.whole_record) {
            Write("netatalk record", "record", Content(*metadata.whole_record), {});
        }
        for (const Metadata::Stray& stray : metadata.strays) {
            missing_.push_back({stray.item, stray.reason});
        }
    }

    void WriteManifest(const Object& object, const Metadata& metadata) {
        Json files = Json::Array();
        for (const Salvaged& one : all_) {
            Json entry;
            entry.SetText("file", one.file);
            entry.SetText("item", one.item);
            if (!one.name.empty()) entry.SetText("name", one.name);
            if (!one.from.empty()) entry.SetText("from", one.from);
            entry.Set("size", one.size);
            entry.Set("of", one.of);
            files.Add(std::move(entry));
        }
        Json problems = Json::Array();
        for (const Failure& problem : metadata.problems) {
            Json entry;
            entry.SetText("message", problem.what());
            problems.Add(std::move(entry));
        }
        Json marks = Json::Array();
        for (const auto& [is_set, mark] : {std::pair(metadata.locked, "locked"),
                                           {metadata.hidden, "hidden"},
                                           {metadata.system, "system"}}) {
            if (is_set) marks.Add(Json(mark));
        }
        json_.SetText("path", object.path());
        json_.Set("files", std::move(files));
        json_.Set("marks", std::move(marks));
        json_.Set("missing", MissingJson(missing_));
        json_.Set("problems", std::move(problems));
        const std::string text = json_.Text() + '\n';
        WriteFile(kManifest, Content(Bytes(text.begin(), text.end())));
        if (directory_) directory_->Sync();
    }

    std::string Text(const Object& object) const {
        std::string text;
        for (const Salvaged& one : all_) {
            text +=
                Printable(object.path()) + ": " + one.item + " into " + Printable(one.file) + '\n';
        }
        return text;
    }
    const Json& json() const { return json_; }
    const std::vector<Missing>& missing() const { return missing_; }

 private:
    void Write(const std::string& item, const std::string& wanted, const Content& value,
               const std::string& from, const std::string& name = {}) {
        const Content readable = value.Readable();
        if (value.damaged()) {
            missing_.push_back({item, std::to_string(readable.size()) + " of its " +
                                          std::to_string(value.size()) + " bytes can be read"});
        }
        const std::string file = FreeName(wanted);
        try {
            WriteFile(file, readable);
        } catch (const Failure& failure) {
            if (failure.subject() == target_.path() + '/' + file) throw;
            missing_.push_back({item, failure.cause()});
            return;
        }
        all_.push_back({item, name, file, from, readable.size(), value.size()});
    }

    // Long names are cut, and some file systems take two that differ in case for one.
    std::string FreeName(const std::string& wanted) {
        constexpr std::size_t kMost = 200;
        std::string name = wanted.substr(0, kMost);
        if (name.size() == wanted.size() && !Has(name)) return name;
        return name + '~' + std::to_string(all_.size() + missing_.size());
    }

    bool Has(const std::string& name) const {
        if (directory_) return directory_->Has(name);
        return std::any_of(all_.begin(), all_.end(),
                           [&](const Salvaged& one) { return one.file == name; });
    }

    void WriteFile(const std::string& name, const Content& content) {
        if (DryRun()) {
            // What cannot be read is found by reading.
            (void)FirstDifference(content, content);
            return;
        }
        TemporaryFile temporary({directory_, name});
        const std::shared_ptr<const File>& file = temporary.shared_file();
        WriteTo(*file, 0, content);
        if (FirstDifference(content, Content(file, 0, file->Size()))) {
            throw Failure(kFailed, file->path(), "what was written is not what is read back",
                          "see whether somebody changes the object, and check the disk");
        }
        file->Sync();
        temporary.GiveToNewTarget();
    }

    Place target_;
    DirectoryRef directory_;  // null in a dry run
    std::vector<Salvaged> all_;
    std::vector<Missing> missing_;
    Json json_;
};

}  // namespace

ExitStatus Salvage(const SalvageOptions& options) {
    const Object object = FindObject(options.path);
    RequireParent(object);
    if (object.keeping() == Keeping::kNone) throw NoStore(object);
    const Metadata metadata = ReadMetadata(object, Sidecars::Services::kFind);
    if (!metadata.HasAny()) {
        throw Failure(kNotFound, object.path(), "no metadata",
                      "mavoea where PATH has the files in which metadata may be");
    }
    const Place target = PlaceOf(options.directory, Shown::kWhole);
    Rescue rescue(target);
    rescue.Write(metadata);
    rescue.WriteManifest(object, metadata);
    target.directory->Sync();
    if (options.verbose && !options.json) std::cout << rescue.Text(object);
    if (options.json) Print(rescue.json());
    for (const Failure& problem : metadata.problems) Report(problem);
    if (rescue.missing().empty() && metadata.problems.empty()) return kSuccess;
    throw Loss(kFailed, object.path(),
               "not all of its metadata could be read" +
                   (rescue.missing().empty() ? std::string() : ": " + Joined(rescue.missing())),
               "what could is in " + Printable(target.path()));
}

}  // namespace mavoea::tool
