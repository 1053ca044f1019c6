// The time base (local wall clock read as UTC) in fixed zones, each in a child,
// with the logger's offset and time stamp made from it.
#include "xpl/Xtime.h"

#include <gtest/gtest.h>
#include <sys/time.h>
#include <unistd.h>

#include <ctime>

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

// A base value as the logger stamps it, less the zone's offset.
std::string stampOf(long long t) {
    const time_t seconds = static_cast<time_t>(t / kSecond);
    struct tm broken {};
    char text[64];
    size_t length = strftime(text, sizeof(text), "%F %T", gmtime_r(&seconds, &broken));
    snprintf(text + length, sizeof(text) - length, ".%03d", static_cast<int>(t % kSecond / 1000));
    return text;
}

TEST(Xtime, BaseConversionAndLogStamp_FollowTheZone) {
    // Midwinter and midsummer 2026, 12:00:00.250 UTC, in true UTC microseconds.
    const long long winter = 1768392000LL * kSecond + 250000;
    const long long summer = 1782302400LL * kSecond + 250000;
    // The zone, how far local time leads UTC (standard, in winter and summer), the
    // logger's offset (the standard one).
    const std::tuple<const char*, long long, long long, long long, const char*> rows[] = {
        {"UTC0", 0, 0, 0, "-0000"},
        {"IST-5:30", 19800 * kSecond, 19800 * kSecond, 19800 * kSecond, "+0530"},
        {"EST5", -5 * kHour, -5 * kHour, -5 * kHour, "-0500"},
        {"CET-1CEST,M3.5.0,M10.5.0/3", kHour, kHour, 2 * kHour, "+0100"},
        {"XST-2XDT,M10.5.0/3,M3.5.0", 2 * kHour, 3 * kHour, 2 * kHour, "+0200"},
    };
    for (const auto& row : rows) {
        ChildOutcome outcome = runInChild([&]() -> std::string {
            const auto& [tz, standard, inWinter, inSummer, offset] = row;
            setenv("TZ", tz, 1);
            tzset();
            long long before = localWallClock(), now = xtimeNow();
            if (now < before || now > localWallClock()) return "xtimeNow is not the wall clock";
            // While daylight saving is in force the base is read as standard time.
            for (const auto& [utc, lead] : {std::pair{winter, inWinter}, {summer, inSummer}})
                if (xtimeToUtc(utc + lead) != utc + lead - standard) return "xtimeToUtc";
            if (xlogLibInit(nullptr, "", "") != XERR_SUCCESS) return "start-up failed";
            char stamp[64];
            // Stamped in the first tenth of a second: the milliseconds show their zeros.
            while (localWallClock() % kSecond >= 100000) usleep(1000);
            before = localWallClock();
            xlogCurrentTime(stamp, sizeof(stamp));
            const std::string first = stampOf(before) + offset;
            const std::string last = stampOf(localWallClock()) + offset;
            bool inside = strlen(stamp) == first.size() && first <= stamp && stamp <= last;
            return inside ? "" : std::string(stamp) + " is not " + first;
        });
        EXPECT_TRUE(outcome.ok()) << std::get<0>(row) << ": " << outcome.describe();
    }
}

// Regression (the last check): the helpers used localtime and gmtime, whose
// one result record is shared by the whole process and its threads.
TEST(Xtime, Strf_FormatsWholeSecondsAsUtcLeavingTheSharedRecordAlone) {
    const time_t newYear1971 = 86400 * 365;
    const struct tm* shared = gmtime(&newYear1971);
    const std::tuple<size_t, const char*, long long, const char*> rows[] = {
        {20, "%F %T", 0, "1970-01-01 00:00:00"},
        {19, "%F %T", 0, ""},                         // no room for the terminator
        {128, "%H:%M:%S", 3723999999LL, "01:02:03"},  // microseconds dropped, not rounded
        {128, "%S", -1, "00"},                        // -1 us has whole seconds 0
        {128, "%S", -1000001, "59"},                  // -1.000001 s has whole seconds -1
    };
    for (const auto& [size, format, t, want] : rows) {  // want empty: does not fit, result 0
        char buf[128] = "";
        size_t length = xtimeStrf(buf, size, format, t);
        EXPECT_EQ(std::string(buf, std::min(length, sizeof(buf))), want) << t;
    }
    const long long start = xtimeNow();
    xtimeSleep(20000);
    EXPECT_GE(xtimeNow() - start, 20000) << "a sleep is never cut short";
    xtimeToUtc(12345 * kSecond);
    EXPECT_EQ(shared->tm_hour * 1000 + shared->tm_yday, 0);
}

}  // namespace
