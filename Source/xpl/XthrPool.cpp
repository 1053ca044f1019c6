#include "xpl/XthrPool.h"

#include <cerrno>
#include <utility>

#include "xpl/Xlog.h"
#include "xpl/XthrDetached.h"

namespace {

constexpr const char* kSourcePath = "Source/xpl/XthrPool";

// Thread-creation errors are Linux error numbers, which are result codes as
// they stand.
static_assert(XERR_AGAIN == EAGAIN && XERR_PERM == EPERM && XERR_INVAL == EINVAL,
              "result codes 1 to 133 are the Linux error numbers");

void* workerMain(void* pool) {
    xthrPoolThreadEntry(static_cast<XthrPool*>(pool));
    return nullptr;
}

}  // namespace

ThreadPool g_thr_pool;

ThreadPool::ThreadPool()
    : mutex(), taskCond(), tasks(), numThreads(0), stop(0), numActive(0), doneCond(), exiting(0) {}

ThreadPool::~ThreadPool() {
    std::deque<std::function<void()>> dropped;
    bool workersAlive;
    {  // acquire lock
        std::lock_guard<std::mutex> lock(mutex);
        exiting = 1;
        dropped.swap(tasks);
        workersAlive = numActive > 0;
    }  // release lock
    // Dropped tasks die outside the lock: their captures may add to this
    // pool, which now refuses quietly.
    dropped.clear();
    if (workersAlive) {
        // A detached worker may be parked on taskCond (destroying a condition
        // variable with a waiter can hang in glibc) or may come back from its
        // task at any moment; the members must outlive it, and for the
        // process-wide pool the process ends first.
        return;
    }
    doneCond.~condition_variable();
    tasks.~deque();
    taskCond.~condition_variable();
    // The mutex is left alive on purpose: it holds no resource, and a thread
    // still adding tasks while the process exits (a Java thread calling a
    // native method) must be able to take it and see `exiting`.
}

xerr_t xthrPoolInit(XthrPool* pool, int numThreads) {
    pool->numThreads = numThreads;
    pool->numActive = numThreads;
    pool->stop = 0;
    for (int started = 0; started < numThreads; ++started) {
        int err = xthrStartDetached(workerMain, pool);
        if (err != 0) {
            {  // acquire lock: workers already started are running
                std::lock_guard<std::mutex> lock(pool->mutex);
                pool->numActive -= numThreads - started;
                if (pool->numActive <= 0) pool->doneCond.notify_all();
            }  // release lock
            XLOG_AT(XLOG_MODULE_XTHR, XLOG_LEVEL_E, kSourcePath,
                    "xerr_t xthrPoolInit(XthrPool *, int)",
                    "xthrPoolInit: started %d of %d workers, error %d\n", started, numThreads, err);
            return err;
        }
    }
    return XERR_SUCCESS;
}

xerr_t xthrPoolAddTask(XthrPool* pool, std::function<void()> task) {
    std::unique_lock<std::mutex> lock(pool->mutex);
    if (pool->exiting) {
        // Another thread still adding while the process exits: nothing will
        // run the task, and this is no caller error.
        return XERR_FAILURE;
    }
    if (pool->stop) {
        lock.unlock();
        XLOG_FATAL(XLOG_MODULE_XTHR, kSourcePath,
                   "xerr_t xthrPoolAddTask(XthrPool *, std::function<void ()>)", "xthrPoolAddTask");
    }
    pool->tasks.push_back(std::move(task));
    pool->taskCond.notify_one();
    return XERR_SUCCESS;
}

void xthrPoolFini(XthrPool* pool) {
    std::unique_lock<std::mutex> lock(pool->mutex);
    pool->stop = 1;
    pool->taskCond.notify_all();
    pool->doneCond.wait(lock, [pool] { return pool->numActive <= 0; });
}

void xthrPoolThreadEntry(XthrPool* pool) {
    std::unique_lock<std::mutex> lock(pool->mutex);
    for (;;) {
        pool->taskCond.wait(lock,
                            [pool] { return pool->exiting || pool->stop || !pool->tasks.empty(); });
        // The pool is being destroyed: leave without touching anything more.
        if (pool->exiting) return;
        if (pool->tasks.empty()) break;  // finishing, and the queue is drained
        std::function<void()> task = std::move(pool->tasks.front());
        pool->tasks.pop_front();
        lock.unlock();
        // An empty task has nothing to run; calling it would throw.
        if (task) task();
        task = nullptr;  // its captures die before the lock is taken again
        lock.lock();
    }
    if (--pool->numActive == 0) pool->doneCond.notify_one();
}
