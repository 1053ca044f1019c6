// The timer service with its real thread and the real clock. Expiry checks
// need no tolerance: a callback reads the clock after the timer thread saw
// its expiry pass, so its reading is never below the scheduled time.

#include "xpl/Xtimer.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <climits>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "support/Gate.h"
#include "xpl/Xtime.h"

namespace {

using ::testing::ElementsAre;

// What callbacks saw, shared with them so that a failed test leaves no
// callback pointing into its frame.
struct Runs {
    EventLog order;
    std::mutex mutex;
    std::vector<long long> times;  // xtimeNow() at each run, in run order

    std::function<void()> record(const std::string& name) {
        return [this, name] {
            {
                std::lock_guard<std::mutex> lock(mutex);
                times.push_back(xtimeNow());
            }
            order.record(name);
        };
    }
    long long timeOf(size_t i) {
        std::lock_guard<std::mutex> lock(mutex);
        return times.at(i);
    }
};

// Blocks the timer thread inside a callback while in scope, so that a test
// can arrange the map behind it.
class TimerThreadHold {
  public:
    TimerThreadHold() {
        auto holding = std::make_shared<Gate>();
        xtimerStart(0, [release = release_, holding] {
            holding->open();
            release->wait();
        });
        EXPECT_TRUE(holding->wait()) << "the timer thread should take a callback due at once";
    }
    ~TimerThreadHold() { release_->open(); }
    void release() { release_->open(); }

  private:
    std::shared_ptr<Gate> release_ = std::make_shared<Gate>();
};

TEST(Xtimer, Start_WhenDelaysOutOfOrder_RunsInExpiryOrderNoEarlierThanExpiry) {
    auto runs = std::make_shared<Runs>();
    const long long delays[] = {30000, 10000, 20000};
    long long earliest[3];
    for (int i = 0; i < 3; ++i) {
        earliest[i] = xtimeNow() + delays[i];
        ASSERT_EQ(xtimerStart(delays[i], [runs, i] { runs->record(std::to_string(i))(); }),
                  XERR_SUCCESS);
    }
    ASSERT_TRUE(runs->order.waitForCount(3));
    EXPECT_THAT(runs->order.events(), ElementsAre("1", "2", "0")) << "ascending expiry";
    EXPECT_GE(runs->timeOf(0), earliest[1]) << "10 ms callback ran early";
    EXPECT_GE(runs->timeOf(1), earliest[2]) << "20 ms callback ran early";
    EXPECT_GE(runs->timeOf(2), earliest[0]) << "30 ms callback ran early";
}

TEST(Xtimer, Start_WhenExpiriesEqual_RunsInSchedulingOrder) {
    auto runs = std::make_shared<Runs>();
    TimerThreadHold hold;
    // The earliest possible expiry: every one of these has the same key,
    // however the clock moves between the calls.
    std::vector<std::string> expected;
    for (int i = 0; i < 20; ++i) {
        expected.push_back(std::to_string(i));
        ASSERT_EQ(xtimerStart(LLONG_MIN, runs->record(expected.back())), XERR_SUCCESS);
    }
    hold.release();
    ASSERT_TRUE(runs->order.waitForCount(20));
    EXPECT_EQ(runs->order.events(), expected) << "equal expiries run first scheduled, first run";
}

TEST(Xtimer, Start_WhenDelayZeroNegativeOrExtreme_RunsDueOnesAtOnceWithoutOverflow) {
    auto runs = std::make_shared<Runs>();
    // Never due: its expiry must saturate rather than wrap round to the past,
    // and the wait for it must not overflow the clock arithmetic.
    ASSERT_EQ(xtimerStart(LLONG_MAX, runs->record("never")), XERR_SUCCESS);
    ASSERT_EQ(xtimerStart(0, runs->record("zero")), XERR_SUCCESS);
    ASSERT_EQ(xtimerStart(-5000000, runs->record("negative")), XERR_SUCCESS);
    ASSERT_EQ(xtimerStart(1000, runs->record("later")), XERR_SUCCESS);
    ASSERT_TRUE(runs->order.waitForCount(3));
    std::vector<std::string> events = runs->order.events();
    EXPECT_THAT(events, ::testing::UnorderedElementsAre("zero", "negative", "later"))
        << "zero and negative delays are due at once, and the far one does not hold up others";
}

TEST(Xtimer, Start_WhenEarlierCallbackScheduledDuringLongWait_RunsItWithoutWaitingForHead) {
    // Far enough that the near callback cannot have waited it out by chance.
    constexpr long long kFarDelayUs = 2000000;
    constexpr long long kNearDelayUs = 1000;
    auto runs = std::make_shared<Runs>();
    const long long farExpiry = xtimeNow() + kFarDelayUs;
    ASSERT_EQ(xtimerStart(kFarDelayUs, runs->record("far")), XERR_SUCCESS);
    // Once this has run, the thread's next step is the long wait for "far".
    auto probed = std::make_shared<Gate>();
    xtimerStart(0, [probed] { probed->open(); });
    ASSERT_TRUE(probed->wait());

    const long long nearExpiry = xtimeNow() + kNearDelayUs;
    ASSERT_EQ(xtimerStart(kNearDelayUs, runs->record("near")), XERR_SUCCESS);
    ASSERT_TRUE(runs->order.waitForCount(1));
    EXPECT_THAT(runs->order.events(), ElementsAre("near"));
    EXPECT_GE(runs->timeOf(0), nearExpiry);
    EXPECT_LT(runs->timeOf(0), farExpiry) << "scheduling must wake the thread from its long wait";

    ASSERT_TRUE(runs->order.waitForCount(2));
    EXPECT_GE(runs->timeOf(1), farExpiry) << "the far callback still runs, and not early";
}

TEST(Xtimer, Start_FromCallback_RunsAfterCallbackReturnsNoEarlierThanExpiry) {
    constexpr long long kInnerDelayUs = 5000;
    auto runs = std::make_shared<Runs>();
    auto innerEarliest = std::make_shared<long long>(0);
    xtimerStart(0, [runs, innerEarliest] {
        *innerEarliest = xtimeNow() + kInnerDelayUs;
        EXPECT_EQ(xtimerStart(kInnerDelayUs, runs->record("inner")), XERR_SUCCESS)
            << "a callback may schedule: the lock is not held while it runs";
        runs->order.record("outer returns");
    });
    ASSERT_TRUE(runs->order.waitForCount(2));
    EXPECT_THAT(runs->order.events(), ElementsAre("outer returns", "inner"));
    EXPECT_GE(runs->timeOf(0), *innerEarliest);
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
