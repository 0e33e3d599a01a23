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
    std::cerr << "mavoea: " << question << ' ' << std::flush;
    std::string answer;
    while (!stopped()) {
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

bool Job::MayBeLost(bool writable, const std::string& question) {
    if (options_.consent == Consent::kAsk) return Ask(question);
    const bool asks =
        options_.consent == Consent::kUsual && ::isatty(STDIN_FILENO) == 1 && !writable;
    return !asks || Ask("it is write-protected: " + question);
}

void Job::AddDone(const std::string& path, const std::string& line) {
    ++done_;
    if (options_.verbose && options_.json) lines_.push_back(line);
    if (options_.verbose && !options_.json) {
        progress_.Clear();
        std::cout << line << '\n';
    }
    ShowProgress(path);
}

void Job::AddBytes(std::uint64_t bytes) {
    bytes_ += bytes;
    has_bytes_ = true;
    ShowProgress(path_);
}

void Job::AddFailure(const std::string& path, const Failure& failure) {
    failures_.push_back({path, failure.what()});
    status_ = std::max(status_, failure.status());
}

void Job::ShowProgress(const std::string& path) {
    path_ = path;
    progress_.Show(Counts(), path);
}

bool Job::stopped() const { return Interrupted() != 0; }

std::string Job::Counts() const {
    std::string text = std::to_string(done_) + ' ' + done_word_;
    if (has_bytes_) text += " (" + std::to_string(bytes_) + " bytes)";
    if (skipped_ > 0) text += ", " + std::to_string(skipped_) + " skipped";
    return text + ", " + std::to_string(failures_.size()) + " failed";
}

ExitStatus Job::Finish() {
    progress_.Clear();
    if (options_.json) {
        PrintJson();
    } else {
        PrintText();
    }
    for (const FailedObject& failed : failures_) Report(failed.message);
    if (!stopped()) return status_;
    Report("interrupted: " + Counts() + "; what is left is as it was, give the command again");
    constexpr int kSignalled = 128;
    return static_cast<ExitStatus>(kSignalled + Interrupted());
}

void Job::PrintText() const {
    if (options_.recursive || options_.paths.size() > 1) std::cout << Counts() << '\n';
    for (const std::string& note : notes_) Note(note);
}

void Job::PrintJson() const {
    Json json;
    json.Set("task", doing_);
    json.Set("done", done_);
    json.Set("skipped", skipped_);
    if (has_bytes_) json.Set("bytes", bytes_);
    json.Set("failed", failures_.size());
    json.Set("interrupted", stopped());
    if (options_.verbose) SetMessages(json, "lines", lines_);
    SetMessages(json, "notes", notes_);
    SetFailures(json, failures_);
    Print(json);
}

std::string Quoted(const std::string& path) { return '\'' + Printable(path) + '\''; }

const char* NameOfType(unsigned mode) {
    switch (mode & S_IFMT) {
        case S_IFREG:
            return "regular file";
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
