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
#include "tools/store/sidecars.h"
#include "tools/walk/journal.h"
#include "tools/walk/packing.h"

namespace mavoea::tool {
namespace {

bool is_worker = false;

// Where the results of errands go, in the order in which they come, whichever stream they come by.
class Results {
 public:
    virtual ~Results() = default;

    void Write(ResultKind kind, std::string_view text) {
        constexpr std::size_t kPiece = std::size_t{1} << 15;
        if (kind != kind_) Post();
        kind_ = kind;
        pending_ += text;
        if (pending_.size() >= kPiece) Post();
    }

    void TellOf(std::string_view message) {
        Post();
        for (; message.size() > kMost; message.remove_prefix(kMost)) {
            Add(ResultKind::kPart, message.substr(0, kMost));
        }
        Add(ResultKind::kTold, message);
    }

 protected:
    // A large one comes in pieces.
    static constexpr std::size_t kMost = WorkArea::kResultsSize / 2;

    void Post() {
        for (std::size_t at = 0; at < pending_.size(); at += kMost) {
            Add(kind_, {pending_.data() + at, std::min(kMost, pending_.size() - at)});
        }
        pending_.clear();
    }

    void Add(ResultKind kind, std::string_view text) {
        Packer packed;
        packed.AddNumber(static_cast<std::uint64_t>(kind));
        packed.AddText(text);
        Take(packed.bytes());
    }

 private:
    virtual void Take(const std::string& packed) = 0;

    ResultKind kind_ = ResultKind::kOutput;
    std::string pending_;
};

// Those of the first process.
class OwnResults final : public Results {
 public:
    std::string End() {
        Post();
        return std::move(results_);
    }

 private:
    void Take(const std::string& packed) override { results_ += packed; }

    std::string results_;
};

// Those of a worker go into the memory that is shared.
class SharedResults final : public Results {
 public:
    SharedResults(int socket, WorkArea* area, const Journal* journal)
        : socket_(socket), area_(area), journal_(journal) {}

    void EndErrand(const Errand& errand, bool done) {
        Post();
        if (TakeLeftEaDirectory()) Add(ResultKind::kLeftEaDirectory, {});
        if (journal_ != nullptr && done) NoteDone(errand);
        record_.clear();
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

    void NoteDone(const Errand& errand) {
        try {
            journal_->Add(KeyOf(errand), record_);
        } catch (const Failure& failure) {
            Packer packed;
            packed.AddNumber(static_cast<std::uint64_t>(ResultKind::kFailure));
            packed.AddText(failure.subject());
            packed.AddText(failure.cause());
            Take(packed.bytes());
        }
    }

    void Take(const std::string& packed) override {
        if (journal_ != nullptr) record_ += packed;
        if (packed.size() > area_->results.size() - size_) MakeRoom();
        std::memcpy(area_->results.data() + size_, packed.data(), packed.size());
        size_ += packed.size();
    }

    void MakeRoom() {
        Publish();
        if (!SendTurn(socket_, Turn::kFull) || ReceiveTurn(socket_) != Turn::kGoOn) ::_exit(0);
        size_ = 0;  // as the first process has said already
    }

    int socket_;
    WorkArea* area_;
    const Journal* journal_;
    std::string record_;
    std::size_t size_ = 0;
    std::size_t done_ = 0;
};

class ResultStream final : public std::streambuf {
 public:
    ResultStream(std::ostream* stream, Results* results, ResultKind kind)
        : stream_(stream), former_(stream->rdbuf(this)), results_(results), kind_(kind) {}
    ~ResultStream() override { stream_->rdbuf(former_); }
    ResultStream(const ResultStream&) = delete;
    ResultStream& operator=(const ResultStream&) = delete;

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

    std::ostream* stream_;
    std::streambuf* former_;
    Results* results_;
    ResultKind kind_;
};

// The errands of one request.
class Reading {
 public:
    Reading(const WorkArea& area, const std::vector<int>& descriptors,
            const std::vector<DirectoryRef>& former)
        : bytes_({area.request.data(), area.request.size()}) {
        auto descriptor = descriptors.begin();
        for (std::uint64_t left = bytes_.TakeNumber(); left > 0; --left) {
            if (const auto index = static_cast<std::size_t>(bytes_.TakeNumber()); index > 0) {
                directories_.push_back(former[index - 1]);
                continue;
            }
            const std::string path(bytes_.TakeText());
            const std::string location(bytes_.TakeText());
            const bool has_location = bytes_.TakeNumber() != 0;
            const bool is_new = bytes_.TakeNumber() != 0;
            directories_.push_back(
                Directory::Adopt(*descriptor++, path, location, has_location, is_new));
        }
        left_ = bytes_.TakeNumber();
    }

