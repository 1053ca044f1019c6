#include "xpl/Xtime.h"

#include <gtest/gtest.h>
#include <sys/time.h>

#include <cstring>
#include <ctime>
#include <string>

#include "support/ChildProcess.h"

namespace {

constexpr long long kMicrosPerSecond = 1000000;
constexpr long long kHalfPastFiveHours = 19800LL * kMicrosPerSecond;
constexpr long long kOneHour = 3600LL * kMicrosPerSecond;
// Two readings of the wall clock taken around xtimeNow may differ by this much.
constexpr long long kClockTolerance = 2 * kMicrosPerSecond;

long long wallClockMicros() {
    struct timeval tv {};
    gettimeofday(&tv, nullptr);
    return static_cast<long long>(tv.tv_sec) * kMicrosPerSecond + tv.tv_usec;
}

// Checks that xtimeNow is the wall clock plus `offset`, and that xtimeToUtc
// removes the offset, in the current zone. Empty on success.
std::string checkOffset(long long offset, long long utcShift) {
    long long before = wallClockMicros();
    long long now = xtimeNow();
    long long after = wallClockMicros();
    if (now - offset < before - kClockTolerance || now - offset > after + kClockTolerance) {
        return "xtimeNow is off by " + std::to_string(now - before - offset) + " us";
    }
    long long utc = xtimeToUtc(now);
    if (now - utc != offset - utcShift) {
        return "xtimeToUtc removed " + std::to_string(now - utc) + " us";
    }
    return std::string();
}

// Midsummer and midwinter 2026, 12:00:00.250 UTC, as true UTC microseconds.
constexpr long long kSummerUtc = 1782302400LL * kMicrosPerSecond + 250000;
constexpr long long kWinterUtc = 1768392000LL * kMicrosPerSecond + 250000;

TEST(XtimeZones, WhenZoneIsUtc_BaseIsTheWallClock) {
    ChildOutcome outcome = runWithTimeZone("UTC0", [] { return checkOffset(0, 0); });
    EXPECT_TRUE(outcome.ok()) << outcome.message;
}

TEST(XtimeZones, WhenZoneIsHalfHourAhead_BaseIsShiftedAndToUtcRemovesIt) {
    ChildOutcome outcome =
        runWithTimeZone("IST-5:30", [] { return checkOffset(kHalfPastFiveHours, 0); });
    EXPECT_TRUE(outcome.ok()) << outcome.message;
}

TEST(XtimeZones, WhenDaylightSavingIsInForce_ToUtcReadsStandardTime) {
    ChildOutcome outcome = runWithTimeZone("CET-1CEST,M3.5.0,M10.5.0/3", [] {
        // Local wall clock as UTC: winter is UTC+1, summer UTC+2.
        long long winterBase = kWinterUtc + kOneHour;
        long long summerBase = kSummerUtc + 2 * kOneHour;
        if (xtimeToUtc(winterBase) != kWinterUtc) return std::string("winter not exact");
        if (xtimeToUtc(summerBase) != kSummerUtc + kOneHour) {
            return "summer: expected the standard-time reading, an hour past true UTC, got " +
                   std::to_string(xtimeToUtc(summerBase) - kSummerUtc) + " us past";
        }
        return std::string();
    });
    EXPECT_TRUE(outcome.ok()) << outcome.message;
}

TEST(XtimeStrf, FormatsWholeSecondsAsUtc) {
    char buf[128];
    EXPECT_EQ(xtimeStrf(buf, sizeof(buf), "%Y-%m-%d %H:%M:%S", 0), 19u);
    EXPECT_STREQ(buf, "1970-01-01 00:00:00");
    EXPECT_EQ(xtimeStrf(buf, sizeof(buf), "%H:%M:%S", 3723999999LL), 8u);
    EXPECT_STREQ(buf, "01:02:03") << "microseconds are dropped, not rounded";
    EXPECT_EQ(xtimeStrf(buf, sizeof(buf), "%S", -1), 2u);
    EXPECT_STREQ(buf, "00") << "-1 us has whole seconds 0 (division toward zero)";
    EXPECT_EQ(xtimeStrf(buf, sizeof(buf), "%S", -1000001), 2u);
    EXPECT_STREQ(buf, "59") << "-1.000001 s has whole seconds -1";
    EXPECT_EQ(xtimeStrf(buf, 10, "%Y-%m-%d %H:%M:%S", 0), 0u) << "too small a buffer gives 0";
}

// Regression: the helpers used localtime and gmtime, whose one result record
// is shared by the whole process, so a conversion on another thread (a log
// time stamp, the timer thread) could change a time under its reader.
TEST(XtimeReentrancy, Helpers_LeaveTheSharedResultRecordAlone) {
    time_t fixed = 86400 * 365;
    struct tm* shared = gmtime(&fixed);
    ASSERT_NE(shared, nullptr);
    struct tm expected = *shared;

    xtimeNow();
    xtimeToUtc(12345LL * kMicrosPerSecond);
    char buf[32];
    xtimeStrf(buf, sizeof(buf), "%H", 7200LL * kMicrosPerSecond);

    EXPECT_EQ(shared->tm_year, expected.tm_year) << "the shared record was overwritten";
    EXPECT_EQ(shared->tm_yday, expected.tm_yday) << "the shared record was overwritten";
    EXPECT_EQ(shared->tm_hour, expected.tm_hour) << "the shared record was overwritten";
}

}  // namespace
