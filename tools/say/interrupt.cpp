#include "tools/say/interrupt.h"

#include <signal.h>

#include <initializer_list>

namespace mavoea::tool {
namespace {

volatile sig_atomic_t first_signal = 0;
volatile sig_atomic_t came_again = 0;

volatile sig_atomic_t progress_requested = 0;

void Count(int number) {
    if (first_signal != 0) came_again = 1;
    if (first_signal == 0) first_signal = number;
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
    for (const int number : {SIGINT, SIGTERM}) Watch(number, Count);
}

int Interrupted() { return first_signal; }

bool InterruptedAgain() { return came_again != 0; }

void WatchForProgressRequests() { Watch(SIGUSR1, NoteRequest); }

bool ProgressRequested() { return progress_requested != 0; }

bool TakeProgressRequest() {
    const bool requested = ProgressRequested();
    progress_requested = 0;
    return requested;
}

}  // namespace mavoea::tool
