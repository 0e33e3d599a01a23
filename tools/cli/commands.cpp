#include "tools/cli/commands.h"

#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cstdint>
#include <iostream>

#include "format/ea_stream.h"
#include "tools/care/check.h"
#include "tools/care/clean.h"
#include "tools/care/lock.h"
#include "tools/care/repair.h"
#include "tools/care/upgrade.h"
#include "tools/cli/opening.h"
#include "tools/cli/set_info.h"
#include "tools/exchange/export.h"
#include "tools/exchange/import.h"
#include "tools/exchange/import_tree.h"
#include "tools/exchange/restore.h"
#include "tools/exchange/salvage.h"
#include "tools/exchange/save.h"
#include "tools/move/carry.h"
#include "tools/move/convert.h"
#include "tools/move/copy.h"
#include "tools/move/delete.h"
#include "tools/move/plan.h"
#include "tools/place/dry_run.h"
#include "tools/place/file.h"
#include "tools/place/volume.h"
#include "tools/say/colour.h"
#include "tools/say/interrupt.h"
#include "tools/say/output.h"
#include "tools/say/progress.h"
#include "tools/say/text.h"
#include "tools/show/attribute_dump.h"
#include "tools/show/attributes.h"
#include "tools/show/diff.h"
#include "tools/show/dump.h"
#include "tools/show/object_info.h"
#include "tools/show/where.h"
#include "tools/store/change.h"
#include "tools/store/foreign/spelling.h"
#include "tools/store/layout.h"
#include "tools/store/record.h"
#include "tools/transfer/pending.h"
#include "tools/walk/tree.h"

