#include "tools/show/attributes.h"

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <iomanip>
#include <iostream>
#include <optional>
#include <utility>

#include "tools/place/volume.h"
#include "tools/say/output.h"
#include "tools/say/progress.h"
#include "tools/say/text.h"
#include "tools/store/gathering.h"
#include "tools/store/reader.h"
#include "tools/store/sidecars.h"
#include "tools/walk/packing.h"
#include "tools/walk/tree.h"

namespace mavoea::tool {
namespace {

struct Line {
    std::string name;
    std::uint64_t size;
    const char* kind;
    std::string file;           // that holds it
    std::string spelling = {};  // the attribute of that file, where it is not its name there
    const Content* value = nullptr;
};

std::vector<Line> LinesOf(const Object& object, const Metadata& metadata) {
    std::vector<Line> lines;
    for (const Metadata::Attribute& attribute : metadata.attributes) {
        lines.push_back({attribute.name, attribute.value.size(), "attribute", attribute.holder,
                         attribute.spelling, &attribute.value});
    }
    if (const auto& info = metadata.finder_info) {
        lines.push_back({std::string(kFinderInfoName), info->value.size(), "Finder info",
                         info->holder, info->spelling, &info->value});
    }
    if (const auto& fork = metadata.fork) {
        lines.push_back({std::string(kResourceForkName), fork->value.size(), "resource fork",
                         fork->holder, fork->spelling, &fork->value});
    }
    if (metadata.locked) {
        static const Content kValue(Bytes{'1'});
        lines.push_back({std::string(kLockedName), 1, "locked state", object.path(), {}, &kValue});
    }
    return lines;
}

// On an AppleDouble volume, a file of the metadata's name that holds none is told.
void AddOccupied(const Object& object, Metadata* metadata) {
    const std::string name = AppleDoubleName(object.place.name);
    if (object.keeping() != Keeping::kAppleDouble || name.empty()) return;
    if (!object.place.directory->MayHave(name)) return;
    try {
        const auto file = object.place.directory->FindFile(name, O_RDONLY);
        if (!file || file->Size() == 0 || IsAppleDouble(*object.place.directory, name)) return;
        metadata->problems.emplace_back(kFailed, file->path(), "no AppleDouble file",
                                        "move it away, or look at it with: mavoea dump FILE");
    } catch (const Failure& failure) {
        metadata->problems.push_back(failure);
    }
}

Metadata ReadAll(const Object& object) {
    RequireParent(object);
    if (object.keeping() == Keeping::kNone) throw NoStore(object);
    const Sidecars sidecars = Sidecars::Find(object, Sidecars::Services::kLeaveOut);
    Metadata metadata = ReadMetadata(object, sidecars);
    if (!sidecars.apple_double) AddOccupied(object, &metadata);
    return metadata;
}

class Listing {
 public:
    explicit Listing(const ListOptions& options) : options_(options) {}

    ExitStatus Run() {
        if (options_.values && !options_.tree.json) Misuse("--values takes --json");
        if (options_.null && options_.tree.json) Misuse("--json and --null exclude each other");
        return LookAtObjects(
            "listing", options_.tree,
            [this](const Object& object, const std::string& shown, const Metadata& metadata,
                   const auto& separate) { Show(object, shown, metadata, separate); });
    }

 private:
    [[noreturn]] static void Misuse(const char* what) {
        throw Failure(kFailed, "list", what, "mavoea list --help has the usage");
    }

    void Show(const Object& object, const std::string& shown, const Metadata& metadata,
              const std::function<void()>& separate) const {
        const std::vector<Line> lines = LinesOf(object, metadata);
        if (options_.tree.json) return PrintJson(object, metadata, lines);
        if (options_.null) {
            PrintNull(object, lines);
        } else if (!lines.empty() || !options_.tree.recursive) {
            if (options_.tree.recursive || options_.tree.paths.several()) {
                separate();
                std::cout << Printable(shown) << ":\n";
            }
            PrintText(lines);
        }
        TellStrays(object, metadata);
    }

    void PrintText(const std::vector<Line>& lines) const {
        std::size_t width = 0;
        for (const Line& line : lines) width = std::max(width, Printable(line.name).size());
        for (const Line& line : lines) {
            const std::string name = Printable(line.name);
            if (!options_.details) {
                std::cout << name << '\n';
                continue;
            }
            std::cout << std::setw(10) << line.size << "  " << std::left << std::setw(13)
                      << line.kind << "  " << std::setw(static_cast<int>(width)) << name
                      << std::right << "  " << WhereText(line.file, line.spelling) << '\n';
        }
    }

