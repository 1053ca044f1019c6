// The timer service with its real thread and the real clock. Expiry checks
// need no tolerance: a callback reads the clock after the timer thread saw
// its expiry pass, so its reading is never below the scheduled time.
#include "xpl/Xtimer.h"

#include <gmock/gmock.h>

#include <climits>

#include "support/Gate.h"
#include "xpl/Xtime.h"

namespace {

using ::testing::ElementsAre;

// Logs `name`, marked when it runs before `earliest`. Every callback holds the
// log, so a failed test leaves none pointing into its frame.
std::function<void()> record(std::shared_ptr<EventLog> log, std::string name,
                             long long earliest = LLONG_MIN) {
    return [=] { log->record(xtimeNow() < earliest ? name + " early" : name); };
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
    const std::pair<const char*, long long> rows[] = {
        {"far", LLONG_MAX},  // saturates rather than wrapping round to the past
        {"30ms", 30000},    {"10ms", 10000},      {"zero", 0},           {"20ms", 20000},
        {"-5s", -5000000},  {"first", LLONG_MIN}, {"second", LLONG_MIN}, {"third", LLONG_MIN},
    };
    for (const auto& [name, delay] : rows) {
        const long long earliest = delay > 0 && delay < LLONG_MAX ? xtimeNow() + delay : LLONG_MIN;
        ASSERT_EQ(xtimerStart(delay, record(log, name, earliest)), XERR_SUCCESS);
    }
    release->open();
    ASSERT_TRUE(log->waitForCount(10));
    EXPECT_THAT(log->events(), ElementsAre("outer returns", "first", "second", "third", "inner",
                                           "-5s", "zero", "10ms", "20ms", "30ms"));
    // The thread now waits for "far": a new head must wake it.
    ASSERT_EQ(xtimerStart(1000, record(log, "near", xtimeNow() + 1000)), XERR_SUCCESS);
    ASSERT_TRUE(log->waitForCount(11));
    EXPECT_EQ(log->events().back(), "near");
}

}  // namespace
