// The logger core as loaded: nothing in this program starts the logger, so
// the record keeps its load-time state (every level 0, no tags).
#include "xpl/Xlog.h"

#include <android/log.h>
#include <gtest/gtest.h>

#include <atomic>
#include <csignal>
#include <cstdlib>
#include <string>
#include <thread>

#include "support/AndroidLogCapture.h"
#include "support/ChildProcess.h"

namespace {

constexpr const char* kFile = "tests/xpl/Xlog_test";
constexpr const char* kFunction = "void test()";

// A logging statement in a static initialiser of another file. This file is
// linked before the library, so its initialisers run first: the logger must
// already be usable here.
struct EarlyLogUser {
    XlogLogger* logger = nullptr;
    int wanted = 0;
    EarlyLogUser() {
        logger = xlogGetLogger();
        wanted = logger->shouldLog(XLOG_MODULE_XLOG, XLOG_LEVEL_E);
        XLOG_AT(XLOG_MODULE_XLOG, XLOG_LEVEL_V, kFile, kFunction, "early line %d", 1);
    }
};
EarlyLogUser g_earlyLogUser;

// Regression: the record was created by one file's static initialiser and
// reached through g_xlog, so a statement in an earlier initialiser met null.
TEST(XlogRecord, WhenUsedFromAnEarlierStaticInitialiser_IsTheOneRecord) {
    ASSERT_NE(g_earlyLogUser.logger, nullptr);
    EXPECT_EQ(g_earlyLogUser.logger, xlogGetLogger()) << "the same record before and after load";
    EXPECT_NE(g_earlyLogUser.wanted, 0) << "level E passes from load on";
    ASSERT_NE(g_xlog, nullptr) << "g_xlog points at the record once loading is done";
    EXPECT_EQ(&g_xlog->logger, xlogGetLogger());
    EXPECT_EQ(g_xlog->logger.shouldLog, &xlogShouldLog) << "default operations at load";
    EXPECT_EQ(g_xlog->logger.print, &xlogPrint) << "default operations at load";
}

TEST(XlogShouldLog, AtLoad_PassesOnlyLevelE) {
    for (int module = 0; module < XLOG_NUM_MODULES; ++module) {
        EXPECT_NE(xlogShouldLog(module, XLOG_LEVEL_E), 0) << "module " << module;
        EXPECT_NE(xlogShouldLog(module, -1), 0) << "negative levels are more severe than E";
        EXPECT_EQ(xlogShouldLog(module, XLOG_LEVEL_W), 0) << "module " << module;
    }
    EXPECT_EQ(g_xlog->modules[XLOG_MODULE_HCALL].tag, nullptr) << "tags come with start-up";
}

TEST(XlogShouldLog, WhenModuleIsOutsideTheTable_SaysNo) {
    EXPECT_EQ(xlogShouldLog(XLOG_NUM_MODULES, XLOG_LEVEL_E), 0);
    EXPECT_EQ(xlogShouldLog(-1, XLOG_LEVEL_E), 0);
}

TEST(XlogPrint, MapsLevelsToAndroidPriorities) {
    AndroidLogCapture capture;
    const struct {
        int level;
        int priority;
    } cases[] = {{0, ANDROID_LOG_ERROR},   {1, ANDROID_LOG_WARN},    {2, ANDROID_LOG_INFO},
                 {3, ANDROID_LOG_DEBUG},   {4, ANDROID_LOG_VERBOSE}, {7, ANDROID_LOG_VERBOSE},
                 {-1, ANDROID_LOG_VERBOSE}};
    for (const auto& c : cases) {
        xlogPrint(c.level, XLOG_MODULE_HCALL, kFile, kFunction, __LINE__, "level %d", c.level);
    }
    auto lines = capture.lines();
    ASSERT_EQ(lines.size(), sizeof(cases) / sizeof(cases[0]));
    for (size_t i = 0; i < lines.size(); ++i) {
        EXPECT_EQ(lines[i].priority, cases[i].priority) << "level " << cases[i].level;
        EXPECT_EQ(lines[i].text, "level " + std::to_string(cases[i].level))
            << "nothing is added to the message";
    }
}

// Regression: the argument list was handed to the kernel log and then reused
// for the Android log, which then formatted whatever followed on the stack.
TEST(XlogPrint, WhenBothSinksFormat_EachGetsTheArguments) {
    AndroidLogCapture capture;
    xlogPrint(XLOG_LEVEL_I, XLOG_MODULE_VMSG, kFile, kFunction, __LINE__, "%s:%d:%s:%lld", "alpha",
              42, "omega", 1234567890123LL);
    auto lines = capture.lines();
    ASSERT_EQ(lines.size(), 1u);
    EXPECT_EQ(lines[0].text, "alpha:42:omega:1234567890123")
        << "the Android log must see the same arguments as the kernel log";
}

TEST(XlogPrint, WhenCalledThroughTheStatement_SkipsUnwantedLinesWithoutEvaluating) {
    AndroidLogCapture capture;
    int evaluated = 0;
    XLOG_AT(XLOG_MODULE_XFILE, XLOG_LEVEL_D, kFile, kFunction, "%d", ++evaluated);
    EXPECT_EQ(evaluated, 0) << "arguments of a suppressed line are not evaluated";
    XLOG_AT(XLOG_MODULE_XFILE, XLOG_LEVEL_E, kFile, kFunction, "%d", ++evaluated);
    EXPECT_EQ(evaluated, 1);
    EXPECT_EQ(capture.lines().size(), 1u);
}

TEST(XlogFatal, PrintsTheFatalLineThenBreaks) {
    ChildOutcome trapped = runInChild([] {
        XLOG_FATAL(XLOG_MODULE_XTHR, kFile, kFunction, "test");
        return std::string("the break returned");
    });
    EXPECT_EQ(trapped.signal, SIGTRAP) << "the break raises SIGTRAP";

    constexpr int kWrongLine = 3;
    ChildOutcome ignored = runInChild([] {
        signal(SIGTRAP, SIG_IGN);
        static AndroidLogCapture* capture = new AndroidLogCapture();
        // Runs inside the break's exit, so the fatal line must be there.
        std::atexit([] {
            auto lines = capture->lines();
            const std::string head = "FATAL: DEBUG BREAK: tests/xpl/Xlog_test:";
            const std::string tail = " test()";
            bool ok =
                lines.size() == 1 && lines[0].priority == ANDROID_LOG_ERROR &&
                lines[0].text.compare(0, head.size(), head) == 0 &&
                lines[0].text.size() > head.size() + tail.size() &&
                lines[0].text.compare(lines[0].text.size() - tail.size(), tail.size(), tail) == 0;
            if (!ok) _exit(kWrongLine);
        });
        XLOG_FATAL(XLOG_MODULE_XTHR, kFile, kFunction, "test");
        return std::string("the break returned");
    });
    EXPECT_NE(ignored.exitCode, kWrongLine) << "the fatal line precedes the break";
    EXPECT_TRUE(ignored.exited && ignored.exitCode == 1)
        << "with SIGTRAP ignored the break exits with 1: " << ignored.message;
}

// The record and the kernel-log stream are never freed: a thread that logs
// while the process exits must find both intact. Repeated, since the window
// is narrow.
TEST(XlogExit, WhenAnotherThreadLogsDuringExit_ProcessEndsCleanly) {
    constexpr int kRounds = 20;
    for (int round = 0; round < kRounds; ++round) {
        ChildOutcome outcome = runInChild([] {
            AndroidLogCapture capture;  // keeps standard error quiet
            static std::atomic<bool> logging{false};
            std::thread([] {
                for (int i = 0;; ++i) {
                    XLOG_AT(XLOG_MODULE_XTHR, XLOG_LEVEL_E, kFile, kFunction, "late %d\n", i);
                    logging.store(true);
                }
            }).detach();
            while (!logging.load()) std::this_thread::yield();
            std::exit(0);
            return std::string();
        });
        ASSERT_TRUE(outcome.exited && outcome.exitCode == 0)
            << "round " << round << ": signal " << outcome.signal << ", exit " << outcome.exitCode;
    }
}

}  // namespace
