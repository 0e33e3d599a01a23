#include "tools/move/convert.h"

#include <sys/stat.h>

#include <algorithm>
#include <cstdint>
#include <filesystem>
#include <iostream>
#include <optional>
#include <set>
#include <utility>
#include <vector>

#include "tools/place/dry_run.h"
#include "tools/place/volume.h"
#include "tools/say/interrupt.h"
#include "tools/say/job.h"
#include "tools/say/output.h"
#include "tools/say/progress.h"
#include "tools/store/sidecars.h"
#include "tools/transfer/pending.h"
#include "tools/transfer/transfer.h"
#include "tools/transfer/tree_comparison.h"
#include "tools/transfer/tree_copy.h"
#include "tools/walk/counting.h"
#include "tools/walk/journal.h"
#include "tools/walk/packing.h"
#include "tools/walk/worker.h"
#include "util/fnv.h"

namespace mavoea::tool {
namespace {

class Conversion final : private TreeCopy {
 public:
    Conversion(const ConvertOptions& options, Pair top)
        : options_(options),
          top_(std::move(top)),
          is_new_(!top_.second.Status()),
          progress_("converting"),
          transfer_({.watch = {.on_bytes =
                                   [this](std::uint64_t size) {
                                       bytes_ += size;
                                       Show(in_hand_);
                                   },
                               .give_up = InterruptedAgain},
                     .on_note = [this](const std::string& note) { notes_.push_back(note); }}),
          crew_(CrewOf(options),
                {.work = [this](const Errand& errand,
                                const Tell& tell) { return CopyOne(errand, tell); },
                 .hear = [this](std::string_view told) { Hear(told); },
                 .on_failure = [this](const std::string& path,
                                      const Failure& failure) { AddFailure(path, failure); },
                 .clear_progress = [this] { progress_.Clear(); },
                 .show_progress = [this](const Object& object) { Show(object.path()); },
                 .sync = [this] { transfer_.MakeDurable(); }},
                OpenJournal()) {}

    // What was not there before has been read back as it was written: it needs no second look.
    void CopyAndCompare() {
        Copy();
        if (is_new_ && failures_.empty()) {
            compared_ = converted_;
        } else {
            Compare();
        }
    }

    void Copy() {
        CopyTree(top_.first, top_.second);
        crew_.Finish();  // and with a log, what it has is on disk
        if (!journal_) Try(top_.second.path(), [&] { transfer_.MakeDurable(); });
    }

    void Compare() {
        compares_ = true;
        // A list as JSON is put together in one process.
        const CrewSize crew = options_.json ? CrewSize{} : CrewOf(options_);
        CompareTrees(
            top_, options_.recursive, Compared(), crew,
            {.compared =
                 [this](const Pair&, const std::vector<Difference>& differences) {
                     for (const Difference& difference : differences) Add(difference);
                     ++found_.compared;
                 },
             .alone =
                 [this](const Pair& pair, Side side) {
                     const bool missing = side == Side::kFirst;
                     Add({.path = (missing ? pair.first : pair.second).path(),
                          .what = missing ? Difference::What::kMissing : Difference::What::kExtra});
                 },
             .fails =
                 [this](const Pair& pair, const Failure& failure) {
                     found_.failures.AddFailure(pair.first.path(), failure);
                 },
             .take = [this] { return TakeFound(); },
             .add = [this](std::string_view told) { AddFound(told); },
             .on_failure = [this](const std::string& path,
                                  const Failure& failure) { AddFailure(path, failure); },
             .clear_progress = [this] { progress_.Clear(); },
             .show_progress = [this](const std::string& path) { Show(path); },
             .stopped = [] { return Interrupted() != 0; },
             .give_up = InterruptedAgain});
    }

    ExitStatus Summarize() {
        progress_.Clear();
        if (options_.json) {
            PrintJson();
        } else {
            std::cout << converted_ << " converted, " << compared_ << " compared, " << differences_
                      << (differences_ == 1 ? " difference, " : " differences, ")
                      << failures_.size() << " failed\n";
        }
        for (const std::string& note : notes_) Note(note);
        for (const FailedObject& failed : failures_) Report(failed.message);
        if (Interrupted() != 0) {
            Report(std::string("interrupted; the source is as it was, ") +
                   (journal_ ? "go on with --resume" : "give the command again"));
            constexpr int kSignalled = 128;
            return static_cast<ExitStatus>(kSignalled + Interrupted());
        }
        return differences_ > 0 ? kFailed : status_;
    }

 private:
    // What would be made is known to one process.
    static CrewSize CrewOf(const ConvertOptions& options) {
        return DryRun() ? CrewSize{} : options.crew;
    }

    bool Stopped() const override { return Interrupted() != 0; }