    static void PrintNull(const Object& object, const std::vector<Line>& lines) {
        for (const Line& line : lines) std::cout << object.path() << '\0' << line.name << '\0';
    }

    // Piece by piece: a value need not fit into memory.
    void PrintJson(const Object& object, const Metadata& metadata,
                   const std::vector<Line>& lines) const {
        Json head;
        head.SetText("path", object.path());
        head.Set("type", TypeJson(object.type));
        std::cout << '{' << head.Members() << ",\"attributes\":[";
        const char* separator = "";
        std::optional<Failure> unread;
        for (const Line& line : lines) {
            Json entry;
            entry.SetText("name", line.name);
            entry.Set("size", line.size);
            entry.Set("kind", line.kind);
            entry.SetText("file", line.file);
            if (!line.spelling.empty()) entry.SetText("attribute", line.spelling);
            std::cout << std::exchange(separator, ",") << '{' << entry.Members();
            if (const auto problem = options_.values ? PrintValue(*line.value) : std::nullopt) {
                // Of what was found damaged that is told with the object's other problems.
                if (!line.value->damaged() || metadata.problems.empty()) unread = problem;
            }
            std::cout << '}';
        }
        std::cout << ']';
        Json tail;
        SetStrays(object, metadata, &tail);
        if (const std::string members = tail.Members(); !members.empty()) {
            std::cout << ',' << members;
        }
        std::cout << "}\n";
        if (unread) throw Failure(*unread);
    }

    // What cannot be read to its end has a "problem", and the line stays whole.
    static std::optional<Failure> PrintValue(const Content& value) {
        constexpr std::uint64_t kPiece = std::uint64_t{3} << 18;
        std::cout << ",\"base64\":\"";
        try {
            for (std::uint64_t at = 0; at < value.size(); at += kPiece) {
                std::cout << Base64(value.Read(at, kPiece));
            }
            std::cout << '"';
            return std::nullopt;
        } catch (const Failure& failure) {
            std::cout << "\",\"problem\":" << Json(failure.what()).Line();
            return failure;
        }
    }

