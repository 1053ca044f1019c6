// The timer service with its real thread and the real clock. Expiry checks
// need no tolerance: a callback reads the clock after the timer thread saw
// its expiry pass, so its reading is never below the scheduled time.
#include "xpl/Xtimer.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <climits>
#include <map>
#include <memory>
#include <mutex>
#include <string>

#include "support/Gate.h"
#include "xpl/Xtime.h"

namespace {

using ::testing::ElementsAre;

// What callbacks saw: their names in run order and xtimeNow() at each. Held
// by shared pointer in every callback, so that a failed test leaves none
// pointing into its frame.
struct Runs : std::enable_shared_from_this<Runs> {
    EventLog order;
    std::mutex mutex;
    std::map<std::string, long long> at;

    std::function<void()> record(const std::string& name) {
        return [self = shared_from_this(), name] {
            {
                std::lock_guard<std::mutex> lock(self->mutex);
                self->at[name] = xtimeNow();
            }
            self->order.record(name);
        };
    }
    long long timeOf(const std::string& name) {
        std::lock_guard<std::mutex> lock(mutex);
        return at.at(name);
    }
};

// Everything scheduled meanwhile is pending at once: the timer thread is
// held inside a callback until release().
TEST(Xtimer, Start_RunsCallbacksByExpiryThenSchedulingOrderNeverEarly) {
    auto runs = std::make_shared<Runs>();
    auto holding = std::make_shared<Gate>(), release = std::make_shared<Gate>();
    xtimerStart(0, [holding, release] {
        holding->open();
        release->wait();
    });
    ASSERT_TRUE(holding->wait());
    const struct {
        const char* name;
        long long delay;
    } rows[] = {
        {"far", LLONG_MAX},  // saturates rather than wrapping round to the past
        {"30ms", 30000},    {"10ms", 10000},      {"zero", 0},           {"20ms", 20000},
        {"-5s", -5000000},  {"first", LLONG_MIN}, {"second", LLONG_MIN}, {"third", LLONG_MIN},
    };
    std::map<std::string, long long> earliest;
    for (const auto& row : rows) {
        if (row.delay > 0 && row.delay < LLONG_MAX) earliest[row.name] = xtimeNow() + row.delay;
        ASSERT_EQ(xtimerStart(row.delay, runs->record(row.name)), XERR_SUCCESS);
    }
    release->open();
    ASSERT_TRUE(runs->order.waitForCount(8));
    EXPECT_THAT(runs->order.events(),
                ElementsAre("first", "second", "third", "-5s", "zero", "10ms", "20ms", "30ms"));
    for (const auto& [name, time] : earliest) EXPECT_GE(runs->timeOf(name), time) << name;
}

TEST(Xtimer, Start_WhenEarlierCallbackScheduledDuringLongWait_RunsItWithoutWaitingForHead) {
    auto runs = std::make_shared<Runs>();
    const long long farExpiry = xtimeNow() + 2000000;  // beyond any chance
    ASSERT_EQ(xtimerStart(2000000, runs->record("far")), XERR_SUCCESS);
    // Once this has run, the thread's next step is the long wait for "far".
    auto probed = std::make_shared<Gate>();
    xtimerStart(0, [probed] { probed->open(); });
    ASSERT_TRUE(probed->wait());

    const long long nearExpiry = xtimeNow() + 1000;
    ASSERT_EQ(xtimerStart(1000, runs->record("near")), XERR_SUCCESS);
    ASSERT_TRUE(runs->order.waitForCount(1));
    EXPECT_GE(runs->timeOf("near"), nearExpiry);
    EXPECT_LT(runs->timeOf("near"), farExpiry) << "scheduling must wake the thread from its wait";
    ASSERT_TRUE(runs->order.waitForCount(2));
    EXPECT_GE(runs->timeOf("far"), farExpiry) << "the far callback still runs, and not early";
}

TEST(Xtimer, Start_FromCallback_RunsAfterCallbackReturnsNoEarlierThanExpiry) {
    auto runs = std::make_shared<Runs>();
    auto innerEarliest = std::make_shared<long long>(0);
    xtimerStart(0, [runs, innerEarliest] {
        *innerEarliest = xtimeNow() + 5000;
        EXPECT_EQ(xtimerStart(5000, runs->record("inner")), XERR_SUCCESS)
            << "a callback may schedule: the lock is not held while it runs";
        runs->order.record("outer returns");
    });
    ASSERT_TRUE(runs->order.waitForCount(2));
    EXPECT_THAT(runs->order.events(), ElementsAre("outer returns", "inner"));
    EXPECT_GE(runs->timeOf("inner"), *innerEarliest);
}

// Scheduled, an empty callback would end the timer thread, and with it this
// program, when called.
TEST(Xtimer, Start_WhenCallbackEmpty_RefusesIt) {
    EXPECT_EQ(xtimerStart(0, std::function<void()>()), XERR_INVAL);
    auto ran = std::make_shared<Gate>();
    xtimerStart(0, [ran] { ran->open(); });
    EXPECT_TRUE(ran->wait()) << "the timer thread goes on";
}

}  // namespace
