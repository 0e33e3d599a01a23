#include "tools/walk/worker.h"

#include <sys/prctl.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <cstring>
#include <iostream>
#include <streambuf>

#include "tools/say/progress.h"
#include "tools/walk/packing.h"

namespace mavoea::tool {
namespace {

// Where the results of a worker go: into the memory that is shared, in the order in which they
// come, whichever stream they come by.
class Results {
 public:
    Results(int socket, WorkArea* area) : socket_(socket), area_(area) {}

    void Write(ResultKind kind, std::string_view text) {
        constexpr std::size_t kPiece = std::size_t{1} << 15;
        if (kind != kind_) Post();
        kind_ = kind;
        pending_ += text;
        if (pending_.size() >= kPiece) Post();
    }

    void TellOf(std::string_view message) {
        Post();
        Add(ResultKind::kTold, message);
    }

    void EndErrand() {
        Post();
        ++done_;
        Publish();
    }

    void Begin() {
        done_ = 0;
        size_ = 0;
        Publish();
    }

 private:
    void Publish() { area_->state.store({done_, size_}, std::memory_order_release); }

    void Post() {
        // A large one comes in pieces.
        constexpr std::size_t kMost = WorkArea::kResultsSize / 2;
        for (std::size_t at = 0; at < pending_.size(); at += kMost) {
            Add(kind_, {pending_.data() + at, std::min(kMost, pending_.size() - at)});
        }
        pending_.clear();
    }

    void Add(ResultKind kind, std::string_view text) {
        Packer head;
        head.AddNumber(static_cast<std::uint64_t>(kind));
        head.AddText(text);
        if (head.bytes().size() > area_->results.size() - size_) MakeRoom();
        std::memcpy(area_->results.data() + size_, head.bytes().data(), head.bytes().size());
        size_ += head.bytes().size();
    }

    void MakeRoom() {
        Publish();
        if (!SendTurn(socket_, Turn::kFull) || ReceiveTurn(socket_) != Turn::kGoOn) ::_exit(0);
        size_ = 0;  // as the first process has said already
    }

    int socket_;
    WorkArea* area_;
    ResultKind kind_ = ResultKind::kOutput;
    std::string pending_;
    std::size_t size_ = 0;
    std::size_t done_ = 0;
};

class ResultStream final : public std::streambuf {
 public:
    ResultStream(Results* results, ResultKind kind) : results_(results), kind_(kind) {}

 private:
    int_type overflow(int_type c) override {
        const char one = traits_type::to_char_type(c);
        results_->Write(kind_, {&one, 1});
        return c;
    }
    std::streamsize xsputn(const char* text, std::streamsize size) override {
        results_->Write(kind_, {text, static_cast<std::size_t>(size)});
        return size;
    }

    Results* results_;
    ResultKind kind_;
};

// The errands of one request.
class Reading {
 public:
    Reading(const WorkArea& area, std::vector<int> descriptors, const DirectoryRef& former)
        : bytes_({area.request.data(), area.request.size()}) {
        for (std::uint64_t left = bytes_.TakeNumber(); left > 0; --left) {
            const bool is_former = bytes_.TakeNumber() != 0;
            const std::string path(bytes_.TakeText());
            const std::string location(bytes_.TakeText());
            const bool has_location = bytes_.TakeNumber() != 0;
            if (is_former) {
                directories_.push_back(former);
                continue;
            }
            directories_.push_back(
                Directory::Adopt(descriptors.front(), path, location, has_location));
            descriptors.erase(descriptors.begin());
        }
        left_ = bytes_.TakeNumber();
    }

    std::optional<Errand> Next() {
        if (left_ == 0) return std::nullopt;
        --left_;
        const auto kind = static_cast<Errand::Kind>(bytes_.TakeNumber());
        const DirectoryRef& directory = directories_[static_cast<std::size_t>(bytes_.TakeNumber())];
        const auto type = static_cast<mode_t>(bytes_.TakeNumber());
        const Place place = {directory, std::string(bytes_.TakeText())};
        const std::string shown(bytes_.TakeText());
        if (kind == Errand::Kind::kDirectory) return Errand{kind, {place}, type, shown};
        return Errand{kind, ObjectAt(place, type), type, shown};
    }

    DirectoryRef last() const { return directories_.back(); }

