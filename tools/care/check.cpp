#include "tools/care/check.h"

#include <unistd.h>

#include <algorithm>
#include <array>
#include <cstdint>
#include <functional>
#include <iostream>
#include <utility>

#include "tools/care/check_directory.h"
#include "tools/care/check_object.h"
#include "tools/care/mending.h"
#include "tools/say/colour.h"
#include "tools/say/json.h"
#include "tools/say/output.h"
#include "tools/say/progress.h"
#include "tools/say/text.h"
#include "tools/store/sidecars.h"
#include "tools/transfer/pending.h"
#include "tools/walk/packing.h"
#include "tools/walk/tree.h"

namespace mavoea::tool {
namespace {

struct Tally {
    std::uint64_t checked;
    std::uint64_t found;
    std::uint64_t mended;  // of those
    std::uint64_t kept;    // files that repairs have replaced
    std::uint64_t stayed;  // of which some were to go, and could not
    std::uint64_t in_use;
    std::uint64_t failed;
    std::array<std::uint64_t, kFindingKinds> by_kind;

    void Add(const Tally& more) {
        checked += more.checked;
        found += more.found;
        mended += more.mended;
        kept += more.kept;
        stayed += more.stayed;
        in_use += more.in_use;
        failed += more.failed;
        std::transform(by_kind.begin(), by_kind.end(), more.by_kind.begin(), by_kind.begin(),
                       std::plus<>());
    }
};

constexpr Tally kOneSound = {1, 0, 0, 0, 0, 0, 0, {}};

// Says everything at once: there may be as many findings as objects.
class Soundness final : public MendingSink {
 public:
    explicit Soundness(const CheckOptions& options) : options_(options) {}

    ExitStatus Run() {
        TreeOptions tree = options_.tree;
        if (options_.repair) tree.crew = {};  // one change after the other
        VisitObjects(
            tree,
            {.work = [this](const Object& object, const std::string&,
                            const Tell& tell) { return Look(tell, [&] { CheckObject(object); }); },
             .on_failure = [this](const std::string&,
                                  const Failure& failure) { AddFailure(failure); },
             .enters =
                 [](const Object& object) {
                     return object.keeping() != Keeping::kNone &&
                            !IsOfTool({object.place.name, S_IFDIR});
                 },
             .hear = [this](std::string_view told) { Hear(told); },
             .changes = options_.repair,
             .look_at_named =
                 [this](const Object& object, const Tell& tell) {
                     return Look(tell, [&] { CheckNamed(object); });
                 },
             .look_into =
                 [this](const DirectoryRef& directory, const Tell& tell) {
                     return Look(tell, [&] { LookInto(directory); });
                 },
             .clear_progress = [this] { progress_.Clear(); },
             .show_progress =
                 [this](const Object& object) {
                     if (progress_.wanted()) progress_.Show(Counts(), object.path());
                 }},
            std::string("check") + (options_.repair ? ", repair" : "") +
                (options_.remove ? ", remove what was kept" : "") + " of");
        progress_.Clear();
        Summarize();
        if (tally_.failed > 0) return kFailed;
        return tally_.found + tally_.stayed > tally_.mended ? kUnsound : kSuccess;
    }

    void Add(const Finding& finding) override {
        Count(finding);
        std::cout << (options_.tree.json ? finding.AsJson().Line() : finding.Text()) << '\n';
    }

    void AddMended(const Finding& finding, const Mended& mended) override {
        Count(finding);
        if (mended.done) ++tally_.mended;
        if (options_.tree.json) {
            Json json = finding.AsJson();
            json.Set("mended", mended.done);
            if (!mended.kept.empty()) json.SetText("kept", mended.kept);
            if (!mended.done) json.SetText("why", mended.why);
            if (!mended.readable.empty()) json.SetText("readable", mended.readable);
            std::cout << json.Line() << '\n';
            return;
        }
        std::cout << finding.Text() << "; "
                  << (mended.done ? Coloured(Colour::kGreen, "mended")
                                  : Coloured(Colour::kYellow, "left") + ": " + mended.why);
        if (!mended.kept.empty()) {
            std::cout << "; the old one is kept in " << Printable(mended.kept);
        }
        if (!mended.readable.empty()) {
            std::cout << "; mavoea salvage writes out what can be read: " << mended.readable;
        }
        std::cout << '\n';
    }

    void AddKept(const std::string& path, const std::string& file) override {
        progress_.Clear();
        ++tally_.kept;
        Note(Printable(file) + ": what a repair has replaced" +
             (path.empty() ? ", of an object that is gone: remove it if it is of no use"
                           : "; check --repair --yes removes it"));
        SayOfKept("kept", path, file, {});
    }

