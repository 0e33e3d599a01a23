#include "tools/convert.h"

#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <filesystem>
#include <iostream>
#include <set>
#include <vector>

#include "include/mavoea.h"
#include "platform/include/mavocore.h"
#include "tools/comparison.h"
#include "tools/directory.h"
#include "tools/file.h"
#include "tools/interrupt.h"
#include "tools/output.h"
#include "tools/progress.h"
#include "tools/store.h"
#include "tools/transfer.h"
#include "tools/volume.h"
#include "util/volume_kind.h"

namespace mavoea::tool {
namespace {

struct Pair {
    std::string from;
    std::string to;
};

Pair ChildOf(const Pair& pair, const std::string& name) {
    const auto in = [&](const std::string& path) {
        return path == "/" ? '/' + name : path + '/' + name;
    };
    return {in(pair.from), in(pair.to)};
}

bool IsDirectory(const std::string& path) {
    struct stat info;
    if (::lstat(path.c_str(), &info) != 0) throw SystemFailure(path, errno);
    return S_ISDIR(info.st_mode);
}

// What to do with something in a directory.
enum class Part {
    kObject,
    kMetadata,  // of an object, with which it is copied
    kOrphan     // metadata of nothing that could take it along
};

Part PartOf(const Directory& directory, const Directory::Entry& entry) {
    struct stat info = {};
    info.st_mode = entry.type;
    if (!IsMetadataName(entry.name, info)) return Part::kObject;
    if (S_ISDIR(entry.type)) return Part::kMetadata;
    constexpr int kNotAppleDouble = -3;
    const std::string path = directory.PathOf(entry.name);
    const int found = MAVOEACheckADFile(path.c_str());
    if (found == kNotAppleDouble) return Part::kObject;
    const bool taken_along = FindObject(path).keeping() != Keeping::kXattr;
    return found == 0 && taken_along ? Part::kMetadata : Part::kOrphan;
}

class Conversion {
 public:
    Conversion(const ConvertOptions& options, Pair top)
        : options_(options),
          top_(std::move(top)),
          progress_(options.compare_only ? "comparing" : "converting") {}

    void Copy() {
        Transfer transfer({.on_bytes = [this](std::uint64_t) { Show(in_hand_); },
                           .give_up = InterruptedAgain,
                           .on_note = [this](const std::string& note) { notes_.push_back(note); }});
        struct Step {
            Pair pair;
            bool finish;  // a directory, whose contents have been copied
        };
        std::vector<Step> steps = {{top_, false}};
        while (!steps.empty()) {
            const Step step = std::move(steps.back());
            const Pair& pair = step.pair;
            steps.pop_back();
            // What was begun is given its attributes all the same.
            if (Interrupted() != 0 && !step.finish) continue;
            Show(pair.from);
            Try(pair.from, [&] {
                if (step.finish) {
                    transfer.FinishDirectory(pair.from, pair.to);
                } else if (!IsDirectory(pair.from)) {
                    transfer.CopyObject(pair.from, pair.to);
                } else {
                    (void)transfer.MakeDirectory(pair.from, pair.to);
                    steps.push_back({pair, true});
                    if (!options_.recursive) return;
                    for (const std::string& name : Children(pair.from, true)) {
                        steps.push_back({ChildOf(pair, name), false});
                    }
                    return;
                }
                ++converted_;
            });
        }
    }

    void Compare() {
        std::vector<Pair> pairs = {top_};
        while (!pairs.empty() && Interrupted() == 0) {
            const Pair pair = std::move(pairs.back());
            pairs.pop_back();
            Show(pair.from);
            Try(pair.from, [&] { CompareObject(pair, &pairs); });
        }
    }

    ExitStatus Summarize() {
        progress_.Clear();
        if (options_.json) {
            PrintJson();
        } else {
            if (!options_.compare_only) std::cout << converted_ << " converted, ";
            std::cout << compared_ << " compared, " << differences_
                      << (differences_ == 1 ? " difference, " : " differences, ")
                      << failures_.size() << " failed\n";
        }
        for (const std::string& note : notes_) Note(note);
        for (const FailedObject& failed : failures_) Report(failed.message);
        if (Interrupted() != 0) {
            Report("interrupted; the source is as it was, give the command again");
            constexpr int kSignalled = 128;
            return static_cast<ExitStatus>(kSignalled + Interrupted());
        }
        return differences_ > 0 ? kFailed : status_;
    }

 private:
    // Names of objects in a directory, the last first. Each part of the work sees what was left
    // behind, so one of them says so.
    std::vector<std::string> Children(const std::string& path, bool reverse) {
        std::vector<std::string> names;
        const Directory directory = Directory::Open(path);
        for (const Directory::Entry& entry : directory.Entries()) {
            if (PartOf(directory, entry) == Part::kObject) names.push_back(entry.name);
        }
        if (reverse) std::reverse(names.begin(), names.end());
        return names;
    }

