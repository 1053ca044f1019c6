// The library's time base (local wall clock read as UTC) in fixed zones, each
// in a child of its own, with the logger's offset and time stamp made from it.
#include "xpl/Xtime.h"

#include <gtest/gtest.h>
#include <sys/time.h>

#include <algorithm>
#include <cstdio>
#include <ctime>
#include <string>

#include "support/ChildProcess.h"
#include "xpl/Xlog.h"

namespace {

constexpr long long kSecond = 1000000, kHour = 3600 * kSecond;

// The wall clock in the base, from the C library's own view of the zone.
long long localWallClock() {
    struct timeval tv {};
    gettimeofday(&tv, nullptr);
    struct tm local {};
    localtime_r(&tv.tv_sec, &local);
    return (tv.tv_sec + local.tm_gmtoff) * kSecond + tv.tv_usec;
}

// A base value as the logger stamps it, followed by `suffix`.
std::string stampOf(long long t, const char* suffix) {
    const time_t seconds = static_cast<time_t>(t / kSecond);
    struct tm broken {};
    gmtime_r(&seconds, &broken);
    char text[64];
    size_t length = strftime(text, sizeof(text), "%Y-%m-%d %H:%M:%S", &broken);
    std::snprintf(text + length, sizeof(text) - length, ".%03d%s",
                  static_cast<int>(t % kSecond / 1000), suffix);
    return text;
}

TEST(Xtime, BaseConversionAndLogStamp_FollowTheZone) {
    // Midwinter and midsummer 2026, 12:00:00.250 UTC, in true UTC microseconds.
    const long long winter = 1768392000LL * kSecond + 250000;
    const long long summer = 1782302400LL * kSecond + 250000;
    const struct {
        const char* tz;
        long long standard, winter, summer;  // how far local time leads UTC
        const char* suffix;                  // the logger's offset: the standard one
    } rows[] = {
        {"UTC0", 0, 0, 0, "-0000"},
        {"IST-5:30", 19800 * kSecond, 19800 * kSecond, 19800 * kSecond, "+0530"},
        {"EST5", -5 * kHour, -5 * kHour, -5 * kHour, "-0500"},
        {"CET-1CEST,M3.5.0,M10.5.0/3", kHour, kHour, 2 * kHour, "+0100"},
        {"XST-2XDT,M10.5.0/3,M3.5.0", 2 * kHour, 3 * kHour, 2 * kHour, "+0200"},
    };
    for (const auto& row : rows) {
        ChildOutcome outcome = runWithTimeZone(row.tz, [&]() -> std::string {
            long long before = localWallClock();
            long long now = xtimeNow();
            if (now < before || now > localWallClock()) return "xtimeNow is not the wall clock";
            // While daylight saving is in force the base is read as standard time.
            for (const auto& [utc, lead] : {std::pair{winter, row.winter}, {summer, row.summer}}) {
                if (xtimeToUtc(utc + lead) != utc + lead - row.standard) return "xtimeToUtc";
            }
            if (xlogLibInit(nullptr, "", "") != XERR_SUCCESS) return "start-up failed";
            char stamp[64];
            before = localWallClock();
            xlogCurrentTime(stamp, sizeof(stamp));
            const std::string first = stampOf(before, row.suffix);
            const std::string last = stampOf(localWallClock(), row.suffix);
            bool inside = strlen(stamp) == first.size() && first <= stamp && stamp <= last;
            return inside ? "" : std::string(stamp) + " is not " + first;
        });
        EXPECT_TRUE(outcome.ok()) << row.tz << ": " << outcome.describe();
    }
}

// Regression (the last check): the helpers used localtime and gmtime, whose one
// result record is shared by the whole process, so a conversion on another
// thread (a log time stamp, the timer thread) could change a time under its reader.
TEST(Xtime, Strf_FormatsWholeSecondsAsUtcLeavingTheSharedRecordAlone) {
    const time_t newYear1971 = 86400 * 365;
    const struct tm* shared = gmtime(&newYear1971);
    const struct {
        size_t size;
        const char* format;
        long long t;
        const char* want;  // empty: does not fit, result 0
    } rows[] = {
        {20, "%Y-%m-%d %H:%M:%S", 0, "1970-01-01 00:00:00"},
        {19, "%Y-%m-%d %H:%M:%S", 0, ""},             // no room for the terminator
        {128, "%H:%M:%S", 3723999999LL, "01:02:03"},  // microseconds dropped, not rounded
        {128, "%S", -1, "00"},                        // -1 us has whole seconds 0
        {128, "%S", -1000001, "59"},                  // -1.000001 s has whole seconds -1
    };
    for (const auto& row : rows) {
        char buf[128] = "";
        size_t length = xtimeStrf(buf, row.size, row.format, row.t);
        EXPECT_EQ(std::string(buf, std::min(length, sizeof(buf))), row.want) << row.t;
    }
    xtimeNow();
    xtimeToUtc(12345 * kSecond);
    EXPECT_EQ(shared->tm_hour * 1000 + shared->tm_yday, 0);
}

}  // namespace