    const ListOptions& options_;
};

std::optional<Content> Find(const Metadata& metadata, const std::string& name) {
    switch (KindOf(name)) {
        case Kind::kFinderInfo:
            return metadata.finder_info ? std::optional(metadata.finder_info->value) : std::nullopt;
        case Kind::kResourceFork:
            return metadata.fork ? std::optional(metadata.fork->value) : std::nullopt;
        case Kind::kLocked:
            return Content(Bytes{static_cast<std::uint8_t>(metadata.locked ? '1' : '0')});
        case Kind::kAttribute:
            break;
    }
    const Metadata::Attribute* const attribute = metadata.Find(name);
    return attribute != nullptr ? std::optional(attribute->value) : std::nullopt;
}

// What a terminal would take for commands may do anything to it.
void RequireShowable(const std::string& path, const std::string& name, const Content& value) {
    if (::isatty(STDOUT_FILENO) != 1) return;
    // More than that nobody reads on a terminal.
    const bool small = value.size() <= kSmallFile;
    const Bytes bytes = small ? value.All() : Bytes();
    const std::string_view text(reinterpret_cast<const char*>(bytes.data()), bytes.size());
    if (small && IsShownByTerminals(text)) return;
    throw Failure(kFailed, path,
                  NameOfAttribute(name) + (small ? " is not text" : " is too long") +
                      " for a terminal, it has " + std::to_string(value.size()) + " bytes",
                  "show it with --hex, lead the output into a file, or give --raw");
}

void WriteRaw(const Content& value) {
    constexpr std::uint64_t kPiece = std::uint64_t{1} << 20;
    for (std::uint64_t at = 0; at < value.size(); at += kPiece) {
        const Bytes piece = value.Read(at, kPiece);
        std::cout.write(reinterpret_cast<const char*>(piece.data()),
                        static_cast<std::streamsize>(piece.size()));
    }
}

// Other programs keep one thing in several places.
bool MayHaveStrays(const Object& object) { return object.dialect() != nullptr || !object.declared; }

}  // namespace

ExitStatus LookAtObjects(const char* doing, const TreeOptions& options, const Look& look) {
    struct Counts {
        std::uint64_t done;
        std::uint64_t failures;
        ExitStatus status;
    };
    Progress progress(doing, Progress::Lines::kOnRequest);
    Counts all = {};
    bool first = true;
    const auto hear = [&](std::string_view message) {
        if (message.empty()) {
            if (!std::exchange(first, false)) std::cout << '\n';
            return;
        }
        const auto more = Unpacker(message).Take<Counts>();
        all.done += more.done;
        all.failures += more.failures;
        all.status = std::max(all.status, more.status);
    };
    const auto work = [&](const Object& object, const std::string& given, const Tell& tell) {
        const std::string shown = given.empty() ? object.path() : given;
        Counts counts = {};
        const auto add = [&](const Failure& failure) {
            ++counts.failures;
            Report(failure.what());
            counts.status = std::max(counts.status, failure.status());
        };
        try {
            const Metadata metadata = ReadAll(object);
            try {
                look(object, shown, metadata, [&] { tell({}); });
            } catch (const Failure& failure) {
                add(failure);
            }
            ++counts.done;
            for (const Failure& problem : metadata.problems) add(problem);
        } catch (const Failure& failure) {
            if (!options.recursive || !HasGone(object.place, failure)) add(failure);
        }
        tell(Packed(counts));
        return counts.status == kSuccess;
    };
    const auto fail = [&](const std::string&, const Failure& failure) {
        ++all.failures;
        Report(failure.what());
        all.status = std::max(all.status, failure.status());
    };
    const auto show = [&](const Object& object) {
        if (!progress.wanted()) return;
        progress.Show(
            std::to_string(all.done) + " done, " + std::to_string(all.failures) + " failed",
            object.path(), all.done);
    };
    VisitObjects(options, {.work = work, .on_failure = fail, .hear = hear, .show_progress = show});
    return all.status;
}

void TellStrays(const Object& object, const Metadata& metadata) {
    if (!MayHaveStrays(object)) return;
    for (const Metadata::Stray& stray : metadata.strays) Note(stray.item + ": " + stray.reason);
}

void SetStrays(const Object& object, const Metadata& metadata, Json* entry) {
    if (!MayHaveStrays(object) || metadata.strays.empty()) return;
    Json strays = Json::Array();
    for (const Metadata::Stray& stray : metadata.strays) {
        strays.Add(Json::Object({{"item", stray.item}, {"reason", stray.reason}}));
    }
    entry->Set("strays", std::move(strays));
}

ExitStatus List(const ListOptions& options) { return Listing(options).Run(); }

std::vector<std::string> AttributeNames(const std::string& path) {
    std::vector<std::string> names;
    const Object object = FindObject(path);
    const Metadata metadata = ReadAll(object);
    for (const Line& line : LinesOf(object, metadata)) names.push_back(line.name);
    return names;
}

ExitStatus Get(const std::string& path, const std::string& name, Format format) {
    const Object object = FindObject(path);
    const Metadata metadata = ReadAll(object);
    const std::optional<Content> value = Find(metadata, name);
    // The lock is told by what could be read, unless nothing of it could.
    const bool unknown = !value || KindOf(name) == Kind::kLocked;
    if (unknown && !metadata.problems.empty()) throw Failure(metadata.problems.front());
    if (!value) throw NoAttribute(path, name);
    // Finder info and fork lie in several places, the first of which counts.
    const bool several = KindOf(name) == Kind::kFinderInfo || KindOf(name) == Kind::kResourceFork;
    if ((value->damaged() || several) && !metadata.problems.empty()) {
        throw Failure(metadata.problems.front());
    }
    switch (format) {
        case Format::kPlain:
            RequireShowable(object.path(), name, *value);
            [[fallthrough]];
        case Format::kRaw:
            WriteRaw(*value);
            break;
        case Format::kHexDump:
            std::cout << HexDump(value->All());
            break;
        case Format::kJson: {
            Json json;
            json.SetText("path", object.path());
            json.SetText("name", name);
            json.Set("size", value->size());
            json.Set("hex", HexDigits(value->All()));
            Print(json);
            break;
        }
    }
    return kSuccess;
}

Failure NoAttribute(const std::string& path, const std::string& name) {
    return {kNotFound, path, "no attribute \"" + Printable(name) + "\"",
            "mavoea list PATH has the names"};
}

}  // namespace mavoea::tool
