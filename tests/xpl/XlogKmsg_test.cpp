// The default print's kernel-log sink, through the kernel-log guard's
// redirection of "/dev/kmsg" to a file of the test's own. The stream is opened
// once per process, so each case runs in a child and the parent never prints.
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <string>
#include <thread>
#include <vector>

#include "support/AndroidLogCapture.h"
#include "support/ChildProcess.h"
#include "support/TempDir.h"
#include "xpl/Xlog.h"

namespace {

TEST(XlogKmsg, Print_WritesEachMessageAsFormattedFlushedAndOnOneStream) {
    TempDir dir;
    ChildOutcome outcome = runInChild([&]() -> std::string {
        setenv("HOSTCALL_TEST_KMSG", (dir / "kmsg").c_str(), 1);
        AndroidLogCapture capture;
        xlogPrint(XLOG_LEVEL_W, XLOG_MODULE_VMSG, "f", "g", 1, "%s=%d;", "alpha", 7);
        if (dir.read("kmsg") != "alpha=7;") return "not flushed at once: " + dir.read("kmsg");
        std::vector<std::thread> threads;
        for (int i = 0; i < 8; ++i) {
            threads.emplace_back(
                [i] { xlogPrint(XLOG_LEVEL_E, XLOG_MODULE_XTHR, "f", "g", 1, "|%d", i); });
        }
        for (std::thread& thread : threads) thread.join();
        // A second opening in "w+" mode would have cut what came before.
        const std::string written = dir.read("kmsg");
        for (int i = 0; i < 8; ++i) {
            if (written.find("|" + std::to_string(i)) == std::string::npos) return written;
        }
        return written.rfind("alpha=7;|", 0) == 0 && capture.lines().size() == 9 ? "" : written;
    });
    EXPECT_TRUE(outcome.ok()) << outcome.describe();
}

TEST(XlogKmsg, WhenDeviceCannotBeOpened_AndroidLogStillGetsLinesAndNoRetry) {
    TempDir dir;  // the guard redirects into a folder that does not exist yet
    ChildOutcome outcome = runInChild([&]() -> std::string {
        setenv("HOSTCALL_TEST_KMSG", (dir / "later/kmsg").c_str(), 1);
        AndroidLogCapture capture;
        xlogPrint(XLOG_LEVEL_E, XLOG_MODULE_XLOG, "f", "g", 1, "first");
        mkdir((dir / "later").c_str(), 0700);
        xlogPrint(XLOG_LEVEL_E, XLOG_MODULE_XLOG, "f", "g", 1, "second");
        if (dir.mode("later/kmsg") != 0) return "the open was tried again";
        return capture.lines().size() == 2 ? "" : "Android log lines were lost";
    });
    EXPECT_TRUE(outcome.ok()) << outcome.describe();
}

}  // namespace
