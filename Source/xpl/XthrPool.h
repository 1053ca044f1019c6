// A pool of worker threads running queued tasks in the order queued.
//
// Locking: `mutex` guards every other member and is never held while a task
// runs, so a task may add tasks to its own pool. Calling order: the record
// exists, then xthrPoolInit, then any number of xthrPoolAddTask from any
// thread, then at most one xthrPoolFini from a thread that is not a worker.
#pragma once

#include <condition_variable>
#include <cstdint>
#include <deque>
#include <functional>
#include <mutex>

#include "xpl/Xerr.h"
#include "xpl/XplExport.h"

struct XPL_EXPORT ThreadPool {
    ThreadPool();
    // Drops queued tasks unrun. While a detached worker is still alive (the
    // process-wide pool is never finished) the synchronisation members and
    // the queue are left constructed, so that a worker waiting on `taskCond`
    // or returning from its task during process exit touches live objects;
    // it sees `exiting` and leaves without running anything more.
    ~ThreadPool();
    ThreadPool(const ThreadPool&) = delete;
    ThreadPool& operator=(const ThreadPool&) = delete;

    // Each of these lives in a union of its own so that the destructor alone
    // decides whether it is destroyed; the layout is that of the plain member.
    union {
        std::mutex mutex;
    };
    union {
        std::condition_variable taskCond;
    };
    union {
        std::deque<std::function<void()>> tasks;
    };
    int32_t numThreads;  // recorded only
    int32_t stop;        // 1 once xthrPoolFini has begun
    int32_t numActive;   // workers that have not yet exited
    union {
        std::condition_variable doneCond;
    };
    int32_t exiting;  // 1 once the destructor has begun; workers leave at once
};
typedef ThreadPool XthrPool;

XPL_EXPORT extern ThreadPool g_thr_pool;

// Starts `numThreads` detached workers; a count below 1 starts none. Returns
// the error of a thread that could not be created (workers already started
// keep running and are the only ones a later xthrPoolFini waits for).
XPL_EXPORT xerr_t xthrPoolInit(XthrPool* pool, int numThreads);
// Queues the task at the back; never waits for it to run. Adding to a pool
// that is finishing is a broken contract and ends the process.
XPL_EXPORT xerr_t xthrPoolAddTask(XthrPool* pool, std::function<void()> task);
// Lets the workers drain the queue and waits until every one has exited.
XPL_EXPORT void xthrPoolFini(XthrPool* pool);
XPL_EXPORT void xthrPoolThreadEntry(XthrPool* pool);
