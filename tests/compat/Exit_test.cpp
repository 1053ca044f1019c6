// The library at process exit, watched from outside: a child process sets up
// one state, calls exit() and reports what its exit-time checks found. The
// pool's detached worker, the timer thread and an exchange on another thread
// outlive main; the exit must neither crash nor hang. The library builds
// g_thr_pool before g_hcall, so g_hcall's destructor runs first: the
// connection is closed before the pool drops the tasks still queued. This
// program is linked twice, with the library's archives in the order the CMake
// build lists them (host calls first) and in the order Android.bp lists them
// (support library first): the order must not depend on it.

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/mman.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <cstdlib>
#include <fstream>
#include <functional>
#include <memory>
#include <string>
#include <thread>

#include "VmsgDeviceModel.h"
#include "hcall/guest/HcallEnc.h"
#include "support/ChildProcess.h"
#include "support/Gate.h"
#include "xpl/XthrPool.h"
#include "xpl/Xtimer.h"

namespace {

// What a child shares with its exit-time checks. Never freed.
struct Probe {
    bool armed = false;
    std::atomic<bool> exitBegun{false};
    long returnDelayUs = 0;
    int deviceFd = -1;
    void* mapping = nullptr;
    Gate release;
    Gate done;
    int result = 0;
    std::string dropped;              // when the pool dropped its queue: the device's state
    std::function<void()> afterExit;  // runs once every exit-time destructor has run
};
Probe* gProbe = nullptr;

void say(const std::string& text) { childReport(text); }

// Built before the library's records and so destroyed after them: keeps the
// process alive a little past their teardown, so that a thread coming back
// late meets the destroyed objects rather than an ended process.
struct LingerAfterTeardown {
    ~LingerAfterTeardown() {
        if (gProbe && gProbe->armed) std::this_thread::sleep_for(std::chrono::milliseconds(3));
    }
} gLinger __attribute__((init_priority(101)));

// Runs after every exit-time destructor of the process.
__attribute__((destructor)) void checkAfterExit() {
    if (gProbe && gProbe->armed && gProbe->afterExit) gProbe->afterExit();
}

bool mapped(void* address) { return msync(address, 4096, MS_ASYNC) == 0; }
bool isOpen(int fd) { return fcntl(fd, F_GETFD) != -1; }

// Leaves a task or callback a chosen time after the exit has begun.
void returnAfterExitBegins() {
    while (!gProbe->exitBegun) std::this_thread::sleep_for(std::chrono::microseconds(50));
    std::this_thread::sleep_for(std::chrono::microseconds(gProbe->returnDelayUs));
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

// A child sets up one state, arms the checks and calls exit(). Returns what
// went wrong: "" for a clean exit with nothing reported.
std::string exitAfter(void (*setUp)(), long returnDelayUs = 0) {
    ChildOutcome child = runInChild(
        [&]() -> std::string {
            gProbe = new Probe();
            gProbe->returnDelayUs = returnDelayUs;
            // Runs before the library's exit-time destructors, registered at load.
            atexit([] { gProbe->exitBegun = true; });
            setUp();
            gProbe->armed = true;
            std::exit(0);
        },
        std::chrono::seconds(20));
    return child.ok() ? "" : child.describe();
}

void connect() {
    vmsgDeviceReset();
    VmsgDeviceScript script;
    script.results[7] = 7007;
    vmsgDeviceConfigure(script);
    if (hcallLibInitGuest() != XERR_SUCCESS) say("no connection\n");
    gProbe->deviceFd = g_hcall.client.mFd;
    gProbe->mapping = g_hcall.client.mHostBoundBuf;
}

// Destroyed, unrun, when g_thr_pool drops its queue at exit.
struct DropWitness {
    ~DropWitness() {
        bool released = !isOpen(gProbe->deviceFd) && !mapped(gProbe->mapping);
        if (gProbe->armed) gProbe->dropped = released ? "released" : "open";
    }
};

// Regression: g_hcall's destructor unmapped the buffers while the worker was
// still waiting for the host, and the worker then read its reply from
// unmapped memory.
TEST(Exit, Exit_DuringAnExchange_LeavesTheBuffersToTheExchange) {
    EXPECT_EQ(exitAfter([] {
                  connect();
                  Gate inFlight;
                  vmsgDeviceSetHostHook([&inFlight](uint32_t) {
                      inFlight.open();
                      gProbe->release.wait();
                  });
                  std::thread([] {
                      gProbe->result = hcallOnOrientationChangedRpc(1);
                      gProbe->done.open();
                  }).detach();
                  inFlight.wait();
                  gProbe->afterExit = [] {
                      if (!mapped(gProbe->mapping)) say("buffers unmapped under an exchange");
                      if (!isOpen(gProbe->deviceFd)) say("device closed under an exchange");
                      gProbe->release.open();  // the exchange reads its reply now
                      gProbe->done.wait();
                      if (gProbe->result != 7007) say("the exchange did not complete");
                  };
              }),
              "");
}

// Regression: the build that listed the host calls first built g_hcall first,
// so the pool was torn down before the connection. The connection is idle (the
// worker is in a task of its own) and so is released.
TEST(Exit, Exit_WithTasksQueued_ReleasesTheConnectionBeforeThePoolDropsThem) {
    EXPECT_EQ(exitAfter([] {
                  connect();
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
                  gProbe->afterExit = [] {
                      if (gProbe->dropped != "released")
                          say("queue dropped with the connection '" + gProbe->dropped + "'");
                  };
              }),
              "");
}

// The library's own threads during exit, each state entered many times since
// what goes wrong depends on timing; where a delay is given, run i returns
// i * delay microseconds into the exit.
TEST(Exit, Exit_WhileTheLibrarysThreadsWork_EndsCleanly) {
    const struct {
        const char* state;
        void (*setUp)();
        long delayStepUs;
    } rows[] = {
        // Regression: destroying the condition variable the worker waited on
        // hung the exit in glibc.
        {"pool worker parked",
         [] {
             static Gate ran;
             static std::atomic<pid_t> worker{0};
             xthrPoolInit(&g_thr_pool, 1);
             xthrPoolAddTask(&g_thr_pool, [] {
                 worker = gettid();
                 ran.open();
             });
             ran.wait();
             waitUntilParked(worker);
         },
         0},
        // Regression: a worker coming back from its task after the queue had
        // been destroyed read freed memory.
        {"pool worker returning, tasks queued",
         [] {
             static Gate started;
             xthrPoolInit(&g_thr_pool, 1);
             xthrPoolAddTask(&g_thr_pool, [] {
                 started.open();
                 returnAfterExitBegins();
             });
             for (int i = 0; i < 3; ++i) xthrPoolAddTask(&g_thr_pool, [] {});
             started.wait();
         },
         100},
        // A task added while the pool is destroyed is dropped quietly, not a
        // caller error with its debug break.
        {"another thread adding tasks",
         [] {
             static std::atomic<long> added{0};
             xthrPoolInit(&g_thr_pool, 1);
             std::thread([] {
                 for (;;) {
                     xthrPoolAddTask(&g_thr_pool, [] {});
                     ++added;
                 }
             }).detach();
             while (added < 1000) std::this_thread::yield();
         },
         0},
        // A callback not yet due when the process ends never runs.
        {"timer thread waiting for a far expiry",
         [] {
             static Gate ran;
             static std::atomic<pid_t> timer{0};
             xtimerStart(0, [] {
                 timer = gettid();
                 ran.open();
             });
             xtimerStart(60LL * 1000 * 1000, [] { say("far timer ran\n"); });
             ran.wait();
             waitUntilParked(timer);
         },
         0},
        {"timer callback returning and scheduling",
         [] {
             static Gate started;
             xtimerStart(0, [] {
                 started.open();
                 returnAfterExitBegins();
                 xtimerStart(0, [] {});
             });
             started.wait();
         },
         100},
    };
    for (const auto& row : rows) {
        for (int i = 0; i < 20; ++i) {
            EXPECT_EQ(exitAfter(row.setUp, i * row.delayStepUs), "") << row.state << ", run " << i;
        }
    }
}

}  // namespace
