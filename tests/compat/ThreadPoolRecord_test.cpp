// The worker pool as a caller outside the library uses it: this file declares
// the pool record itself, from its seven documented members, never includes
// the library's pool header, and links the shipped library. Every operation
// runs on value-initialised pools of this declaration, on the stack and on
// the heap (where a library that read past the record meets AddressSanitizer).

#include <gtest/gtest.h>
#include <sys/wait.h>

#include <atomic>
#include <condition_variable>
#include <csignal>
#include <cstdarg>
#include <cstdio>
#include <deque>
#include <functional>
#include <memory>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "support/Gate.h"
#include "xpl/Xerr.h"
#include "xpl/Xlog.h"

struct ThreadPool {
    std::mutex mutex;
    std::condition_variable taskCond;
    std::deque<std::function<void()>> tasks;
    int32_t numThreads;
    int32_t stop;
    int32_t numActive;
    std::condition_variable doneCond;
};
typedef ThreadPool XthrPool;

xerr_t xthrPoolInit(XthrPool* pool, int numThreads);
xerr_t xthrPoolAddTask(XthrPool* pool, std::function<void()> task);
void xthrPoolFini(XthrPool* pool);
void xthrPoolThreadEntry(XthrPool* pool);

namespace {

// Runs `body` on a fresh pool on the stack, then on one on the heap. The body
// leaves the pool finished or never started: a caller's own record is simply
// destroyed, so no worker may outlive it.
void onStackAndHeap(const std::function<void(ThreadPool&)>& body) {
    {
        SCOPED_TRACE("pool on the stack");
        ThreadPool pool{};
        body(pool);
    }
    SCOPED_TRACE("pool on the heap");
    body(*std::make_unique<ThreadPool>());
}

size_t queued(ThreadPool& pool) {
    std::lock_guard<std::mutex> lock(pool.mutex);
    return pool.tasks.size();
}

// One worker runs the queue first in, first out, one task at a time; a task's
// own task goes to the back; finishing discards nothing and returns once
// every queued task has run.
TEST(ThreadPoolRecord, OneWorker_RunsTasksInOrderAndFiniDrainsTheQueue) {
    onStackAndHeap([](ThreadPool& pool) {
        EventLog events;
        Gate added, release;
        std::atomic<int> running{0}, overlaps{0};
        xthrPoolAddTask(&pool, [&] {
            xthrPoolAddTask(&pool, [&] { events.record("added by 0"); });
            added.open();
            release.wait();
            events.record("0");
        });
        std::vector<std::string> expected = {"0"};
        for (int i = 1; i < 20; ++i) {
            expected.push_back(std::to_string(i));
            ASSERT_EQ(xthrPoolAddTask(&pool,
                                      [&, i] {
                                          overlaps += running.fetch_add(1) != 0;
                                          events.record(std::to_string(i));
                                          std::this_thread::yield();
                                          running.fetch_sub(1);
                                      }),
                      XERR_SUCCESS);
        }
        expected.push_back("added by 0");
        // Queued before the worker starts, so task 0's own task comes last.
        ASSERT_EQ(xthrPoolInit(&pool, 1), XERR_SUCCESS);
        ASSERT_TRUE(added.wait());
        std::thread finisher([&] { xthrPoolFini(&pool); });
        for (bool stopping = false; !stopping; std::this_thread::yield()) {
            std::lock_guard<std::mutex> lock(pool.mutex);
            stopping = pool.stop != 0;
        }
        EXPECT_EQ(queued(pool), 20u) << "finishing discards nothing";
        release.open();
        finisher.join();
        EXPECT_EQ(events.events(), expected);
        EXPECT_EQ(overlaps, 0);
        EXPECT_EQ(pool.numActive, 0);
        xthrPoolFini(&pool);  // a second call finds no worker and returns at once
    });
}

TEST(ThreadPoolRecord, Init_WhenCountZeroOrNegative_StartsNoWorkerAndKeepsTasksQueued) {
    for (int count : {0, -1}) {
        SCOPED_TRACE(count);
        onStackAndHeap([count](ThreadPool& pool) {
            bool ran = false;
            EXPECT_EQ(xthrPoolAddTask(&pool, [&] { ran = true; }), XERR_SUCCESS)
                << "a pool that was never started still accepts tasks";
            EXPECT_EQ(xthrPoolInit(&pool, count), XERR_SUCCESS);
            EXPECT_EQ(pool.numThreads, count);
            EXPECT_EQ(pool.numActive, count);
            xthrPoolFini(&pool);
            EXPECT_EQ(pool.stop, 1);
            EXPECT_FALSE(ran);
            EXPECT_EQ(queued(pool), 1u);
        });
    }
}

TEST(ThreadPoolRecord, Init_WhenSeveralWorkers_RunsTasksSideBySide) {
    onStackAndHeap([](ThreadPool& pool) {
        Gate warm, secondStarted;
        std::atomic<bool> sawSecond{false};
        ASSERT_EQ(xthrPoolInit(&pool, 2), XERR_SUCCESS);
        xthrPoolAddTask(&pool, [&] { warm.open(); });
        ASSERT_TRUE(warm.wait());
        // The workers wait for work now: each added task must wake one, and
        // only a second worker can open this gate.
        xthrPoolAddTask(&pool, [&] { sawSecond = secondStarted.wait(); });
        xthrPoolAddTask(&pool, [&] { secondStarted.open(); });
        EXPECT_TRUE(secondStarted.wait()) << "the tasks waited for xthrPoolFini";
        xthrPoolFini(&pool);
        EXPECT_TRUE(sawSecond);
    });
}

// The worker loop itself, on the caller's thread: on a finished pool it runs
// what is queued, in order, and returns. An empty task is skipped.
TEST(ThreadPoolRecord, ThreadEntry_OnFinishedPool_RunsTheQueueSkippingEmptyTasksAndReturns) {
    onStackAndHeap([](ThreadPool& pool) {
        EventLog events;
        xthrPoolAddTask(&pool, [&] { events.record("first"); });
        xthrPoolAddTask(&pool, std::function<void()>());
        xthrPoolAddTask(&pool, [&] { events.record("second"); });
        xthrPoolFini(&pool);
        xthrPoolThreadEntry(&pool);
        EXPECT_EQ(events.events(), (std::vector<std::string>{"first", "second"}));
        EXPECT_EQ(queued(pool), 0u);
    });
}

// The fatal path, seen through a logger of the test's own that writes what
// the statement handed over to standard error, where the death test reads it:
// whether the pool's lock was free while it printed, and whether the line in
// the text is the statement's own.
ThreadPool* g_fatalPool = nullptr;

void printToStderr(int level, int module, const char* file, const char*, int line,
                   const char* format, ...) {
    const bool lockFree = g_fatalPool->mutex.try_lock();
    if (lockFree) g_fatalPool->mutex.unlock();
    char message[256];
    va_list args;
    va_start(args, format);
    std::vsnprintf(message, sizeof(message), format, args);
    va_end(args);
    const bool ownLine =
        std::string(message).find(":" + std::to_string(line) + " ") != std::string::npos;
    std::fprintf(stderr, "level=%d module=%d file=%s lock=%s line=%s msg=%s|\n", level, module,
                 file, lockFree ? "free" : "held", ownLine ? "same" : "other", message);
}

void addAfterFini() {
    g_fatalPool = new ThreadPool();
    static const XlogLogger logger = {[](int, int) { return 1; }, printToStderr};
    xlogLibInit(&logger, "", "*:I");
    xthrPoolInit(g_fatalPool, 1);
    xthrPoolFini(g_fatalPool);
    xthrPoolAddTask(g_fatalPool, [] {});
}

bool endedByDebugBreak(int status) {
    // The trap ends the process; were it ignored, the break exits with 1.
    return (WIFSIGNALED(status) && WTERMSIG(status) == SIGTRAP) ||
           (WIFEXITED(status) && WEXITSTATUS(status) == 1);
}

TEST(ThreadPoolRecordDeathTest, AddTask_AfterFini_PrintsFatalLineWithoutLockAndEndsProcess) {
    GTEST_FLAG_SET(death_test_style, "threadsafe");
    EXPECT_EXIT(addAfterFini(), endedByDebugBreak,
                "level=0 module=43 file=Source/xpl/XthrPool lock=free line=same "
                "msg=FATAL: DEBUG BREAK: Source/xpl/XthrPool:[0-9]+ xthrPoolAddTask\\(\\)\\|");
}

}  // namespace
