#include "tools/walk/crew.h"

#include <poll.h>
#include <sched.h>
#include <signal.h>
#include <sys/mman.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <climits>
#include <cstring>
#include <iostream>
#include <utility>

#include "tools/walk/packing.h"
#include "tools/walk/worker.h"

namespace mavoea::tool {
namespace {

// Of one batch: large enough that turns cost little, small enough that none waits long at the end.
constexpr std::size_t kErrands = WorkArea::kErrandsMost;
// Their descriptors are open while it waits. An errand may add two.
constexpr std::size_t kDirectories = 15;
static_assert(kDirectories + 1 <= kDescriptorsMost);

// Steps that wait, with what they keep open.
constexpr std::size_t kSteps = 64;

// Batches that wait for each worker, and what may wait for its turn to come out.
constexpr std::size_t kWaiting = 2;
constexpr std::size_t kResultsMost = std::size_t{64} << 20;

// Whether it takes no more room than a batch has for each. What lies too deep for the usual paths
// may have one of any length.
bool IsSent(const Errand& errand) {
    constexpr std::size_t kPathMost = std::size_t{1} << 15;
    const auto fits = [](const DirectoryRef& directory) {
        return !directory || directory->path().size() <= kPathMost;
    };
    return errand.shown.size() <= PATH_MAX && fits(errand.object.place.directory) &&
           fits(errand.to.directory);
}

std::string EndOf(int status) {
    if (!WIFSIGNALED(status)) return "exit status " + std::to_string(WEXITSTATUS(status));
    const int number = WTERMSIG(status);
    return "signal " + std::to_string(number) + " (" + ::strsignal(number) + ')';
}

}  // namespace

bool IsApart(const std::string& name) {
    constexpr std::size_t kLong = 200;
    return name.size() < kLong;
}

CrewSize UsualCrew() {
    constexpr int kMost = 8;
    constexpr std::uint64_t kAlone = 256;
    cpu_set_t processors;
    const bool known = ::sched_getaffinity(0, sizeof processors, &processors) == 0;
    const int count = known ? CPU_COUNT(&processors) : 1;
    return {static_cast<unsigned>(std::clamp(count, 1, kMost)), kAlone};
}

// What came of a batch, and what the first process does after it.
struct Crew::Slot {
    std::string results = {};
    bool complete = false;
    std::vector<std::function<void()>> steps = {};
};

struct Crew::Batch {
    std::vector<Errand> errands = {};
    std::size_t next = 0;  // that is not done, when a worker takes it
    std::size_t directories = 0;
    std::uint64_t number = 0;  // in the order of all
    std::shared_ptr<Slot> slot = std::make_shared<Slot>();
};

struct Crew::Worker {
    ~Worker() {
        if (socket >= 0) ::close(socket);
        if (area != nullptr) ::munmap(area, sizeof(WorkArea));
    }

