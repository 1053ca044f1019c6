#include "xpl/Xlog.h"

#include <android/log.h>

#include <cstdarg>
#include <cstdio>
#include <new>

#include "xpl/XlogInternal.h"
#include "xpl/XplLayout.h"
#include "xpl/XplLoadOrder.h"

namespace {

XPL_LAYOUT_FIRST(XlogLogger, shouldLog)
XPL_LAYOUT_FOLLOWS(XlogLogger, shouldLog, print)
XPL_LAYOUT_LAST(XlogLogger, print)
XPL_LAYOUT_FIRST(XlogState, file)
XPL_LAYOUT_FOLLOWS(XlogState, file, fileName)
XPL_LAYOUT_FOLLOWS(XlogState, fileName, processTag)
XPL_LAYOUT_FOLLOWS(XlogState, processTag, utcOffset)
XPL_LAYOUT_FOLLOWS(XlogState, utcOffset, levelNames)
XPL_LAYOUT_FOLLOWS(XlogState, levelNames, modules)
XPL_LAYOUT_FOLLOWS(XlogState, modules, formatFlags)
XPL_LAYOUT_FOLLOWS(XlogState, formatFlags, logger)
XPL_LAYOUT_LAST(XlogState, logger)

// Android priorities by level; levels past the table (and negative ones) log
// as verbose.
constexpr int kPriorityByLevel[] = {
    ANDROID_LOG_ERROR,  // E
    ANDROID_LOG_WARN,   // W
    ANDROID_LOG_INFO,   // I
    ANDROID_LOG_DEBUG,  // D
};
static_assert(sizeof(kPriorityByLevel) / sizeof(kPriorityByLevel[0]) == XLOG_LEVEL_V,
              "every level below V has its own priority");

int priorityOf(int level) {
    return level >= 0 && level < XLOG_LEVEL_V ? kPriorityByLevel[level] : ANDROID_LOG_VERBOSE;
}

bool isModule(int module) { return module >= 0 && module < XLOG_NUM_MODULES; }

XlogState* createState() {
    // Value-initialised: empty strings, null tags, every level 0 (only E
    // passes), all flags false. Never freed, so that threads still logging
    // while the process exits find it intact.
    auto* state = new XlogState();
    state->logger.shouldLog = xlogShouldLog;
    state->logger.print = xlogPrint;
    g_xlog = state;
    return state;
}

// Opened on the first print, exactly once even when threads race to it, and
// never closed: a late line from another thread during exit stays safe.
FILE* kmsgStream() {
    static FILE* const stream = std::fopen("/dev/kmsg", "w+");
    return stream;
}

}  // namespace

XlogState* xlogState() {
    static XlogState* const state = createState();
    return state;
}

// Points at the record from its creation, which happens at its rank in the
// load order or at an earlier first use.
XlogState* g_xlog = nullptr;
namespace {
const XplLoadStep kCreateLogger XPL_LOAD_ORDER(XPL_LOAD_ORDER_XLOG)([] { xlogState(); });
}  // namespace

XlogLogger* xlogGetLogger() { return &xlogState()->logger; }

int xlogShouldLog(int module, int level) {
    // A module outside the table is a caller's mistake; answer no rather than
    // read past the table.
    return isModule(module) && xlogState()->modules[module].level >= level ? 1 : 0;
}

void xlogPrint(int level, int module, const char* /*file*/, const char* /*function*/, int /*line*/,
               const char* format, ...) {
    va_list args;
    va_start(args, format);
    if (FILE* kmsg = kmsgStream()) {
        // One message, two sinks: the kernel log consumes a copy so that the
        // Android log still receives the untouched argument list.
        va_list kmsgArgs;
        va_copy(kmsgArgs, args);
        (void)std::vfprintf(kmsg, format, kmsgArgs);
        va_end(kmsgArgs);
        (void)std::fflush(kmsg);
    }
    const char* tag = isModule(module) ? xlogState()->modules[module].tag : nullptr;
    __android_log_vprint(priorityOf(level), tag, format, args);
    va_end(args);
}
