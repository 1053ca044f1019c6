// The service start as native_init runs it, outside a JVM: a step that
// succeeded is not run again, and calls from several threads at once take
// turns. Each scenario runs in a child process of its own, since the start is
// process-wide.

#include "ServiceStart.h"

#include <gtest/gtest.h>

#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "hcall/DeviceSession.h"
#include "support/ChildProcess.h"
#include "support/Gate.h"
#include "support/LogRecorder.h"
#include "threading/ThreadCreateFault.h"
#include "xpl/XthrPool.h"

namespace {

int workers() {
    std::lock_guard<std::mutex> lock(g_thr_pool.mutex);
    return g_thr_pool.numActive;
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
        LogRecorder log;
        if (xlogSetLevels("HCALL:V") != XERR_SUCCESS) return "levels refused";
        bridge::startService();
        std::string errors;
        for (const LoggedLine& l : log.lines(XLOG_MODULE_HCALL))
            errors += std::to_string(l.level) + " " + l.file + ":" + std::to_string(l.line) + " " +
                      l.text + "\n";
        if (errors !=
            "0 server/native/com_zelvane_server_KivHostCallService:74 "
            "hcallLibInitGuest failed, error -1\n")
            return "connection failure logged as: " + errors;
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
        if (xlogSetLevels("HCALL:V") != XERR_SUCCESS) return "levels refused";
        bridge::startService();
        if (countEvents(VmsgDeviceEventKind::Open) != 1) return "the device was opened again";
        if (!xlogShouldLog(XLOG_MODULE_HCALL, XLOG_LEVEL_V)) return "the levels were reset";
        return workers() == 1 ? "" : "no worker after the retry";
    });
    EXPECT_TRUE(child.ok()) << child.message;
}

// A race may go either way in one round, so each of several children races.
TEST(ServiceStart, Start_FromSeveralThreadsAtOnce_ConnectsOnceAndStartsOneWorker) {
    for (int round = 0; round < 20; ++round) {
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
        ASSERT_TRUE(child.ok()) << "round " << round << ": " << child.message;
    }
}

}  // namespace