    void ReportOrphans(const std::string& path) {
        const Directory directory = Directory::Open(path);
        for (const Directory::Entry& entry : directory.Entries()) {
            if (PartOf(directory, entry) != Part::kOrphan) continue;
            Add({.path = directory.PathOf(entry.name),
                 .what = Difference::What::kMissing,
                 .because = "this AppleDouble file belongs to no object that it could go with"});
        }
    }

    void CompareObject(const Pair& pair, std::vector<Pair>* pairs) {
        const Object original = FindObject(pair.from);
        if (!Exists(pair.to)) {
            Add({.path = pair.from, .what = Difference::What::kMissing});
            return;
        }
        const Comparison::Receiver receiver = {
            .differs = [this](const Difference& difference) { Add(difference); },
            .fails = [&](const Failure& failure) { AddFailure(pair.from, failure); },
            .give_up = InterruptedAgain};
        Comparison(original, FindObject(pair.to), receiver).Run();
        ++compared_;
        if (!options_.recursive || !IsDirectory(pair.from) || !IsDirectory(pair.to)) return;
        ReportOrphans(pair.from);
        const std::vector<std::string> names = Children(pair.from, true);
        for (const std::string& name : names) pairs->push_back(ChildOf(pair, name));
        const std::set<std::string> known(names.begin(), names.end());
        for (const std::string& name : Children(pair.to, false)) {
            if (known.contains(name)) continue;
            Add({.path = ChildOf(pair, name).to, .what = Difference::What::kExtra});
        }
    }

    template <class Work>
    void Try(const std::string& path, Work work) {
        try {
            work();
        } catch (const Failure& failure) {
            AddFailure(path, failure);
        }
    }

    void Add(const Difference& difference) {
        ++differences_;
        if (options_.json) {
            list_.Add(DifferenceJson(difference));
        } else {
            progress_.Clear();
            std::cout << DifferenceText(difference) << '\n';
        }
    }

    void AddFailure(const std::string& path, const Failure& failure) {
        failures_.push_back({path, failure.what()});
        status_ = std::max(status_, failure.status());
    }

    void Show(const std::string& path) {
        in_hand_ = path;
        progress_.Show(std::to_string(converted_) + " converted, " + std::to_string(compared_) +
                           " compared, " + std::to_string(failures_.size()) + " failed",
                       path);
    }

    void PrintJson() const {
        Json json;
        json.Set("converted", converted_);
        json.Set("compared", compared_);
        json.Set("differences", list_);
        json.Set("failed", failures_.size());
        json.Set("interrupted", Interrupted() != 0);
        SetMessages(json, "notes", notes_);
        SetFailures(json, failures_);
        Print(json);
    }

    const ConvertOptions& options_;
    Pair top_;
    Progress progress_;
    std::string in_hand_;
    std::uint64_t converted_ = 0;
    std::uint64_t compared_ = 0;
    std::uint64_t differences_ = 0;
    Json list_ = Json::Array();
    std::vector<std::string> notes_;
    std::vector<FailedObject> failures_;
    ExitStatus status_ = kSuccess;
};

// Where it is, whatever symbolic links lead there; one at its own end stays.
std::filesystem::path RealPath(const std::string& path) {
    const std::filesystem::path given(path);
    std::error_code error;
    const auto parent = std::filesystem::weakly_canonical(given.parent_path(), error);
    return error ? given : parent / given.filename();
}

bool IsWithin(const std::filesystem::path& inner, const std::filesystem::path& outer) {
    return std::mismatch(outer.begin(), outer.end(), inner.begin(), inner.end()).first ==
           outer.end();
}

}  // namespace

ExitStatus Convert(const ConvertOptions& options) {
    const Object source = FindObject(options.source);
    RequireParent(source);
    if (options.destination.empty()) {
        throw Failure(kFailed, "DST", "it is empty", "name the copy");
    }
    // The destination's type must not say anything of the source.
    const std::string destination =
        DeclareVolume(options.destination, options.type, "--to " + options.type).directory;
    const auto real_source = RealPath(source.path);
    const auto real_destination = RealPath(destination);
    if (IsWithin(real_destination, real_source) || IsWithin(real_source, real_destination)) {
        throw Failure(kFailed, options.destination, "it and the source are not apart",
                      "name a place outside of the source");
    }
    const Object target = {destination, MAVOGetFSType(destination.c_str(), 1)};
    if (source.keeping() == Keeping::kNone) throw NoStore(source);
    if (VolumeKindOf(target.type) == VolumeKind::kNone) throw NoStore(target);
    if (options.compare_only && !Exists(destination)) throw SystemFailure(destination, ENOENT);

    WatchForInterrupts();
    Conversion conversion(options, {source.path, destination});
    if (!options.compare_only) conversion.Copy();
    conversion.Compare();
    return conversion.Summarize();
}

}  // namespace mavoea::tool
