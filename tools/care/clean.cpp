#include "tools/care/clean.h"

#include <algorithm>
#include <cerrno>
#include <filesystem>
#include <iostream>

#include "include/mavoea.h"
#include "tools/care/dangling.h"
#include "tools/place/volume.h"
#include "tools/say/output.h"
#include "tools/say/text.h"
#include "tools/store/sidecars.h"

namespace mavoea::tool {
namespace {

class Cleaning {
 public:
    explicit Cleaning(const CleanOptions& options) : options_(options) {}

    void Do(const std::string& path) {
        try {
            const Place top = FindObject(path).place;
            RefuseEaDirectory(top.path());
            const auto info = top.Status();
            if (info && !S_ISDIR(info->st_mode)) throw SystemFailure(top.path(), ENOTDIR);
            DoDirectory(top);
        } catch (const Failure& failure) {
            Add(path, failure);
        }
        // No depth takes more than the heap.
        while (!pending_.empty()) {
            const Place place = std::move(pending_.back());
            pending_.pop_back();
            try {
                DoDirectory(place);
            } catch (const Failure& failure) {
                // Nothing is wrong with what has gone meanwhile.
                if (failure.status() == kNotFound && !place.directory->Has(place.name)) continue;
                Add(place.path(), failure);
            }
        }
    }

    ExitStatus Summarize() const {
        if (options_.json) {
            PrintJson();
        } else {
            std::cout << (options_.remove ? removed_ : dangling_)
                      << (options_.remove ? " removed, " : " to be removed with --yes, ") << kept_
                      << " kept, " << failures_.size() << " failed\n";
        }
        for (const FailedObject& failed : failures_) Report(failed.message);
        return status_;
    }

 private:
    // What is in there is metadata, whatever its name.
    static void RefuseEaDirectory(const std::string& path) {
        for (const std::filesystem::path& component : std::filesystem::path(path)) {
            if (component == "@eaDir") {
                throw Failure(kFailed, path, "in an EA directory",
                              "name a directory that holds objects");
            }
        }
    }

    void DoDirectory(const Place& place) {
        const DirectoryRef directory = place.directory->OpenIn(place.name);
        const auto info = directory->StatusOf(kEaDirName);
        const DirectoryRef ea_dir =
            info && S_ISDIR(info->st_mode) ? directory->FindIn(kEaDirName) : nullptr;
        for (const Dangling& dangling : FindDangling(directory, ea_dir, options_.others)) {
            const Directory& holder = dangling.InEaDirectory() && ea_dir ? *ea_dir : *directory;
            DoDangling(dangling, holder, ea_dir.get());
        }
        if (!options_.recursive) return;
        const std::size_t first = pending_.size();
        for (const Directory::Entry& entry : directory->Entries()) {
            if (S_ISDIR(entry.type) && MAVOEAIsHiddenDirName(entry.name.c_str()) == 0) {
                pending_.push_back({directory, entry.name});
            }
        }
        std::reverse(pending_.begin() + static_cast<std::ptrdiff_t>(first), pending_.end());
    }

    void DoDangling(const Dangling& dangling, const Directory& holder, const Directory* ea_dir) {
        const std::string path = holder.PathOf(dangling.name);
        const bool kept = dangling.kind == DanglingKind::kOther && !options_.others;
        bool removed = false;
        try {
            if (options_.remove && !kept) {
                removed = dangling.kind == DanglingKind::kEaDirectory && ea_dir != nullptr
                              ? RemoveEaDirectory(holder, *ea_dir, dangling.name)
                              : holder.Remove(dangling.name);
                if (!removed) return;
            }
            ++(kept ? kept_ : removed ? removed_ : dangling_);
            List(path, dangling, kept, removed);
        } catch (const Failure& failure) {
            Add(path, failure);
        }
    }

    // Unless something has come into it, or could not be removed.
    static bool RemoveEaDirectory(const Directory& holder, const Directory& ea_dir,
                                  const std::string& name) {
        const auto entries = ea_dir.Entries();
        const bool only_cover = std::all_of(entries.begin(), entries.end(), [](const auto& entry) {
            return entry.name == ".cover" && S_ISREG(entry.type);
        });
        if (!only_cover) return false;
        (void)ea_dir.Remove(".cover");
        return holder.RemoveEmpty(name);
    }

    void List(const std::string& path, const Dangling& dangling, bool kept, bool removed) {
        if (!options_.json) {
            std::cout << Printable(path) << ": " << LabelOf(dangling.kind) << ", "
                      << dangling.because
                      << (kept      ? "; kept"
                          : removed ? "; removed"
                                    : "")
                      << '\n';
            return;
        }
        Json entry;
        entry.SetText("path", path);
        entry.Set("kind", IdOf(dangling.kind));
        entry.Set("reason", dangling.because);
        entry.Set("kept", kept);
        entry.Set("removed", removed);
        list_.Add(std::move(entry));
    }

    void Add(const std::string& path, const Failure& failure) {
        failures_.push_back({path, failure.what()});
        status_ = std::max(status_, failure.status());
    }

    void PrintJson() const {
        Json json;
        json.Set("found", list_);
        json.Set("dangling", dangling_);
        json.Set("removed", removed_);
        json.Set("kept", kept_);
        json.Set("failed", failures_.size());
        SetFailures(json, failures_);
        Print(json);
    }

    const CleanOptions& options_;
    std::vector<Place> pending_;  // directories
    Json list_ = Json::Array();
    std::size_t dangling_ = 0;  // neither removed nor kept
    std::size_t removed_ = 0;
    std::size_t kept_ = 0;
    std::vector<FailedObject> failures_;
    ExitStatus status_ = kSuccess;
};

}  // namespace

ExitStatus Clean(const CleanOptions& options) {
    if (options.recursive) RequireDescriptorPaths();
    Cleaning cleaning(options);
    for (const std::string& directory : options.directories) cleaning.Do(directory);
    return cleaning.Summarize();
}

}  // namespace mavoea::tool
