#include "tools/move/plan.h"

#include <sys/stat.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdint>
#include <iostream>
#include <map>
#include <set>
#include <sstream>
#include <utility>
#include <vector>

#include "tools/place/dry_run.h"
#include "tools/place/file.h"
#include "tools/say/interrupt.h"
#include "tools/say/output.h"
#include "tools/say/progress.h"
#include "tools/say/text.h"
#include "tools/store/fitting.h"
#include "tools/store/reader.h"
#include "tools/store/sidecars.h"
#include "tools/store/writer.h"
#include "tools/transfer/own_attributes.h"
#include "util/fnv.h"

namespace mavoea::tool {
namespace {

constexpr std::string_view kTitle = "mavoea plan 1";

// ---- The source as it is ------------------------------------------------------------------------

// Of all that has a part in a conversion: paths, and of each file what changes with its contents,
// rights and attributes.
class Fingerprint {
 public:
    void Add(std::string_view text) {
        hash_.Add(text);
        hash_.Add(0);
    }
    void Add(const struct stat& info) {
        hash_.AddNumber(info.st_ino);
        hash_.AddNumber(info.st_mode);
        hash_.AddNumber(static_cast<std::uint64_t>(info.st_size));
        for (const timespec& time : {info.st_mtim, info.st_ctim}) {
            hash_.AddNumber(static_cast<std::uint64_t>(time.tv_sec));
            hash_.AddNumber(static_cast<std::uint64_t>(time.tv_nsec));
        }
    }
    std::string text() const { return HexNumber(hash_.value(), 16); }

 private:
    Fnv hash_;
};

// An object of the source, and where its copy would be.
struct Step {
    Object from;
    struct stat info;
    Sidecars sidecars;
    DirectoryRef into;  // null where that directory is not there yet
    std::string name;
};

// The objects of a conversion in its order, directories before what is in them. Goes on after what
// `look` throws.
class Source {
 public:
    Source(const ConvertOptions& options, const ConversionEnds& ends)
        : recursive_(options.recursive), ends_(ends) {}

    template <class Look, class Fail>
    void Visit(Look look, Fail fail) {
        const Place& to = ends_.destination;
        pending_.push_back({ends_.source.place, to.directory, to.name});
        while (!pending_.empty() && Interrupted() == 0) {
            const Inner inner = std::move(pending_.back());
            pending_.pop_back();
            try {
                VisitOne(inner, look);
            } catch (const Failure& failure) {
                fail(inner.from, failure);
            }
        }
    }

    const Fingerprint& fingerprint() const { return fingerprint_; }
    std::uint64_t count() const { return count_; }

 private:
    struct Inner {
        Place from;
        DirectoryRef into;
        std::string name;
    };

    template <class Look>
    void VisitOne(const Inner& inner, Look look) {
        const struct stat info = StatusOf(inner.from);
        const Object object = ObjectAt(inner.from, info.st_mode & S_IFMT);
        Sidecars sidecars = Sidecars::Find(object, Sidecars::Services::kFind);
        ++count_;
        fingerprint_.Add(inner.from.name);
        fingerprint_.Add(info);
        for (const Sidecars::Found& file : sidecars.Files()) {
            fingerprint_.Add(file.name);
            fingerprint_.Add(file.info);
        }
        // What is in it is visited even where it cannot be looked at itself.
        if (recursive_ && S_ISDIR(info.st_mode)) AddInner(inner);
        look(Step{object, info, std::move(sidecars), inner.into, inner.name});
    }

    void AddInner(const Inner& outer) {
        const DirectoryRef directory = outer.from.Open();
        const auto there = outer.into ? outer.into->StatusOf(outer.name) : std::nullopt;
        const DirectoryRef into =
            there && S_ISDIR(there->st_mode) ? outer.into->OpenIn(outer.name) : nullptr;
        const std::vector<Directory::Entry> entries = ObjectsIn(directory);
        for (auto entry = entries.rbegin(); entry != entries.rend(); ++entry) {
            pending_.push_back({{directory, entry->name}, into, entry->name});
        }
    }

    bool recursive_;
    const ConversionEnds& ends_;
    std::vector<Inner> pending_;
    Fingerprint fingerprint_;
    std::uint64_t count_ = 0;
};

// ---- What there is ------------------------------------------------------------------------------

struct Amount {
    std::uint64_t count = 0;
    std::uint64_t bytes = 0;

    void Add(std::uint64_t size) {
        ++count;
        bytes += size;
    }
};

// What somebody has to decide on, by a code that stays what it is.
enum class Matter { kLost, kUnreadable, kRefused, kReplaced };
constexpr std::array<const char*, 4> kMatters = {"lost", "unreadable", "refused", "replaced"};

class Plan {
 public:
    Plan(const PlanOptions& options, const ConversionEnds& ends)
        : options_(options), ends_(ends), source_(options.conversion, ends) {}