    void Begin(const Place& from, const Place& to, Level* level) override {
        const struct stat info = StatusOf(from);
        if (!S_ISDIR(info.st_mode)) {
            const bool begun = crew_.Do({.kind = Errand::Kind::kPair,
                                         .object = {from},
                                         .type = info.st_mode & S_IFMT,
                                         .to = to,
                                         .here = info.st_nlink > 1 || !IsApart(to),
                                         .state = journal_ ? StateOf(info) : 0});
            if (begun && journal_) touched_.insert(to.directory.get());
            if (begun || info.st_nlink == 1) return;
            // Its further names are to be names of that copy.
            return crew_.Then([=, this] {
                Try(from.path(), [&] { transfer_.TakeForCopy(from, to, Links::kSeveral); });
            });
        }
        Show(from.path());
        level->inside = from.Open();
        level->info = info;
        level->is_new = !to.Status();
        level->made = transfer_.MakeDirectory(from, to);
        crew_.Then([this, line = LineOf(from, to)] { Say(line); });
        if (!level->is_new) {
            (void)SettlePending(level->made);
            (void)level->made->EntriesAtFirst();  // for IsApart()
        }
        // Of several workers others read objects, and what is not apart from them is to be known.
        if (options_.recursive) {
            level->entries = CrewOf(options_).workers == 1 ? CandidatesIn(level->inside)
                                                           : ObjectsIn(level->inside);
        }
    }

    void Finish(const Level& level) override {
        crew_.Afterwards([this, level] {
            const std::string key = KeyOf({.kind = Errand::Kind::kDirectory,
                                           .object = {level.from},
                                           .state = StateOf(level.info)});
            const bool touched = touched_.erase(level.made.get()) > 0 || level.is_new;
            if (!touched) {
                if (const auto former = crew_.FormerResult(key)) return Hear(*former);
            }
            if (journal_) touched_.insert(level.to.directory.get());
            bool done = false;
            const std::string told = Carried(level.from, {}, &done, [&] {
                if (crew_.LeftEaDirectories()) RemoveLeftEaDirectory(*level.made);
                transfer_.FinishDirectory(level.from, *level.inside, level.to, level.made,
                                          level.is_new);
            });
            if (done) crew_.NoteDone(key, told);
            Hear(told);
        });
    }

    // Another one when the object is not what it was.
    static std::uint64_t StateOf(const struct stat& info) {
        Fnv hash;
        hash.AddNumber(info.st_ino);
        hash.AddNumber(info.st_mode);
        hash.AddNumber(static_cast<std::uint64_t>(info.st_size));
        for (const timespec& time : {info.st_mtim, info.st_ctim}) {
            hash.AddNumber(static_cast<std::uint64_t>(time.tv_sec));
            hash.AddNumber(static_cast<std::uint64_t>(time.tv_nsec));
        }
        return hash.value();
    }

    Journal* OpenJournal() {
        if (!options_.log) return nullptr;
        std::string work = options_.recursive ? "convert all of " : "convert ";
        work += top_.first.location() + " to " + top_.second.location() + ", type " + options_.type;
        if (options_.verbose) work += ", each said";
        journal_.emplace(*options_.log, work, is_new_ ? "new" : "");
        is_new_ = journal_->remark() == "new";
        return &*journal_;
    }

    // What comparisons have found, until it is told.
    struct Found {
        std::uint64_t compared = 0;
        std::uint64_t differences = 0;
        Packer failures = {};
    };

    std::string TakeFound() {
        const Found found = std::exchange(found_, {});
        Packer told;
        told.AddNumber(found.compared);
        told.AddNumber(found.differences);
        return told.bytes() + found.failures.bytes();
    }

    void AddFound(std::string_view told) {
        Unpacker said(told);
        compared_ += said.TakeNumber();
        differences_ += said.TakeNumber();
        while (!said.empty()) AddFailure(&said);
    }

    void AddFailure(Unpacker* said) {
        const ToldFailure failure = said->TakeFailure();
        failures_.push_back({failure.path, failure.message});
        status_ = std::max(status_, failure.status);
    }

    // Whether nothing that other objects of its directory become can meet what it becomes. What
    // could be metadata of another one waits until that is there.
    bool IsApart(const Place& to) const {
        const std::string prefix = AppleDoubleName({});
        if (!tool::IsApart(to.name) || to.name.starts_with(prefix)) return false;
        if (to.directory->is_new()) return true;
        return to.directory->TellsApart(to.name) &&
               !levels().back().entries.back().name.starts_with(prefix);
    }

    bool CopyOne(const Errand& errand, const Tell& tell) {
        const Place& from = errand.object.place;
        bool done = false;
        if (Stopped()) return false;
        tell(Carried(from, LineOf(from, errand.to), &done,
                     [&] { transfer_.CopyObject(from, errand.type, errand.to, Links::kSeveral); }));
        if (IsWorker()) transfer_.ForgetMade();
        return done;
    }

