#include "xpl/Xdbg.h"

#include <csignal>
#include <cstdlib>

void xdbgBreak() {
    // A debugger stops here; without one the trap ends the process. Should the
    // signal be caught or ignored, the process still must not go on.
    (void)std::raise(SIGTRAP);
    // Ending the process is the point, whatever other threads are doing.
    std::exit(1);  // NOLINT(concurrency-mt-unsafe)
}
