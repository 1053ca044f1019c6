// Host calls from several threads at once share one connection: the device
// must never see two exchanges in flight, and every caller must get its own
// reply. Also the connection's end at process exit while an exchange runs.

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/mman.h>
#include <sys/wait.h>
#include <unistd.h>

#include <condition_variable>
#include <cstring>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "DeviceSession.h"
#include "LogRecorder.h"

namespace {

// A one-shot gate: threads wait until it is opened.
class Gate {
  public:
    void open() {
        std::lock_guard<std::mutex> lock(mutex_);
        open_ = true;
        cv_.notify_all();
    }
    void wait() {
        std::unique_lock<std::mutex> lock(mutex_);
        cv_.wait(lock, [this] { return open_; });
    }

  private:
    std::mutex mutex_;
    std::condition_variable cv_;
    bool open_ = false;
};

// Opens the gate when it goes out of scope, so a failed assertion cannot
// leave threads waiting forever.
struct GateOpener {
    Gate& gate;
    ~GateOpener() { gate.open(); }
};

TEST(HcallThreads, Calls_FromSeveralThreadsAtOnce_NeverOverlapAndEachGetsItsOwnReply) {
    LogRecorder log(XLOG_LEVEL_E);
    VmsgDeviceScript script;
    script.results[7] = 700;
    script.results[19] = 1900;
    script.results[40] = 4000;
    script.launchAllowed = false;  // unlike the answer of a call that never reached the host
    script.propsText = "props";
    script.propsValue = 123;
    // Holds each exchange open long enough for an unserialised call to collide.
    script.delayUs = 20;
    HcallSession session(script);
    ASSERT_TRUE(session.connected());
    constexpr int kCallsPerThread = 200;

    // Each thread makes a call whose reply no other thread's call gets.
    const std::vector<std::function<bool()>> callers = {
        [] { return hcallOnOrientationChangedRpc(1) == 700; },
        [] { return hcallOnVolumeChangedRpc(true, 3) == 1900; },
        [] { return hcallOnImportFilesCompletedRpc(0, "/sdcard/Download") == 4000; },
        [] { return !hcallIsAppLaunchAllowedRpc("com.example.game"); },
        [] {
            char buffer[32] = "";
            int32_t value = 0;
            return hcallGetPropsRpc(buffer, sizeof(buffer), &value) == 0 &&
                   std::string(buffer) == "props" && value == 123;
        },
    };
    Gate start;
    std::vector<int> wrong(callers.size(), 0);
    std::vector<std::thread> threads;
    {
        GateOpener opener{start};
        for (size_t t = 0; t < callers.size(); ++t) {
            threads.emplace_back([&, t] {
                start.wait();
                for (int i = 0; i < kCallsPerThread; ++i) wrong[t] += !callers[t]();
            });
        }
    }
    for (std::thread& thread : threads) thread.join();

    for (size_t t = 0; t < callers.size(); ++t)
        EXPECT_EQ(wrong[t], 0) << "thread " << t << " got another call's reply";
    EXPECT_EQ(vmsgDeviceOverlapCount(), 0u) << "two exchanges were in flight at once";
    std::vector<VmsgDeviceExchange> exchanges = vmsgDeviceExchanges();
    EXPECT_EQ(exchanges.size(), callers.size() * kCallsPerThread);
    size_t malformed = 0;
    for (const VmsgDeviceExchange& exchange : exchanges) malformed += !exchange.wellFormed;
    EXPECT_EQ(malformed, 0u) << "a request was written while another was being read";
}

// What the exit scenarios below left for the check after the exit-time
// destructors: the device descriptor and the mapping of g_hcall as they were
// before the exit began.
struct ExitProbe {
    bool armed = false;
    bool busy = false;  // an exchange is held in the host when the exit begins
    int reportFd = -1;
    int deviceFd = -1;
    void* mapping = nullptr;
    Gate release;
    Gate done;
    int result = 0;
};
ExitProbe* gProbe = nullptr;

void report(const std::string& message) {
    if (!message.empty()) (void)!write(gProbe->reportFd, message.data(), message.size());
    _exit(message.empty() ? 0 : 1);
}

bool mapped(void* address) { return msync(address, 4096, MS_ASYNC) == 0; }
bool isOpen(int fd) { return fcntl(fd, F_GETFD) != -1; }

// Runs after the exit-time destructors of the process, g_hcall's among them.
__attribute__((destructor)) void checkAfterExit() {
    if (!gProbe || !gProbe->armed) return;
    if (!gProbe->busy) {
        report(mapped(gProbe->mapping) || isOpen(gProbe->deviceFd)
                   ? "an idle connection was not released at exit"
                   : "");
    }
    if (!mapped(gProbe->mapping)) report("the buffers were unmapped under a running exchange");
    if (!isOpen(gProbe->deviceFd)) report("the device was closed under a running exchange");
    // The exchange now completes and reads its reply from the mapping.
    gProbe->release.open();
    gProbe->done.wait();
    report(gProbe->result == 7007 ? "" : "the exchange did not complete after the exit");
}

// Forks; the child connects, optionally holds one exchange in the host, and
// calls exit(). Returns what the child reported, or why it failed.
std::string runExit(bool busy) {
    int fds[2];
    if (pipe(fds) != 0) return "pipe failed";
    pid_t pid = fork();
    if (pid == 0) {
        close(fds[0]);
        gProbe = new ExitProbe();
        gProbe->busy = busy;
        gProbe->reportFd = fds[1];
        vmsgDeviceReset();
        VmsgDeviceScript script;
        script.results[7] = 7007;
        vmsgDeviceConfigure(script);
        if (hcallLibInitGuest() != XERR_SUCCESS) report("no connection");
        gProbe->deviceFd = g_hcall.client.mFd;
        gProbe->mapping = g_hcall.client.mHostBoundBuf;
        if (busy) {
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
        }
        gProbe->armed = true;
        std::exit(0);
    }
    close(fds[1]);
    std::string message;
    char buf[256];
    ssize_t got;
    while ((got = read(fds[0], buf, sizeof(buf))) > 0) message.append(buf, size_t(got));
    close(fds[0]);
    int status = 0;
    if (waitpid(pid, &status, 0) != pid) return "no child";
    if (!WIFEXITED(status)) return "child killed by signal " + std::to_string(WTERMSIG(status));
    if (WEXITSTATUS(status) != 0 && message.empty()) return "child failed";
    return message;
}

TEST(HcallExit, Exit_WhenIdle_ReleasesTheConnection) {
    LogRecorder log(XLOG_LEVEL_E);
    EXPECT_EQ(runExit(false), "");
}

// Regression: g_hcall's destructor unmapped the buffers while the worker was
// still waiting for the host, and the worker then read its reply from
// unmapped memory.
TEST(HcallExit, Exit_DuringAnExchange_LeavesTheBuffersToTheExchange) {
    LogRecorder log(XLOG_LEVEL_E);
    EXPECT_EQ(runExit(true), "");
}

}  // namespace
