#include "tools/show/diff.h"

#include <sys/stat.h>

#include <algorithm>
#include <cstdint>
#include <iostream>
#include <utility>
#include <vector>

#include "tools/place/volume.h"
#include "tools/say/colour.h"
#include "tools/say/interrupt.h"
#include "tools/say/job.h"
#include "tools/say/json.h"
#include "tools/say/output.h"
#include "tools/say/progress.h"
#include "tools/say/text.h"
#include "tools/store/metadata.h"
#include "tools/transfer/tree_comparison.h"
#include "tools/walk/packing.h"

namespace mavoea::tool {
namespace {

using Aspect = Difference::Aspect;
using What = Difference::What;

constexpr ExitStatus kDifferent = ExitStatus{1};

bool Has(const std::vector<Difference>& differences, Aspect aspect) {
    return std::any_of(differences.begin(), differences.end(),
                       [=](const Difference& one) { return one.aspect == aspect; });
}

// ---- As diff says it ----------------------------------------------------------------------------

std::string AmountText(const Difference& difference) {
    if (difference.what == What::kMissing) return " only in the first";
    if (difference.what == What::kExtra) return " only in the second";
    return difference.offset ? " at byte " + std::to_string(*difference.offset) : "";
}

// As patches have it: from the first to the second.
Colour ColourOf(What what) {
    switch (what) {
        case What::kMissing:
            return Colour::kRed;
        case What::kExtra:
            return Colour::kGreen;
        default:
            return Colour::kYellow;
    }
}

std::string PairText(const Pair& pair, const std::vector<Difference>& differences, bool brief) {
    const std::string first = Printable(pair.first.path());
    const std::string second = Printable(pair.second.path());
    if (Has(differences, Aspect::kType)) {
        return "File " + first + " is a " + NameOfType(StatusOf(pair.first)) + " while file " +
               second + " is a " + NameOfType(StatusOf(pair.second));
    }
    std::string text = "Files " + first + " and " + second + " differ";
    if (brief) return text;
    const char* before = ": ";
    for (const Difference& difference : differences) {
        text += before +
                Coloured(ColourOf(difference.what), ItemText(difference) + AmountText(difference));
        before = ", ";
    }
    return text;
}

std::string AloneText(const Place& place, Side side) {
    return Coloured(ColourOf(side == Side::kFirst ? What::kMissing : What::kExtra), "Only in") +
           ' ' + Printable(place.directory->path()) + ": " + Printable(place.name);
}

// ---- As rsync says it ---------------------------------------------------------------------------

constexpr std::string_view kLetters = "dafrems";

char LetterOf(const Difference& difference) {
    switch (difference.aspect) {
        case Aspect::kData:
            return 'd';
        case Aspect::kEntry:
            return 'e';
        case Aspect::kService:
            return 's';
        case Aspect::kAttribute:
            break;
        case Aspect::kObject:
        case Aspect::kType:
        case Aspect::kTarget:
            return '\0';
    }
    if (difference.name == kFinderInfoName) return 'f';
    if (difference.name == kResourceForkName) return 'r';
    return difference.name.starts_with("mavoea.") ? 'm' : 'a';
}

char KindLetter(mode_t mode) {
    switch (mode & S_IFMT) {
        case S_IFDIR:
            return 'd';
        case S_IFLNK:
            return 'L';
        case S_IFBLK:
        case S_IFCHR:
            return 'D';
        case S_IFIFO:
        case S_IFSOCK:
            return 'S';
        default:
            return 'f';
    }
}

// What would make the second like the first.
std::string ChangeText(const std::vector<Difference>& differences, mode_t mode) {
    std::string text = {'.', KindLetter(mode)};
    const bool replaced = Has(differences, Aspect::kTarget) || Has(differences, Aspect::kType);
    if (replaced) text.front() = 'c';
    if (Has(differences, Aspect::kData)) text.front() = '>';
    for (const char letter : kLetters) {
        const bool changes =
            std::any_of(differences.begin(), differences.end(),
                        [=](const Difference& one) { return LetterOf(one) == letter; });
        text.push_back(changes ? letter : '.');
    }
    return text;
}

// ---- The work -----------------------------------------------------------------------------------

class Diffing {
 public:
    Diffing(const DiffOptions& options, const Pair& top)
        : options_(options), top_(top), progress_("comparing") {
        WatchForInterrupts();
    }

