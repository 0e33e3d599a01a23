#include "tools/say/interrupt.h"

#include <signal.h>

#include <initializer_list>

namespace mavoea::tool {
namespace {

volatile sig_atomic_t first_signal = 0;
volatile sig_atomic_t came_again = 0;

void Count(int number) {
    if (first_signal != 0) came_again = 1;
    if (first_signal == 0) first_signal = number;
}

}  // namespace

void WatchForInterrupts() {
    for (const int number : {SIGINT, SIGTERM}) {
        struct sigaction former;
        if (::sigaction(number, nullptr, &former) != 0 || former.sa_handler == SIG_IGN) continue;
        struct sigaction action = {};
        action.sa_handler = Count;
        (void)::sigfillset(&action.sa_mask);  // one after the other
        action.sa_flags = SA_RESTART;         // no call fails for it
        (void)::sigaction(number, &action, nullptr);
    }
}

int Interrupted() { return first_signal; }

bool InterruptedAgain() { return came_again != 0; }

}  // namespace mavoea::tool
