// The timer thread itself: started once, by the first xtimerStart, and a
// thread that cannot be created leaves the service as it was. The system's
// thread limit is stood in for at pthread_create. The service is process
// wide: each test takes it as it finds it.

#include <gtest/gtest.h>

#include <memory>
#include <string>
#include <thread>
#include <vector>

#include "support/Gate.h"
#include "threading/ThreadCreateFault.h"
#include "xpl/Xtimer.h"

namespace {

// Regression: a failed creation left the lock held or the flag set with no
// thread behind it, so every later callback was silently lost.
TEST(XtimerThread, Start_WhenThreadCannotBeCreated_ReportsErrorAndLeavesServiceUntouched) {
    if (g_xtimer->threadStarted) GTEST_SKIP() << "the timer thread already runs in this process";
    auto ran = std::make_shared<Gate>();
    {
        ThreadCreateFault fault(/*succeedFirst=*/0);
        EXPECT_EQ(xtimerStart(0, [ran] { ran->open(); }), XERR_AGAIN);
    }
    ASSERT_TRUE(g_xtimer->mutex.try_lock()) << "the lock is released on the failure path";
    EXPECT_EQ(g_xtimer->threadStarted, 0) << "no thread, so the next call must try again";
    EXPECT_TRUE(g_xtimer->timers.empty()) << "a refused callback is not left pending";
    g_xtimer->mutex.unlock();

    EXPECT_EQ(xtimerStart(0, [ran] { ran->open(); }), XERR_SUCCESS);
    EXPECT_TRUE(ran->wait()) << "once a thread can be created, callbacks run";
}

TEST(XtimerThread, Start_WhenCalledRepeatedly_StartsOneThreadOnly) {
    auto done = std::make_shared<EventLog>();
    xtimerStart(0, [done] { done->record("first"); });
    ASSERT_TRUE(done->waitForCount(1));
    const int before = threadCreateAttempts();
    std::thread::id caller = std::this_thread::get_id();
    for (int i = 0; i < 10; ++i) {
        xtimerStart(0, [done, caller] {
            done->record(std::this_thread::get_id() == caller ? "caller" : "timer thread");
        });
    }
    ASSERT_TRUE(done->waitForCount(11));
    EXPECT_EQ(threadCreateAttempts(), before) << "the thread from the first call serves all";
    EXPECT_EQ(g_xtimer->threadStarted, 1);
    std::vector<std::string> where = done->events();
    for (size_t i = 1; i < where.size(); ++i) EXPECT_EQ(where[i], "timer thread");
}

}  // namespace
