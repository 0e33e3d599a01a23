#include "tools/walk/tree.h"

#include <sys/stat.h>

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <filesystem>
#include <map>
#include <optional>

#include "include/mavoea.h"
#include "tools/store/sidecars.h"
#include "tools/walk/counting.h"
#include "tools/walk/packing.h"

namespace mavoea::tool {
namespace {

mode_t TypeOf(const Place& place) {
    const auto info = place.Status();
    return info ? info->st_mode & S_IFMT : 0;
}

// What a log is of: what is done, to what, and how that is told.
std::string WorkOn(const TreeOptions& options, const std::string& doing) {
    std::string work = doing;
    if (options.recursive) work += " all of";
    for (const std::string& path : options.paths.arguments) {
        work += ' ' + std::filesystem::absolute(path).string();
    }
    if (options.paths.list) work += " what a list names";
    if (options.shard.count > 1) work += ", shard " + ShardText(options.shard);
    if (options.json) work += ", as JSON";
    return work;
}

// One tree after the other.
class Walk {
 public:
    Walk(const TreeOptions& options, const Visit& visit, Journal* journal)
        : recursive_(options.recursive),
          shard_(options.shard),
          visit_(visit),
          logs_(journal != nullptr),
          crew_(visit.hear ? options.crew : CrewSize{},
                {.work = [this](const Errand& errand,
                                const Tell& tell) { return Work(errand, tell); },
                 .hear = visit.hear ? visit.hear : [](std::string_view) {},
                 .on_failure = visit.on_failure,
                 .clear_progress = visit.clear_progress,
                 .show_progress = visit.show_progress,
                 .sync = [this] { SyncVolumes(); }},
                journal) {}

    void Run(const std::string& path) {
        const PathHash hash = PathHash::OfNamed(path);
        if (!recursive_ && !shard_.Has(hash)) return;
        try {
            const Object object = FindObject(path);
            const mode_t type = TypeOf(object.place);
            const bool descends = recursive_ && S_ISDIR(type);
            NoteVolume(object.place.directory);
            if (!descends && !shard_.Has(hash)) return;
            visit_.on_named(object);
            // The root has no directory to keep metadata in.
            const bool is_top = descends && object.is_root();
            const bool enters = is_top || Do(Errand::Kind::kNamed, object, type, hash, path);
            if (enters && descends) pending_.push_back({object.place, hash});
        } catch (const Failure& failure) {
            Fail(path, hash, failure);
        }
        while (!pending_.empty()) {
            const Inner directory = std::move(pending_.back());
            pending_.pop_back();
            Guard(directory, [&] { DoDirectory(directory); });
        }
    }

    void Fail(const Failure& failure) {
        crew_.Then([=, this] { visit_.on_failure(failure.subject(), failure); });
    }

    // All that came of what has been visited is out.
    void Settle() { crew_.Finish(); }

    // What has kept this shard from objects that may be its own.
    void Finish() {
        crew_.Finish();
        if (others_ == 0) return;
        visit_.on_failure({},
                          {gravest_, "shard " + ShardText(shard_),
                           std::to_string(others_) + (others_ == 1 ? " path" : " paths") +
                               " of other shards could not be looked into",
                           "see what these say of " + std::string(others_ == 1 ? "it" : "them")});
    }

 private:
    struct Inner {
        Place place;
        PathHash hash;
    };

    // Whether what is in it, if it is a directory, is to be looked at.
    bool Do(Errand::Kind kind, const Object& object, mode_t type, PathHash hash,
            const std::string& shown) {
        if (!shard_.Has(hash)) {
            visit_.on_other(object);
            return true;
        }
        (void)crew_.Do({.kind = kind,
                        .object = object,
                        .type = type,
                        .shown = shown,
                        .here = visit_.changes &&
                                (kind == Errand::Kind::kNamed || !IsApart(object.place.name))});
        return !S_ISDIR(type) || visit_.enters(object);
    }

    bool Work(const Errand& errand, const Tell& tell) const {
        const Object& object = errand.object;
        if (errand.kind == Errand::Kind::kDirectory) {
            return visit_.look_into(object.place.directory, tell);
        }
        const bool looked =
            errand.kind != Errand::Kind::kNamed || visit_.look_at_named(object, tell);
        return visit_.work(object, errand.shown, tell) && looked;
    }

    // Where work is done of which a log says that it is on disk.
    void NoteVolume(const DirectoryRef& directory) {
        if (logs_ && visit_.changes) volumes_.try_emplace(directory->Status().st_dev, directory);
    }
    void SyncVolumes() const {
        for (const auto& [device, directory] : volumes_) directory->SyncVolume();
    }

    void Fail(const std::string& path, PathHash hash, const Failure& failure) {
        if (shard_.Has(hash)) return crew_.Then([=, this] { visit_.on_failure(path, failure); });
        ++others_;
        gravest_ = std::max(gravest_, failure.status());
    }

    template <class Work>
    void Guard(const Inner& inner, Work work) {
        try {
            work();
        } catch (const Failure& failure) {
            if (!HasGone(inner.place, failure)) Fail(inner.place.path(), inner.hash, failure);
        }
    }