    ExitStatus Run() {
        source_.Visit([this](const Step& step) { Look(step); },
                      [this](const Place& from, const Failure& failure) {
                          if (failure.status() == kNotFound && !from.Status()) return;
                          ++failed_;
                          Tell(Matter::kUnreadable, from.path(), failure.cause());
                      });
        progress_.Clear();
        if (Interrupted() != 0) {
            Report("interrupted: this is no plan of all of it");
            constexpr int kSignalled = 128;
            return static_cast<ExitStatus>(kSignalled + Interrupted());
        }
        Summarize();
        if (options_.file) WriteFile();
        return failed_ > 0 ? kFailed : matters() > 0 ? kUnsound : kSuccess;
    }

 private:
    bool json() const { return options_.conversion.json; }
    std::uint64_t matters() const {
        std::uint64_t sum = 0;
        for (const std::uint64_t count : matters_) sum += count;
        return sum;
    }

    void Look(const Step& step) {
        if (progress_.wanted()) {
            progress_.Show(std::to_string(source_.count()) + " planned, " +
                               std::to_string(matters()) + " to decide",
                           step.from.path(), source_.count());
        }
        CountObject(step.info);
        const Metadata metadata = ReadMetadata(step.from, step.sidecars);
        CountMetadata(metadata);
        LookAtName(step, metadata);
        if (step.into) LookAtTarget(step);
        std::vector<Missing> missing;
        const Object to = {{step.from.place.directory, step.name}, ends_.type, true};
        const Metadata fitting = WriterFor(to).Fit(metadata, to, &missing);
        const OwnAttributes own(step.from, Inode::Open(step.from.place), to);
        own.AddWrittenOver(fitting, &missing);
        if (fitting.HasAny() || !own.Names().empty()) {
            const DirectoryRef& there = ends_.destination.directory;
            const auto copy = Inode::Foresee({there, step.name},
                                             Foreseen::StatusOfNew(*there, step.info.st_mode));
            own.AddWithoutRoom(*copy, &missing);
            for (Missing& one : WriterFor(to).WithoutRoom(*copy, fitting)) {
                missing.push_back(std::move(one));
            }
        }
        for (const Missing& one : missing) Tell(Matter::kLost, step, one.item, one.reason);
        const std::set<std::string> whole = WholeFiles(step, fitting);
        for (const Metadata::Stray& stray : metadata.strays) {
            if (!whole.contains(stray.holder)) Tell(Matter::kLost, step, stray.item, stray.reason);
        }
        for (const Failure& problem : metadata.problems) {
            if (whole.contains(problem.subject())) continue;
            Tell(Matter::kUnreadable, step.from.path(),
                 Printable(problem.subject()) + ": " + problem.cause());
        }
    }

    // What goes byte for byte goes with all that is wrong with it.
    std::set<std::string> WholeFiles(const Step& step, const Metadata& fitting) const {
        std::set<std::string> whole;
        const Keeping keeping = KeepingOf(ends_.type);
        if (keeping == Keeping::kAppleDouble) whole = {HolderOf(fitting.whole_apple_double)};
        if (keeping == Keeping::kEaDirectory) {
            whole = {HolderOf(fitting.whole_stream), HolderOf(fitting.whole_resource)};
        }
        if (fitting.whole_record) whole.insert(step.from.path());
        return whole;
    }

    void CountObject(const struct stat& info) {
        switch (info.st_mode & S_IFMT) {
            case S_IFREG:
                // Further names of a file have no bytes of their own.
                if (info.st_nlink == 1 || seen_.emplace(info.st_dev, info.st_ino).second) {
                    files_.bytes += static_cast<std::uint64_t>(info.st_size);
                }
                ++files_.count;
                break;
            case S_IFDIR:
                ++directories_;
                break;
            case S_IFLNK:
                ++links_;
                break;
            default:
                ++others_;
        }
    }

    void CountMetadata(const Metadata& metadata) {
        std::uint64_t size = 0;
        for (const Metadata::Attribute& attribute : metadata.attributes) {
            attributes_.Add(attribute.value.size());
            size += attribute.value.size();
        }
        largest_ = std::max(largest_, size);
        if (metadata.finder_info) finder_info_.Add(metadata.finder_info->value.size());
        if (metadata.fork) forks_.Add(metadata.fork->value.size());
        for (const auto& [id, item] : metadata.entries) {
            entries_[NameOfEntry(id)].Add(item.value.size());
        }
        for (const auto& file : metadata.services) services_.Add(file.value.size());
        locked_ += metadata.locked ? 1U : 0U;
        hidden_ += metadata.hidden ? 1U : 0U;
        earlier_ += metadata.earlier.empty() ? 0U : 1U;
    }

