#include "tools/say/job.h"

#include <poll.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <iostream>

#include "tools/say/interrupt.h"
#include "tools/say/output.h"
#include "tools/say/text.h"

namespace mavoea::tool {

Job::Job(const char* doing, const char* done, const JobOptions& options)
    : doing_(doing), done_word_(done), options_(options), progress_(doing) {
    WatchForInterrupts();
}

bool Job::Ask(const std::string& question) {
    constexpr int kWait = 100;  // milliseconds
    progress_.Clear();
    std::cout.flush();
    std::cerr << Speaker() << ": " << question << ' ' << std::flush;
    std::string answer;
    while (!stopped() && !options_.lists_on_input()) {
        pollfd input = {STDIN_FILENO, POLLIN, 0};
        const int ready = ::poll(&input, 1, kWait);
        if (ready == 0 || (ready < 0 && errno == EINTR)) continue;
        char c = 0;
        if (::read(STDIN_FILENO, &c, 1) != 1 || c == '\n') {
            return answer.starts_with('y') || answer.starts_with('Y');
        }
        answer.push_back(c);
    }
    std::cerr << '\n';
    return false;
}

void Job::Say(const std::string& line) {
    if (!options_.verbose) return;
    if (options_.json) return lines_.push_back(line);
    progress_.Clear();
    std::cout << line << '\n';
}

void Job::AddBytes(std::uint64_t bytes) {
    bytes_ += bytes;
    has_bytes_ = true;
    ShowProgress(path_);
}

void Job::AddFailure(const std::string& path, const Failure& failure) {
    ++failures_;
    const bool incomplete = dynamic_cast<const Incomplete*>(&failure) != nullptr;
    if (!incomplete) status_ = kRefused;
    if (incomplete && status_ == kSuccess) status_ = kFailed;
    progress_.Clear();
    Report(failure);
    if (options_.json) failed_.push_back({path, failure.what()});
}

void Job::AddNote(const std::string& note) {
    if (options_.json) return notes_.push_back(note);
    progress_.Clear();
    Note(note);
}

void Job::AddWarning(const std::string& warning) {
    if (options_.json) return notes_.push_back(warning);
    progress_.Clear();
    Report("warning: " + warning);
}

void Job::ShowProgress(const std::string& path) {
    path_ = path;
    if (wants_progress()) progress_.Show(Counts(), path, done_ + skipped_ + failures_);
}

bool Job::stopped() const { return Interrupted() != 0; }

std::string Job::Counts() const {
    std::string text = std::to_string(done_) + ' ' + done_word_;
    if (has_bytes_) text += " (" + std::to_string(bytes_) + " bytes)";
    if (skipped_ > 0) text += ", " + std::to_string(skipped_) + " skipped";
    return text + ", " + std::to_string(failures_) + " failed";
}

ExitStatus Job::Finish() {
    progress_.Clear();
    // Scripts that read standard output have not asked for counts.
    const bool counts = (options_.recursive || options_.several()) && !SpeaksAsAnother() &&
                        (options_.verbose || ::isatty(STDOUT_FILENO) == 1);
    if (options_.json) {
        PrintJson();
    } else if (counts) {
        std::cout << Counts() << '\n';
    }
    if (!stopped()) return status_;
    Report("interrupted: " + Counts() + "; what is left is as it was, give the command again");
    constexpr int kSignalled = 128;
    return static_cast<ExitStatus>(kSignalled + Interrupted());
}

void Job::PrintJson() const {
    Json json;
    json.Set("task", doing_);
    json.Set("done", done_);
    json.Set("skipped", skipped_);
    if (has_bytes_) json.Set("bytes", bytes_);
    json.Set("failed", failures_);
    json.Set("interrupted", stopped());
    if (options_.verbose) SetMessages(json, "lines", lines_);
    SetMessages(json, "notes", notes_);
    SetFailures(json, failed_);
    Print(json);
}

std::string Quoted(const std::string& path) { return '\'' + Printable(path) + '\''; }

const char* NameOfType(const struct stat& info) {
    switch (info.st_mode & S_IFMT) {
        case S_IFREG:
            return info.st_size == 0 ? "regular empty file" : "regular file";
        case S_IFDIR:
            return "directory";
        case S_IFLNK:
            return "symbolic link";
        case S_IFIFO:
            return "fifo";
        case S_IFSOCK:
            return "socket";
        case S_IFBLK:
            return "block special file";
        case S_IFCHR:
            return "character special file";
        default:
            return "file";
    }
}

}  // namespace mavoea::tool
