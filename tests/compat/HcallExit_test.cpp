// The connection and the worker pool at process exit. The library builds
// g_thr_pool before g_hcall, so g_hcall's destructor runs first: the
// connection is closed before the pool drops the tasks still queued. This
// program is linked twice, with the library's archives in the order the CMake
// build lists them (host calls first) and in the order Android.bp lists them
// (support library first): the order must not depend on it.

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/mman.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdlib>
#include <memory>
#include <string>
#include <thread>

#include "VmsgDeviceModel.h"
#include "hcall/guest/HcallEnc.h"
#include "support/Gate.h"
#include "xpl/XthrPool.h"

namespace {

enum class AtExit {
    Idle,     // nothing in flight
    Busy,     // an exchange held in the host
    Backlog,  // the worker inside a task, another task queued behind it
};

// What the scenarios leave for the checks during and after the exit-time
// destructors: the device descriptor and the mapping of g_hcall as they were
// before the exit began. Never freed.
struct ExitProbe {
    AtExit state = AtExit::Idle;
    bool armed = false;
    int reportFd = -1;
    int deviceFd = -1;
    void* mapping = nullptr;
    Gate release;
    Gate done;
    int result = 0;
    std::string dropped;  // when the pool dropped its queue: was the device open?
};
ExitProbe* gProbe = nullptr;

void report(const std::string& message) {
    if (!message.empty()) (void)!write(gProbe->reportFd, message.data(), message.size());
    _exit(message.empty() ? 0 : 1);
}

bool mapped(void* address) { return msync(address, 4096, MS_ASYNC) == 0; }
bool isOpen(int fd) { return fcntl(fd, F_GETFD) != -1; }

// Destroyed, unrun, when g_thr_pool drops its queue at exit.
struct DropWitness {
    ~DropWitness() {
        if (gProbe->armed) gProbe->dropped = isOpen(gProbe->deviceFd) ? "open" : "closed";
    }
};

// Runs after the exit-time destructors of the process.
__attribute__((destructor)) void checkAfterExit() {
    if (!gProbe || !gProbe->armed) return;
    if (gProbe->state == AtExit::Backlog) {
        report(gProbe->dropped == "closed" ? ""
                                           : "the pool dropped its queue with the device " +
                                                 gProbe->dropped + ", before g_hcall's end");
    }
    if (gProbe->state == AtExit::Idle) {
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

void holdExchange() {
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

void queueBehindBusyWorker() {
    static Gate started;
    xthrPoolInit(&g_thr_pool, 1);
    xthrPoolAddTask(&g_thr_pool, [] {
        started.open();
        for (;;) pause();
    });
    auto witness = std::make_shared<DropWitness>();
    xthrPoolAddTask(&g_thr_pool, [witness] {});
    witness.reset();
    started.wait();
}

// Forks; the child connects, sets up `state` and calls exit(). Returns what
// the child reported, or why it failed.
std::string runExit(AtExit state) {
    int fds[2];
    if (pipe(fds) != 0) return "pipe failed";
    pid_t pid = fork();
    if (pid == 0) {
        close(fds[0]);
        gProbe = new ExitProbe();
        gProbe->state = state;
        gProbe->reportFd = fds[1];
        vmsgDeviceReset();
        VmsgDeviceScript script;
        script.results[7] = 7007;
        vmsgDeviceConfigure(script);
        if (hcallLibInitGuest() != XERR_SUCCESS) report("no connection");
        gProbe->deviceFd = g_hcall.client.mFd;
        gProbe->mapping = g_hcall.client.mHostBoundBuf;
        if (state == AtExit::Busy) holdExchange();
        if (state == AtExit::Backlog) queueBehindBusyWorker();
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

TEST(HcallExit, Exit_WhenIdle_ReleasesTheConnection) { EXPECT_EQ(runExit(AtExit::Idle), ""); }

// Regression: g_hcall's destructor unmapped the buffers while the worker was
// still waiting for the host, and the worker then read its reply from
// unmapped memory.
TEST(HcallExit, Exit_DuringAnExchange_LeavesTheBuffersToTheExchange) {
    EXPECT_EQ(runExit(AtExit::Busy), "");
}

// Regression: the build that listed the host calls first built g_hcall first,
// so the pool was torn down before the connection.
TEST(HcallExit, Exit_WithTasksQueued_ClosesTheConnectionBeforeThePoolDropsThem) {
    EXPECT_EQ(runExit(AtExit::Backlog), "");
}

}  // namespace
