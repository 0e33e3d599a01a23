#include "tools/care/lock.h"

#include <algorithm>
#include <array>
#include <cstdint>
#include <iostream>
#include <string>

#include "tools/say/json.h"
#include "tools/say/output.h"
#include "tools/say/progress.h"
#include "tools/say/text.h"
#include "tools/store/change.h"
#include "tools/transfer/pending.h"
#include "tools/walk/packing.h"

namespace mavoea::tool {
namespace {

class Locking {
 public:
    Locking(const TreeOptions& options, bool locked)
        : options_(options),
          locked_(locked),
          words_{locked ? "locked" : "unlocked", locked ? "already locked" : "already unlocked"},
          progress_(locked ? "locking" : "unlocking") {}

    ExitStatus Run() {
        VisitObjects(
            options_,
            {.work = [this](const Object& object, const std::string&,
                            const Tell& tell) { return DoObject(object, tell); },
             .on_failure = [this](
                               const std::string&,
                               const Failure& failure) { Fail(failure.status(), failure.what()); },
             .on_named = SettleNamed,
             .on_directory = [](const DirectoryRef& inside) { (void)SettlePending(inside); },
             .hear = [this](std::string_view told) { Hear(told); },
             .changes = true,
             .clear_progress = [this] { progress_.Clear(); },
             .show_progress = [this](const Object& object) { Show(object); }});
        progress_.Clear();
        if (options_.json) {
            Print(json_);
        } else if (options_.verbose) {
            std::cout << changed_ << ' ' << words_[0] << ", " << same_ << ' ' << words_[1] << ", "
                      << failed_ << " failed\n";
        }
        return status_;
    }

 private:
    // Tells whether it could be done; then the path and whether it was otherwise before, or the
    // failure.
    bool DoObject(const Object& object, const Tell& tell) const {
        Packer told;
        bool done = false;
        try {
            const bool changed = SetLocked(object, locked_);
            told.AddNumber(1);
            told.AddText(object.path());
            told.AddNumber(changed ? 1 : 0);
            done = true;
        } catch (const Failure& failure) {
            told.AddNumber(0);
            told.AddFailure(object.path(), failure);
        }
        tell(told.bytes());
        return done;
    }

    void Hear(std::string_view told) {
        Unpacker said(told);
        if (said.TakeNumber() == 0) {
            const ToldFailure failure = said.TakeFailure();
            return Fail(failure.status, failure.message);
        }
        const std::string path(said.TakeText());
        const bool changed = said.TakeNumber() != 0;
        ++(changed ? changed_ : same_);
        if (options_.json) {
            Json entry;
            entry.SetText("path", path);
            entry.Set("locked", locked_);
            json_.Add(std::move(entry));
        } else if (options_.verbose) {
            progress_.Clear();
            std::cout << Printable(path) << ": " << words_[changed ? 0 : 1] << '\n';
        }
    }

    void Fail(ExitStatus status, const std::string& message) {
        progress_.Clear();
        Report(message);
        ++failed_;
        status_ = std::max(status_, status);
    }

    void Show(const Object& object) {
        if (!progress_.wanted()) return;
        const std::uint64_t done = changed_ + same_;
        progress_.Show(std::to_string(done) + " done, " + std::to_string(failed_) + " failed",
                       object.path(), done + failed_);
    }

    const TreeOptions& options_;
    const bool locked_;
    const std::array<const char*, 2> words_;  // of what was otherwise, and was not
    Progress progress_;
    Json json_ = Json::Array();
    std::uint64_t changed_ = 0;
    std::uint64_t same_ = 0;
    std::uint64_t failed_ = 0;
    ExitStatus status_ = kSuccess;
};

}  // namespace

ExitStatus Lock(const TreeOptions& options, bool locked) { return Locking(options, locked).Run(); }

}  // namespace mavoea::tool
