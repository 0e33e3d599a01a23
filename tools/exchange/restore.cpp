#include "tools/exchange/restore.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <functional>
#include <map>
#include <memory>
#include <set>
#include <string_view>
#include <utility>
#include <vector>

#include "format/attribute_text.h"
#include "format/ea_stream.h"
#include "tools/exchange/taking_over.h"
#include "tools/place/volume.h"
#include "tools/say/interrupt.h"
#include "tools/say/job.h"
#include "tools/say/text.h"
#include "tools/store/saved.h"
#include "tools/store/sidecars.h"
#include "tools/transfer/pending.h"

namespace mavoea::tool {
namespace {

// ---- The text -----------------------------------------------------------------------------------

struct TextLine {
    std::string text;  // without its end
    std::uint64_t number = 0;
    bool ended = true;      // by a line feed, and not by the text's end
    bool overlong = false;  // only its beginning is in `text`
};

// Reads lines, and holds one of them in memory.
class LineReader {
 public:
    explicit LineReader(const std::string& file) : file_(Open(file)), name_(NameOf(file)) {}

    const std::string& name() const { return name_; }

    // False at the end, or when the work is interrupted. Throws Failure.
    bool Next(TextLine* line) {
        line->text.clear();
        line->overlong = false;
        line->ended = false;
        bool any = false;
        while (!line->ended && (at_ < size_ || Fill())) {
            any = true;
            const char* const begin = buffer_.data() + at_;
            const char* const end = buffer_.data() + size_;
            const char* const feed = std::find(begin, end, '\n');
            Append(std::string_view(begin, static_cast<std::size_t>(feed - begin)), line);
            line->ended = feed != end;
            at_ += static_cast<std::size_t>(feed - begin) + (line->ended ? 1 : 0);
        }
        while (line->ended && line->text.ends_with('\r')) line->text.pop_back();
        if (any) line->number = ++number_;
        return any;
    }

 private:
    // Two digits for each byte of the largest value, and a name of which each byte takes four.
    static constexpr std::size_t kMost = 2 * kSavedValueMax + 4 * kNameSizeMax + 64;

    static File Open(const std::string& file) {
        if (file != "-") return File::OpenAny(file);
        const int fd = ::fcntl(STDIN_FILENO, F_DUPFD_CLOEXEC, 0);
        if (fd < 0) throw SystemFailure("standard input", errno);
        return {fd, "standard input"};
    }
    static std::string NameOf(const std::string& file) {
        return file == "-" ? "standard input" : file;
    }

    static void Append(std::string_view part, TextLine* line) {
        const std::size_t room = kMost - line->text.size();
        if (part.size() > room) line->overlong = true;
        line->text += part.substr(0, room);
    }

    bool Fill() {
        constexpr int kWait = 100;  // milliseconds
        at_ = size_ = 0;
        while (Interrupted() == 0) {
            pollfd input = {file_.fd(), POLLIN, 0};
            const int ready = ::poll(&input, 1, kWait);
            if (ready == 0 || (ready < 0 && errno == EINTR)) continue;
            const ssize_t size = ::read(file_.fd(), buffer_.data(), buffer_.size());
            if (size < 0 && (errno == EINTR || errno == EAGAIN)) continue;
            if (size < 0) throw SystemFailure(name_, errno);
            size_ = static_cast<std::size_t>(size);
            return size > 0;
        }
        return false;
    }

    File file_;
    std::string name_;
    std::vector<char> buffer_ = std::vector<char>(std::size_t{1} << 16);
    std::size_t at_ = 0;
    std::size_t size_ = 0;
    std::uint64_t number_ = 0;
};

// An object as the text has it.
struct TextObject {
    std::string path;
    SavedAttributes attributes;
};

// Reads objects, one at a time.
class ObjectReader {
 public:
    explicit ObjectReader(const std::string& file) : lines_(file) {}

    // Told what is damaged; the object stays as it is.
    using OnFailure = std::function<void(const Failure&)>;

    // None at the end.
    std::optional<TextObject> Next(const OnFailure& on_failure) {
        for (;;) {
            if (!header_ && !FindObject(on_failure)) return std::nullopt;
            if (auto object = ReadObject(on_failure)) return object;
        }
    }

    // Whether the text ended where getfattr would have gone on.
    bool cut() const { return cut_; }

 private:
    using Kind = AttributeTextLine::Kind;

    bool FindObject(const OnFailure& on_failure) {
        bool told = false;
        while (lines_.Next(&line_)) {
            const Kind kind = ParseAttributeTextLine(line_.text).kind;
            cut_ = !line_.ended;
            if (kind == Kind::kObject) {
                header_ = true;
                return true;
            }
            if (kind != Kind::kAttribute || told) continue;
            on_failure(Wrong("no object is named before this line, by \"# file: \""));
            told = true;
        }
        return false;
    }