    pid_t process = -1;
    int socket = -1;
    WorkArea* area = nullptr;
    std::vector<DirectoryRef> has = {};  // of its last batch
    std::shared_ptr<Batch> batch = {};   // in hand
    bool waits = false;                  // for what it has found to be collected
};

Crew::Crew(CrewSize size, Duties duties, Journal* journal)
    : size_(size),
      duties_(std::move(duties)),
      journal_(journal),
      open_(std::make_shared<Batch>()) {}

Crew::~Crew() {
    for (const auto& worker : workers_) {
        (void)SendTurn(worker->socket, Turn::kEnd);
        if (worker->batch) ::kill(worker->process, SIGKILL);  // its results are not wanted
        while (::waitpid(worker->process, nullptr, 0) < 0 && errno == EINTR) continue;
    }
}

bool Crew::Do(Errand errand) {
    if (journal_ != nullptr && journal_->resumed()) {
        if (const auto results = FormerResult(KeyOf(errand))) {
            Then([this, results] { Say(*results); });
            return false;
        }
    }
    if (!shared_out_ && (GoesOnAlone() || !Begin())) {
        duties_.show_progress(errand.object);
        DoAlone(errand);
        return true;
    }
    if (errand.here || !IsSent(errand)) {
        Then([this, errand] { DoHere(errand); });
        return true;
    }
    const Errand* const last = open_->errands.empty() ? nullptr : &open_->errands.back();
    if (last == nullptr || last->object.place.directory != errand.object.place.directory) {
        ++open_->directories;
    }
    if (last == nullptr || last->to.directory != errand.to.directory) ++open_->directories;
    open_->errands.push_back(std::move(errand));
    if (open_->errands.size() == kErrands || open_->directories >= kDirectories) CloseBatch();
    return true;
}

void Crew::Then(std::function<void()> step) {
    if (!shared_out_) return step();
    CloseBatch();
    Afterwards(std::move(step));
    Output();
}

void Crew::Afterwards(std::function<void()> step) {
    if (!shared_out_) return step();
    Slot* slot = open_->slot.get();
    if (open_->errands.empty()) {
        if (outputs_.empty()) return step();
        slot = outputs_.back().get();
    }
    slot->steps.push_back(std::move(step));
    if (++steps_ < kSteps) return;
    CloseBatch();
    while (steps_ > 0) Wait();
}

void Crew::Finish() {
    CloseBatch();
    while (!outputs_.empty()) Wait();
    if (journal_ != nullptr) Guard([&] { journal_->Sync(duties_.sync); });
}

std::optional<std::string> Crew::FormerResult(const std::string& key) const {
    return journal_ != nullptr ? journal_->Find(key) : std::nullopt;
}

void Crew::NoteDone(const std::string& key, std::string_view result) {
    if (journal_ == nullptr) return;
    Guard([&] { journal_->Add(key, result); });
    NoteDone(1);
}

void Crew::NoteDone(std::size_t count) {
    if (journal_ != nullptr) Guard([&] { journal_->NoteDone(count, duties_.sync); });
}

// The log takes nothing any more.
template <class Work>
void Crew::Guard(Work work) {
    try {
        work();
    } catch (const Failure& failure) {
        duties_.on_failure(failure.subject(), failure);
    }
}

// Giving an errand to another process, which knows less of the directory, costs some 10 us.
bool Crew::GoesOnAlone() {
    constexpr std::chrono::microseconds kWorthIt(20);
    if (done_alone_ < size_.alone) return true;
    const bool soon_done = took_ < kWorthIt * (done_alone_ / 2);
    done_alone_ = 0;
    took_ = {};
    return soon_done;
}

// The first ones take longer than those that follow: half of them tell.
void Crew::DoAlone(const Errand& errand) {
    const auto began = std::chrono::steady_clock::now();
    DoHere(errand);
    if (++done_alone_ > size_.alone / 2) took_ += std::chrono::steady_clock::now() - began;
}

// False when nobody but this process is to do anything.
bool Crew::Begin() {
    if (size_.workers <= 1) return false;
    while (workers_.size() < size_.workers && StartWorker()) continue;
    shared_out_ = !workers_.empty();
    if (!shared_out_) size_.workers = 1;
    return shared_out_;
}

// False when there can be no further one.
bool Crew::StartWorker() {
    void* const shared = ::mmap(nullptr, sizeof(WorkArea), PROT_READ | PROT_WRITE,
                                MAP_SHARED | MAP_ANONYMOUS, -1, 0);
    if (shared == MAP_FAILED) return false;
    auto worker = std::make_unique<Worker>();
    worker->area = new (shared) WorkArea;
    int ends[2];
    if (::socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, ends) != 0) return false;
    worker->socket = ends[0];
    const pid_t first = ::getpid();
    std::cout.flush();  // it would come out of both
    worker->process = ::fork();
    if (worker->process == 0) {
        (void)::prctl(PR_SET_PDEATHSIG, SIGKILL);
        if (::getppid() != first) ::_exit(0);
        // An end that is open here too would keep others from seeing that this process has gone.
        for (const auto& other : workers_) ::close(other->socket);
        ::close(ends[0]);
        WorkAsTold(ends[1], worker->area, duties_.work, journal_);
    }
    ::close(ends[1]);
    if (worker->process < 0) return false;
    workers_.push_back(std::move(worker));
    return true;
}

void Crew::CloseBatch() {
    if (open_->errands.empty()) return;
    open_->number = ++batches_;
    outputs_.push_back(open_->slot);
    ready_.push_back(std::exchange(open_, std::make_shared<Batch>()));
    Assign();
    while (ready_.size() > kWaiting * workers_.size() && !workers_.empty()) Wait();
}

// To whoever has nothing to do. With nobody left, this process does everything itself.
void Crew::Assign() {
    for (;;) {
        const auto idle = std::find_if(workers_.begin(), workers_.end(),
                                       [](const auto& worker) { return !worker->batch; });
        if (idle == workers_.end() || ready_.empty()) break;
        if (Give(idle->get(), ready_.front())) {
            ready_.pop_front();
        } else {
            Bury(idle->get());
        }
    }
    if (!workers_.empty()) return;
    while (!ready_.empty()) {
        Output();
        DoHere(*ready_.front());
        ready_.pop_front();
    }
}

// False when it has died.
bool Crew::Give(Worker* worker, const std::shared_ptr<Batch>& batch) {
    const Request request = RequestOf(batch->errands, batch->next, worker->has);
    std::memcpy(worker->area->request.data(), request.bytes.data(), request.bytes.size());
    worker->area->state.store({}, std::memory_order_release);
    if (!SendTurn(worker->socket, Turn::kWork, request.descriptors)) return false;
    worker->batch = batch;
    worker->has = request.directories;
    return true;
}

void Crew::DoHere(const Errand& errand) {
    if (journal_ == nullptr) {
        (void)duties_.work(errand, duties_.hear);
        return;
    }
    const Recorded recorded = Record(errand, duties_.work);
    if (recorded.done) NoteDone(KeyOf(errand), recorded.results);
    Say(recorded.results);
}

void Crew::DoHere(const Batch& batch) {
    for (std::size_t i = batch.next; i < batch.errands.size(); ++i) DoHere(batch.errands[i]);
    batch.slot->complete = true;
}

