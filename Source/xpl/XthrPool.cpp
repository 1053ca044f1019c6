#include "xpl/XthrPool.h"

#include <cerrno>
#include <utility>

#include "xpl/Xlog.h"
#include "xpl/XplLayout.h"
#include "xpl/XplLoadOrder.h"
#include "xpl/XthrDetached.h"

using android::base::ScopedLockAssertion;

namespace {

constexpr const char* kSourcePath = "Source/xpl/XthrPool";

// Thread-creation errors are Linux error numbers, which are result codes as
// they stand.
static_assert(XERR_AGAIN == EAGAIN && XERR_PERM == EPERM && XERR_INVAL == EINVAL,
              "result codes 1 to 133 are the Linux error numbers");

// The record as a caller declares it: the unions around the synchronisation
// members must not move, widen or pad anything.
XPL_LAYOUT_FIRST(ThreadPool, mutex)
XPL_LAYOUT_FOLLOWS(ThreadPool, mutex, taskCond)
XPL_LAYOUT_FOLLOWS(ThreadPool, taskCond, tasks)
XPL_LAYOUT_FOLLOWS(ThreadPool, tasks, numThreads)
XPL_LAYOUT_FOLLOWS(ThreadPool, numThreads, stop)
XPL_LAYOUT_FOLLOWS(ThreadPool, stop, numActive)
XPL_LAYOUT_FOLLOWS(ThreadPool, numActive, doneCond)
XPL_LAYOUT_LAST(ThreadPool, doneCond)

void* workerMain(void* pool) {
    xthrPoolThreadEntry(static_cast<XthrPool*>(pool));
    return nullptr;
}

}  // namespace

ThreadPool g_thr_pool XPL_LOAD_ORDER(XPL_LOAD_ORDER_THR_POOL);

ThreadPool::ThreadPool() : mutex(), taskCond(), numThreads(0), stop(0), numActive(0), doneCond() {}

ThreadPool::~ThreadPool() {
    std::deque<std::function<void()>> dropped;
    bool workersAlive;
    {  // acquire lock
        std::lock_guard<std::mutex> lock(mutex);
        stop = XTHR_POOL_DESTROYED;
        dropped.swap(tasks);
        workersAlive = numActive > 0;
    }  // release lock
    // Dropped tasks die outside the lock: their captures may add to this
    // pool, which now refuses quietly.
    dropped.clear();
    // The queue itself is destroyed with the record: every path of a worker
    // and an adder tests `stop` first and leaves without reaching it.
    if (workersAlive) {
        // A detached worker may be parked on taskCond (destroying a condition
        // variable with a waiter can hang in glibc) or may come back from its
        // task at any moment; for the process-wide pool the process ends
        // first.
        return;
    }
    doneCond.~condition_variable();
    taskCond.~condition_variable();
    // The mutex is left alive on purpose: it holds no resource, and a thread
    // still adding tasks while the process exits (a Java thread calling a
    // native method) must be able to take it and see the pool destroyed.
}

xerr_t xthrPoolInit(XthrPool* pool, int numThreads) {
    {  // acquire lock: other threads may already be adding tasks
        std::lock_guard<std::mutex> lock(pool->mutex);
        pool->numThreads = numThreads;
        pool->numActive = numThreads;
        pool->stop = 0;
    }  // release lock
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
    {  // acquire lock
        std::lock_guard<std::mutex> lock(pool->mutex);
        // Another thread still adding while the process exits: nothing will
        // run the task, and this is no caller error.
        if (pool->stop == XTHR_POOL_DESTROYED) return XERR_FAILURE;
        if (!pool->stop) {
            pool->tasks.push_back(std::move(task));
            pool->taskCond.notify_one();
            return XERR_SUCCESS;
        }
    }  // release lock: the fatal path logs without it
    XLOG_FATAL(XLOG_MODULE_XTHR, kSourcePath,
               "xerr_t xthrPoolAddTask(XthrPool *, std::function<void ()>)", "xthrPoolAddTask");
}

void xthrPoolFini(XthrPool* pool) {
    std::unique_lock<std::mutex> lock(pool->mutex);
    ScopedLockAssertion held(pool->mutex);
    pool->stop = 1;
    pool->taskCond.notify_all();
    pool->doneCond.wait(lock, [pool] {
        ScopedLockAssertion waitHeld(pool->mutex);
        return pool->numActive <= 0;
    });
}

void xthrPoolThreadEntry(XthrPool* pool) {
    for (;;) {
        std::function<void()> task;
        {  // acquire lock
            std::unique_lock<std::mutex> lock(pool->mutex);
            ScopedLockAssertion held(pool->mutex);
            pool->taskCond.wait(lock, [pool] {
                ScopedLockAssertion waitHeld(pool->mutex);
                return pool->stop || !pool->tasks.empty();
            });
            // The pool is being destroyed: leave without touching anything more.
            if (pool->stop == XTHR_POOL_DESTROYED) return;
            if (pool->tasks.empty()) {
                // Finishing, and the queue is drained.
                if (--pool->numActive == 0) pool->doneCond.notify_one();
                return;
            }
            task = std::move(pool->tasks.front());
            pool->tasks.pop_front();
        }  // release lock
        // An empty task has nothing to run; calling it would throw. Its
        // captures die at the end of this turn, before the lock is taken again.
        if (task) task();
    }
}
