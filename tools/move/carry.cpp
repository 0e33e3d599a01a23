#include "tools/move/carry.h"

#include <sys/stat.h>

#include <cerrno>
#include <vector>

#include "tools/move/ends.h"
#include "tools/place/volume.h"
#include "tools/say/interrupt.h"
#include "tools/store/sidecars.h"
#include "tools/transfer/transfer.h"
#include "tools/transfer/tree_copy.h"

namespace mavoea::tool {
namespace {

class Carrying final : private TreeCopy {
 public:
    explicit Carrying(const CarryOptions& options)
        : options_(options),
          job_("carrying", "carried", options.job),
          transfer_({.watch = {.give_up = InterruptedAgain},
                     .on_note = [this](const std::string& note) { job_.AddNote(note); },
                     .manner = {.keeps_mode = false,
                                .keeps_owner = false,
                                .keeps_times = false,
                                .keeps_attributes = false,
                                .metadata_only = true}}) {}

    ExitStatus Run() {
        if (options_.job.recursive) RequireDescriptorPaths();
        const Place from = PlaceOf(options_.job.paths.front(), Shown::kAsGiven);
        const Place to = PlaceOf(options_.destination, Shown::kAsGiven);
        const struct stat source = StatusOf(from);
        (void)StatusOf(to);
        if (S_ISDIR(source.st_mode) && IsInside(to, source)) {
            throw Failure(kFailed, to.path(), "it and the source are not apart",
                          "name a copy outside of the source");
        }
        CopyTree(from, to);
        try {
            transfer_.MakeDurable();
        } catch (const Failure& failure) {
            job_.AddFailure(failure.subject(), failure);
        }
        return job_.Finish();
    }

 private:
    bool Stopped() const override { return job_.stopped(); }

    void Begin(const Place& from, const Place& to, Level* level) override {
        job_.ShowProgress(from.path());
        const struct stat info = StatusOf(from);
        const auto there = to.Status();
        if (!there) {
            throw Failure(kFailed, from.path(), "there is no copy of it at " + Quoted(to.path()),
                          "copy it with: mavoea cp");
        }
        if (((info.st_mode ^ there->st_mode) & S_IFMT) != 0) {
            throw Failure(kFailed, from.path(),
                          Quoted(to.path()) + " is no copy of it, but a " + NameOfType(*there),
                          "move that away, and copy it with: mavoea cp");
        }
        if (SameFile(info, *there)) {
            throw Failure(kFailed, from.path(),
                          "it and " + Quoted(to.path()) + " are the same file", "name the copy");
        }
        if (!S_ISDIR(info.st_mode)) {
            transfer_.CarryMetadata(from, to);
            return Say(from, to);
        }
        level->inside = from.Open();
        level->made = to.Open();
        level->info = info;
        level->is_new = false;
        if (options_.job.recursive) level->entries = CandidatesIn(level->inside);
        former_.push_back(*there);
    }

    void Finish(const Level& level) override {
        const struct stat former = former_.back();
        former_.pop_back();
        transfer_.FinishDirectory(level.from, *level.inside, level.to, level.made, level.is_new);
        // What lies in it has changed, and not the directory.
        Inode::Open(level.to)->SetTimes({former.st_atim, former.st_mtim});
        Say(level.from, level.to);
    }

    void Fail(const Place& from, const Failure& failure) override {
        job_.AddFailure(from.path(), failure);
    }

    void Say(const Place& from, const Place& to) {
        job_.AddDone();
        job_.Say(Quoted(from.path()) + " -> " + Quoted(to.path()));
    }

    const CarryOptions& options_;
    Job job_;
    Transfer transfer_;
    std::vector<struct stat> former_;  // of the copies of the directories that are under way
};

}  // namespace

ExitStatus Carry(const CarryOptions& options) { return Carrying(options).Run(); }

}  // namespace mavoea::tool
