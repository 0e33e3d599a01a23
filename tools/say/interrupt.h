// Ctrl-C and its like, and who asks how far it is: noticed between objects, not in the middle of
// one.
#ifndef MAVOEA_TOOLS_SAY_INTERRUPT_H_
#define MAVOEA_TOOLS_SAY_INTERRUPT_H_

namespace mavoea::tool {

// From here on SIGINT and SIGTERM are counted only, unless they are ignored: those that come to
// this process, for it and the processes that it starts.
void WatchForInterrupts();

// The number of the first signal that came, 0 when none did.
int Interrupted();

// Whether another one came after it: not even the object in hand is to be finished.
bool InterruptedAgain();

// From here on SIGUSR1 asks for a line of progress, unless it is ignored.
void WatchForProgressRequests();

// Whether somebody waits for one; taken, it has been answered.
bool ProgressRequested();
bool TakeProgressRequest();

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_SAY_INTERRUPT_H_
