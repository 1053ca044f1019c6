// A pool of worker threads running queued tasks in the order queued.
//
// Locking: `mutex` guards every other member and is never held while a task
// runs, so a task may add tasks to its own pool. Calling order: the record
// exists, then xthrPoolInit, then any number of xthrPoolAddTask from any
// thread, then at most one xthrPoolFini from a thread that is not a worker.
//
// The record is exactly its seven members: callers declare pools of their own
// from it, so nothing may be added (XthrPool.cpp asserts the layout).
#pragma once

#include <condition_variable>
#include <cstdint>
#include <deque>
#include <functional>
#include <mutex>

#include "xpl/Xerr.h"
#include "xpl/XplExport.h"
#include "xpl/XplThreadAnnotations.h"

struct XPL_EXPORT ThreadPool {
    ThreadPool();
    // Drops queued tasks unrun and marks the pool as being destroyed (`stop`
    // becomes XTHR_POOL_DESTROYED), after which a worker that wakes or comes
    // back from its task leaves at once and an adder is refused quietly.
    // While a detached worker is still alive (the process-wide pool is never
    // finished) the mutex and condition variables are left constructed so
    // that it touches live objects during process exit.
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
    std::deque<std::function<void()>> tasks GUARDED_BY(mutex);
    int32_t numThreads GUARDED_BY(mutex);  // recorded only
    int32_t stop GUARDED_BY(mutex);        // 1 once xthrPoolFini has begun, 2 once destroyed
    int32_t numActive GUARDED_BY(mutex);   // workers that have not yet exited
    union {
        std::condition_variable doneCond;
    };
};
typedef ThreadPool XthrPool;

// The value of `stop` once the record's destructor has begun.
constexpr int32_t XTHR_POOL_DESTROYED = 2;

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
