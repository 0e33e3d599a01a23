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
#include "tools/say/json.h"
#include "tools/say/output.h"
#include "tools/say/progress.h"
#include "tools/store/sidecars.h"
#include "tools/walk/packing.h"
#include "tools/walk/tree.h"

namespace mavoea::tool {
namespace {

struct Tally {
    std::uint64_t checked;
    std::uint64_t found;
    std::uint64_t in_use;
    std::uint64_t failed;
    std::array<std::uint64_t, kFindingKinds> by_kind;

    void Add(const Tally& more) {
        checked += more.checked;
        found += more.found;
        in_use += more.in_use;
        failed += more.failed;
        std::transform(by_kind.begin(), by_kind.end(), more.by_kind.begin(), by_kind.begin(),
                       std::plus<>());
    }
};

// Says everything at once: there may be as many findings as objects.
class Soundness final : public FindingSink {
 public:
    explicit Soundness(const CheckOptions& options) : options_(options) {}

    ExitStatus Run() {
        VisitObjects(
            options_.tree,
            {.work = [this](const Object& object, const std::string&,
                            const Tell& tell) { Look(tell, [&] { CheckObject(object); }); },
             .on_failure = [this](const std::string&,
                                  const Failure& failure) { AddFailure(failure); },
             .enters =
                 [](const Object& object) {
                     return object.keeping() != Keeping::kNone &&
                            !IsOfTool({object.place.name, S_IFDIR});
                 },
             .hear = [this](std::string_view told) { tally_.Add(Unpacker(told).Take<Tally>()); },
             .look_at_named = [this](const Object& object,
                                     const Tell& tell) { Look(tell, [&] { CheckName(object); }); },
             .look_into =
                 [this](const DirectoryRef& directory, const Tell& tell) {
                     Look(tell, [&] { CheckDirectory(directory, this); });
                 },
             .clear_progress = [this] { progress_.Clear(); },
             .show_progress =
                 [this](const Object& object) {
                     if (progress_.wanted()) progress_.Show(Counts(), object.path());
                 }});
        progress_.Clear();
        Summarize();
        return tally_.failed > 0 ? kFailed : tally_.found > 0 ? kUnsound : kSuccess;
    }

    void Add(const Finding& finding) override {
        ++tally_.found;
        ++tally_.by_kind[static_cast<std::size_t>(finding.kind)];
        progress_.Clear();
        std::cout << (options_.tree.json ? finding.AsJson().Line() : finding.Text()) << '\n';
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
    // What it adds to the tally is told, in whatever process this is.
    template <class Work>
    void Look(const Tell& tell, Work work) {
        const Tally before = std::exchange(tally_, {});
        try {
            work();
        } catch (const Failure& failure) {
            AddFailure(failure);
        }
        const Tally more = std::exchange(tally_, before);
        tell(Packed(more));
    }

    // Of an object in a directory that is looked at as a whole this is found there.
    void CheckName(const Object& object) {
        if (object.keeping() != Keeping::kEaDirectory || object.is_root()) return;
        if (const auto other = SharesNames(object.place)) Add(SharedNames(object.place, *other));
    }

    void CheckObject(const Object& object) {
        const auto info = object.place.Status();
        if (info && IsOfTool({object.place.name, info->st_mode & S_IFMT})) return;
        try {
            check_.Run(object);
            ++tally_.checked;
        } catch (const Failure& failure) {
            if (!HasGone(object.place, failure)) AddFailure(failure);
        }
    }

    std::string Counts() const {
        return std::to_string(tally_.checked) + " checked, " + std::to_string(tally_.found) +
               (tally_.found == 1 ? " finding, " : " findings, ") +
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
        return Json::Object({{"checked", tally_.checked},
                             {"findings", tally_.found},
                             {"inUse", tally_.in_use},
                             {"failed", tally_.failed},
                             {"kinds", std::move(kinds)}});
    }

    const CheckOptions& options_;
    Progress progress_{"checking"};
    ObjectCheck check_{this};
    Tally tally_ = {};
};

}  // namespace

ExitStatus CheckSoundness(const CheckOptions& options) { return Soundness(options).Run(); }

}  // namespace mavoea::tool
