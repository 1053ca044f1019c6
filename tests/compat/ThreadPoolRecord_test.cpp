// The worker pool as a caller outside the library uses it: this file declares
// the pool record itself, from its seven documented members, never includes
// the library's pool header, and links the shipped library. Every operation
// runs on value-initialised pools of this declaration, on the stack and on
// the heap (where a library that read past the record meets AddressSanitizer).

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/wait.h>

#include <atomic>
#include <condition_variable>
#include <csignal>
#include <cstdarg>
#include <cstdint>
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

using ::testing::ElementsAre;

// Runs `body` on a fresh pool on the stack, then on one on the heap. The body
// leaves the pool finished or never started: a caller's own record is simply
// destroyed, so no worker may outlive it.
void onStackAndHeap(const std::function<void(ThreadPool&)>& body) {
    {
        SCOPED_TRACE("pool on the stack");
        ThreadPool pool{};
        body(pool);
    }
    {
        SCOPED_TRACE("pool on the heap");
        auto pool = std::make_unique<ThreadPool>();
        body(*pool);
    }
}

size_t queued(ThreadPool& pool) {
    std::lock_guard<std::mutex> lock(pool.mutex);
    return pool.tasks.size();
}

TEST(ThreadPoolRecord, AddTask_WhenOneWorker_RunsTasksInOrderAddedWithoutOverlap) {
    onStackAndHeap([](ThreadPool& pool) {
        EventLog events;
        std::atomic<int> running{0};
        std::atomic<int> overlaps{0};
        ASSERT_EQ(xthrPoolInit(&pool, 1), XERR_SUCCESS);
        std::vector<std::string> expected;
        for (int i = 0; i < 50; ++i) {
            expected.push_back(std::to_string(i));
            ASSERT_EQ(xthrPoolAddTask(&pool,
                                      [&, i] {
                                          if (running.fetch_add(1) != 0) ++overlaps;
                                          events.record(std::to_string(i));
                                          std::this_thread::yield();
                                          running.fetch_sub(1);
                                      }),
                      XERR_SUCCESS);
        }
        xthrPoolFini(&pool);
        EXPECT_EQ(events.events(), expected) << "one worker runs the queue first in, first out";
        EXPECT_EQ(overlaps, 0) << "with one worker each task finishes before the next starts";
        EXPECT_EQ(pool.numActive, 0);
    });
}

// The count is recorded as given; a pool without workers accepts tasks and
// keeps them until a worker starts, and finishing it does not wait.
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

TEST(ThreadPoolRecord, Fini_WhenTasksQueued_DrainsQueueBeforeReturning) {
    onStackAndHeap([](ThreadPool& pool) {
        Gate firstStarted;
        Gate release;
        std::atomic<int> runs{0};
        ASSERT_EQ(xthrPoolInit(&pool, 1), XERR_SUCCESS);
        xthrPoolAddTask(&pool, [&] {
            firstStarted.open();
            release.wait();
            ++runs;
        });
        for (int i = 0; i < 5; ++i) xthrPoolAddTask(&pool, [&] { ++runs; });
        ASSERT_TRUE(firstStarted.wait());

        std::thread finisher([&] { xthrPoolFini(&pool); });
        for (bool stopping = false; !stopping; std::this_thread::yield()) {
            std::lock_guard<std::mutex> lock(pool.mutex);
            stopping = pool.stop != 0;
        }
        EXPECT_EQ(queued(pool), 5u) << "finishing discards nothing";
        release.open();
        finisher.join();
        EXPECT_EQ(runs, 6) << "xthrPoolFini returns only once every task has run";
        xthrPoolFini(&pool);  // a second call finds no worker and returns at once
    });
}

TEST(ThreadPoolRecord, AddTask_FromRunningTask_RunsAfterCurrentAndEarlierQueuedTasks) {
    onStackAndHeap([](ThreadPool& pool) {
        EventLog events;
        Gate release;
        ASSERT_EQ(xthrPoolInit(&pool, 1), XERR_SUCCESS);
        xthrPoolAddTask(&pool, [&] {
            release.wait();
            xthrPoolAddTask(&pool, [&] { events.record("added by A"); });
            events.record("A");
        });
        xthrPoolAddTask(&pool, [&] { events.record("B"); });
        release.open();
        // Finishing first would make A's own add a caller error.
        ASSERT_TRUE(events.waitForCount(3));
        xthrPoolFini(&pool);
        EXPECT_THAT(events.events(), ElementsAre("A", "B", "added by A"))
            << "a task's own task goes to the back of the queue, after the task returns";
    });
}

TEST(ThreadPoolRecord, Init_WhenSeveralWorkers_RunsTasksSideBySide) {
    onStackAndHeap([](ThreadPool& pool) {
        Gate secondStarted;
        std::atomic<bool> sawSecond{false};
        ASSERT_EQ(xthrPoolInit(&pool, 2), XERR_SUCCESS);
        // Only a second worker can open this gate.
        xthrPoolAddTask(&pool, [&] { sawSecond = secondStarted.wait(); });
        xthrPoolAddTask(&pool, [&] { secondStarted.open(); });
        xthrPoolFini(&pool);
        EXPECT_TRUE(sawSecond) << "two workers run two tasks at the same time";
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
        EXPECT_THAT(events.events(), ElementsAre("first", "second"));
        EXPECT_EQ(queued(pool), 0u);
    });
}

// The fatal path, observed through a logger of the test's own; the line goes
// to standard error, where the death test reads it.
ThreadPool* g_fatalPool = nullptr;

int logEverything(int, int) { return 1; }

// Writes what the statement handed over, whether the pool's lock was free
// while it printed, and whether the line in the text is the statement's own.
void printToStderr(int level, int module, const char* file, const char*, int line,
                   const char* format, ...) {
    bool lockFree = g_fatalPool->mutex.try_lock();
    if (lockFree) g_fatalPool->mutex.unlock();
    char message[256];
    va_list args;
    va_start(args, format);
    std::vsnprintf(message, sizeof(message), format, args);
    va_end(args);
    const std::string ownLine = ":" + std::to_string(line) + " ";
    std::fprintf(stderr, "level=%d module=%d file=%s lock=%s line=%s msg=%s|\n", level, module,
                 file, lockFree ? "free" : "held",
                 std::string(message).find(ownLine) != std::string::npos ? "same" : "other",
                 message);
}

void addAfterFini() {
    g_fatalPool = new ThreadPool();
    static const XlogLogger logger = {logEverything, printToStderr};
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
