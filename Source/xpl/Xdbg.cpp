#include "xpl/Xdbg.h"

#include <csignal>
#include <cstdlib>

void xdbgBreak() {
    // A debugger stops here; without one the trap ends the process. Should the
    // signal be caught or ignored, the process still must not go on.
    std::raise(SIGTRAP);
    std::exit(1);
}