 private:
    Unpacker bytes_;
    std::vector<DirectoryRef> directories_;
    std::uint64_t left_ = 0;
};

}  // namespace

bool SendTurn(int socket, Turn turn, const std::vector<int>& descriptors) {
    char code = static_cast<char>(turn);
    iovec data = {&code, 1};
    alignas(cmsghdr) std::array<char, CMSG_SPACE(kDescriptorsMost * sizeof(int))> control{};
    msghdr message = {};
    message.msg_iov = &data;
    message.msg_iovlen = 1;
    if (!descriptors.empty()) {
        message.msg_control = control.data();
        message.msg_controllen = CMSG_SPACE(descriptors.size() * sizeof(int));
        cmsghdr* const head = CMSG_FIRSTHDR(&message);
        head->cmsg_level = SOL_SOCKET;
        head->cmsg_type = SCM_RIGHTS;
        head->cmsg_len = CMSG_LEN(descriptors.size() * sizeof(int));
        std::memcpy(CMSG_DATA(head), descriptors.data(), descriptors.size() * sizeof(int));
    }
    for (;;) {
        if (::sendmsg(socket, &message, MSG_NOSIGNAL) == 1) return true;
        if (errno != EINTR) return false;
    }
}

std::optional<Turn> ReceiveTurn(int socket, std::vector<int>* descriptors) {
    char code = 0;
    iovec data = {&code, 1};
    alignas(cmsghdr) std::array<char, CMSG_SPACE(kDescriptorsMost * sizeof(int))> control{};
    msghdr message = {};
    message.msg_iov = &data;
    message.msg_iovlen = 1;
    message.msg_control = control.data();
    message.msg_controllen = control.size();
    ssize_t size = 0;
    do {
        size = ::recvmsg(socket, &message, MSG_CMSG_CLOEXEC);
    } while (size < 0 && errno == EINTR);
    if (size != 1) return std::nullopt;
    for (cmsghdr* head = CMSG_FIRSTHDR(&message); head != nullptr;
         head = CMSG_NXTHDR(&message, head)) {
        if (head->cmsg_type != SCM_RIGHTS || descriptors == nullptr) continue;
        const std::size_t count = (head->cmsg_len - CMSG_LEN(0)) / sizeof(int);
        descriptors->resize(count);
        std::memcpy(descriptors->data(), CMSG_DATA(head), count * sizeof(int));
    }
    return static_cast<Turn>(code);
}

Request RequestOf(const std::vector<Errand>& errands, std::size_t first, const Directory* former) {
    std::vector<const Directory*> directories;
    Packer packed;
    std::vector<std::size_t> indexes;
    for (std::size_t i = first; i < errands.size(); ++i) {
        const Directory* const directory = errands[i].object.place.directory.get();
        if (directories.empty() || directories.back() != directory) {
            directories.push_back(directory);
        }
        indexes.push_back(directories.size() - 1);
    }
    Request request;
    packed.AddNumber(directories.size());
    for (const Directory* const directory : directories) {
        packed.AddNumber(directory == former ? 1 : 0);
        packed.AddText(directory == former ? std::string() : directory->path());
        packed.AddText(directory == former ? std::string() : directory->location());
        packed.AddNumber(directory->has_location() ? 1 : 0);
        if (directory != former) request.descriptors.push_back(directory->fd());
    }
    packed.AddNumber(indexes.size());
    for (std::size_t i = 0; i < indexes.size(); ++i) {
        const Errand& errand = errands[first + i];
        packed.AddNumber(static_cast<std::uint64_t>(errand.kind));
        packed.AddNumber(indexes[i]);
        packed.AddNumber(errand.type);
        packed.AddText(errand.object.place.name);
        packed.AddText(errand.shown);
    }
    request.bytes = packed.bytes();
    return request;
}

void WorkAsTold(int socket, WorkArea* area,
                const std::function<void(const Errand&, const Tell&)>& work) {
    Results results(socket, area);
    ResultStream output(&results, ResultKind::kOutput);
    ResultStream error(&results, ResultKind::kError);
    std::cout.rdbuf(&output);
    std::cerr.rdbuf(&error);
    SilenceProgress();
    DirectoryRef former;
    std::vector<int> descriptors;
    while (ReceiveTurn(socket, &descriptors) == Turn::kWork) {
        results.Begin();
        Reading reading(*area, std::move(descriptors), former);
        descriptors.clear();
        while (const auto errand = reading.Next()) {
            work(*errand, [&](std::string_view message) { results.TellOf(message); });
            results.EndErrand();
        }
        former = reading.last();
        if (!SendTurn(socket, Turn::kDone)) break;
    }
    ::_exit(0);
}

}  // namespace mavoea::tool