    // One name cannot stand for two things.
    void LookAtName(const Step& step, const Metadata& metadata) {
        const Keeping keeping = KeepingOf(ends_.type);
        const Place& from = step.from.place;
        const std::string prefix = AppleDoubleName({});
        const bool by_name = keeping == Keeping::kAppleDouble || keeping == Keeping::kEaDirectory;
        if (by_name && S_ISREG(step.info.st_mode) && step.name.size() > prefix.size() &&
            step.name.starts_with(prefix) &&
            from.directory->HadAtFirst(step.name.substr(prefix.size())) &&
            IsAppleDouble(*from.directory, from.name)) {
            const std::string object = from.directory->PathOf(step.name.substr(prefix.size()));
            Tell(Matter::kRefused, from.path(),
                 "it would be metadata of '" + Printable(object) + "' there");
        }
        if (keeping != Keeping::kEaDirectory || !(metadata.HasAny() || metadata.locked)) return;
        if (const auto other = SharesNames({from.directory, step.name})) {
            Tell(Matter::kRefused, from.path(),
                 "its metadata would have the same names as that of " +
                     Printable(from.directory->PathOf(*other)));
        }
    }

    // Directories become one.
    void LookAtTarget(const Step& step) {
        const auto there = step.into->StatusOf(step.name);
        if (!there) return;
        const bool was = S_ISDIR(there->st_mode);
        const bool is = S_ISDIR(step.info.st_mode);
        if (was && is) return;
        const std::string target = Printable(step.into->PathOf(step.name));
        if (was != is) {
            return Tell(Matter::kRefused, step.from.path(),
                        target + (was ? " is a directory" : " is no directory"));
        }
        Tell(Matter::kReplaced, step.from.path(), target + " is there");
    }

    void Tell(Matter matter, const Step& step, const std::string& item, const std::string& reason) {
        Tell(matter, step.from.path(), item + ": " + reason);
    }

    void Tell(Matter matter, const std::string& path, const std::string& detail) {
        const auto index = static_cast<std::size_t>(matter);
        ++matters_[index];
        progress_.Clear();
        if (json()) {
            Json line;
            line.SetText("path", path);
            line.Set("kind", kMatters[index]);
            line.SetText("detail", detail);
            std::cout << line.Line() << '\n';
        } else {
            std::cout << Printable(path) << ": " << kMatters[index] << ": " << detail << '\n';
        }
    }

    static Json AmountJson(const Amount& amount) {
        return Json::Object({{"count", amount.count}, {"bytes", amount.bytes}});
    }

    void Summarize() const {
        if (json()) return PrintJson();
        const auto line = [](const std::string& what, const Amount& amount, bool sized = true) {
            if (amount.count == 0) return;
            std::cout << "  " << what << ": " << amount.count;
            if (sized) std::cout << ", " << amount.bytes << " bytes";
            std::cout << '\n';
        };
        std::cout << Printable(ends_.source.path()) << " to " << Printable(ends_.destination.path())
                  << ", " << TypeName(ends_.type) << ":\n";
        line("files", files_);
        line("directories", {directories_, 0}, false);
        line("symbolic links", {links_, 0}, false);
        line("special files", {others_, 0}, false);
        line("attributes", attributes_);
        if (largest_ > 0) std::cout << "    at most " << largest_ << " bytes of one object\n";
        line("Finder info", finder_info_);
        line("resource forks", forks_);
        for (const auto& [name, amount] : entries_) line(name, amount);
        line("files of other services", services_);
        line("locked", {locked_, 0}, false);
        line("hidden", {hidden_, 0}, false);
        line("in an earlier layout", {earlier_, 0}, false);
        for (std::size_t i = 0; i < matters_.size(); ++i) {
            line(kMatters[i], {matters_[i], 0}, false);
        }
        if (matters() == 0) std::cout << "everything would arrive\n";
    }

    void PrintJson() const {
        Json entries = Json::Object({});
        for (const auto& [name, amount] : entries_) entries.Set(name, AmountJson(amount));
        Json matters = Json::Object({});
        for (std::size_t i = 0; i < matters_.size(); ++i) matters.Set(kMatters[i], matters_[i]);
        Json json;
        json.SetText("source", ends_.source.path());
        json.SetText("destination", ends_.destination.path());
        json.Set("type", TypeJson(ends_.type));
        json.Set("files", AmountJson(files_));
        json.Set("directories", directories_);
        json.Set("links", links_);
        json.Set("specialFiles", others_);
        json.Set("attributes", AmountJson(attributes_));
        json.Set("mostAttributeBytes", largest_);
        json.Set("finderInfo", AmountJson(finder_info_));
        json.Set("resourceForks", AmountJson(forks_));
        json.Set("entries", std::move(entries));
        json.Set("serviceFiles", AmountJson(services_));
        json.Set("locked", locked_);
        json.Set("hidden", hidden_);
        json.Set("earlierLayout", earlier_);
        json.Set("toDecide", std::move(matters));
        std::cout << json.Line() << '\n';
    }

