// The logger core. A program of its own, which prints only in children: the
// kernel-log stream (redirected by the kernel-log guard) is opened once per process.
#include "xpl/Xlog.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <csignal>
#include <thread>

#include "support/AndroidLogCapture.h"
#include "support/ChildProcess.h"
#include "support/LogRecorder.h"
#include "support/TempDir.h"

namespace {

// What a logging statement in a static initialiser of another file meets.
// This file is linked before the library, so its initialisers run first.
struct AtLoad {
    XlogLogger* logger = xlogGetLogger();
    bool onlyErrorsPass = true;
    AtLoad() {
        for (int m = 0; m < XLOG_NUM_MODULES; ++m)
            onlyErrorsPass &= logger->shouldLog(m, -1) && logger->shouldLog(m, XLOG_LEVEL_E) &&
                              !logger->shouldLog(m, XLOG_LEVEL_W);
    }
} g_atLoad;

// Regression: the record was created by one file's static initialiser and
// reached through g_xlog, so a statement in an earlier initialiser met null.
TEST(Xlog, Record_BeforeTheLibrarysInitialisers_IsTheOneRecordAtLevelE) {
    EXPECT_EQ(g_atLoad.logger, xlogGetLogger());
    EXPECT_EQ(&g_xlog->logger, xlogGetLogger());
    EXPECT_TRUE(g_atLoad.onlyErrorsPass) << "every level is 0 at load";
}

// Regression (the texts): the argument list was handed to the kernel log and
// then reused for the Android log, which formatted whatever followed.
TEST(Xlog, Print_SendsEachMessageAsFormattedToBothSinksFlushedAndOnOneStream) {
    TempDir dir;
    ChildOutcome outcome = runInChild([&]() -> std::string {
        setenv("HOSTCALL_TEST_KMSG", (dir / "kmsg").c_str(), 1);
        AndroidLogCapture capture;
        std::string want, got, priorities;
        for (int level = -1; level <= 5; ++level) {
            xlogPrint(level, XLOG_MODULE_HCALL, "f", "g", 1, "%d:%lld;", level, 1LL << 40);
            want += std::to_string(level) + ":1099511627776;";
            if (dir.read("kmsg") != want) return "kernel log, flushed at once: " + dir.read("kmsg");
        }
        for (const AndroidLogLine& line : capture.lines())
            got += line.text, priorities += std::to_string(line.priority);
        if (got + priorities != want + "2654322") return "Android log: " + got + priorities;
        std::vector<std::thread> threads;
        for (int i = 0; i < 8; ++i)
            threads.emplace_back([i] { xlogPrint(1, XLOG_MODULE_XTHR, "f", "g", 1, "|%d", i); });
        for (std::thread& thread : threads) thread.join();
        // A second opening in "w+" mode would have cut what came before.
        const std::string written = dir.read("kmsg");
        const bool all = std::count(written.begin(), written.end(), '|') == 8;
        return all && written.rfind(want, 0) == 0 && capture.lines().size() == 15 ? "" : written;
    });
    EXPECT_TRUE(outcome.ok()) << outcome.describe();
}

TEST(Xlog, Fatal_PrintsTheFatalLineThenBreaks) {
    for (bool ignored : {false, true}) {
        ChildOutcome outcome = runInChild([ignored] {
            if (ignored) signal(SIGTRAP, SIG_IGN);
            static LogRecorder* recorder = new LogRecorder();
            // Runs inside the break's exit: the fatal line came first.
            std::atexit([] {
                if (recorder->lines(XLOG_MODULE_XTHR).size() != 1) _exit(3);
            });
            XLOG_FATAL(XLOG_MODULE_XTHR, "f", "g", "h");
            return "the break returned";
        });
        // With SIGTRAP ignored the break exits with 1 (3: no fatal line).
        EXPECT_EQ(outcome.exited ? outcome.exitCode : -outcome.signal, ignored ? 1 : -SIGTRAP)
            << outcome.describe();
    }
}

}  // namespace