    // What became of an object, packed: what there is to say of it, or a failure.
    template <class Carry>
    std::string Carried(const Place& from, const std::string& line, bool* done, Carry carry) {
        Packer told;
        std::vector<std::string> before = std::exchange(notes_, {});
        const std::uint64_t bytes = bytes_;
        std::optional<Failure> failed;
        try {
            carry();
            *done = true;
        } catch (const Failure& failure) {
            failed = failure;
        }
        told.AddNumber(std::exchange(bytes_, bytes) - bytes);
        told.AddNumber(failed ? 1 : 0);
        if (failed) {
            told.AddFailure(from.path(), *failed);
        } else {
            told.AddText(line);
        }
        for (const std::string& note : notes_) told.AddText(note);
        notes_ = std::move(before);
        return told.bytes();
    }

    void Hear(std::string_view told) {
        Unpacker said(told);
        bytes_ += said.TakeNumber();
        if (said.TakeNumber() == 0) {
            ++converted_;
            Say(said.TakeText());
        } else {
            AddFailure(&said);
        }
        while (!said.empty()) notes_.emplace_back(said.TakeText());
    }

    // That people are to read once it is there; as with cp, directories come before what is in
    // them.
    std::string LineOf(const Place& from, const Place& to) const {
        if (!options_.verbose) return {};
        return Quoted(from.path()) + " -> " + Quoted(to.path());
    }

    void Say(std::string_view line) {
        if (line.empty() || options_.json) return;
        progress_.Clear();
        std::cout << line << '\n';
    }

    void Fail(const Place& from, const Failure& failure) override {
        AddFailure(from.path(), failure);
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
        ++found_.differences;
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
        if (!progress_.wanted()) return;
        progress_.Show(std::to_string(converted_) + " converted, " + std::to_string(compared_) +
                           " compared, " + std::to_string(failures_.size()) + " failed, " +
                           SizeText(bytes_),
                       path, converted_ + compared_ + failures_.size(),
                       compares_ ? compared_ : converted_ + failures_.size());
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
    bool is_new_;  // nothing was there when the work began
    std::optional<Journal> journal_;
    std::set<const Directory*> touched_;  // in which something has been done, with a journal
    Progress progress_;
    Transfer transfer_;
    Crew crew_;
    std::string in_hand_;
    std::uint64_t bytes_ = 0;  // of data
    bool compares_ = false;
    std::uint64_t converted_ = 0;
    std::uint64_t compared_ = 0;
    std::uint64_t differences_ = 0;
    Found found_;
    Json list_ = Json::Array();
    std::vector<std::string> notes_;
    std::vector<FailedObject> failures_;
    ExitStatus status_ = kSuccess;
};

// Where it is, whatever symbolic links lead there; one at its own end stays.
std::filesystem::path RealPath(const Place& place) {
    const std::filesystem::path given(place.path());
    std::error_code error;
    const auto parent = std::filesystem::canonical(place.directory->ProcPath(), error);
    return error ? given : parent / place.name;
}

bool IsWithin(const std::filesystem::path& inner, const std::filesystem::path& outer) {
    return std::mismatch(outer.begin(), outer.end(), inner.begin(), inner.end()).first ==
           outer.end();
}

}  // namespace

ConversionEnds EndsOf(const ConvertOptions& options) {
    const Object source = FindObject(options.source);
    RequireParent(source);
    if (options.destination.empty()) {
        throw Failure(kFailed, "DST", "it is empty", "name the copy");
    }
    // The destination's type must not say anything of the source.
    (void)DeclareType(options.destination, options.type, "--to " + options.type);
    const Place destination = PlaceOf(options.destination, Shown::kWhole);
    const auto real_source = RealPath(source.place);
    const auto real_destination = RealPath(destination);
    if (IsWithin(real_destination, real_source) || IsWithin(real_source, real_destination)) {
        throw Failure(kFailed, options.destination, "it and the source are not apart",
                      "name a place outside of the source");
    }
    const Object target = ObjectAt(destination, nullptr);
    if (source.keeping() == Keeping::kNone) throw NoStore(source);
    const Object readable = AsReadable(target);
    if (readable.keeping() == Keeping::kNone) throw NoStore(target);
    return {source, destination, readable.type};
}

ExitStatus Convert(const ConvertOptions& options) {
    if (options.recursive) RequireDescriptorPaths();
    const ConversionEnds ends = EndsOf(options);
    WatchForInterrupts();
    std::optional<Counting> counting;
    if (options.recursive) counting.emplace(Counting::Kind::kCopied, std::vector{options.source});
    Conversion conversion(options, {ends.source.place, ends.destination});
    conversion.CopyAndCompare();
    return conversion.Summarize();
}

}  // namespace mavoea::tool
