// The pool and the timer service when a thread cannot be created, as at the
// system's thread limit. A program of its own: it replaces pthread_create.
// The timer service is process wide: each test takes it as it finds it.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <atomic>
#include <memory>
#include <string>
#include <thread>

#include "support/Gate.h"
#include "support/LogRecorder.h"
#include "threading/ThreadCreateFault.h"
#include "xpl/XthrPool.h"
#include "xpl/Xtimer.h"

namespace {

// Regression: xthrPoolFini waited for every worker asked for, started or not,
// and so never returned.
TEST(ThreadCreateFailure,
     PoolInit_WhenCreationFailsPartWay_ReportsErrorAndFiniWaitsOnlyForStarted) {
    LogRecorder recorder;
    ThreadPool pool;
    {
        ThreadCreateFault fault(/*succeedFirst=*/2);
        EXPECT_EQ(xthrPoolInit(&pool, 4), XERR_AGAIN) << "the creation error is the result";
    }
    EXPECT_EQ(recorder.texts(XLOG_MODULE_XTHR),
              std::vector<std::string>{"xthrPoolInit: started 2 of 4 workers, error 11\n"})
        << "native_init ignores the result, so the line is all that tells of it";
    EXPECT_EQ(recorder.lines(XLOG_MODULE_XTHR).at(0).level, XLOG_LEVEL_E);
    EXPECT_EQ(pool.numThreads * 10 + pool.numActive, 42) << "4 asked for, 2 to wait for";

    // Both started workers are live: each holds a task until the other runs.
    std::atomic<int> runs{0};
    Gate first, second;
    xthrPoolAddTask(&pool, [&] {
        first.open();
        runs += second.wait();
    });
    xthrPoolAddTask(&pool, [&] {
        second.open();
        runs += first.wait();
    });
    xthrPoolFini(&pool);
    EXPECT_EQ(runs, 2) << "the started workers run tasks side by side";
    EXPECT_EQ(pool.numActive, 0);
}

// Regression: a failed creation left the lock held or the flag set with no
// thread behind it, so every later callback was silently lost.
TEST(ThreadCreateFailure, TimerStart_WhenThreadCannotBeCreated_LeavesServiceUntouched) {
    if (g_xtimer->threadStarted) GTEST_SKIP() << "the timer thread already runs in this process";
    auto ran = std::make_shared<EventLog>();
    {
        ThreadCreateFault fault(/*succeedFirst=*/0);
        EXPECT_EQ(xtimerStart(0, [ran] { ran->record("refused"); }), XERR_AGAIN);
    }
    ASSERT_TRUE(g_xtimer->mutex.try_lock()) << "the lock is released on the failure path";
    EXPECT_EQ(g_xtimer->threadStarted, 0) << "no thread, so the next call must try again";
    EXPECT_TRUE(g_xtimer->timers.empty()) << "a refused callback is not left pending";
    g_xtimer->mutex.unlock();

    // Once a thread can be created, callbacks run, all on the one thread.
    const std::thread::id caller = std::this_thread::get_id();
    const std::function<void()> record = [ran, caller] {
        ran->record(std::this_thread::get_id() == caller ? "caller" : "timer thread");
    };
    ASSERT_EQ(xtimerStart(0, record), XERR_SUCCESS);
    ASSERT_TRUE(ran->waitForCount(1));
    const int attempts = threadCreateAttempts();
    for (int i = 0; i < 9; ++i) xtimerStart(0, record);
    ASSERT_TRUE(ran->waitForCount(10));
    EXPECT_EQ(threadCreateAttempts(), attempts) << "the thread from the first call serves all";
    EXPECT_THAT(ran->events(), ::testing::Each("timer thread"));
}

}  // namespace