    ExitStatus Run() {
        CompareTrees(top_, options_.recursive, {.data = options_.data, .copied = false},
                     options_.crew,
                     {.compared =
                          [this](const Pair& pair, const std::vector<Difference>& differences) {
                              ++found_.compared;
                              if (!differences.empty()) Add(pair, differences);
                          },
                      .alone = [this](const Pair& pair, Side side) { AddAlone(pair, side); },
                      .fails = [this](const Pair& pair,
                                      const Failure& failure) { AddFailure(pair, failure); },
                      .take = [this] { return Packed(std::exchange(found_, {})); },
                      .add = [this](std::string_view told) { Add(Unpacker(told).Take<Counts>()); },
                      .on_failure =
                          [this](const std::string&, const Failure& failure) {
                              ++all_.failed;
                              Report(failure);
                          },
                      .clear_progress = [this] { progress_.Clear(); },
                      .show_progress = [this](const std::string& path) { Show(path); },
                      .stopped = [] { return Interrupted() != 0; },
                      .give_up = InterruptedAgain});
        progress_.Clear();
        if (options_.json) PrintSummary();
        if (Interrupted() != 0) {
            Report("interrupted; the rest was not compared");
            constexpr int kSignalled = 128;
            return static_cast<ExitStatus>(kSignalled + Interrupted());
        }
        if (all_.failed > 0) return kFailed;
        return all_.different > 0 ? kDifferent : kSuccess;
    }

 private:
    struct Counts {
        std::uint64_t compared = 0;
        std::uint64_t different = 0;
        std::uint64_t failed = 0;
    };

    void Add(const Counts& more) {
        all_.compared += more.compared;
        all_.different += more.different;
        all_.failed += more.failed;
    }

    void Show(const std::string& path) {
        if (!progress_.wanted()) return;
        progress_.Show(std::to_string(all_.compared) + " compared, " +
                           std::to_string(all_.different) + " different",
                       path, all_.compared + all_.failed);
    }

    void Say(const std::string& line) {
        progress_.Clear();
        std::cout << line << '\n';
    }

    void Add(const Pair& pair, const std::vector<Difference>& differences) {
        ++found_.different;
        if (options_.json) {
            Json list = Json::Array();
            for (Difference difference : differences) {
                difference.path.clear();
                list.Add(DifferenceJson(difference));
            }
            Json json;
            json.SetText("first", pair.first.path());
            json.SetText("second", pair.second.path());
            json.Set("differences", std::move(list));
            Say(json.Line());
        } else if (options_.itemized) {
            const mode_t mode = StatusOf(pair.first).st_mode;
            Say(Coloured(Colour::kYellow, ChangeText(differences, mode)) + ' ' +
                Relative(pair.first, top_.first, mode));
        } else {
            Say(PairText(pair, differences, options_.brief));
        }
    }

    void AddAlone(const Pair& pair, Side side) {
        ++found_.different;
        const Place& place = side == Side::kFirst ? pair.first : pair.second;
        if (options_.json) {
            const bool missing = side == Side::kFirst;
            Json list = Json::Array();
            list.Add(DifferenceJson({.what = missing ? What::kMissing : What::kExtra}));
            Json json;
            json.SetText(missing ? "first" : "second", place.path());
            json.Set("differences", std::move(list));
            Say(json.Line());
        } else if (options_.itemized) {
            const mode_t mode = StatusOf(place).st_mode;
            if (side == Side::kFirst) {
                const std::string change =
                    std::string{'>', KindLetter(mode)} + std::string(kLetters.size(), '+');
                Say(Coloured(Colour::kGreen, change) + ' ' + Relative(place, top_.first, mode));
            } else {
                Say(Coloured(Colour::kRed, "*deleting") + ' ' + Relative(place, top_.second, mode));
            }
        } else {
            Say(AloneText(place, side));
        }
    }

    void AddFailure(const Pair& pair, const Failure& failure) {
        ++found_.failed;
        progress_.Clear();
        Report(failure);
        if (!options_.json) return;
        Json json;
        json.SetText("first", pair.first.path());
        json.SetText("second", pair.second.path());
        json.SetText("failure", failure.what());
        Say(json.Line());
    }

    void PrintSummary() {
        Json json;
        json.Set("compared", all_.compared);
        json.Set("different", all_.different);
        json.Set("failed", all_.failed);
        json.Set("interrupted", Interrupted() != 0);
        Say(json.Line());
    }

    // Below what was named, with a slash behind directories, as rsync has it.
    static std::string Relative(const Place& place, const Place& top, mode_t mode) {
        const std::string path = place.path();
        const std::string from = top.path();
        const bool below = path.size() > from.size();
        std::string text = below ? path.substr(from.size() + (from.ends_with('/') ? 0 : 1))
                                 : (S_ISDIR(mode) ? "." : top.name);
        if (S_ISDIR(mode)) text.push_back('/');
        return Printable(text);
    }

    const DiffOptions& options_;
    const Pair& top_;
    Progress progress_;
    Counts all_;
    Counts found_;  // until it is told
};

Place Named(const std::string& path) {
    Place place = PlaceOf(path, Shown::kAsGiven);
    const Object object = ObjectAt(place, StatusOf(place).st_mode & S_IFMT);
    RequireParent(object);
    if (AsReadable(object).keeping() == Keeping::kNone) throw NoStore(object);
    return place;
}

}  // namespace

ExitStatus Diff(const DiffOptions& options) {
    if (options.recursive) RequireDescriptorPaths();
    try {
        const Pair top = {Named(options.first), Named(options.second)};
        return Diffing(options, top).Run();
    } catch (const Failure& failure) {  // 1 would mean that they differ
        Report(failure);
        return kFailed;
    }
}

}  // namespace mavoea::tool
