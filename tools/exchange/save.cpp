#include "tools/exchange/save.h"

#include <sys/stat.h>
#include <unistd.h>

#include <iostream>
#include <memory>
#include <string_view>

#include "format/attribute_text.h"
#include "tools/place/volume.h"
#include "tools/say/job.h"
#include "tools/say/text.h"
#include "tools/store/reader.h"
#include "tools/store/saved.h"
#include "tools/store/sidecars.h"
#include "tools/walk/tree.h"

namespace mavoea::tool {
namespace {

std::optional<TextEncoding> EncodingNamed(const std::optional<std::string>& name) {
    if (!name) return std::nullopt;
    if (*name == "text") return TextEncoding::kText;
    if (*name == "hex") return TextEncoding::kHex;
    if (*name == "base64") return TextEncoding::kBase64;
    throw Failure(kFailed, "--encoding", "no encoding is called \"" + Printable(*name) + '"',
                  "use text, hex or base64");
}

template <class Use>
void InPieces(const Content& value, Use use) {
    for (std::uint64_t at = 0; at < value.size(); at += kSmallFile) {
        use(value.Read(at, kSmallFile));
    }
}

TextEncoding BestFor(const Content& value) {
    TextChoice choice;
    InPieces(value, [&](const Bytes& piece) { choice.Add(piece); });
    return choice.Best();
}

// Where the text goes: standard output, or a file that has no name until all of it is there.
class TextOutput {
 public:
    explicit TextOutput(const SaveOptions& options) : force_(options.force) {
        if (!options.file) return;
        target_ = PlaceOf(*options.file, Shown::kWhole);
        if (const auto there = target_->Status()) {
            if (!force_) {
                throw Failure(kFailed, target_->path(), "it is there already",
                              "replace it with: mavoea save --force, or name another file");
            }
            if (!S_ISREG(there->st_mode)) {
                throw Failure(kFailed, target_->path(), "not a regular file", "name another file");
            }
        }
        // What nobody else may read is in it as well.
        file_ = std::make_unique<TemporaryFile>(*target_);
    }

    void Write(std::string_view text) {
        if (file_) {
            const auto* const bytes = reinterpret_cast<const std::uint8_t*>(text.data());
            file_->file().Write(end_, ByteView(bytes, text.size()));
            end_ += text.size();
            return;
        }
        std::cout.write(text.data(), static_cast<std::streamsize>(text.size()));
        if (std::cout) return;
        throw Failure(kFailed, "standard output", "it could not be written",
                      "free some space, or write it elsewhere");
    }

    void Finish() {
        if (!file_) return;
        file_->file().Sync();
        if (force_) {
            file_->GiveToTarget();
        } else {
            file_->GiveToNewTarget();
        }
        target_->directory->Sync();
    }

 private:
    bool force_;
    std::optional<Place> target_;
    std::unique_ptr<TemporaryFile> file_;
    std::uint64_t end_ = 0;
};

// With what a terminal might take for commands as octal digits, which mean the same in names and in
// values.
std::string ForTerminals(const std::string& text) {
    if (IsShownByTerminals(text)) return text;
    std::string shown;
    for (const char c : text) {
        if (c == '\n' || (c >= ' ' && c <= '~')) {
            shown += c;
        } else {
            const auto escape = OctalEscape(static_cast<std::uint8_t>(c));
            shown.append(escape.data(), escape.size());
        }
    }
    return shown;
}

bool HasDotDot(std::string_view path) {
    return path == ".." || path.starts_with("../") || path.ends_with("/..") ||
           path.find("/../") != path.npos;
}

class Saving {
 public:
    explicit Saving(const SaveOptions& options)
        : options_(options),
          encoding_(EncodingNamed(options.encoding)),
          to_terminal_(!options.file && ::isatty(STDOUT_FILENO) == 1),
          // Nothing else comes where the text goes.
          job_options_{
              .paths = {}, .recursive = options.recursive && options.file, .json = options.json},
          job_("saving", "saved", job_options_),
          output_(options) {}

