// The timer thread is woken only when a new callback becomes the earliest
// pending one: for any other it would wake, find the same head and wait again.
// Wake-ups are counted at the C library's pthread_cond_signal and
// pthread_cond_broadcast on the service's condition variable.
// A program of its own: it replaces those two functions for the whole process.

#include <dlfcn.h>
#include <gtest/gtest.h>
#include <pthread.h>

#include <atomic>
#include <climits>
#include <memory>
#include <mutex>
#include <thread>

#include "support/Gate.h"
#include "xpl/Xtimer.h"

namespace {

std::atomic<pthread_cond_t*> gWatched{nullptr};
std::atomic<int> gWakes{0};

using CondCall = int (*)(pthread_cond_t*);

int countAndCall(const char* name, pthread_cond_t* cond) {
    if (cond == gWatched.load()) ++gWakes;
    // The default version, which is the one std::condition_variable uses.
    return reinterpret_cast<CondCall>(dlsym(RTLD_NEXT, name))(cond);
}

}  // namespace

extern "C" int pthread_cond_signal(pthread_cond_t* cond) {
    return countAndCall("pthread_cond_signal", cond);
}
extern "C" int pthread_cond_broadcast(pthread_cond_t* cond) {
    return countAndCall("pthread_cond_broadcast", cond);
}

namespace {

// The timer thread exists and nothing is pending.
void startIdleTimerThread() {
    auto ran = std::make_shared<Gate>();
    ASSERT_EQ(xtimerStart(0, [ran] { ran->open(); }), XERR_SUCCESS);
    ASSERT_TRUE(ran->wait());
    for (bool empty = false; !empty; std::this_thread::yield()) {
        std::lock_guard<std::mutex> lock(g_xtimer->mutex);
        empty = g_xtimer->timers.empty();
    }
}

TEST(XtimerWake, Start_WhenNewCallbackIsNotTheEarliest_LeavesTheTimerThreadAsleep) {
    startIdleTimerThread();
    gWatched = g_xtimer->cond.native_handle();
    constexpr long long kSecond = 1000000;
    const struct {
        long long delay;
        int wakes;
        const char* why;
    } rows[] = {
        {LLONG_MAX, 1, "the only pending callback is the earliest"},
        {LLONG_MAX, 0, "an equal expiry goes behind the head"},
        {120 * kSecond, 1, "earlier than the head"},
        {240 * kSecond, 0, "later than the head"},
        {60 * kSecond, 1, "earlier than the head again"},
        {90 * kSecond, 0, "between the head and the rest"},
    };
    for (const auto& row : rows) {
        const int before = gWakes;
        ASSERT_EQ(xtimerStart(row.delay, [] {}), XERR_SUCCESS);
        EXPECT_EQ(gWakes - before, row.wakes) << row.why;
    }
}

}  // namespace
