#include "xpl/Xtime.h"

#include <sys/time.h>
#include <unistd.h>

#include <ctime>

namespace {

constexpr long long kMicrosPerSecond = 1000000;
// usleep takes a 32-bit count; longer sleeps go in pieces below that limit.
constexpr unsigned long long kMaxSleepPiece = 1000000000ULL;

}  // namespace

// The reentrant forms of localtime and gmtime throughout: the logger's time
// stamps and the timer thread convert times concurrently.

long long xtimeNow() {
    struct timeval tv {};
    gettimeofday(&tv, nullptr);
    time_t seconds = tv.tv_sec;
    struct tm local {};
    localtime_r(&seconds, &local);
    return static_cast<long long>(timegm(&local)) * kMicrosPerSecond + tv.tv_usec;
}

long long xtimeToUtc(long long t) {
    long long secs = t / kMicrosPerSecond;
    auto seconds = static_cast<time_t>(secs);
    struct tm broken {};
    gmtime_r(&seconds, &broken);
    // Read as standard time: the base holds no daylight-saving flag.
    broken.tm_isdst = 0;
    return static_cast<long long>(mktime(&broken)) * kMicrosPerSecond +
           (t - secs * kMicrosPerSecond);
}

size_t xtimeStrf(char* buf, size_t size, const char* fmt, long long t) {
    auto seconds = static_cast<time_t>(t / kMicrosPerSecond);
    struct tm broken {};
    gmtime_r(&seconds, &broken);
    return strftime(buf, size, fmt, &broken);
}

void xtimeSleep(unsigned long long us) {
    while (us > kMaxSleepPiece) {
        usleep(static_cast<useconds_t>(kMaxSleepPiece));
        us -= kMaxSleepPiece;
    }
    usleep(static_cast<useconds_t>(us));
}

void xtime_init() {}
