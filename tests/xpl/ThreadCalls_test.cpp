// The pool and the timer service as seen from the C library's thread calls. A
// program of its own: it replaces pthread_create and pthread_cond_signal/_broadcast.
#include <gtest/gtest.h>

#include <climits>

#include "support/Gate.h"
#include "support/LogRecorder.h"
#include "threading/ThreadCreateFault.h"
#include "xpl/XthrPool.h"
#include "xpl/Xtimer.h"

namespace {

std::atomic<pthread_cond_t*> gWatched{nullptr};
std::atomic<int> gWakes{0};

int countAndCall(const char* name, pthread_cond_t* cond) {
    if (cond == gWatched.load()) ++gWakes;
    using Call = int (*)(pthread_cond_t*);  // the default version, as std::condition_variable
    return reinterpret_cast<Call>(dlsym(RTLD_NEXT, name))(cond);
}

}  // namespace

extern "C" int pthread_cond_signal(pthread_cond_t* c) { return countAndCall(__func__, c); }
extern "C" int pthread_cond_broadcast(pthread_cond_t* c) { return countAndCall(__func__, c); }

namespace {

// Regression: xthrPoolFini waited for every worker asked for, started or not,
// and so never returned.
TEST(ThreadCreateFailure,
     PoolInit_WhenCreationFailsPartWay_ReportsErrorAndFiniWaitsOnlyForStarted) {
    LogRecorder recorder;
    ThreadPool pool;
    {
        ThreadCreateFault fault(/*succeedFirst=*/2);
        EXPECT_EQ(xthrPoolInit(&pool, 4), XERR_AGAIN);
    }
    const std::vector<LoggedLine> lines = recorder.lines(XLOG_MODULE_XTHR);
    ASSERT_EQ(lines.size(), 1u);
    EXPECT_EQ(levelLetter(lines[0].level) + lines[0].text,
              "ExthrPoolInit: started 2 of 4 workers, error 11\n");
    EXPECT_EQ(pool.numThreads * 10 + pool.numActive, 42) << "4 asked for, 2 to wait for";
    // Both started workers are live: each holds a task until the other runs.
    std::atomic<int> runs{0};
    Gate first, second;
    xthrPoolAddTask(&pool, [&] { first.open(), runs += second.wait(); });
    xthrPoolAddTask(&pool, [&] { second.open(), runs += first.wait(); });
    xthrPoolFini(&pool);
    EXPECT_EQ(runs * 10 + pool.numActive, 20);
    pool.~ThreadPool();  // a caller still adding at exit meets this
    EXPECT_EQ(xthrPoolAddTask(&pool, [] {}), XERR_FAILURE) << "refused, and no caller error";
    new (&pool) ThreadPool();
}

// Regression: a failed creation left the lock held or the flag set with no
// thread behind it. Once made, the thread is woken only for a new head.
TEST(XtimerThread, Start_MakesTheThreadOnceItCanAndWakesItOnlyForANewHead) {
    auto ran = std::make_shared<EventLog>();
    const int attempts = threadCreateAttempts();
    {
        ThreadCreateFault fault(/*succeedFirst=*/0);
        EXPECT_EQ(xtimerStart(0, [ran] { ran->record("refused"); }), XERR_AGAIN);
    }
    ASSERT_TRUE(g_xtimer->mutex.try_lock()) << "the lock is released on the failure path";
    EXPECT_EQ(g_xtimer->threadStarted + g_xtimer->timers.size(), 0u) << "no flag, none pending";
    g_xtimer->mutex.unlock();
    gWatched = g_xtimer->cond.native_handle();
    constexpr long long kSecond = 1000000;
    const std::pair<long long, int> rows[] = {
        // delay, wake-ups
        {LLONG_MAX, 1},  // the only one pending is the earliest
        {LLONG_MAX, 0},  // an equal expiry goes behind the head
        {120 * kSecond, 1}, {240 * kSecond, 0}, {60 * kSecond, 1}, {90 * kSecond, 0},
    };
    for (const auto& [delay, wakes] : rows) {
        const int before = gWakes;
        ASSERT_EQ(xtimerStart(delay, [] {}), XERR_SUCCESS);
        EXPECT_EQ(gWakes - before, wakes) << delay;
    }
    for (int i = 0; i < 10; ++i) ASSERT_EQ(xtimerStart(0, [ran] { ran->record("ran"); }), 0);
    ASSERT_TRUE(ran->waitForCount(10));
    EXPECT_EQ(threadCreateAttempts(), attempts + 2) << "one refused, then one for all";
}

}  // namespace