    // What is pending keeps the directory open in which it is, and none besides: no depth takes
    // more than the heap.
    void DoDirectory(const Inner& outer) {
        const DirectoryRef directory = outer.place.directory->OpenIn(outer.place.name);
        NoteVolume(directory);
        visit_.on_directory(directory);
        if (visit_.look_into && shard_.Has(outer.hash)) {
            (void)crew_.Do(
                {.kind = Errand::Kind::kDirectory, .object = {{directory, "."}}, .type = S_IFDIR});
        }
        const std::size_t first = pending_.size();
        for (const Directory::Entry& entry : CandidatesIn(directory)) {
            if (!IsVisited(entry)) continue;
            const Inner inner = {{directory, entry.name}, outer.hash.Below(entry.name)};
            if (!S_ISDIR(entry.type) && !shard_.Has(inner.hash)) continue;
            Guard(inner, [&] {
                if (!IsObject(directory, entry)) return;
                const Object object = ObjectAt(inner.place, entry.type);
                const bool enters = Do(Errand::Kind::kFound, object, entry.type, inner.hash, {});
                if (enters && S_ISDIR(entry.type)) pending_.push_back(inner);
            });
        }
        if (visit_.changes) {
            crew_.Afterwards([this, directory, outer] {
                if (!crew_.LeftEaDirectories()) return;
                try {
                    RemoveLeftEaDirectory(*directory);
                } catch (const Failure& failure) {
                    visit_.on_failure(outer.place.path(), failure);
                }
            });
        }
        std::reverse(pending_.begin() + static_cast<std::ptrdiff_t>(first), pending_.end());
    }

    bool recursive_;
    Shard shard_;
    const Visit& visit_;
    bool logs_;
    std::map<dev_t, DirectoryRef> volumes_;
    Crew crew_;
    std::vector<Inner> pending_;     // directories
    std::uint64_t others_ = 0;       // failures, with what belongs to other shards
    ExitStatus gravest_ = kSuccess;  // of those
};

// ---- The work -----------------------------------------------------------------------------------

constexpr std::uint64_t kFailedOutcome = UINT64_MAX;

class Work {
 public:
    Work(const TreeOptions& options, const Task& task)
        : task_(task),
          report_({task.doing, task.done, task.current, task.nothing},
                  TreeReport::EachOf(options.verbose, options.json)),
          tells_each_(options.verbose || options.log) {}

    void Run(const TreeOptions& options) {
        VisitObjects(
            options,
            {.work =
                 [this](const Object& object, const std::string&, const Tell& tell) {
                     const Result result = DoObject(object);
                     tell(result.told);
                     return result.done;
                 },
             .on_failure = [this](const std::string& path,
                                  const Failure& failure) { report_.AddFailure(path, failure); },
             .enters = [this](const Object& object) { return Suits(object); },
             .on_named = task_.on_named,
             .on_directory = task_.on_directory,
             .hear = [this](std::string_view told) { Hear(told); },
             .changes = true,
             .clear_progress = [this] { report_.ClearProgress(); },
             .show_progress = [this](const Object& object) { report_.Show(object.place); },
             .on_other = task_.check},
            task_.doing);
    }

    ExitStatus Finish(bool json) { return report_.Finish(json); }

 private:
    // What is below what does not would fail for the same reason.
    bool Suits(const Object& object) const {
        try {
            task_.check(object);
            return true;
        } catch (const Failure&) {
            return false;
        }
    }

    // What became of it, packed: an outcome with what there is to say, or a failure.
    struct Result {
        std::string told;
        bool done;
    };
    Result DoObject(const Object& object) const {
        Packer told;
        bool suits = false;
        try {
            task_.check(object);
            suits = true;
            Notes notes;
            const Outcome outcome = task_.work(object, &notes);
            told.AddNumber(static_cast<std::uint64_t>(outcome));
            told.AddText(tells_each_ ? object.path() : std::string());
            for (const std::string& note : notes) told.AddText(note);
            return {told.bytes(), true};
        } catch (const Failure& failure) {
            if (suits && HasGone(object.place, failure)) return {{}, true};
            told.AddNumber(kFailedOutcome);
            told.AddFailure(object.path(), failure);
        }
        return {told.bytes(), false};
    }

    void Hear(std::string_view told) {
        if (told.empty()) return;
        Unpacker said(told);
        const std::uint64_t outcome = said.TakeNumber();
        if (outcome == kFailedOutcome) {
            const ToldFailure failure = said.TakeFailure();
            return report_.AddFailure(failure.path, failure.status, failure.message);
        }
        report_.Add(std::string(said.TakeText()), static_cast<Outcome>(outcome));
        while (!said.empty()) report_.notes()->emplace_back(said.TakeText());
    }

    const Task& task_;
    TreeReport report_;
    bool tells_each_;  // now, or when a log is gone on with
};

}  // namespace

bool IsVisited(const Directory::Entry& entry) {
    return !S_ISLNK(entry.type) && MAVOEAIsHiddenDirName(entry.name.c_str()) == 0;
}

bool HasGone(const Place& place, const Failure& failure) {
    return failure.status() == kNotFound && !place.directory->Has(place.name);
}

void VisitObjects(const TreeOptions& options, const Visit& visit, const std::string& doing) {
    if (options.recursive) RequireDescriptorPaths();
    std::optional<Journal> journal;
    if (options.log) journal.emplace(*options.log, WorkOn(options, doing), std::string());
    std::optional<Counting> counting;
    if (options.recursive && !options.paths.list) {
        counting.emplace(Counting::Kind::kVisited, options.paths.arguments, options.shard);
    }
    Walk walk(options, visit, journal ? &*journal : nullptr);
    PathReader paths(
        options.paths, [&](const Failure& failure) { walk.Fail(failure); }, [&] { walk.Settle(); });
    while (const auto path = paths.Next()) walk.Run(*path);
    walk.Finish();
}

ExitStatus RunOnTree(const TreeOptions& options, const Task& task) {
    Work work(options, task);
    work.Run(options);
    return work.Finish(options.json);
}

}  // namespace mavoea::tool
