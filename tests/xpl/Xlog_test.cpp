// The logger core: the record as loaded, the default print's Android sink,
// the fatal-error statement.
#include "xpl/Xlog.h"

#include <android/log.h>
#include <gtest/gtest.h>

#include <csignal>
#include <cstdlib>
#include <string>

#include "support/AndroidLogCapture.h"
#include "support/ChildProcess.h"
#include "support/LogRecorder.h"

namespace {

// What a logging statement in a static initialiser of another file meets.
// This file is linked before the library, so its initialisers run first.
struct AtLoad {
    XlogLogger* logger = xlogGetLogger();
    bool onlyErrorsPass = true;
    AtLoad() {
        for (int module = 0; module < XLOG_NUM_MODULES; ++module) {
            onlyErrorsPass = onlyErrorsPass && logger->shouldLog(module, -1) &&
                             logger->shouldLog(module, XLOG_LEVEL_E) &&
                             !logger->shouldLog(module, XLOG_LEVEL_W);
        }
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
TEST(Xlog, Print_SendsTheMessageAsFormattedWithTheLevelsPriority) {
    AndroidLogCapture capture;
    const int priorities[] = {ANDROID_LOG_VERBOSE, ANDROID_LOG_ERROR, ANDROID_LOG_WARN,
                              ANDROID_LOG_INFO,    ANDROID_LOG_DEBUG, ANDROID_LOG_VERBOSE,
                              ANDROID_LOG_VERBOSE};  // for levels -1 to 5
    for (int level = -1; level <= 5; ++level) {
        xlogPrint(level, XLOG_MODULE_HCALL, "f", "g", 1, "%s:%d:%lld", "level", level, 1LL << 40);
        ASSERT_EQ(capture.lines().size(), static_cast<size_t>(level + 2));
        EXPECT_EQ(capture.lines().back().priority, priorities[level + 1]) << level;
        EXPECT_EQ(capture.lines().back().text, "level:" + std::to_string(level) + ":1099511627776");
    }
}

TEST(Xlog, Fatal_PrintsTheFatalLineThenBreaks) {
    ChildOutcome trapped = runInChild([] {
        XLOG_FATAL(XLOG_MODULE_XTHR, "f", "g", "h");
        return "the break returned";
    });
    EXPECT_EQ(trapped.signal, SIGTRAP) << trapped.describe();
    ChildOutcome ignored = runInChild([] {
        signal(SIGTRAP, SIG_IGN);
        static LogRecorder* recorder = new LogRecorder();
        recorder->clear();
        // Runs inside the break's exit: the fatal line came first.
        std::atexit([] {
            if (recorder->texts(XLOG_MODULE_XTHR).size() != 1) _exit(3);
        });
        XLOG_FATAL(XLOG_MODULE_XTHR, "f", "g", "h");
        return "the break returned";
    });
    EXPECT_TRUE(ignored.exited && ignored.exitCode == 1)
        << "with SIGTRAP ignored the break exits with 1 (3: no fatal line); " << ignored.describe();
}

}  // namespace