namespace mavoea::tool {
namespace {

// The attribute's name, as it is on disk.
std::string NameIn(const Options& options) {
    const auto name = options.escaped ? FromPrintable(options.name) : options.name;
    if (!name) {
        throw Failure(
            kFailed, options.paths.front(),
            "a backslash in \"" + options.name + "\" begins no escape",
            "write \"\\x0A\" for a control character and \"\\\\\" for a backslash, as list "
            "does");
    }
    if (name->empty()) {
        throw Failure(kFailed, options.paths.front(), "the attribute's name is empty",
                      "give it a name");
    }
    if (name->size() >= kNameSizeMax) {
        throw Failure(kFailed, options.paths.front(),
                      "the attribute's name has " + std::to_string(name->size()) +
                          " bytes, at most " + std::to_string(kNameSizeMax - 1) + " are possible",
                      "use a shorter name");
    }
    return *name;
}

// ---- get, set, remove ---------------------------------------------------------------------------

ExitStatus GetValue(const Options& options) {
    const Format format = options.json  ? Format::kJson
                          : options.hex ? Format::kHexDump
                          : options.raw ? Format::kRaw
                                        : Format::kPlain;
    return Get(options.paths.front(), NameIn(options), format);
}

Bytes ValueToSet(const Options& options) {
    if (options.value && options.hex) {
        if (auto bytes = ParseHex(*options.value)) return *std::move(bytes);
        throw Failure(kFailed, options.paths.front(), "VALUE is not hexadecimal digits",
                      "give two digits for each byte, or leave --hex out");
    }
    if (options.value) return {options.value->begin(), options.value->end()};
    if (options.file) {
        const File file = File::OpenAny(*options.file);
        return ReadToEnd(file.fd(), file.path(), kStreamSizeMax);
    }
    return ReadToEnd(STDIN_FILENO, "standard input", kStreamSizeMax);
}

void SayOf(const Options& options, const Object& object, const std::string& what) {
    if ((options.verbose || options.dry_run) && !options.json) {
        std::cout << Printable(object.path()) << ": " << what << '\n';
    }
}

ExitStatus Set(const Options& options) {
    const std::string name = NameIn(options);
    const Object object = FindObject(options.paths.front());
    const Bytes value = ValueToSet(options);
    OpenToChange(object)->Set(name, value);
    if (const auto note = NoteOfUnseen(object, name, value.size())) Note(*note);
    SayOf(options, object,
          "set " + NameOfAttribute(name) + ", " + std::to_string(value.size()) +
              (value.size() == 1 ? " byte" : " bytes"));
    if (options.json) {
        Json json;
        json.SetText("path", object.path());
        json.SetText("name", name);
        json.Set("size", value.size());
        Print(json);
    }
    return kSuccess;
}

ExitStatus Remove(const Options& options) {
    const std::string name = NameIn(options);
    const Object object = FindObject(options.paths.front());
    if (!RemoveFrom(object, name)) throw NoAttribute(options.paths.front(), name);
    SayOf(options, object, "removed " + NameOfAttribute(name));
    if (options.json) {
        Json json;
        json.SetText("path", object.path());
        json.SetText("name", name);
        json.Set("removed", true);
        Print(json);
    }
    return kSuccess;
}

// ---- dump ---------------------------------------------------------------------------------------

// The two places of an object's record; the head of a resource file that is too short for one is
// none.
ExitStatus DumpRecord(const Options& options) {
    const Object object = FindObject(options.paths.front());
    Json json = Json::Array();
    std::size_t violations = 0;
    bool found = false;
    for (const RecordPlace place : {RecordPlace::kAttribute, RecordPlace::kResourceFile}) {
        const auto stored = ReadStoredRecord(object, place);
        if (!stored) continue;
        const Layout layout = ReadLayout(stored->block);
        const Findings findings = CheckRecord(layout, place);
        const std::string kind =
            "netatalk record, " + (stored->attribute.empty() ? "head of a resource file"
                                                             : "attribute " + stored->attribute);
        violations += findings.violations.size();
        if (options.json) {
            json.Add(DumpJson(stored->file, layout, findings, kind.c_str()));
        } else {
            std::cout << (found ? "\n" : "")
                      << DumpText(stored->file, layout, findings, kind.c_str());
        }
        found = true;
    }
    if (options.json) Print(json);
    if (!found) {
        throw Failure(kNotFound, options.paths.front(), "no netatalk record",
                      "mavoea where PATH has the files in which metadata may be");
    }
    if (violations == 0) return kSuccess;
    throw Failure(kFailed, options.paths.front(), "its netatalk record is damaged",
                  "let the AFP service write it anew, or remove it");
}

ExitStatus DumpAttributesOf(const Options& options) {
    const std::string& path = options.paths.front();
    const std::vector<AttributeDump> dumps = DumpAttributes(FindObject(path));
    Json json = Json::Array();
    std::size_t violations = 0;
    bool first = true;
    for (const AttributeDump& dump : dumps) {
        violations += dump.violations;
        json.Add(dump.json);
        if (!options.json) std::cout << (first ? "" : "\n") << dump.text;
        first = false;
    }
    if (options.json) Print(json);
    if (dumps.empty()) {
        throw Failure(kNotFound, path, "no attributes of users or of other programs",
                      "mavoea where PATH has the files in which metadata may be");
    }
    if (violations == 0) return kSuccess;
    throw Failure(
        kFailed, path,
        "its attributes are violated in " + std::to_string(violations) +
            (violations == 1 ? " place" : " places"),
        "let the program that keeps them write them anew, or remove them with: setfattr -x");
}

ExitStatus Dump(const Options& options) {
    if (options.record) return DumpRecord(options);
    if (options.attributes) return DumpAttributesOf(options);
    const std::string& path = options.paths.front();
    const Layout layout = ReadLayout(File::OpenToRead(path));
    const Findings findings = CheckLayout(layout);
    if (options.json) {
        Print(DumpJson(path, layout, findings));
    } else {
        std::cout << DumpText(path, layout, findings);
    }
    if (findings.violations.empty()) return kSuccess;
    const std::size_t count = findings.violations.size();
    throw Failure(
        kFailed, path,
        "the layout is violated in " + std::to_string(count) + (count == 1 ? " place" : " places"),
        "restore the file from a copy, or leave it alone");
}

// How many processes share the work.
CrewSize CrewOf(const Options& options) {
    return options.jobs > 0 ? CrewSize{.workers = options.jobs} : UsualCrew();
}

ConvertOptions ConversionOf(const Options& options) {
    return {.source = options.paths.front(),
            .destination = options.destination,
            .type = options.to,
            .recursive = options.recursive,
            .json = options.json,
            .verbose = options.verbose || options.dry_run,
            .crew = CrewOf(options),
            .log = options.log};
}

}  // namespace

ExitStatus Run(const Options& options) {
    RequireVolumeTable();
    for (const std::string& volume : options.volumes) DeclareVolume(volume);
    UseColour(options.color);
    WatchForProgressRequests();
    if (!options.progress.empty()) {
        ReportProgressEach(std::chrono::seconds(std::stoi(options.progress)));
    }
    if (options.dry_run) BeginDryRun();
    const bool verbose = options.verbose || options.dry_run;
    const TreeOptions tree = {.paths = options.paths,
                              .recursive = options.recursive,
                              .json = options.json,
                              .shard = options.shard,
                              .log = options.log,
                              .crew = CrewOf(options),
                              .verbose = verbose};
    switch (options.command) {
        case Command::kWhere:
            return Where(options.paths.front(), options.json);
        case Command::kList:
            return List({.tree = tree,
                         .details = options.details,
                         .null = options.null,
                         .values = options.values});
        case Command::kShow:
            return Show(tree);
        case Command::kGet:
            return GetValue(options);
        case Command::kSet:
            return Set(options);
        case Command::kSetInfo:
            return SetInfo({.paths = options.paths,
                            .info = options.info,
                            .verbose = verbose,
                            .json = options.json});
        case Command::kRemove:
            return Remove(options);
        case Command::kLock:
            return Lock(tree, true);
        case Command::kUnlock:
            return Lock(tree, false);
        case Command::kImport:
            if (options.recursive) {
                return ImportTree({.directories = options.paths.arguments,
                                   .keep = options.keep,
                                   .keep_existing = options.keep_existing,
                                   .verbose = verbose,
                                   .json = options.json});
            }
            return Import({.file = options.archive,
                           .path = options.paths.front(),
                           .replaces_data = options.replaces_data,
                           .json = options.json});
        case Command::kExport:
            return Export({.path = options.paths.front(),
                           .file = options.archive,
                           .format = options.format,
                           .force = options.force,
                           .verbose = verbose,
                           .json = options.json});
        case Command::kSave:
            return Save({.paths = options.paths,
                         .recursive = options.recursive,
                         .encoding = options.encoding,
                         .absolute_names = options.absolute_names,
                         .file = options.output,
                         .force = options.force,
                         .json = options.json});
        case Command::kRestore:
            return Restore({.file = options.archive,
                            .directory = options.directory,
                            .from_type = options.type,
                            .absolute_names = options.absolute_names,
                            .verbose = verbose,
                            .json = options.json});
        case Command::kCopy:
            return Copy(options.copy);
        case Command::kMove:
            return Move(options.copy);
        case Command::kDelete:
            return Delete(options.remove);
        case Command::kCarry:
            return Carry({{.paths = options.paths.arguments,
                           .recursive = options.recursive,
                           .verbose = verbose,
                           .json = options.json},
                          options.destination});
        case Command::kUpgrade:
            return Upgrade(tree);
        case Command::kRepair:
            return Repair(tree);
        case Command::kClean:
            return Clean({.directories = options.paths,
                          .recursive = options.recursive,
                          .remove = options.yes,
                          .others = options.all,
                          .wait = options.wait,
                          .json = options.json});
        case Command::kCheck:
            return CheckSoundness({.tree = tree,
                                   .verbose = verbose,
                                   .repair = options.repair,
                                   .remove = options.yes});
        case Command::kConvert:
            if (options.plan) {
                return ConvertAsPlanned(*options.plan, {.json = options.json,
                                                        .verbose = verbose,
                                                        .crew = CrewOf(options),
                                                        .log = options.log});
            }
            return Convert(ConversionOf(options));
        case Command::kPlan:
            return PlanConversion({.conversion = ConversionOf(options),
                                   .file = options.output,
                                   .force = options.force});
        case Command::kDiff:
            return Diff({.first = options.paths.front(),
                         .second = options.destination,
                         .recursive = options.recursive,
                         .crew = CrewOf(options),
                         .data = options.data,
                         .brief = options.brief,
                         .itemized = options.itemized,
                         .json = options.json});
        case Command::kSalvage:
            return Salvage({.path = options.paths.front(),
                            .directory = options.destination,
                            .verbose = verbose,
                            .json = options.json});
        case Command::kDump:
            break;
    }
    return Dump(options);
}

}  // namespace mavoea::tool
