// Ends a process while the library's own threads are still at work, in the
// state a scenario names, so that a test can watch the exit from outside:
//   pool-idle           the pool's worker parked on its condition variable
//   pool-busy           the worker inside a task that never returns, a task
//                       queued behind it
//   pool-returning US   the worker returns from its task US microseconds
//                       after the exit has begun, tasks queued behind it
//   pool-adding         another thread still adding tasks throughout the exit
//   timer-waiting       the timer thread in its timed wait for a far expiry
//   timer-returning US  a callback returns US microseconds after the exit has
//                       begun and schedules another
// The process leaves main with status 0; anything else is the fault.
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <memory>
#include <string>
#include <thread>

#include "support/Gate.h"
#include "xpl/XthrPool.h"
#include "xpl/Xtimer.h"

namespace {

std::atomic<bool> g_exitBegun{false};
long g_returnDelayUs = 0;

// How long the process stays after the library's static objects are gone,
// so that a thread coming back late meets the destroyed objects rather than
// an ended process.
constexpr std::chrono::microseconds kLinger{3000};

// Constructed before every object of default priority, so destroyed after
// them all, the library's pool among them.
struct LingerAfterTeardown {
    ~LingerAfterTeardown() { std::this_thread::sleep_for(kLinger); }
} g_linger __attribute__((init_priority(101)));

void say(const char* text) { (void)!write(STDOUT_FILENO, text, strlen(text)); }

// Runs before the library's static destructors, which were registered at load.
void markExitBegun() { g_exitBegun = true; }

// Leaves a task or callback a chosen time after the exit has begun.
void returnAfterExitBegins() {
    while (!g_exitBegun) std::this_thread::sleep_for(std::chrono::microseconds(50));
    std::this_thread::sleep_for(std::chrono::microseconds(g_returnDelayUs));
}

// Waits until thread `tid` blocks in a futex wait (a condition variable or a
// timed wait), read from the kernel's record of its current system call.
void waitUntilParked(pid_t tid) {
    const std::string path = "/proc/self/task/" + std::to_string(tid) + "/syscall";
    auto deadline = std::chrono::steady_clock::now() + kGateTolerance;
    while (std::chrono::steady_clock::now() < deadline) {
        std::ifstream in(path);
        long number = -1;
        if (in >> number && number == 202) return;  // futex on x86-64
        std::this_thread::sleep_for(std::chrono::microseconds(200));
    }
    say("thread never parked\n");
}

// Says so when destroyed: shows that a queued task was dropped, not run.
struct DropWitness {
    ~DropWitness() { say("queued task dropped\n"); }
};

int poolIdle() {
    static Gate ran;
    static std::atomic<pid_t> workerTid{0};
    xthrPoolInit(&g_thr_pool, 1);
    xthrPoolAddTask(&g_thr_pool, [] {
        workerTid = gettid();
        ran.open();
    });
    ran.wait();
    waitUntilParked(workerTid);
    return 0;
}

int poolBusy() {
    static Gate started;
    xthrPoolInit(&g_thr_pool, 1);
    xthrPoolAddTask(&g_thr_pool, [] {
        started.open();
        for (;;) pause();
    });
    auto witness = std::make_shared<DropWitness>();
    xthrPoolAddTask(&g_thr_pool, [witness] { say("queued task ran\n"); });
    witness.reset();
    started.wait();
    return 0;
}

int poolReturning() {
    static Gate started;
    xthrPoolInit(&g_thr_pool, 1);
    xthrPoolAddTask(&g_thr_pool, [] {
        started.open();
        returnAfterExitBegins();
    });
    for (int i = 0; i < 3; ++i) xthrPoolAddTask(&g_thr_pool, [] {});
    started.wait();
    return 0;
}

int poolAdding() {
    static std::atomic<long> added{0};
    xthrPoolInit(&g_thr_pool, 1);
    std::thread([] {
        for (;;) {
            xthrPoolAddTask(&g_thr_pool, [] {});
            ++added;
        }
    }).detach();
    while (added < 1000) std::this_thread::yield();
    return 0;
}

int timerWaiting() {
    static Gate ran;
    static std::atomic<pid_t> timerTid{0};
    xtimerStart(0, [] {
        timerTid = gettid();
        ran.open();
    });
    xtimerStart(60LL * 1000 * 1000, [] { say("far timer ran\n"); });
    ran.wait();
    waitUntilParked(timerTid);
    return 0;
}

int timerReturning() {
    static Gate started;
    xtimerStart(0, [] {
        started.open();
        returnAfterExitBegins();
        xtimerStart(0, [] {});
    });
    started.wait();
    return 0;
}

}  // namespace

int main(int argc, char** argv) {
    if (argc < 2) return 2;
    const std::string scenario = argv[1];
    if (argc > 2) g_returnDelayUs = std::atol(argv[2]);
    atexit(markExitBegun);
    if (scenario == "pool-idle") return poolIdle();
    if (scenario == "pool-busy") return poolBusy();
    if (scenario == "pool-returning") return poolReturning();
    if (scenario == "pool-adding") return poolAdding();
    if (scenario == "timer-waiting") return timerWaiting();
    if (scenario == "timer-returning") return timerReturning();
    return 2;
}
