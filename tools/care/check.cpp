#include "tools/care/check.h"

#include <unistd.h>

#include <algorithm>
#include <array>
#include <cstdint>
#include <iostream>

#include "tools/care/check_directory.h"
#include "tools/care/check_object.h"
#include "tools/say/json.h"
#include "tools/say/output.h"
#include "tools/say/progress.h"
#include "tools/store/sidecars.h"
#include "tools/walk/tree.h"

namespace mavoea::tool {
namespace {

// Says everything at once: there may be as many findings as objects.
class Soundness final : public FindingSink {
 public:
    explicit Soundness(const CheckOptions& options) : options_(options) {}

    ExitStatus Run() {
        VisitObjects(options_.tree,
                     {.work = [this](const Object& object,
                                     const std::string&) { return CheckObject(object); },
                      .on_failure = [this](const std::string&,
                                           const Failure& failure) { AddFailure(failure); },
                      .on_named = [this](const Object& object) { CheckName(object); },
                      .on_directory =
                          [this](const DirectoryRef& directory) {
                              Guard([&] { CheckDirectory(directory, this); });
                          }});
        progress_.Clear();
        Summarize();
        return failed_ > 0 ? kFailed : found_ > 0 ? kUnsound : kSuccess;
    }

    void Add(const Finding& finding) override {
        ++found_;
        ++by_kind_[static_cast<std::size_t>(finding.kind)];
        progress_.Clear();
        std::cout << (options_.tree.json ? finding.AsJson().Line() : finding.Text()) << '\n';
    }

    void AddFailure(const Failure& failure) override {
        progress_.Clear();
        const bool in_use = failure.fault() == Fault::kInUse;
        ++(in_use ? in_use_ : failed_);
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
    template <class Work>
    void Guard(Work work) {
        try {
            work();
        } catch (const Failure& failure) {
            AddFailure(failure);
        }
    }

    // Of an object in a directory that is looked at as a whole this is found there.
    void CheckName(const Object& object) {
        if (object.keeping() != Keeping::kEaDirectory || object.is_root()) return;
        if (const auto other = SharesNames(object.place)) Add(SharedNames(object.place, *other));
    }

    bool CheckObject(const Object& object) {
        const auto info = object.place.Status();
        if (info && IsOfTool({object.place.name, info->st_mode & S_IFMT})) return false;
        progress_.Show(Counts(), object.path());
        const bool keeps = object.keeping() != Keeping::kNone;
        try {
            check_.Run(object);
            ++checked_;
        } catch (const Failure& failure) {
            if (!HasGone(object.place, failure)) AddFailure(failure);
        }
        return keeps;
    }

    std::string Counts() const {
        return std::to_string(checked_) + " checked, " + std::to_string(found_) +
               (found_ == 1 ? " finding, " : " findings, ") +
               (in_use_ > 0 ? std::to_string(in_use_) + " in use, " : "") +
               std::to_string(failed_) + " failed";
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
            if (by_kind_[i] > 0) kinds.Set(CodeOf(static_cast<FindingKind>(i)), by_kind_[i]);
        }
        return Json::Object({{"checked", checked_},
                             {"findings", found_},
                             {"inUse", in_use_},
                             {"failed", failed_},
                             {"kinds", std::move(kinds)}});
    }

    const CheckOptions& options_;
    Progress progress_{"checking"};
    ObjectCheck check_{this};
    std::uint64_t checked_ = 0;
    std::uint64_t found_ = 0;
    std::uint64_t in_use_ = 0;
    std::uint64_t failed_ = 0;
    std::array<std::uint64_t, kFindingKinds> by_kind_{};
};

}  // namespace

ExitStatus CheckSoundness(const CheckOptions& options) { return Soundness(options).Run(); }

}  // namespace mavoea::tool
