#include "tools/walk/journal.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <bit>
#include <cerrno>
#include <chrono>
#include <cstdlib>
#include <thread>

#include "include/mavoea.h"
#include "tools/say/messages.h"
#include "tools/say/text.h"
#include "util/fnv.h"

namespace mavoea::tool {
namespace {

// The first word of each line, behind its checksum.
// WORK REMARK, escaped. Results are as this version and this machine have them.
const std::string& Title() {
    static const std::string title =
        "mavoea-log-" + std::to_string(MAVOEA_VERSION) +
        (std::endian::native == std::endian::little ? "-little" : "-big");
    return title;
}
constexpr std::string_view kRun = "run";    // BOOT: from here on, while the system of that id runs
constexpr std::string_view kDone = "done";  // RESULT KEY: in digits, and escaped
constexpr std::string_view kDisk = "disk";  // OFFSET: the lines before that are on disk

constexpr std::size_t kChecksumDigits = 16;

std::string Line(std::string_view word, const std::string& rest) {
    const std::string text = std::string(word) + ' ' + rest;
    return HexNumber(Fnv::Of(text), kChecksumDigits).substr(2) + ' ' + text + '\n';
}

// What stands behind the checksum; none when that is not of it.
std::optional<std::string_view> Checked(std::string_view line) {
    if (line.size() <= kChecksumDigits || line[kChecksumDigits] != ' ') return std::nullopt;
    const std::string_view text = line.substr(kChecksumDigits + 1);
    const std::string sum = HexNumber(Fnv::Of(text), kChecksumDigits).substr(2);
    return line.starts_with(sum) ? std::optional(text) : std::nullopt;
}

// Takes a word and the blank behind it off.
std::string_view TakeWord(std::string_view* text) {
    const std::string_view word = text->substr(0, text->find(' '));
    text->remove_prefix(std::min(word.size() + 1, text->size()));
    return word;
}

// A word may not have blanks.
std::string AsWord(const std::string& text) {
    std::string word = Printable(text);
    for (std::size_t at = 0; (at = word.find(' ', at)) != std::string::npos;) {
        word.replace(at, 1, "\\x20");
    }
    return word.empty() ? "-" : word;
}

// Another one each time that the system starts.
std::string BootId() {
    constexpr const char* kPath = "/proc/sys/kernel/random/boot_id";
    try {
        const Bytes bytes = File::OpenAny(kPath).Read(0, 64);
        std::string id(bytes.begin(), bytes.end());
        id.erase(std::remove(id.begin(), id.end(), '\n'), id.end());
        if (!id.empty()) return id;
    } catch (const Failure&) {  // who cannot tell takes what is on disk only
    }
    return "unknown";
}

// Processes of a run that was killed end a little later than that.
bool LockSoon(int fd) {
    constexpr int kTries = 100;
    constexpr std::chrono::milliseconds kPause(20);
    for (int attempt = 0; attempt < kTries; ++attempt) {
        if (::flock(fd, LOCK_EX | LOCK_NB) == 0) return true;
        std::this_thread::sleep_for(kPause);
    }
    return false;
}

Failure NoLog(const std::string& path) {
    return {kFailed, path, "it is no log of this tool", "begin a new one with --log FILE"};
}

}  // namespace

Journal::Journal(const LogFile& file, const std::string& work, const std::string& remark)
    : resumed_(file.resumes) {
    constexpr int kFlags = O_RDWR | O_APPEND | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC;
    constexpr mode_t kMode = S_IRUSR | S_IWUSR;
    const int make = resumed_ ? 0 : O_CREAT | O_EXCL;
    const int fd = ::open(file.path.c_str(), kFlags | make, kMode);
    if (fd < 0 && errno == EEXIST) {
        throw Failure(kFailed, file.path, "it is there already",
                      "go on with it by --resume, or name another one");
    }
    if (fd < 0) throw SystemFailure(file.path, errno);
    file_ = std::make_unique<const File>(fd, file.path);
    if (!LockSoon(fd)) {
        throw Failure(kFailed, file.path, "another run writes to it", "wait until that has ended");
    }
    if (resumed_) Resume(work);
    // A run may have been killed before it wrote anything.
    if (file_->Size() == 0) Begin(work, remark);
    Write(Line(kRun, BootId()));
    file_->Sync();
}

void Journal::Begin(const std::string& work, const std::string& remark) {
    remark_ = remark;
    Write(Line(Title(), AsWord(work) + ' ' + AsWord(remark)));
}

void Journal::Resume(const std::string& work) {
    const struct stat info = file_->Status();
    if (!S_ISREG(info.st_mode)) throw NoLog(file_->path());
    // Whoever wrote it decides what is left out; and no other file is written to.
    constexpr mode_t kOthers = S_IWGRP | S_IWOTH;
    if (info.st_uid != ::geteuid() || (info.st_mode & kOthers) != 0 || info.st_nlink != 1) {
        throw Failure(kFailed, file_->path(), "others may have written to it",
                      "go on with a log that is this user's own");
    }
    if (info.st_size > 0) Read(work);
    // Behind a line that was cut short.
    const std::uint64_t size = file_->Size();
    if (size > 0 && file_->Read(size - 1, 1).front() != '\n') Write("\n");
}

// Of each run what was on disk counts; all of it when the system has not gone down since.
void Journal::Read(const std::string& work) {
    constexpr std::uint64_t kPiece = std::uint64_t{1} << 20;
    const std::string boot = BootId();
    bool has_title = false;
    bool counts = false;    // what the run has written until it ended
    std::size_t first = 0;  // line of the run
    std::uint64_t on_disk = 0;
    const auto end_run = [&] {
        if (counts) return;
        const auto lost = [&](const auto& line) { return line.second >= on_disk; };
        lines_.erase(
            std::remove_if(lines_.begin() + static_cast<std::ptrdiff_t>(first), lines_.end(), lost),
            lines_.end());
    };
    const auto take = [&](std::string_view line, std::uint64_t offset) {
        auto text = Checked(line);
        if (!text) return;
        const std::string_view word = TakeWord(&*text);
        if (!has_title) {
            const auto whose = FromPrintable(TakeWord(&*text));
            const auto remark = FromPrintable(TakeWord(&*text));
            if (word != Title() || !whose || !remark) throw NoLog(file_->path());
            if (*whose != work) {
                throw Failure(kFailed, file_->path(), "it is the log of other work: " + *whose,
                              "give the command as it was, or begin a new log");
            }
            has_title = true;
            remark_ = *remark == "-" ? std::string() : *remark;
        } else if (word == kRun) {
            end_run();
            first = lines_.size();
            counts = *text == boot && boot != "unknown";
        } else if (word == kDisk) {
            on_disk = std::strtoull(std::string(*text).c_str(), nullptr, 10);
        } else if (word == kDone) {
            (void)TakeWord(&*text);
            lines_.emplace_back(Fnv::Of(*text), offset);
        }
    };
    std::string pending;
    std::uint64_t offset = 0;
    for (std::uint64_t at = 0;;) {
        const Bytes bytes = file_->Read(at, kPiece);
        if (bytes.empty()) break;
        at += bytes.size();
        pending.append(bytes.begin(), bytes.end());
        const std::string_view lines = pending;
        std::size_t begin = 0;
        for (std::size_t end = 0; (end = pending.find('\n', begin)) != std::string::npos;) {
            take(lines.substr(begin, end - begin), offset);
            offset += end - begin + 1;
            begin = end + 1;
        }
        pending.erase(0, begin);
    }
    if (!pending.empty()) take(pending, offset);
    if (!has_title) throw NoLog(file_->path());
    end_run();
    std::stable_sort(lines_.begin(), lines_.end(),
                     [](const auto& one, const auto& other) { return one.first < other.first; });
}

std::optional<std::string> Journal::Find(const std::string& key) const {
    if (key.empty()) return std::nullopt;
    const std::string wanted = Printable(key);
    const std::uint64_t hash = Fnv::Of(wanted);
    auto line =
        std::upper_bound(lines_.begin(), lines_.end(), hash,
                         [](std::uint64_t one, const auto& other) { return one < other.first; });
    // The last one counts.
    while (line != lines_.begin() && (--line)->first == hash) {
        constexpr std::uint64_t kUsual = 4096;
        std::string text;
        for (std::uint64_t size = kUsual;; size *= 2) {
            const Bytes bytes = file_->Read(line->second, size);
            text.assign(bytes.begin(), std::find(bytes.begin(), bytes.end(), '\n'));
            if (text.size() < bytes.size() || bytes.size() < size) break;
        }
        auto rest = Checked(text);
        if (!rest) continue;
        (void)TakeWord(&*rest);
        const auto result = ParseHex(TakeWord(&*rest));
        if (*rest != wanted || !result) continue;
        return std::string(result->begin(), result->end());
    }
    return std::nullopt;
}

void Journal::Add(const std::string& key, std::string_view result) const {
    if (key.empty() || is_full_) return;
    const auto* const bytes = reinterpret_cast<const std::uint8_t*>(result.data());
    Write(Line(kDone, HexDigits({bytes, result.size()}) + ' ' + Printable(key)));
}

void Journal::NoteDone(std::uint64_t count, const std::function<void()>& sync) {
    constexpr std::uint64_t kBatch = 1024;
    done_ += count;
    if (done_ >= kBatch) Sync(sync);
}

void Journal::Sync(const std::function<void()>& sync) {
    const std::uint64_t end = file_->Size();
    sync();
    if (is_full_) return;
    Write(Line(kDisk, std::to_string(end)));
    file_->Sync();
    done_ = 0;
}

// In one call: lines of several processes do not mix.
void Journal::Write(const std::string& text) const {
    ssize_t size = 0;
    do {
        size = ::write(file_->fd(), text.data(), text.size());
    } while (size < 0 && errno == EINTR);
    if (size == static_cast<ssize_t>(text.size())) return;
    is_full_ = true;
    throw SystemFailure(file_->path(), size < 0 ? errno : ENOSPC);
}

}  // namespace mavoea::tool