    // `line_` begins it. None where it is damaged, which has been told.
    std::optional<TextObject> ReadObject(const OnFailure& on_failure) {
        header_ = false;
        std::optional<Failure> failure;
        const auto fail = [&](const std::string& problem) {
            if (!failure) failure = Wrong(problem);
        };
        TextObject object = {{}, SavedAttributes(Place())};
        std::uint64_t total = 0;
        object.path = Decoded(ParseAttributeTextLine(line_.text).name, "the path", fail);
        if (!line_.ended) fail(kUnended);
        cut_ = true;
        while (lines_.Next(&line_)) {
            const AttributeTextLine parts = ParseAttributeTextLine(line_.text);
            if (parts.kind == Kind::kEmpty) {
                cut_ = false;
                break;
            }
            if (parts.kind == Kind::kObject) {
                header_ = true;
                break;
            }
            if (parts.kind == Kind::kAttribute && !failure) {
                AddAttribute(parts, &object.attributes, &total, fail);
            }
        }
        if (!failure) return object;
        on_failure(*failure);
        return std::nullopt;
    }

    template <class Fail>
    void AddAttribute(const AttributeTextLine& parts, SavedAttributes* attributes,
                      std::uint64_t* total, Fail fail) {
        constexpr std::size_t kEach = 256;  // what an attribute takes besides, about
        if (line_.overlong) return fail("the line is longer than that of any value");
        if (!line_.ended && !IsWholeTextValue(parts.value)) return fail(kUnended);
        const std::string name = Decoded(parts.name, "the attribute's name", fail);
        Bytes value(parts.value.size());
        const DecodedText decoded = DecodeTextValue(parts.value, value);
        if (decoded.problem != nullptr) return fail(decoded.problem);
        value.resize(decoded.size);
        value.shrink_to_fit();
        *total += decoded.size + name.size() + kEach;
        if (decoded.size > kSavedValueMax || *total > 2 * kSavedObjectMax) {
            return fail("the object has more than a text may hold of one");
        }
        attributes->Set(name, std::move(value), decoded.encoding);
    }

    template <class Fail>
    static std::string Decoded(std::string_view text, const char* what, Fail fail) {
        Bytes bytes(text.size());
        const DecodedText decoded = DecodeTextName(text, bytes);
        if (decoded.problem != nullptr) fail(std::string(what) + ": " + decoded.problem);
        return {bytes.begin(), bytes.begin() + static_cast<std::ptrdiff_t>(decoded.size)};
    }

    std::string Place() const { return lines_.name() + ':' + std::to_string(line_.number); }
    Failure Wrong(const std::string& problem) const {
        return {kFailed, Place(), problem, "mend the line; its object stays as it is"};
    }

    static constexpr const char* kUnended = "the text ends within this line";

    LineReader lines_;
    TextLine line_;
    bool header_ = false;  // `line_` begins an object
    bool cut_ = false;
};

// ---- Places -------------------------------------------------------------------------------------

// Finds what the paths of a text lead to: below one directory, and through no link.
class PathFinder {
 public:
    PathFinder(const std::string& directory, bool absolute_names)
        : top_(PlaceOf(directory, Shown::kWhole)), absolute_names_(absolute_names) {
        inside_ = top_.Open();
    }

    // Throws Failure.
    Object Find(const std::string& path) {
        std::vector<std::string> names = NamesIn(path);
        const bool from_root = path.starts_with('/');
        if (names.empty()) return At(from_root ? PlaceOf("/", Shown::kWhole) : top_);
        const std::string last = names.back();
        names.pop_back();
        // Most of what a text has is in the directory of what stood before it.
        if (!last_ || last_root_ != from_root || last_names_ != names) {
            DirectoryRef in = from_root ? PlaceOf("/", Shown::kWhole).Open() : inside_;
            for (const std::string& name : names) in = in->OpenIn(name);
            Settle(in);
            last_ = in;
            last_root_ = from_root;
            last_names_ = names;
        }
        return At({last_, last});
    }

 private:
    // What a run that was killed has left there, once.
    void Settle(const DirectoryRef& directory) {
        const struct stat info = directory->Status();
        if (settled_.emplace(info.st_dev, info.st_ino).second) (void)SettlePending(directory);
    }

