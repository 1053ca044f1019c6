// The library at exit() in a child, linked with the archives in CMake's order and in Android.bp's:
// in both, g_thr_pool is built before g_hcall, so g_hcall is torn down first.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/mman.h>
#include <unistd.h>

#include <atomic>
#include <fstream>
#include <memory>
#include <thread>
#include <tuple>

#include "VmsgDeviceModel.h"
#include "hcall/guest/HcallEnc.h"
#include "support/ChildProcess.h"
#include "support/Gate.h"
#include "support/LogRecorder.h"
#include "xpl/XthrPool.h"
#include "xpl/Xtimer.h"

#if defined(__SANITIZE_THREAD__)
constexpr int kRunScale = 4;  // a child costs ThreadSanitizer about a second
#else
constexpr int kRunScale = 1;
#endif

// What a child shares with its exit-time checks. Never freed.
struct Probe {
    std::atomic<bool> armed{false};  // set as the child calls exit()
    long delayUs = 0;
    int fd = -1;
    void* mapping = nullptr;
    Gate release, done;
    std::function<void()> afterExit;
};
static Probe* gProbe = nullptr;

// Destroyed after the library's records: checks what they left, then lingers
// so that a thread coming back late meets destroyed objects, not an ended process.
struct AfterTeardown {
    ~AfterTeardown() {
        if (!gProbe || !gProbe->armed) return;
        if (gProbe->afterExit) gProbe->afterExit();
        std::this_thread::sleep_for(std::chrono::milliseconds(3));
    }
} gAfterTeardown __attribute__((init_priority(101)));

static bool mapped(void* address) { return msync(address, 4096, MS_ASYNC) == 0; }
static bool isOpen(int fd) { return fcntl(fd, F_GETFD) != -1; }

static void returnAfterExitBegins() {
    while (!gProbe->armed) std::this_thread::sleep_for(std::chrono::microseconds(50));
    std::this_thread::sleep_for(std::chrono::microseconds(gProbe->delayUs));
}

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
    if (hcallLibInitGuest() != XERR_SUCCESS) childReport("no connection\n");
    gProbe->fd = g_hcall.client.mFd;
    gProbe->mapping = g_hcall.client.mHostBoundBuf;
}

// What goes wrong depends on timing: run i returns late i * 100 us into the exit.
TEST(Exit, Exit_WhileTheLibrarysThreadsWork_EndsCleanly) {
    const std::tuple<const char*, int, void (*)()> rows[] = {
        // Regression: g_hcall's destructor unmapped the buffers while the
        // worker waited for the host, which then read its reply from them.
        {"exchange in flight", 1,
         [] {
             connect();
             Gate inFlight;
             vmsgDeviceSetHostHook([&inFlight](uint32_t) {
                 inFlight.open();
                 gProbe->release.wait();
             });
             std::thread([] {
                 if (hcallOnOrientationChangedRpc(1) != XERR_SUCCESS) childReport("failed\n");
                 gProbe->done.open();
             }).detach();
             inFlight.wait();
             gProbe->afterExit = [] {
                 if (!mapped(gProbe->mapping) || !isOpen(gProbe->fd))
                     childReport("closed under an exchange");
                 gProbe->release.open();
                 gProbe->done.wait();
             };
         }},
        // Regression: where g_hcall was built first, the pool was torn down
        // before the (idle) connection.
        {"tasks queued behind a busy worker", 1,
         [] {
             connect();
             static Gate started;
             xthrPoolInit(&g_thr_pool, 1);
             xthrPoolAddTask(&g_thr_pool, [] {
                 started.open();
                 for (;;) pause();
             });
             // Destroyed, unrun, when g_thr_pool drops its queue at exit.
             std::shared_ptr<void> witness(nullptr, [](void*) {
                 if (gProbe->armed && (isOpen(gProbe->fd) || mapped(gProbe->mapping)))
                     childReport("queue dropped before the connection was released\n");
             });
             xthrPoolAddTask(&g_thr_pool, [witness] { childReport("queued task ran\n"); });
             witness.reset();
             started.wait();
         }},
        // Once g_hcall is torn down, a late call is refused without a word.
        {"a call after the connection closed", 1,
         [] {
             connect();
             gProbe->afterExit = [] {
                 static LogRecorder* const log = new LogRecorder();
                 if (hcallOnOrientationChangedRpc(1) != -1 || !log->lines(XLOG_MODULE_VMSG).empty())
                     childReport("a late call was not refused silently\n");
             };
         }},
        // Regression: destroying the condition variable a worker waited on
        // hung the exit in glibc. A timer not yet due never runs.
        {"pool worker and timer thread parked", 5,
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
        // A task added meanwhile is dropped quietly, not a caller error.
        {"pool worker, timer callback and an adder at work", 20,
         [] {
             static std::atomic<long> started{0}, added{0};
             xthrPoolInit(&g_thr_pool, 1);
             xthrPoolAddTask(&g_thr_pool, [] {
                 ++started;
                 returnAfterExitBegins();
             });
             xtimerStart(0, [] {
                 ++started;
                 returnAfterExitBegins();
                 xtimerStart(0, [] {});
             });
             std::thread([] {
                 for (;; ++added) xthrPoolAddTask(&g_thr_pool, [] {});
             }).detach();
             while (started < 2 || added < 1000) std::this_thread::yield();
         }},
    };
    for (const auto& [state, runs, setUp] : rows)
        for (int i = 0; i < (runs + kRunScale - 1) / kRunScale; ++i) {
            ChildOutcome child = runInChild([&]() -> std::string {
                gProbe = new Probe();
                gProbe->delayUs = i * 100 * kRunScale;
                setUp();
                gProbe->armed = true;
                std::exit(0);
            });
            EXPECT_TRUE(child.ok()) << state << ", run " << i << ": " << child.describe();
        }
}
