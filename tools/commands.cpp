#include "tools/commands.h"

#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <iomanip>
#include <iostream>

#include "format/ea_stream.h"
#include "tools/clean.h"
#include "tools/convert.h"
#include "tools/copy.h"
#include "tools/delete.h"
#include "tools/dump.h"
#include "tools/file.h"
#include "tools/import.h"
#include "tools/lock.h"
#include "tools/output.h"
#include "tools/record.h"
#include "tools/repair.h"
#include "tools/store.h"
#include "tools/text.h"
#include "tools/upgrade.h"
#include "tools/volume.h"

namespace mavoea::tool {
namespace {

using Declarations = std::vector<Declaration>;

const char* KindName(Kind kind) {
    switch (kind) {
        case Kind::kFinderInfo:
            return "Finder info";
        case Kind::kResourceFork:
            return "resource fork";
        case Kind::kLocked:
            return "locked state";
        case Kind::kAttribute:
            break;
    }
    return "attribute";
}

void CheckName(const Options& options) {
    if (options.name.empty()) {
        throw Failure(kFailed, options.paths.front(), "the attribute's name is empty",
                      "give it a name");
    }
    if (options.name.size() >= kNameSizeMax) {
        throw Failure(kFailed, options.paths.front(),
                      "the attribute's name has " + std::to_string(options.name.size()) +
                          " bytes, at most " + std::to_string(kNameSizeMax - 1) + " are possible",
                      "use a shorter name");
    }
}

Failure NoAttribute(const Options& options) {
    return {kNotFound, options.paths.front(), "no attribute \"" + Printable(options.name) + "\"",
            "mavoea list PATH has the names"};
}

// ---- where --------------------------------------------------------------------------------------

ExitStatus Where(const Options& options, const Declarations& declarations) {
    const Object object = FindObject(options.paths.front());
    const std::string source = TypeSource(object, declarations);
    Json json;
    json.SetText("path", object.path);
    json.Set("type", object.type);
    json.Set("typeName", TypeName(object.type));
    json.Set("typeSource", source);
    Json files = Json::Array();
    std::string text = Printable(object.path) + "\n  volume type: " + std::to_string(object.type) +
                       ", " + std::string(TypeName(object.type)) + " (" + source + ")\n";
    for (const MetadataPath& place : MetadataPaths(object)) {
        struct stat info;
        const bool exists = !place.path.empty() && ::lstat(place.path.c_str(), &info) == 0;
        Json entry;
        entry.Set("kind", place.id);
        text += std::string("  ") + place.label + ": ";
        if (place.path.empty()) {
            entry.Set("path", Json());
            entry.Set("problem", place.problem);
            text += "none, " + place.problem + '\n';
        } else {
            entry.SetText("path", place.path);
            text += Printable(place.path) + (exists ? " (exists" : " (missing");
            if (exists && S_ISREG(info.st_mode)) {
                text += ", " + std::to_string(info.st_size) + " bytes";
                entry.Set("size", info.st_size);
            }
            text += ")\n";
        }
        entry.Set("exists", exists);
        files.Add(std::move(entry));
    }
    json.Set("files", std::move(files));
    if (options.json) {
        Print(json);
    } else {
        std::cout << text;
    }
    if (object.keeping() == Keeping::kNone) throw NoStore(object);
    return kSuccess;
}

// ---- list ---------------------------------------------------------------------------------------

void ListText(const std::vector<Attribute>& list, bool details) {
    std::size_t name_width = 0;
    for (const Attribute& attribute : list) {
        name_width = std::max(name_width, Printable(attribute.name).size());
    }
    for (const Attribute& attribute : list) {
        const std::string name = Printable(attribute.name);
        if (!details) {
            std::cout << name << '\n';
            continue;
        }
        std::cout << std::setw(10) << attribute.size << "  " << std::left << std::setw(13)
                  << KindName(attribute.kind) << "  " << std::setw(static_cast<int>(name_width))
                  << name << std::right << "  " << Printable(attribute.file) << '\n';
    }
}

Json ListJson(const std::vector<Attribute>& list) {
    Json json = Json::Array();
    for (const Attribute& attribute : list) {
        Json entry;
        entry.SetText("name", attribute.name);
        entry.Set("size", attribute.size);
        entry.Set("kind", KindName(attribute.kind));
        entry.SetText("file", attribute.file);
        json.Add(std::move(entry));
    }
    return json;
}

ExitStatus List(const Options& options) {
    ExitStatus status = kSuccess;
    Json json = Json::Array();
    bool first = true;
    for (const std::string& path : options.paths) {
        try {
            const Object object = FindObject(path);
            const std::vector<Attribute> list = OpenStore(object)->List();
            if (options.json) {
                Json entry;
                entry.SetText("path", object.path);
                entry.Set("type", object.type);
                entry.Set("attributes", ListJson(list));
                json.Add(std::move(entry));
                continue;
            }
            if (options.paths.size() > 1) {
                std::cout << (first ? "" : "\n") << Printable(path) << ":\n";
            }
            first = false;
            ListText(list, options.details);
        } catch (const Failure& failure) {
            Report(failure.what());
            status = std::max(status, failure.status());
        }
    }
    if (options.json) Print(json);
    return status;
}

// ---- get, set, remove ---------------------------------------------------------------------------

ExitStatus Get(const Options& options) {
    CheckName(options);
    const Object object = FindObject(options.paths.front());
    const std::optional<Bytes> value = OpenStore(object)->Get(options.name);
    if (!value) throw NoAttribute(options);
    if (options.json) {
        Json json;
        json.SetText("path", object.path);
        json.SetText("name", options.name);
        json.Set("size", value->size());
        json.Set("hex", HexDigits(*value));
        Print(json);
    } else if (options.hex) {
        std::cout << HexDump(*value);
    } else {
        std::cout.write(reinterpret_cast<const char*>(value->data()),
                        static_cast<std::streamsize>(value->size()));
    }
    return kSuccess;
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

ExitStatus Set(const Options& options) {
    CheckName(options);
    const Object object = FindObject(options.paths.front());
    const auto store = OpenStore(object);
    const Bytes value = ValueToSet(options);
    store->Set(options.name, value);
    if (options.json) {
        Json json;
        json.SetText("path", object.path);
        json.SetText("name", options.name);
        json.Set("size", value.size());
        Print(json);
    }
    return kSuccess;
}

ExitStatus Remove(const Options& options) {
    CheckName(options);
    const Object object = FindObject(options.paths.front());
    if (!OpenStore(object)->Remove(options.name)) throw NoAttribute(options);
    if (options.json) {
        Json json;
        json.SetText("path", object.path);
        json.SetText("name", options.name);
        json.Set("removed", true);
        Print(json);
    }
    return kSuccess;
}

// ---- lock, unlock -------------------------------------------------------------------------------

ExitStatus Lock(const Options& options, bool locked) {
    ExitStatus status = kSuccess;
    Json json = Json::Array();
    for (const std::string& path : options.paths) {
        try {
            const Object object = FindObject(path);
            SetLocked(object, locked);
            Json entry;
            entry.SetText("path", object.path);
            entry.Set("locked", locked);
            json.Add(std::move(entry));
        } catch (const Failure& failure) {
            Report(failure.what());
            status = std::max(status, failure.status());
        }
    }
    if (options.json) Print(json);
    return status;
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
        const char* const kind = place == RecordPlace::kAttribute
                                     ? "netatalk record, attribute user.netatalk.Metadata"
                                     : "netatalk record, head of a resource file";
        violations += findings.violations.size();
        if (options.json) {
            json.Add(DumpJson(stored->file, layout, findings, kind));
        } else {
            std::cout << (found ? "\n" : "") << DumpText(stored->file, layout, findings, kind);
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

ExitStatus Dump(const Options& options) {
    if (options.record) return DumpRecord(options);
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

}  // namespace

ExitStatus Run(const Options& options) {
    Declarations declarations;
    for (const std::string& volume : options.volumes) {
        declarations.push_back(DeclareVolume(volume));
    }
    const TreeOptions tree = {options.paths, options.recursive, options.json};
    const JobOptions job = {options.paths, options.recursive, options.consent, options.verbose,
                            options.json};
    const CopyOptions copy = {job, options.target_directory, options.no_target_directory};
    switch (options.command) {
        case Command::kWhere:
            return Where(options, declarations);
        case Command::kList:
            return List(options);
        case Command::kGet:
            return Get(options);
        case Command::kSet:
            return Set(options);
        case Command::kRemove:
            return Remove(options);
        case Command::kLock:
            return Lock(options, true);
        case Command::kUnlock:
            return Lock(options, false);
        case Command::kImport:
            return Import(options.apple_double, options.paths.front(), options.json);
        case Command::kCopy:
            return Copy(copy);
        case Command::kMove:
            return Move(copy);
        case Command::kDelete:
            return Delete(job);
        case Command::kUpgrade:
            return Upgrade(tree);
        case Command::kRepair:
            return Repair(tree);
        case Command::kClean:
            return Clean({.directories = options.paths,
                          .recursive = options.recursive,
                          .remove = options.yes,
                          .others = options.all,
                          .json = options.json});
        case Command::kConvert:
            return Convert({.source = options.paths.front(),
                            .destination = options.destination,
                            .type = options.to,
                            .recursive = options.recursive,
                            .compare_only = options.compare_only,
                            .json = options.json});
        case Command::kDump:
            break;
    }
    return Dump(options);
}

}  // namespace mavoea::tool
