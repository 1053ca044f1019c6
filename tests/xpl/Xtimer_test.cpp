// The timer service with its real thread and the real clock. Expiry checks
// need no tolerance: a callback reads the clock after the timer thread saw
// its expiry pass, so its reading is never below the scheduled time.
#include "xpl/Xtimer.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <climits>
#include <memory>
#include <string>

#include "support/Gate.h"
#include "xpl/Xtime.h"

namespace {

using ::testing::ElementsAre;

// Logs `name`, marked when it runs before `earliest` or from `late` on. Every
// callback holds the log, so a failed test leaves none pointing into its frame.
std::function<void()> record(std::shared_ptr<EventLog> log, std::string name,
                             long long earliest = LLONG_MIN, long long late = LLONG_MAX) {
    return [=] {
        const long long now = xtimeNow();
        log->record(name + (now < earliest ? " early" : now >= late ? " late" : ""));
    };
}

TEST(Xtimer, Start_RunsCallbacksByExpiryThenSchedulingOrderNeverEarly) {
    auto log = std::make_shared<EventLog>();
    auto holding = std::make_shared<Gate>(), release = std::make_shared<Gate>();
    // Holds the timer thread until every row is pending, then schedules from
    // the callback: the lock is not held while it runs.
    xtimerStart(0, [=] {
        holding->open();
        release->wait();
        EXPECT_EQ(xtimerStart(-10000000, record(log, "inner")), XERR_SUCCESS);
        log->record("outer returns");
    });
    ASSERT_TRUE(holding->wait());
    EXPECT_EQ(xtimerStart(0, std::function<void()>()), XERR_INVAL) << "it would end the thread";
    const struct {
        const char* name;
        long long delay;
    } rows[] = {
        {"far", LLONG_MAX},  // saturates rather than wrapping round to the past
        {"30ms", 30000},    {"10ms", 10000},      {"zero", 0},           {"20ms", 20000},
        {"-5s", -5000000},  {"first", LLONG_MIN}, {"second", LLONG_MIN}, {"third", LLONG_MIN},
    };
    for (const auto& row : rows) {
        const bool ahead = row.delay > 0 && row.delay < LLONG_MAX;
        const long long earliest = ahead ? xtimeNow() + row.delay : LLONG_MIN;
        ASSERT_EQ(xtimerStart(row.delay, record(log, row.name, earliest)), XERR_SUCCESS);
    }
    release->open();
    ASSERT_TRUE(log->waitForCount(10));
    EXPECT_THAT(log->events(), ElementsAre("outer returns", "first", "second", "third", "inner",
                                           "-5s", "zero", "10ms", "20ms", "30ms"));
}

TEST(Xtimer, Start_WhenEarlierCallbackScheduledDuringLongWait_RunsItWithoutWaitingForHead) {
    auto log = std::make_shared<EventLog>();
    const long long far = xtimeNow() + 2000000;
    ASSERT_EQ(xtimerStart(2000000, record(log, "far", far)), XERR_SUCCESS);
    // Once this has run, the thread's next step is the long wait for "far".
    auto probed = std::make_shared<Gate>();
    xtimerStart(0, [probed] { probed->open(); });
    ASSERT_TRUE(probed->wait());
    ASSERT_EQ(xtimerStart(1000, record(log, "near", xtimeNow() + 1000, far)), XERR_SUCCESS);
    ASSERT_TRUE(log->waitForCount(2));
    EXPECT_THAT(log->events(), ElementsAre("near", "far")) << "late: the thread was not woken";
}

}  // namespace
