#include "xpl/Xtimer.h"

#include <algorithm>
#include <chrono>
#include <climits>
#include <utility>

#include "xpl/XplLayout.h"
#include "xpl/XplLoadOrder.h"
#include "xpl/XthrDetached.h"
#include "xpl/Xtime.h"

using android::base::ScopedLockAssertion;

namespace {

XPL_LAYOUT_FIRST(XtimerInfo, expiry)
XPL_LAYOUT_FOLLOWS(XtimerInfo, expiry, callback)
XPL_LAYOUT_LAST(XtimerInfo, callback)
XPL_LAYOUT_FIRST(XtimerGlobals, cond)
XPL_LAYOUT_FOLLOWS(XtimerGlobals, cond, mutex)
XPL_LAYOUT_FOLLOWS(XtimerGlobals, mutex, threadStarted)
XPL_LAYOUT_FOLLOWS(XtimerGlobals, threadStarted, timers)
XPL_LAYOUT_LAST(XtimerGlobals, timers)

// A wait is cut at this length and then re-evaluated, so that a far expiry
// cannot overflow the clock arithmetic; ten years is no polling.
constexpr long long kMaxWaitUs = 10LL * 366 * 24 * 3600 * 1000000;

// Reached through this function from every operation, so that a use from
// another file's static initialiser finds the record whatever the order of
// initialisation. Never freed: the timer thread may run during exit.
XtimerGlobals* timerGlobals() {
    static auto* const globals = g_xtimer = new XtimerGlobals();
    return globals;
}

// now + delay, held at the ends of the range instead of overflowing.
long long expiryAfter(long long now, long long delay) {
    if (delay > 0 && now > LLONG_MAX - delay) return LLONG_MAX;
    if (delay < 0 && now < LLONG_MIN - delay) return LLONG_MIN;
    return now + delay;
}

void* timerThreadMain(void*) { xtimerThreadEntry(); }

}  // namespace

// Points at the record from its creation, at its rank in the load order or at
// an earlier first use.
XtimerGlobals* g_xtimer = nullptr;
namespace {
const XplLoadStep kCreateTimer XPL_LOAD_ORDER(XPL_LOAD_ORDER_XTIMER)([] { timerGlobals(); });
}  // namespace

xerr_t xtimerLibInit() { return XERR_SUCCESS; }

xerr_t xtimerStart(long long delay, std::function<void()> callback) {
    if (!callback) return XERR_INVAL;
    XtimerGlobals* timer = timerGlobals();
    std::lock_guard<std::mutex> lock(timer->mutex);
    if (!timer->threadStarted) {
        int err = xthrStartDetached(timerThreadMain, nullptr);
        if (err != 0) return err;  // flag stays 0: the next call tries again
        timer->threadStarted = 1;
    }
    long long expiry = expiryAfter(xtimeNow(), delay);
    auto entry = timer->timers.emplace(expiry, XtimerInfo{expiry, std::move(callback)});
    // Behind the head the entry changes nothing for the timer thread, which
    // wakes for the head anyway and then finds it; only a new head moves its
    // wake-up time.
    if (entry == timer->timers.begin()) timer->cond.notify_one();
    return XERR_SUCCESS;
}

void xtimerThreadEntry() {
    XtimerGlobals* timer = timerGlobals();
    std::unique_lock<std::mutex> lock(timer->mutex);
    // Held throughout but for the waits and the callbacks, which release it
    // through `lock`.
    ScopedLockAssertion held(timer->mutex);
    for (;;) {
        if (timer->timers.empty()) {
            timer->cond.wait(lock);
            continue;
        }
        // Only this thread removes entries, so the head stays valid while
        // the lock is released, even when earlier ones are inserted.
        auto head = timer->timers.begin();
        if (head->first <= xtimeNow()) {
            std::function<void()> callback = std::move(head->second.callback);
            lock.unlock();
            callback();
            callback = nullptr;  // its captures die outside the lock
            lock.lock();
            timer->timers.erase(head);
            continue;
        }
        long long remaining = head->first - xtimeNow();
        if (remaining > 0) {
            // Against the real-time clock, like the expiries themselves: a
            // clock set forward ends the wait for callbacks now due.
            auto deadline = std::chrono::system_clock::now() +
                            std::chrono::microseconds(std::min(remaining, kMaxWaitUs));
            timer->cond.wait_until(lock, deadline);
        }
    }
}
