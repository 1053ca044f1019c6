// The library at process exit: a child sets up one state, calls exit() and
// reports what its exit-time checks found. Linked twice, with the archives in
// the CMake build's order and in Android.bp's: g_thr_pool must be built before
// g_hcall, so g_hcall is torn down first, in either order.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/mman.h>
#include <unistd.h>

#include <atomic>
#include <fstream>
#include <memory>
#include <thread>

#include "VmsgDeviceModel.h"
#include "hcall/guest/HcallEnc.h"
#include "support/ChildProcess.h"
#include "support/Gate.h"
#include "xpl/XthrPool.h"
#include "xpl/Xtimer.h"

#if defined(__SANITIZE_THREAD__)
constexpr int kRunScale = 4;  // a child costs ThreadSanitizer about a second
#else
constexpr int kRunScale = 1;
#endif

// What a child shares with its exit-time checks. Never freed.
struct Probe {
    bool armed = false;
    std::atomic<bool> exitBegun{false};
    long delayUs = 0;
    int fd = -1;
    void* mapping = nullptr;
    Gate release, done;
    int result = 0;
    std::string dropped;              // the connection's state when the pool dropped its queue
    std::function<void()> afterExit;  // runs once every exit-time destructor has run
};
static Probe* gProbe = nullptr;

// Destroyed after the library's records: a thread coming back late meets
// destroyed objects rather than an ended process.
struct LingerAfterTeardown {
    ~LingerAfterTeardown() {
        if (gProbe && gProbe->armed) std::this_thread::sleep_for(std::chrono::milliseconds(3));
    }
} gLinger __attribute__((init_priority(101)));

__attribute__((destructor)) void checkAfterExit() {
    if (gProbe && gProbe->armed && gProbe->afterExit) gProbe->afterExit();
}

static bool mapped(void* address) { return msync(address, 4096, MS_ASYNC) == 0; }
static bool isOpen(int fd) { return fcntl(fd, F_GETFD) != -1; }

static void returnAfterExitBegins() {
    while (!gProbe->exitBegun) std::this_thread::sleep_for(std::chrono::microseconds(50));
    std::this_thread::sleep_for(std::chrono::microseconds(gProbe->delayUs));
}

// Waits until thread `tid`, once known, blocks in a futex wait.
static void waitUntilParked(const std::atomic<pid_t>& tid) {
    for (auto end = std::chrono::steady_clock::now() + kGateTolerance;
         std::chrono::steady_clock::now() < end;
         std::this_thread::sleep_for(std::chrono::microseconds(200))) {
        long number = -1;
        std::ifstream in("/proc/self/task/" + std::to_string(tid) + "/syscall");
        if (tid && in >> number && number == 202) return;  // futex on x86-64
    }
    childReport("thread never parked\n");
}

static void connect() {
    VmsgDeviceScript script;
    script.results[7] = 7007;
    vmsgDeviceConfigure(script);
    if (hcallLibInitGuest() != XERR_SUCCESS) childReport("no connection\n");
    gProbe->fd = g_hcall.client.mFd;
    gProbe->mapping = g_hcall.client.mHostBoundBuf;
}

// Destroyed, unrun, when g_thr_pool drops its queue at exit.
struct DropWitness {
    ~DropWitness() {
        bool released = !isOpen(gProbe->fd) && !mapped(gProbe->mapping);
        if (gProbe->armed) gProbe->dropped = released ? "released" : "open";
    }
};

// Each state entered `runs` times, since what goes wrong depends on timing;
// run i returns i * delayStepUs microseconds into the exit.
TEST(Exit, Exit_WhileTheLibrarysThreadsWork_EndsCleanly) {
    const struct {
        const char* state;
        int runs;
        long delayStepUs;
        void (*setUp)();
    } rows[] = {
        // Regression: g_hcall's destructor unmapped the buffers while the
        // worker waited for the host, which then read its reply from them.
        {"exchange in flight", 1, 0,
         [] {
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
                 if (!mapped(gProbe->mapping) || !isOpen(gProbe->fd))
                     childReport("closed under an exchange");
                 gProbe->release.open();
                 gProbe->done.wait();
                 if (gProbe->result != 7007) childReport("the exchange did not complete");
             };
         }},
        // Regression: where g_hcall was built first, the pool was torn down
        // before the (idle) connection.
        {"tasks queued behind a busy worker", 1, 0,
         [] {
             connect();
             static Gate started;
             xthrPoolInit(&g_thr_pool, 1);
             xthrPoolAddTask(&g_thr_pool, [] {
                 started.open();
                 for (;;) pause();
             });
             auto witness = std::make_shared<DropWitness>();
             xthrPoolAddTask(&g_thr_pool, [witness] { childReport("queued task ran\n"); });
             witness.reset();
             started.wait();
             gProbe->afterExit = [] {
                 if (gProbe->dropped != "released")
                     childReport("queue dropped, connection " + gProbe->dropped);
             };
         }},
        // Regression: destroying the condition variable a worker waited on
        // hung the exit in glibc. A timer not yet due never runs.
        {"pool worker and timer thread parked", 5, 0,
         [] {
             static std::atomic<pid_t> worker{0}, timer{0};
             xthrPoolInit(&g_thr_pool, 1);
             xthrPoolAddTask(&g_thr_pool, [] { worker = gettid(); });
             xtimerStart(0, [] { timer = gettid(); });
             xtimerStart(60LL * 1000 * 1000, [] { childReport("far timer ran\n"); });
             waitUntilParked(worker);
             waitUntilParked(timer);
         }},
        // Regression: a worker back from its task read the destroyed queue.
        {"pool worker and timer callback returning", 20, 100,
         [] {
             static Gate task, callback;
             xthrPoolInit(&g_thr_pool, 1);
             xthrPoolAddTask(&g_thr_pool, [] {
                 task.open();
                 returnAfterExitBegins();
             });
             for (int i = 0; i < 3; ++i) xthrPoolAddTask(&g_thr_pool, [] {});
             xtimerStart(0, [] {
                 callback.open();
                 returnAfterExitBegins();
                 xtimerStart(0, [] {});
             });
             task.wait();
             callback.wait();
         }},
        // Dropped quietly: not a caller error with its debug break.
        {"another thread adding tasks", 20, 0,
         [] {
             static std::atomic<long> added{0};
             xthrPoolInit(&g_thr_pool, 1);
             std::thread([] {
                 for (;; ++added) xthrPoolAddTask(&g_thr_pool, [] {});
             }).detach();
             while (added < 1000) std::this_thread::yield();
         }},
    };
    for (const auto& row : rows) {
        for (int i = 0; i < (row.runs + kRunScale - 1) / kRunScale; ++i) {
            ChildOutcome child = runInChild(
                [&]() -> std::string {
                    gProbe = new Probe();
                    gProbe->delayUs = i * row.delayStepUs * kRunScale;
                    // Before the library's exit-time destructors, registered at load.
                    atexit([] { gProbe->exitBegun = true; });
                    row.setUp();
                    gProbe->armed = true;
                    std::exit(0);
                },
                std::chrono::seconds(20));
            EXPECT_TRUE(child.ok()) << row.state << ", run " << i << ": " << child.describe();
        }
    }
}