    ExitStatus Run() {
        PathReader reader(options_.paths, [this](const Failure& failure) { AddFailure(failure); });
        while (const auto next = reader.Next()) {
            const std::string& path = *next;
            if (HasDotDot(path)) {
                AddFailure(Failure(kFailed, path, "nothing that a text says of \"..\" is restored",
                                   "give the command in another directory"));
                continue;
            }
            VisitObjects({.paths = {{path}}, .recursive = options_.recursive},
                         {.work =
                              [&](const Object& object, const std::string&, const Tell&) {
                                  Do(object, path);
                                  return true;
                              },
                          .on_failure = [this](const std::string&,
                                               const Failure& failure) { AddFailure(failure); },
                          .enters = [this](const Object&) { return !job_.stopped(); },
                          .on_named = [this](const Object& object) { named_ = object.path(); }});
        }
        if (!job_.stopped()) output_.Finish();
        return job_.Finish();
    }

 private:
    // All that can go wrong is that something is not in the text.
    void AddFailure(const Failure& failure) {
        job_.AddFailure(failure.subject(), Incomplete(kFailed, failure.subject(), failure.cause(),
                                                      "what else there is has been saved"));
    }

    void Do(const Object& object, const std::string& given) {
        if (job_.stopped()) return;
        if (options_.file) job_.ShowProgress(object.path());
        std::string text;
        try {
            text = TextOf(object, PathInText(object, given));
        } catch (const Failure& failure) {
            if (!options_.recursive || !HasGone(object.place, failure)) AddFailure(failure);
            return;
        }
        // Nothing more can be said where this cannot be written.
        if (!text.empty()) output_.Write(to_terminal_ ? ForTerminals(text) : text);
        job_.AddDone();
    }

    // As it was given, and below that; as getfattr has it, without what makes it absolute.
    std::string PathInText(const Object& object, const std::string& given) {
        const std::string path = object.path();
        std::string below = path.substr(named_ == "/" ? 0 : named_.size());
        std::string text = given;
        while (text.size() > 1 && text.ends_with('/')) text.pop_back();
        if (text == "/" && !below.empty()) text.clear();
        text += below;
        if (options_.absolute_names) return text;
        const bool absolute = text.starts_with('/');
        if (absolute && !told_) {
            job_.AddNote(
                "paths stand without the '/' at their beginning: restore them with --directory /, "
                "or save them with --absolute-names");
            told_ = true;
        }
        std::size_t from = absolute || text.starts_with("./") ? text.find('/') : 0;
        from = text.find_first_not_of('/', from);
        return from == std::string::npos ? "." : text.substr(from);
    }

    std::string TextOf(const Object& object, const std::string& path) {
        RequireParent(object);
        if (object.keeping() == Keeping::kNone) throw NoStore(object);
        const Metadata metadata = ReadMetadata(object, Sidecars::Services::kFind);
        for (const Failure& problem : metadata.problems) AddFailure(problem);
        std::vector<Missing> missing;
        std::string lines;
        for (const SavedItem& item : SavedItems(metadata, &missing)) {
            const std::size_t before = lines.size();
            try {
                AddLine(item, &lines);
            } catch (const Failure& failure) {
                lines.resize(before);
                missing.push_back({item.item, failure.cause()});
            }
        }
        for (const Missing& one : missing) {
            AddFailure(
                Failure(kFailed, object.path(), one.item + " is not saved: " + one.reason, ""));
        }
        if (lines.empty()) return {};
        std::string text(kObjectLine);
        PutTextName(TextName::kPath, path, [&](std::string_view part) { text += part; });
        return text + '\n' + lines + '\n';
    }

    void AddLine(const SavedItem& item, std::string* lines) const {
        const auto put = [&](std::string_view part) { *lines += part; };
        PutTextName(TextName::kAttribute, item.attribute, put);
        put("=");
        TextValueWriter value(encoding_ ? *encoding_ : BestFor(item.value), put);
        InPieces(item.value, [&](const Bytes& piece) { value.Write(piece); });
        value.End();
        put("\n");
    }

    const SaveOptions& options_;
    std::optional<TextEncoding> encoding_;
    bool to_terminal_;
    JobOptions job_options_;
    Job job_;
    TextOutput output_;
    std::string named_;  // the path of what is walked
    bool told_ = false;
};

}  // namespace

ExitStatus Save(const SaveOptions& options) {
    if (options.json && !options.file) {
        throw Failure(kFailed, "--json", "standard output cannot have both the text and JSON",
                      "name a file with --output");
    }
    return Saving(options).Run();
}

}  // namespace mavoea::tool
