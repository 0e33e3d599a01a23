#include "tools/upgrade.h"

#include <algorithm>
#include <filesystem>
#include <optional>

#include "include/mavoea.h"
#include "tools/file.h"
#include "tools/messages.h"
#include "tools/store.h"

namespace mavoea::tool {
namespace {

constexpr std::string_view kReserved = "MAVO";

// A path that the library derives; empty where it derives none.
template <class Derive>
std::string Derived(Derive derive) {
    std::string path(MAVOEA_PATH_SIZE + 1, '\0');
    if (derive(path.data()) != 0) return {};
    path.resize(path.find('\0'));
    return path;
}

std::string StreamPath(const Object& object) {
    return Derived([&](char* buffer) {
        return MAVOEAPath(EA_FORM_FILE, object.path.c_str(), MAVOEA_KIND_STREAM, buffer,
                          MAVOEA_PATH_SIZE, EA_PLACE_EADIR);
    });
}

std::string AppleDoublePath(const Object& object) {
    return Derived(
        [&](char* buffer) { return MAVOEAADPath(object.path.c_str(), buffer, MAVOEA_PATH_SIZE); });
}

// What the legacy folder holds now.
struct Folder {
    std::string path;
    std::vector<std::string> attributes;  // files that are to go into the stream
    std::vector<std::string> reserved;    // "MAVO:..." but for the resource file

    static Folder Read(const Object& object) {
        Folder folder;
        folder.path = Derived([&](char* buffer) {
            return MAVOEADirPath(EA_FORM_FOLDER, object.path.c_str(), buffer, MAVOEA_PATH_SIZE);
        });
        std::error_code error;
        for (std::filesystem::directory_iterator entry(folder.path, error), end;
             !error && entry != end; entry.increment(error)) {
            const std::string name = entry->path().filename().string();
            const bool has_colon = name.find(':') != std::string::npos;
            if (!name.starts_with(kReserved)) {
                if (!has_colon) folder.attributes.push_back(name);
            } else if (has_colon && name != MAVOEA_KIND_LEGACY_RESOURCE) {
                folder.reserved.push_back(name);
            }
        }
        std::sort(folder.attributes.begin(), folder.attributes.end());
        std::sort(folder.reserved.begin(), folder.reserved.end());
        return folder;
    }
};

std::string Files(std::size_t count) {
    return std::to_string(count) + (count == 1 ? " file" : " files");
}

const char* Stay(std::size_t count) { return count == 1 ? " stays in " : " stay in "; }

// One object's kinds, one after the other.
class ObjectUpgrade {
 public:
    ObjectUpgrade(const Object& object, Notes* notes) : object_(object), notes_(notes) {}

    // What failed is told when everything has been tried.
    Outcome Run() {
        const std::vector<std::string> reserved = Folder::Read(object_).reserved;
        Try([&] { UpgradeStream(); });
        Try([&] { UpgradeResourceFile(); });
        for (const std::string& name : reserved) {
            Try([&] { UpgradeReserved(name); });
        }
        if (failure_) throw Failure(*failure_);
        return converted_ ? Outcome::kDone : current_ ? Outcome::kCurrent : Outcome::kNothing;
    }

 private:
    enum Result { kConverted = 0, kCurrent = 1, kNothing = 2 };

    template <class Upgrade>
    void Try(Upgrade upgrade) {
        try {
            upgrade();
        } catch (const Failure& failure) {
            if (!failure_) failure_ = failure;
        }
    }

    // `code`: the last one that the library recorded, 0 for none.
    int Call(const std::string& kind, int* code) const {
        const ErrorMark mark;
        const int result = MAVOEAUpgrade(object_.path.c_str(), kind.c_str());
        const LibraryError error = mark.Get();
        if (result < 0) throw LibraryFailure(object_.path, error);
        *code = error.code;
        return result;
    }

    void UpgradeStream() {
        const std::string stream = StreamPath(object_);
        const std::string apple_double = AppleDoublePath(object_);
        const bool had_apple_double = !apple_double.empty() && Exists(apple_double);
        int code = 0;
        const int result = Call(MAVOEA_KIND_STREAM, &code);
        const Folder left = Folder::Read(object_);
        const std::size_t count = left.attributes.size();
        switch (result) {
            case kConverted:
                break;
            case kCurrent:
                current_ = true;
                if (count > 0) {
                    AddNote(Files(count) + Stay(count) + Printable(left.path) +
                            ": it has an EA stream already");
                }
                return;
            default:
                return;
        }
        // A name that can have no "._" file ends the work as if it were done.
        const bool has_stream = Exists(stream);
        converted_ = converted_ || has_stream;
        if (count == 0) return;
        if (had_apple_double && !Exists(apple_double)) {
            AddNote(Files(count) + Stay(count) + Printable(left.path) +
                    ": its AppleDouble file was read later and has become the EA stream");
            return;
        }
        throw Failure(kFailed, object_.path,
                      (has_stream ? Files(count) + " of its legacy folder could not be converted, "
                                  : "its name is too long for the " + Files(count) +
                                        " of its legacy folder to be converted, ") +
                          "\"" + Printable(left.attributes.front()) + "\"" +
                          (count == 1 ? "" : " and others"),
                      "see whether they can be read, and store them with: mavoea set PATH NAME "
                      "--file FILE");
    }

    void UpgradeResourceFile() {
        int code = 0;
        switch (Call(MAVOEA_KIND_RESOURCE, &code)) {
            case kConverted:
                converted_ = true;
                if (code != 0) {
                    AddNote(
                        "its legacy resource file says nothing of its read-only and hidden "
                        "marks");
                }
                return;
            case kCurrent:
                current_ = true;
                return;
            default:
                return;
        }
    }

    void UpgradeReserved(const std::string& name) {
        int code = 0;
        if (Call(name, &code) != kConverted) return;
        const Folder left = Folder::Read(object_);
        if (std::find(left.reserved.begin(), left.reserved.end(), name) == left.reserved.end()) {
            converted_ = true;
            return;
        }
        throw Failure(kFailed, object_.path,
                      "\"" + Printable(name) + "\" of its legacy folder could not be renamed",
                      "see whether the folder can be written");
    }

    void AddNote(const std::string& text) {
        notes_->push_back(Printable(object_.path) + ": " + text);
    }

    const Object& object_;
    Notes* notes_;
    bool converted_ = false;
    bool current_ = false;
    std::optional<Failure> failure_;
};

}  // namespace

void RequireEaDirectory(const Object& object) {
    if (object.keeping() == Keeping::kNone) throw NoStore(object);
    if (object.keeping() != Keeping::kEaDirectory) {
        throw Failure(kFailed, object.path,
                      "volumes of type " + std::to_string(object.type) + ", " +
                          std::string(TypeName(object.type)) + ", keep no EA directory",
                      "there is nothing to do there");
    }
    RequireParent(object);
}

ExitStatus Upgrade(const TreeOptions& options) {
    const Task task = {.doing = "upgrading",
                       .done = "converted",
                       .current = "already current",
                       .nothing = "with nothing to convert",
                       .check = RequireEaDirectory,
                       .work = [](const Object& object, Notes* notes) {
                           return ObjectUpgrade(object, notes).Run();
                       }};
    return RunOnTree(options, task);
}

}  // namespace mavoea::tool