    std::vector<std::string> NamesIn(const std::string& path) const {
        const auto refuse = [&](const char* cause, const char* advice) {
            throw Failure(kFailed, path, cause, advice);
        };
        if (path.starts_with('/') && !absolute_names_) {
            refuse("the path in the text is absolute",
                   "allow such paths with --absolute-names, if you trust the text");
        }
        std::vector<std::string> names;
        for (std::size_t at = 0; at < path.size();) {
            const std::size_t end = std::min(path.find('/', at), path.size());
            const std::string name = path.substr(at, end - at);
            at = end + 1;
            if (name.empty() || name == ".") continue;
            if (name == "..") {
                refuse("the path in the text leads upwards", "name it from another directory");
            }
            if (name == kEaDirName || IsTemporaryName(name)) {
                refuse("what it leads to is metadata itself", "name the object");
            }
            names.push_back(name);
        }
        return names;
    }

    static Object At(const Place& place) {
        const struct stat info = StatusOf(place);
        const mode_t type = info.st_mode & S_IFMT;
        Object object = ObjectAt(place, type);
        if (!object.is_root() && IsMetadata(*place.directory, {place.name, type}, object.type)) {
            throw Failure(kFailed, object.path(), "what it leads to is metadata itself",
                          "name the object");
        }
        return object;
    }

    Place top_;
    DirectoryRef inside_;
    bool absolute_names_;
    DirectoryRef last_;
    bool last_root_ = false;
    std::vector<std::string> last_names_;
    std::set<std::pair<dev_t, ino_t>> settled_;
};

// ---- The work -----------------------------------------------------------------------------------

class Restoring {
 public:
    explicit Restoring(const RestoreOptions& options)
        : type_(options.from_type ? TypeFromName(*options.from_type, "--from") : -1),
          job_options_{.paths = {options.file},
                       .recursive = true,
                       .verbose = options.verbose,
                       .json = options.json},
          job_("restoring", "restored", job_options_),
          objects_(options.file),
          places_(options.directory, options.absolute_names) {}

    ExitStatus Run() {
        RequireDescriptorPaths();
        const auto fail = [this](const Failure& failure) { AddFailure(failure); };
        while (!job_.stopped()) {
            auto object = objects_.Next(fail);
            if (!object) break;
            // It is not known to be all there.
            if (job_.stopped()) break;
            try {
                Do(*object);
            } catch (const Failure& failure) {
                AddFailure(failure);
            }
        }
        for (const auto& [name, count] : others_) {
            job_.AddNote(NameOfAttribute(name) + " of " + std::to_string(count) +
                         (count == 1 ? " object" : " objects") +
                         " is no metadata of Macs or SMB clients, and was left out");
        }
        if (objects_.cut() && !job_.stopped()) {
            job_.AddNote(
                "the text ends without the empty line that follows each object: something of it "
                "may "
                "be missing");
        }
        return job_.Finish();
    }

 private:
    // All that can go wrong is that metadata does not arrive.
    void AddFailure(const Failure& failure) {
        if (dynamic_cast<const Incomplete*>(&failure) != nullptr) {
            return job_.AddFailure(failure.subject(), failure);
        }
        const std::string sentence = failure.what();
        const std::string brief = failure.brief();
        const std::string advice =
            sentence.size() > brief.size() + 2 ? sentence.substr(brief.size() + 2) : std::string();
        job_.AddFailure(failure.subject(),
                        Incomplete(kFailed, failure.subject(), failure.cause(), advice));
    }

    void Do(const TextObject& text) {
        job_.ShowProgress(text.path);
        ReadBack read = ReadSaved(text.attributes, type_);
        for (const std::string& name : read.others) ++others_[name];
        for (const Failure& problem : read.metadata.problems) AddFailure(problem);
        Metadata& metadata = read.metadata;
        metadata.problems.clear();
        SortOut(&metadata);
        const bool any = metadata.HasAny() || metadata.locked || metadata.hidden ||
                         metadata.system || metadata.archived || metadata.created;
        const Object object = places_.Find(text.path);
        if (any) TakeOver(object, metadata);
        job_.AddDone();
        job_.Say(Quoted(object.path()));
    }

    void TakeOver(const Object& object, const Metadata& metadata) {
        SettleNamed(object);
        TakingOver work(object);
        work.Run(metadata);
        for (const std::string& note : work.notes()) job_.AddNote(note);
        if (work.lost().empty()) return;
        throw Loss(kFailed, object.path(), "not all of it was restored: " + Joined(work.lost()),
                   "keep the text, or what it was made of");
    }

    int type_;
    JobOptions job_options_;
    Job job_;
    ObjectReader objects_;
    PathFinder places_;
    std::map<std::string, std::uint64_t> others_;  // attributes left out, and of how many objects
};

}  // namespace

ExitStatus Restore(const RestoreOptions& options) { return Restoring(options).Run(); }

}  // namespace mavoea::tool
