// The timer service at process exit: its record is never freed, so its
// detached thread may go on through the exit, waiting or running a callback.

#include <gtest/gtest.h>

#include <string>

#include "threading/ExitRun.h"

namespace {

constexpr int kRepeats = 20;

TEST(XtimerExit, Exit_WhenTimerThreadWaitsForFarExpiry_EndsCleanlyWithoutRunningIt) {
    for (int i = 0; i < kRepeats; ++i) {
        ExitRun run = runExitScenario({"timer-waiting"});
        ASSERT_TRUE(run.exitedCleanly()) << "run " << i << ": " << run.describe();
        EXPECT_EQ(run.output, "") << "a callback not yet due when the process ends never runs";
    }
}

TEST(XtimerExit, Exit_WhenCallbackReturnsAndSchedulesDuringExit_EndsCleanly) {
    for (int i = 0; i < kRepeats; ++i) {
        const std::string delayUs = std::to_string(i * 100);
        ExitRun run = runExitScenario({"timer-returning", delayUs});
        ASSERT_TRUE(run.exitedCleanly())
            << "return " << delayUs << " us into the exit: " << run.describe();
    }
}

}  // namespace