    void AddRemoved(const std::string& path, const std::string& file,
                    const std::string& why) override {
        progress_.Clear();
        if (why.empty()) {
            Note(Printable(file) + ": removed, " + Printable(path) + " has all that it holds");
        } else {
            ++tally_.stayed;
            Report(Printable(file) + ": kept: " + why);
        }
        SayOfKept(why.empty() ? "removed" : "kept", path, file, why);
    }

    void AddFailure(const Failure& failure) override {
        progress_.Clear();
        const bool in_use = failure.fault() == Fault::kInUse;
        ++(in_use ? tally_.in_use : tally_.failed);
        if (in_use) {
            Note(failure.brief() + ": not looked into");
        } else {
            Report(failure);
        }
        if (!options_.tree.json) return;
        Json json;
        json.SetText("path", failure.subject());
        json.SetText(in_use ? "inUse" : "failure", failure.what());
        std::cout << json.Line() << '\n';
    }

 private:
    // What it adds to the tally is told, in whatever process this is: nothing of one more object
    // that is sound. Whether all of it could be looked at.
    template <class Work>
    bool Look(const Tell& tell, Work work) {
        const Tally before = std::exchange(tally_, {});
        try {
            work();
        } catch (const Failure& failure) {
            AddFailure(failure);
        }
        const Tally more = std::exchange(tally_, before);
        tell(Packed(more) == Packed(kOneSound) ? std::string() : Packed(more));
        return more.failed == 0 && more.in_use == 0;
    }

    void Hear(std::string_view told) {
        tally_.Add(told.empty() ? kOneSound : Unpacker(told).Take<Tally>());
    }

    void Count(const Finding& finding) {
        ++tally_.found;
        ++tally_.by_kind[static_cast<std::size_t>(finding.kind)];
        progress_.Clear();
    }

    void SayOfKept(const char* what, const std::string& path, const std::string& file,
                   const std::string& why) const {
        if (!options_.tree.json) return;
        Json json;
        if (!path.empty()) json.SetText("path", path);
        json.SetText(what, file);
        if (!why.empty()) json.SetText("why", why);
        std::cout << json.Line() << '\n';
    }

    void LookInto(const DirectoryRef& directory) {
        if (options_.repair) {
            MendDirectory(directory, this);
        } else {
            CheckDirectory(directory, this);
        }
    }

    // Of an object in a directory that is looked at as a whole this is found there.
    void CheckNamed(const Object& object) {
        if (options_.repair) SettleNamed(object);
        if (object.keeping() != Keeping::kEaDirectory || object.is_root()) return;
        if (const auto other = SharesNames(object.place)) Add(SharedNames(object.place, *other));
    }

    void CheckObject(const Object& object) {
        const auto info = object.place.Status();
        if (!info) {  // a repair has looked at it with the object that has it now
            ++tally_.checked;
            return;
        }
        if (IsOfTool({object.place.name, info->st_mode & S_IFMT})) return;
        try {
            if (options_.repair) {
                MendObject(object, options_.remove ? Replaced::kRemoved : Replaced::kKept, this);
            } else {
                check_.Run(object);
            }
            ++tally_.checked;
        } catch (const Failure& failure) {
            if (!HasGone(object.place, failure)) AddFailure(failure);
        }
    }

    std::string Counts() const {
        return std::to_string(tally_.checked) + " checked, " + std::to_string(tally_.found) +
               (tally_.found == 1 ? " finding, " : " findings, ") +
               (options_.repair ? std::to_string(tally_.mended) + " mended, " : "") +
               (tally_.in_use > 0 ? std::to_string(tally_.in_use) + " in use, " : "") +
               std::to_string(tally_.failed) + " failed";
    }

    void Summarize() const {
        const bool counts = (options_.tree.recursive || options_.tree.paths.several()) &&
                            ::isatty(STDOUT_FILENO) == 1;
        if (options_.tree.json) {
            std::cout << SummaryJson().Line() << '\n';
        } else if (counts || options_.verbose) {
            std::cout << Counts() << '\n';
        }
    }

    Json SummaryJson() const {
        Json kinds = Json::Object({});
        for (std::size_t i = 0; i < kFindingKinds; ++i) {
            const std::uint64_t count = tally_.by_kind[i];
            if (count > 0) kinds.Set(CodeOf(static_cast<FindingKind>(i)), count);
        }
        const Tally& all = tally_;
        Json json = Json::Object({{"checked", all.checked}, {"findings", all.found}});
        if (options_.repair) json.Set("mended", all.mended);
        if (all.kept + all.stayed > 0) json.Set("kept", all.kept + all.stayed);
        json.Set("inUse", all.in_use);
        json.Set("failed", all.failed);
        json.Set("kinds", std::move(kinds));
        return json;
    }

    const CheckOptions& options_;
    Progress progress_{"checking"};
    ObjectCheck check_{this};
    Tally tally_ = {};
};

}  // namespace

ExitStatus CheckSoundness(const CheckOptions& options) { return Soundness(options).Run(); }

}  // namespace mavoea::tool
