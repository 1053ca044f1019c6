// A pool of worker threads running queued tasks in the order queued.
#pragma once

#include <condition_variable>
#include <cstdint>
#include <deque>
#include <functional>
#include <mutex>

#include "xpl/Xerr.h"
#include "xpl/XplExport.h"

struct XPL_EXPORT ThreadPool {
    std::mutex mutex;
    std::condition_variable taskCond;
    std::deque<std::function<void()>> tasks;
    int32_t numThreads;
    int32_t stop;
    int32_t numActive;
    std::condition_variable doneCond;
};
typedef ThreadPool XthrPool;

XPL_EXPORT extern ThreadPool g_thr_pool;

XPL_EXPORT xerr_t xthrPoolInit(XthrPool* pool, int numThreads);
XPL_EXPORT xerr_t xthrPoolAddTask(XthrPool* pool, std::function<void()> task);
XPL_EXPORT void xthrPoolFini(XthrPool* pool);
XPL_EXPORT void xthrPoolThreadEntry(XthrPool* pool);
