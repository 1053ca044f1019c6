// One-shot callbacks after a delay, run in expiry order on one timer thread.
#pragma once

#include <condition_variable>
#include <cstdint>
#include <functional>
#include <map>
#include <mutex>

#include "xpl/Xerr.h"
#include "xpl/XplExport.h"

struct XtimerInfo {
    long long expiry;
    std::function<void()> callback;
};

struct XtimerGlobals {
    std::condition_variable cond;
    std::mutex mutex;
    int32_t threadStarted;
    std::multimap<long long, XtimerInfo> timers;
};

// Allocated at load and never freed, so its thread can outlive static teardown.
XPL_EXPORT extern XtimerGlobals* g_xtimer;

XPL_EXPORT xerr_t xtimerLibInit();
XPL_EXPORT xerr_t xtimerStart(long long delay, std::function<void()> callback);
XPL_EXPORT void xtimerThreadEntry();
