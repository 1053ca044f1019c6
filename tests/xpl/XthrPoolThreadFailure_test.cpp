// A worker thread that cannot be created: xthrPoolInit reports the error, the
// workers already started keep running, and a later xthrPoolFini waits only
// for them. The system's thread limit is stood in for at pthread_create.

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <atomic>

#include "threading/Gate.h"
#include "threading/ThreadCreateFault.h"
#include "xpl/XthrPool.h"

namespace {

// Regression: xthrPoolFini waited for every worker asked for, started or not,
// and so never returned.
TEST(XthrPoolThreadFailure, Init_WhenCreationFailsPartWay_ReportsErrorAndFiniWaitsOnlyForStarted) {
    ThreadPool pool;
    Gate release;
    std::atomic<int> runs{0};
    {
        ThreadCreateFault fault(/*succeedFirst=*/2);
        EXPECT_EQ(xthrPoolInit(&pool, 4), XERR_AGAIN) << "the creation error is the result";
    }
    EXPECT_EQ(pool.numThreads, 4) << "the count asked for is still recorded";
    EXPECT_EQ(pool.numActive, 2) << "only the two workers that exist are waited for";

    // Both started workers are live: each holds a task until the other runs.
    Gate firstRunning;
    Gate secondRunning;
    xthrPoolAddTask(&pool, [&] {
        firstRunning.open();
        if (secondRunning.wait()) ++runs;
    });
    xthrPoolAddTask(&pool, [&] {
        secondRunning.open();
        if (firstRunning.wait()) ++runs;
    });
    xthrPoolFini(&pool);
    EXPECT_EQ(runs, 2) << "the started workers run tasks side by side";
    EXPECT_EQ(pool.numActive, 0);
}

TEST(XthrPoolThreadFailure, Init_WhenNoWorkerCanBeCreated_FiniReturnsAndTasksStayQueued) {
    ThreadPool pool;
    bool ran = false;
    xthrPoolAddTask(&pool, [&] { ran = true; });
    {
        ThreadCreateFault fault(/*succeedFirst=*/0);
        EXPECT_EQ(xthrPoolInit(&pool, 1), XERR_AGAIN);
    }
    EXPECT_EQ(pool.numActive, 0);
    xthrPoolFini(&pool);
    EXPECT_FALSE(ran) << "no worker exists to run the task";
    std::lock_guard<std::mutex> lock(pool.mutex);
    EXPECT_EQ(pool.tasks.size(), 1u);
}

}  // namespace
