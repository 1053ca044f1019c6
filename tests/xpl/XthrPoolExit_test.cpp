// The process-wide pool at process exit. Its detached worker is never
// finished, so the pool is destroyed under a live worker; the exit must
// neither crash nor hang, and queued tasks are not run. Each state is
// entered many times, since what goes wrong depends on timing.

#include <gtest/gtest.h>

#include <string>

#include "threading/ExitRun.h"

namespace {

constexpr int kRepeats = 20;

// Regression: destroying the pool's condition variable while the worker
// waited on it hung the exit in glibc.
TEST(XthrPoolExit, Exit_WhenWorkerIdle_EndsCleanly) {
    for (int i = 0; i < kRepeats; ++i) {
        ExitRun run = runExitScenario({"pool-idle"});
        ASSERT_TRUE(run.exitedCleanly()) << "run " << i << ": " << run.describe();
        EXPECT_EQ(run.output, "") << "the worker should have parked before the exit";
    }
}

TEST(XthrPoolExit, Exit_WhenWorkerInsideLongTask_EndsCleanlyAndDropsQueuedTasks) {
    for (int i = 0; i < kRepeats; ++i) {
        ExitRun run = runExitScenario({"pool-busy"});
        ASSERT_TRUE(run.exitedCleanly()) << "run " << i << ": " << run.describe();
        EXPECT_EQ(run.output, "queued task dropped\n")
            << "a task queued behind the running one is destroyed at exit, never run";
    }
}

// Regression: a worker coming back from its task after the queue had been
// destroyed read freed memory.
TEST(XthrPoolExit, Exit_WhenWorkerReturnsFromTaskDuringExit_EndsCleanly) {
    for (int i = 0; i < kRepeats; ++i) {
        const std::string delayUs = std::to_string(i * 100);
        ExitRun run = runExitScenario({"pool-returning", delayUs});
        ASSERT_TRUE(run.exitedCleanly())
            << "return " << delayUs << " us into the exit: " << run.describe();
    }
}

TEST(XthrPoolExit, Exit_WhenAnotherThreadKeepsAddingTasks_EndsWithoutDebugBreak) {
    for (int i = 0; i < kRepeats; ++i) {
        ExitRun run = runExitScenario({"pool-adding"});
        ASSERT_TRUE(run.exitedCleanly())
            << "a task added while the pool is destroyed is dropped quietly, not a caller "
               "error: "
            << run.describe();
    }
}

}  // namespace