    std::optional<Errand> Next() {
        if (left_ == 0) return std::nullopt;
        --left_;
        Errand errand;
        errand.kind = static_cast<Errand::Kind>(bytes_.TakeNumber());
        const Place place = TakePlace();
        errand.type = static_cast<mode_t>(bytes_.TakeNumber());
        errand.shown = bytes_.TakeText();
        errand.state = bytes_.TakeNumber();
        switch (errand.kind) {
            case Errand::Kind::kPair:
                errand.to = TakePlace();
                [[fallthrough]];
            case Errand::Kind::kDirectory:
                errand.object.place = place;
                break;
            case Errand::Kind::kNamed:
            case Errand::Kind::kFound:
                errand.object = ObjectAt(place, errand.type);
                break;
        }
        return errand;
    }

    const std::vector<DirectoryRef>& directories() const { return directories_; }

 private:
    Place TakePlace() {
        const auto index = static_cast<std::size_t>(bytes_.TakeNumber());
        return {directories_[index], std::string(bytes_.TakeText())};
    }

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

Request RequestOf(const std::vector<Errand>& errands, std::size_t first,
                  const std::vector<DirectoryRef>& former) {
    Request request;
    Packer packed;
    const auto add = [&](const Place& place) {
        auto& all = request.directories;
        const auto found = std::find(all.begin(), all.end(), place.directory);
        packed.AddNumber(static_cast<std::uint64_t>(found - all.begin()));
        packed.AddText(place.name);
        if (found == all.end()) all.push_back(place.directory);
    };
    packed.AddNumber(errands.size() - first);
    for (std::size_t i = first; i < errands.size(); ++i) {
        const Errand& errand = errands[i];
        packed.AddNumber(static_cast<std::uint64_t>(errand.kind));
        add(errand.object.place);
        packed.AddNumber(errand.type);
        packed.AddText(errand.shown);
        packed.AddNumber(errand.state);
        if (errand.kind == Errand::Kind::kPair) add(errand.to);
    }
    Packer head;
    head.AddNumber(request.directories.size());
    for (const DirectoryRef& directory : request.directories) {
        const auto found = std::find(former.begin(), former.end(), directory);
        if (found != former.end()) {
            head.AddNumber(static_cast<std::uint64_t>(found - former.begin()) + 1);
            continue;
        }
        head.AddNumber(0);
        head.AddText(directory->path());
        head.AddText(directory->location());
        head.AddNumber(directory->has_location() ? 1 : 0);
        head.AddNumber(directory->is_new() ? 1 : 0);
        request.descriptors.push_back(directory->fd());
    }
    request.bytes = head.bytes() + packed.bytes();
    return request;
}

bool IsWorker() { return is_worker; }

std::string KeyOf(const Errand& errand) {
    const Place& place = errand.object.place;
    if (!place.directory->HasLocation(place.name)) return {};  // others might have the same
    return std::to_string(static_cast<unsigned>(errand.kind)) + ' ' + std::to_string(errand.state) +
           ' ' + place.location();
}

Recorded Record(const Errand& errand, const DoErrand& work) {
    OwnResults results;
    const ResultStream output(&std::cout, &results, ResultKind::kOutput);
    const ResultStream error(&std::cerr, &results, ResultKind::kError);
    const bool done = work(errand, [&](std::string_view message) { results.TellOf(message); });
    return {results.End(), done};
}

void WorkAsTold(int socket, WorkArea* area, const DoErrand& work, const Journal* journal) {
    SharedResults results(socket, area, journal);
    const ResultStream output(&std::cout, &results, ResultKind::kOutput);
    const ResultStream error(&std::cerr, &results, ResultKind::kError);
    is_worker = true;
    SilenceProgress();
    LeaveEmptyEaDirectories();
    std::vector<DirectoryRef> former;
    std::vector<int> descriptors;
    while (ReceiveTurn(socket, &descriptors) == Turn::kWork) {
        results.Begin();
        Reading reading(*area, descriptors, former);
        descriptors.clear();
        while (const auto errand = reading.Next()) {
            const bool done =
                work(*errand, [&](std::string_view message) { results.TellOf(message); });
            results.EndErrand(*errand, done);
        }
        former = reading.directories();
        if (!SendTurn(socket, Turn::kDone)) break;
    }
    ::_exit(0);
}

}  // namespace mavoea::tool
