// One-shot callbacks after a delay, run in expiry order on one timer thread.
//
// Locking: `mutex` guards the map and the flag and is never held while a
// callback runs, so a callback may schedule further callbacks.
#pragma once

#include <condition_variable>
#include <cstdint>
#include <functional>
#include <map>
#include <mutex>

#include "xpl/Xerr.h"
#include "xpl/XplExport.h"
#include "xpl/XplThreadAnnotations.h"

struct XtimerInfo {
    long long expiry;  // microseconds in the time base of xtimeNow
    std::function<void()> callback;
};

struct XtimerGlobals {
    std::condition_variable cond;
    std::mutex mutex;
    int32_t threadStarted GUARDED_BY(mutex) = 0;  // 1 once the timer thread exists
    // Keyed by expiry; an entry goes after those already there with its key.
    std::multimap<long long, XtimerInfo> timers GUARDED_BY(mutex);
};

// Allocated at load and never freed, so its thread can outlive static teardown.
XPL_EXPORT extern XtimerGlobals* g_xtimer;

XPL_EXPORT xerr_t xtimerLibInit();
// Runs the callback once, on the timer thread, `delay` microseconds from now
// (at once for zero or less). The first call starts the timer thread; when it
// cannot be created the error is returned and nothing is scheduled. An empty
// callback is refused with XERR_INVAL. The timer thread is woken only when the
// new callback is due before every one already pending.
XPL_EXPORT xerr_t xtimerStart(long long delay, std::function<void()> callback);
[[noreturn]] XPL_EXPORT void xtimerThreadEntry();
