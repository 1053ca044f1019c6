// The worker pool with real threads. Order is checked through gates: a task
// blocks on a gate until the test has arranged the queue behind it.

#include "xpl/XthrPool.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <atomic>
#include <cstdarg>
#include <cstdio>
#include <memory>
#include <string>
#include <thread>
#include <vector>

#include "threading/Gate.h"
#include "xpl/Xlog.h"

namespace {

using ::testing::ElementsAre;

// Each test owns a pool; whatever a test leaves blocked is released and the
// pool finished before the gates and the log that its tasks use go away.
class XthrPoolTest : public ::testing::Test {
  protected:
    ~XthrPoolTest() override {
        release.open();
        xthrPoolFini(&pool);
    }

    std::function<void()> recordTask(const std::string& name) {
        return [this, name] { events.record(name); };
    }

    int queued() {
        std::lock_guard<std::mutex> lock(pool.mutex);
        return static_cast<int>(pool.tasks.size());
    }

    Gate release;
    EventLog events;
    ThreadPool pool;
};

TEST_F(XthrPoolTest, AddTask_WhenOneWorker_RunsTasksInOrderAddedWithoutOverlap) {
    std::atomic<int> running{0};
    std::atomic<int> overlaps{0};
    ASSERT_EQ(xthrPoolInit(&pool, 1), XERR_SUCCESS);
    for (int i = 0; i < 50; ++i) {
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
    std::vector<std::string> expected;
    for (int i = 0; i < 50; ++i) expected.push_back(std::to_string(i));
    EXPECT_EQ(events.events(), expected) << "one worker runs the queue first in, first out";
    EXPECT_EQ(overlaps, 0) << "with one worker each task finishes before the next starts";
}

TEST_F(XthrPoolTest, AddTask_BeforeInitOrWithoutInit_StaysQueuedUntilWorkerStarts) {
    ASSERT_EQ(xthrPoolAddTask(&pool, recordTask("early")), XERR_SUCCESS)
        << "a pool that was never started still accepts tasks";
    EXPECT_EQ(queued(), 1) << "nothing runs tasks before xthrPoolInit";
    EXPECT_EQ(pool.numActive, 0);

    ASSERT_EQ(xthrPoolInit(&pool, 1), XERR_SUCCESS);
    xthrPoolFini(&pool);
    EXPECT_THAT(events.events(), ElementsAre("early")) << "the first worker takes the early task";
}

TEST_F(XthrPoolTest, Init_WhenCountBelowOne_StartsNoWorkerAndFiniReturnsAtOnce) {
    for (int count : {0, -1}) {
        ThreadPool idle;
        EXPECT_EQ(xthrPoolInit(&idle, count), XERR_SUCCESS);
        EXPECT_EQ(idle.numThreads, count) << "the count is recorded as given";
        EXPECT_EQ(idle.numActive, count);
        EXPECT_EQ(idle.stop, 0);
        EXPECT_EQ(xthrPoolAddTask(&idle, recordTask("never")), XERR_SUCCESS);
        xthrPoolFini(&idle);  // must not wait for workers that do not exist
        EXPECT_EQ(idle.stop, 1);
    }
    EXPECT_TRUE(events.events().empty()) << "no worker, so no task ever ran";
}

TEST_F(XthrPoolTest, Fini_WhenTasksQueued_DrainsQueueBeforeReturning) {
    Gate firstStarted;
    ASSERT_EQ(xthrPoolInit(&pool, 1), XERR_SUCCESS);
    xthrPoolAddTask(&pool, [&] {
        firstStarted.open();
        release.wait();
        events.record("first");
    });
    for (int i = 0; i < 5; ++i) xthrPoolAddTask(&pool, recordTask("queued"));
    ASSERT_TRUE(firstStarted.wait());

    std::thread finisher([&] { xthrPoolFini(&pool); });
    // Gate on the pool's own state: the finisher has set stop and is waiting.
    for (;;) {
        std::lock_guard<std::mutex> lock(pool.mutex);
        if (pool.stop) break;
        std::this_thread::yield();
    }
    EXPECT_EQ(queued(), 5) << "finishing discards nothing";
    release.open();
    finisher.join();

    EXPECT_EQ(events.events().size(), 6u) << "xthrPoolFini returns only once every task has run";
    EXPECT_EQ(pool.numActive, 0);
    EXPECT_EQ(queued(), 0);
    xthrPoolFini(&pool);  // a second call finds no worker and returns at once
}

TEST_F(XthrPoolTest, AddTask_FromRunningTask_RunsAfterCurrentAndEarlierQueuedTasks) {
    ASSERT_EQ(xthrPoolInit(&pool, 1), XERR_SUCCESS);
    xthrPoolAddTask(&pool, [&] {
        release.wait();
        xthrPoolAddTask(&pool, recordTask("added by A"));
        events.record("A");
    });
    xthrPoolAddTask(&pool, recordTask("B"));
    xthrPoolAddTask(&pool, recordTask("C"));
    release.open();
    // Finishing first would make A's own add a caller error.
    ASSERT_TRUE(events.waitForCount(4));
    EXPECT_THAT(events.events(), ElementsAre("A", "B", "C", "added by A"))
        << "a task's own task goes to the back of the queue, after the task returns";
}

TEST_F(XthrPoolTest, Init_WhenSeveralWorkers_RunsTasksConcurrently) {
    Gate secondStarted;
    ASSERT_EQ(xthrPoolInit(&pool, 2), XERR_SUCCESS);
    EXPECT_EQ(pool.numThreads, 2);
    xthrPoolAddTask(&pool, [&] {
        // Only a second worker can open this gate.
        events.record(secondStarted.wait() ? "first saw second" : "first alone");
    });
    xthrPoolAddTask(&pool, [&] { secondStarted.open(); });
    xthrPoolFini(&pool);
    EXPECT_THAT(events.events(), ElementsAre("first saw second"))
        << "two workers run two tasks at the same time";
}

TEST_F(XthrPoolTest, AddTask_FromManyThreads_RunsEveryTaskExactlyOnce) {
    constexpr int kThreads = 4;
    constexpr int kPerThread = 500;
    std::atomic<int> runs{0};
    ASSERT_EQ(xthrPoolInit(&pool, 2), XERR_SUCCESS);
    std::vector<std::thread> adders;
    for (int t = 0; t < kThreads; ++t) {
        adders.emplace_back([&] {
            for (int i = 0; i < kPerThread; ++i) xthrPoolAddTask(&pool, [&] { ++runs; });
        });
    }
    for (std::thread& adder : adders) adder.join();
    xthrPoolFini(&pool);
    EXPECT_EQ(runs, kThreads * kPerThread);
}

TEST_F(XthrPoolTest, AddTask_WhenTaskIsEmpty_WorkerSkipsItAndGoesOn) {
    ASSERT_EQ(xthrPoolInit(&pool, 1), XERR_SUCCESS);
    EXPECT_EQ(xthrPoolAddTask(&pool, std::function<void()>()), XERR_SUCCESS);
    xthrPoolAddTask(&pool, recordTask("after empty"));
    xthrPoolFini(&pool);
    EXPECT_THAT(events.events(), ElementsAre("after empty"))
        << "calling an empty function object would end the worker";
}

TEST(XthrPoolDestroy, Destructor_WhenTasksQueued_DestroysThemUnrun) {
    auto witness = std::make_shared<int>(0);
    {
        ThreadPool pool;
        xthrPoolAddTask(&pool, [witness] { ++*witness; });
        EXPECT_EQ(witness.use_count(), 2) << "the queue holds its own copy";
    }
    EXPECT_EQ(witness.use_count(), 1) << "the destroyed queue released the task";
    EXPECT_EQ(*witness, 0) << "queued tasks are not run at destruction";
}

// The fatal path, observed through a logger of the test's own installed as
// the support library's logger; the line goes to standard error, where the
// death test reads it.
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
    static ThreadPool pool;
    g_fatalPool = &pool;
    static const XlogLogger logger = {logEverything, printToStderr};
    xlogLibInit(&logger, "", "*:I");
    xthrPoolInit(&pool, 1);
    xthrPoolFini(&pool);
    xthrPoolAddTask(&pool, [] {});
}

bool endedByDebugBreak(int status) {
    // The trap ends the process; were it ignored, the break exits with 1.
    return (WIFSIGNALED(status) && WTERMSIG(status) == SIGTRAP) ||
           (WIFEXITED(status) && WEXITSTATUS(status) == 1);
}

TEST(XthrPoolDeathTest, AddTask_AfterFini_PrintsFatalLineWithoutLockAndEndsProcess) {
    GTEST_FLAG_SET(death_test_style, "threadsafe");
    EXPECT_EXIT(addAfterFini(), endedByDebugBreak,
                "level=0 module=43 file=Source/xpl/XthrPool lock=free line=same "
                "msg=FATAL: DEBUG BREAK: Source/xpl/XthrPool:[0-9]+ xthrPoolAddTask\\(\\)\\|");
}

}  // namespace