// For a turn of anybody's.
void Crew::Wait() {
    constexpr int kSecond = 1000;  // milliseconds
    Output();
    if (outputs_.empty()) return;
    std::vector<pollfd> sockets;
    for (const auto& worker : workers_) {
        const bool speaks = worker->batch && !worker->waits;
        sockets.push_back({speaks ? worker->socket : -1, POLLIN, 0});
    }
    if (::poll(sockets.data(), sockets.size(), kSecond) <= 0) return;
    std::vector<Worker*> speakers;
    for (std::size_t i = 0; i < sockets.size(); ++i) {
        if (sockets[i].revents != 0) speakers.push_back(workers_[i].get());
    }
    for (Worker* const worker : speakers) Hear(worker);
    Assign();
    Output();
}

void Crew::Hear(Worker* worker) {
    const auto turn = ReceiveTurn(worker->socket);
    if (!turn) return Bury(worker);
    if (*turn == Turn::kFull && !MayCollect(*worker)) {
        worker->waits = true;
        return;
    }
    Collect(worker);
    if (*turn == Turn::kFull) return LetGoOn(worker);
    worker->batch->slot->complete = true;
    NoteDone(worker->batch->errands.size() - worker->batch->next);
    worker->batch = nullptr;
}

// With all the room that there is for results.
void Crew::LetGoOn(Worker* worker) {
    worker->area->state.store({worker->area->state.load().done(), 0});
    (void)SendTurn(worker->socket, Turn::kGoOn);
}

// Its errand in hand has failed; the rest of them is for others.
void Crew::Bury(Worker* worker) {
    int status = 0;
    while (::waitpid(worker->process, &status, 0) < 0 && errno == EINTR) continue;
    const std::shared_ptr<Batch> batch = worker->batch;
    if (batch) {
        Collect(worker);
        batch->next += worker->area->state.load(std::memory_order_acquire).done();
    }
    workers_.erase(std::find_if(workers_.begin(), workers_.end(),
                                [&](const auto& one) { return one.get() == worker; }));
    (void)StartWorker();
    if (!batch) return;
    if (batch->next < batch->errands.size()) {
        Packer failure;
        failure.AddNumber(static_cast<std::uint64_t>(ResultKind::kFailure));
        failure.AddText(batch->errands[batch->next++].object.path());
        failure.AddText("the process that worked on it has died: " + EndOf(status));
        batch->slot->results += failure.bytes();
    }
    if (batch->next == batch->errands.size()) {
        batch->slot->complete = true;
        return;
    }
    ready_.insert(std::find_if(ready_.begin(), ready_.end(),
                               [&](const auto& other) { return other->number > batch->number; }),
                  batch);
}

// What it has found so far.
void Crew::Collect(Worker* worker) {
    const auto size = worker->area->state.load(std::memory_order_acquire).size();
    worker->batch->slot->results.append(worker->area->results.data(), size);
}

// What comes out next is never kept waiting, or nothing would ever come out.
bool Crew::MayCollect(const Worker& worker) const {
    if (worker.batch->slot == outputs_.front()) return true;
    std::size_t size = 0;
    for (const auto& slot : outputs_) size += slot->results.size();
    return size < kResultsMost;
}

void Crew::Output() {
    while (!outputs_.empty()) {
        const std::shared_ptr<Slot> slot = outputs_.front();
        Say(slot->results);
        slot->results.clear();
        if (slot->complete) {
            outputs_.pop_front();
            for (const auto& step : slot->steps) step();
            steps_ -= slot->steps.size();
            continue;
        }
        const auto next = std::find_if(workers_.begin(), workers_.end(), [&](const auto& worker) {
            return worker->waits && worker->batch->slot == slot;
        });
        if (next == workers_.end()) break;
        (*next)->waits = false;
        Collect(next->get());
        LetGoOn(next->get());
    }
    for (const auto& worker : workers_) {
        if (!worker->batch || worker->batch->slot != outputs_.front()) continue;
        duties_.show_progress(worker->batch->errands[worker->batch->next].object);
    }
}

void Crew::Say(std::string_view said) {
    Unpacker results(said);
    while (!results.empty()) {
        const auto kind = static_cast<ResultKind>(results.TakeNumber());
        const std::string_view text = results.TakeText();
        switch (kind) {
            case ResultKind::kPart:
                told_ += text;
                break;
            case ResultKind::kTold:
                duties_.hear(told_.empty() ? text : told_ += text);
                told_.clear();
                break;
            case ResultKind::kLeftEaDirectory:
                left_ea_directories_ = true;
                break;
            case ResultKind::kFailure:
                if (std::exchange(in_line_, false)) std::cout << '\n';
                duties_.on_failure(std::string(text),
                                   {kFailed, text, results.TakeText(),
                                    "give the command again, and see what it says of this one"});
                break;
            case ResultKind::kOutput:
                duties_.clear_progress();
                std::cout << text;
                in_line_ = !text.ends_with('\n');
                break;
            case ResultKind::kError:
                duties_.clear_progress();
                std::cout.flush();
                std::cerr << text;
                break;
        }
    }
}

}  // namespace mavoea::tool
