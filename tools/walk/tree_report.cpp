#include "tools/walk/tree_report.h"

#include <algorithm>
#include <iostream>
#include <string_view>
#include <utility>

#include "tools/say/text.h"

namespace mavoea::tool {

void TreeReport::Show(const Place& place) {
    if (progress_.wanted()) progress_.Show(StatusText(), place.path(), Total() + failures_.size());
}

void TreeReport::Add(const std::string& path, Outcome outcome) {
    const auto index = static_cast<std::size_t>(outcome);
    ++counts_[index];
    if (each_ == Each::kNotTold) return;
    constexpr std::string_view kWith = "with ";
    std::string_view word = WordsByOutcome()[index];
    if (word.starts_with(kWith)) word.remove_prefix(kWith.size());
    std::string line = Printable(path) + ": " + std::string(word);
    if (each_ == Each::kInJson) return lines_.push_back(std::move(line));
    progress_.Clear();
    std::cout << line << '\n';
}

void TreeReport::AddFailure(const std::string& path, ExitStatus status,
                            const std::string& message) {
    failures_.push_back({path, message});
    status_ = std::max(status_, status);
}

ExitStatus TreeReport::Finish(bool json) {
    progress_.Clear();
    if (json) {
        PrintJson();
    } else {
        PrintText();
    }
    return status_;
}

std::string TreeReport::StatusText() const {
    const std::string done = std::to_string(Total()) + " done";
    return failures_.empty() ? done : done + ", " + std::to_string(failures_.size()) + " failed";
}

// The words of the outcomes that can be, in the order of Outcome.
std::array<const char*, 3> TreeReport::WordsByOutcome() const {
    return {words_.done, words_.current, words_.nothing};
}

void TreeReport::PrintText() const {
    for (std::size_t i = 0; i < counts_.size(); ++i) {
        const char* const word = WordsByOutcome()[i];
        if (word != nullptr) std::cout << counts_[i] << ' ' << word << ", ";
    }
    std::cout << failures_.size() << " failed\n";
    for (const std::string& note : notes_) Note(note);
    for (const FailedObject& failed : failures_) Report(failed.message);
}

void TreeReport::PrintJson() const {
    constexpr std::array<const char*, 3> kKeys = {"done", "current", "nothing"};
    Json json;
    json.Set("task", words_.doing);
    for (std::size_t i = 0; i < counts_.size(); ++i) {
        if (WordsByOutcome()[i] != nullptr) json.Set(kKeys[i], counts_[i]);
    }
    json.Set("failed", failures_.size());
    if (each_ == Each::kInJson) SetMessages(json, "lines", lines_);
    SetMessages(json, "notes", notes_);
    SetFailures(json, failures_);
    Print(json);
    for (const FailedObject& failed : failures_) Report(failed.message);
}

}  // namespace mavoea::tool
