// The service start as native_init runs it, outside a JVM: a step that
// succeeded is not run again, and calls from several threads at once take
// turns. Each scenario runs in a child process of its own, since the start is
// process-wide.

#include "ServiceStart.h"

#include <gtest/gtest.h>

#include <cstdarg>
#include <cstdio>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "VmsgDeviceModel.h"
#include "support/ChildProcess.h"
#include "support/Gate.h"
#include "threading/ThreadCreateFault.h"
#include "xpl/Xlog.h"
#include "xpl/XthrPool.h"

namespace {

size_t countEvents(VmsgDeviceEventKind kind) {
    size_t n = 0;
    for (const VmsgDeviceEvent& event : vmsgDeviceEvents()) n += event.kind == kind;
    return n;
}

int workers() {
    std::lock_guard<std::mutex> lock(g_thr_pool.mutex);
    return g_thr_pool.numActive;
}

std::string gHcallErrors;

// Keeps the HCALL error lines with the source path and line they name.
void keepHcallErrors(int level, int module, const char* file, const char*, int line,
                     const char* format, ...) {
    if (module != XLOG_MODULE_HCALL || level != XLOG_LEVEL_E) return;
    char text[256];
    va_list args;
    va_start(args, format);
    std::vsnprintf(text, sizeof(text), format, args);
    va_end(args);
    gHcallErrors += std::string(file) + ":" + std::to_string(line) + " " + text + "\n";
}

// Running the support library's start again would reinstall the default
// logger and reset the levels to "*:I XMEM:D". The connection failure names
// the source path and line log readers have always matched it by.
TEST(ServiceStart, Start_AfterAFailedConnect_KeepsLoggerAndLevelsSetSinceAndConnects) {
    ChildOutcome child = runInChild([]() -> std::string {
        VmsgDeviceScript script;
        script.openErrno = ENOENT;
        vmsgDeviceConfigure(script);
        bridge::startService();
        const XlogLogger logger = {xlogShouldLog, keepHcallErrors};
        xlogLibInit(&logger, "", "");
        if (xlogSetLevels("HCALL:V") != XERR_SUCCESS) return "levels refused";
        bridge::startService();
        if (gHcallErrors !=
            "server/native/com_zelvane_server_KivHostCallService:74 "
            "hcallLibInitGuest failed, error -1\n")
            return "connection failure logged as: " + gHcallErrors;
        vmsgDeviceConfigure(VmsgDeviceScript());
        bridge::startService();
        if (!xlogShouldLog(XLOG_MODULE_HCALL, XLOG_LEVEL_V)) return "the levels were reset";
        if (countEvents(VmsgDeviceEventKind::Connect) != 1) return "no connection on the retry";
        return workers() == 1 ? "" : "no worker after the retry";
    });
    EXPECT_TRUE(child.ok()) << child.message;
}

// Regression: a worker that could not be created was taken for started, and
// every later native_init answered "already started" with no worker behind.
TEST(ServiceStart, Start_WhenTheWorkerCouldNotBeCreated_StartsItOnTheNextCall) {
    ChildOutcome child = runInChild([]() -> std::string {
        {
            ThreadCreateFault fault(/*succeedFirst=*/0);
            bridge::startService();
        }
        if (workers() != 0) return "a worker that was never created counts";
        bridge::startService();
        if (countEvents(VmsgDeviceEventKind::Open) != 1) return "the device was opened again";
        return workers() == 1 ? "" : "no worker after the retry";
    });
    EXPECT_TRUE(child.ok()) << child.message;
}

TEST(ServiceStart, Start_FromSeveralThreadsAtOnce_ConnectsOnceAndStartsOneWorker) {
    ChildOutcome child = runInChild([]() -> std::string {
        Gate go;
        std::vector<std::thread> callers;
        for (int i = 0; i < 8; ++i) {
            callers.emplace_back([&go] {
                go.wait();
                bridge::startService();
            });
        }
        go.open();
        for (std::thread& caller : callers) caller.join();
        if (countEvents(VmsgDeviceEventKind::Open) != 1) return "the device was opened again";
        return workers() == 1 ? "" : std::to_string(workers()) + " workers";
    });
    EXPECT_TRUE(child.ok()) << child.message;
}

}  // namespace