    // For ConvertAsPlanned(), and for people: a line for each thing.
    void WriteFile() const {
        const ConvertOptions& conversion = options_.conversion;
        const std::string text =
            std::string(kTitle) + "\nsource " + Printable(ends_.source.path()) + "\ndestination " +
            Printable(ends_.destination.path()) + "\ntype " + conversion.type + "\nrecursive " +
            (conversion.recursive ? "yes" : "no") + "\nobjects " + std::to_string(source_.count()) +
            "\nfingerprint " + source_.fingerprint().text() + "\nend\n";
        const Place place = PlaceOf(*options_.file, Shown::kAsGiven);
        TemporaryFile file(place);
        const auto* const bytes = reinterpret_cast<const std::uint8_t*>(text.data());
        file.file().Write(0, ByteView(bytes, text.size()));
        file.file().Sync();
        if (options_.force) {
            file.GiveToTarget();
        } else {
            file.GiveToNewTarget();
        }
        place.directory->Sync();
    }

    const PlanOptions& options_;
    const ConversionEnds& ends_;
    Source source_;
    Progress progress_{"planning"};
    Amount files_;
    Amount attributes_;
    Amount finder_info_;
    Amount forks_;
    Amount services_;
    std::map<std::string, Amount> entries_;
    std::set<std::pair<dev_t, ino_t>> seen_;  // files of several names
    std::uint64_t directories_ = 0;
    std::uint64_t links_ = 0;
    std::uint64_t others_ = 0;
    std::uint64_t largest_ = 0;  // bytes of attributes of one object
    std::uint64_t locked_ = 0;
    std::uint64_t hidden_ = 0;
    std::uint64_t earlier_ = 0;
    std::uint64_t failed_ = 0;
    std::array<std::uint64_t, kMatters.size()> matters_{};
};

// ---- What was planned ---------------------------------------------------------------------------

struct Planned {
    ConvertOptions conversion;
    std::string objects;
    std::string fingerprint;
};

Planned ReadPlan(const std::string& path, ConvertOptions manner) {
    constexpr std::uint64_t kMost = std::uint64_t{1} << 20;
    const Failure no_plan(kFailed, path, "it is no plan of a conversion",
                          "make one with: mavoea plan --output FILE");
    const File file = File::OpenToRead(path);
    if (file.Size() > kMost) throw Failure(no_plan);
    const Bytes bytes = file.Read(0, file.Size());
    std::istringstream lines(std::string(bytes.begin(), bytes.end()));
    std::string line;
    if (!std::getline(lines, line) || line != kTitle) throw Failure(no_plan);
    const auto take = [&](const std::string& key) {
        const bool found = std::getline(lines, line) && line.starts_with(key + ' ');
        const auto value = found ? FromPrintable(line.substr(key.size() + 1)) : std::nullopt;
        if (!value || value->empty()) throw Failure(no_plan);
        return *value;
    };
    Planned planned = {std::move(manner), {}, {}};
    planned.conversion.source = take("source");
    planned.conversion.destination = take("destination");
    planned.conversion.type = take("type");
    planned.conversion.recursive = take("recursive") == "yes";
    planned.objects = take("objects");
    planned.fingerprint = take("fingerprint");
    if (!std::getline(lines, line) || line != "end") throw Failure(no_plan);
    return planned;
}

}  // namespace

ExitStatus PlanConversion(const PlanOptions& options) {
    if (options.conversion.recursive) RequireDescriptorPaths();
    const ConversionEnds ends = EndsOf(options.conversion);
    if (options.file && !options.force && PlaceOf(*options.file, Shown::kAsGiven).Status()) {
        throw SystemFailure(*options.file, EEXIST);
    }
    WatchForInterrupts();
    return Plan(options, ends).Run();
}

ExitStatus ConvertAsPlanned(const std::string& file, ConvertOptions manner) {
    const Planned planned = ReadPlan(file, std::move(manner));
    if (planned.conversion.recursive) RequireDescriptorPaths();
    {
        const ConversionEnds ends = EndsOf(planned.conversion);
        Source source(planned.conversion, ends);
        bool whole = true;
        source.Visit([](const Step&) {}, [&](const Place&, const Failure&) { whole = false; });
        const bool same = std::to_string(source.count()) == planned.objects &&
                          source.fingerprint().text() == planned.fingerprint;
        if (!same && whole) {
            throw Failure(kFailed, planned.conversion.source, "it has changed since it was planned",
                          "plan it again");
        }
        if (!whole) {
            throw Failure(kFailed, planned.conversion.source,
                          "not all of it can be looked at any more", "plan it again");
        }
    }
    return Convert(planned.conversion);
}

}  // namespace mavoea::tool
