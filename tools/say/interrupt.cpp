#include "tools/say/interrupt.h"

#include <signal.h>
#include <sys/mman.h>
#include <unistd.h>

#include <initializer_list>
#include <new>

namespace mavoea::tool {
namespace {

// What has come to the process that watches. Its children see it as well: a terminal sends each of
// them what it sends that one, and others send it to that one only.
struct Signals {
    volatile sig_atomic_t first;
    volatile sig_atomic_t came_again;
};
Signals own_signals = {};
Signals* signals = &own_signals;
pid_t watcher = 0;

volatile sig_atomic_t progress_requested = 0;

void Count(int number) {
    if (::getpid() != watcher) return;
    if (signals->first != 0) signals->came_again = 1;
    if (signals->first == 0) signals->first = number;
}

void NoteRequest(int /*number*/) { progress_requested = 1; }

void Watch(int number, void (*handler)(int)) {
    struct sigaction former;
    if (::sigaction(number, nullptr, &former) != 0 || former.sa_handler == SIG_IGN) return;
    struct sigaction action = {};
    action.sa_handler = handler;
    (void)::sigfillset(&action.sa_mask);  // one after the other
    action.sa_flags = SA_RESTART;         // no call fails for it
    (void)::sigaction(number, &action, nullptr);
}

}  // namespace

void WatchForInterrupts() {
    if (watcher == 0) {
        watcher = ::getpid();
        void* const shared = ::mmap(nullptr, sizeof(Signals), PROT_READ | PROT_WRITE,
                                    MAP_SHARED | MAP_ANONYMOUS, -1, 0);
        if (shared != MAP_FAILED) signals = new (shared) Signals();
    }
    for (const int number : {SIGINT, SIGTERM}) Watch(number, Count);
}

int Interrupted() { return signals->first; }

bool InterruptedAgain() { return signals->came_again != 0; }

void WatchForProgressRequests() { Watch(SIGUSR1, NoteRequest); }

bool ProgressRequested() { return progress_requested != 0; }

bool TakeProgressRequest() {
    const bool requested = ProgressRequested();
    progress_requested = 0;
    return requested;
}

}  // namespace mavoea::tool
