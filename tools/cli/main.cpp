// mavoea: where files keep their Mac and SMB metadata, and what is in it.

#include <sys/resource.h>

#include <exception>
#include <iostream>
#include <new>

#include "tools/cli/command_line.h"
#include "tools/cli/commands.h"
#include "tools/say/messages.h"
#include "tools/say/output.h"

namespace {

using namespace mavoea::tool;

// Trees take some descriptors for each level.
void RaiseDescriptorLimit() {
    rlimit limit;
    if (::getrlimit(RLIMIT_NOFILE, &limit) != 0) return;
    limit.rlim_cur = limit.rlim_max;
    (void)::setrlimit(RLIMIT_NOFILE, &limit);
}

int RunAndReport(int argc, char** argv) {
    RaiseDescriptorLimit();
    try {
        const auto parsed = ParseCommandLine(argc, argv);
        if (const int* const status = std::get_if<int>(&parsed)) return *status;
        const ExitStatus status = Run(std::get<Options>(parsed));
        std::cout.flush();
        if (std::cout) return status;
        throw Failure(kFailed, "standard output", "it could not be written",
                      "free some space, or write it elsewhere");
    } catch (const Failure& failure) {
        Report(failure);
        return SpeaksAsAnother() ? kRefused : failure.status();
    } catch (const std::bad_alloc&) {
        Report("out of memory; use smaller values");
    } catch (const std::exception& failure) {
        Report(failure.what());
    }
    return kFailed;
}

}  // namespace

int main(int argc, char** argv) { return RunAndReport(argc, argv); }
