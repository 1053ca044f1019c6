#include "xpl/Xpl.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <cstdarg>
#include <cstdio>
#include <string>
#include <vector>

#include "support/ChildProcess.h"

namespace {

std::vector<std::string> g_lines;

int sayYes(int, int) { return 1; }

__attribute__((format(printf, 6, 7))) void recordLine(int, int, const char*, const char*, int,
                                                      const char* format, ...) {
    char text[256];
    va_list args;
    va_start(args, format);
    vsnprintf(text, sizeof(text), format, args);
    va_end(args);
    g_lines.push_back(text);
}

TEST(XplLibInit, WithDefaults_StartsCodesAndLoggerWithoutALogFile) {
    ChildOutcome outcome = runInChild([] {
        if (xerrFromNative(22) != 100022) return std::string("codes filled before start-up");
        xerr_t err = xplLibInit(nullptr, "");
        if (err != XERR_SUCCESS) return "returned " + std::to_string(err);
        if (xerrFromNative(22) != XERR_INVAL) return std::string("codes not filled");
        if (!g_xlog->fileName.empty()) return std::string("a log file was opened");
        for (int module = 0; module < XLOG_NUM_MODULES; ++module) {
            int expected = module == XLOG_MODULE_XMEM ? XLOG_LEVEL_D : XLOG_LEVEL_I;
            if (g_xlog->modules[module].level != expected) {
                return "module " + std::to_string(module) + " at the wrong level";
            }
        }
        return std::string();
    });
    EXPECT_TRUE(outcome.ok()) << outcome.message;
}

TEST(XplLibInit, WithCallerLogger_InstallsItAfterTheCodes) {
    ChildOutcome outcome = runInChild([] {
        XlogLogger mine{sayYes, recordLine};
        if (xplLibInit(&mine, "") != XERR_SUCCESS) return std::string("start-up failed");
        if (xlogGetLogger()->print != &recordLine) return std::string("logger not installed");
        if (g_lines != std::vector<std::string>{"xlog inited using logger"}) {
            return std::string("the install line did not reach the caller's logger");
        }
        if (xerrStr(2) != "XERR_NOENT") return std::string("codes not filled");
        return std::string();
    });
    EXPECT_TRUE(outcome.ok()) << outcome.message;
}

TEST(XplLibInit, WhenLogFileCannotBeOpened_ReturnsTheOpenError) {
    char dir[] = "/tmp/xpl_test_XXXXXX";
    ASSERT_NE(mkdtemp(dir), nullptr);
    std::string blocker = std::string(dir) + "/plain";
    int fd = open(blocker.c_str(), O_CREAT | O_WRONLY, 0600);
    ASSERT_GE(fd, 0);
    close(fd);
    ChildOutcome outcome = runInChild([&] {
        xerr_t err = xplLibInit(nullptr, blocker + "/log.txt");
        if (err != XERR_NOTDIR) return "returned " + xerrStr(err);
        if (g_xlog->modules[XLOG_MODULE_HCALL].tag != nullptr) {
            return std::string("the logger went on starting after the failure");
        }
        return std::string();  // no debug break: the caller recovers
    });
    EXPECT_TRUE(outcome.ok()) << outcome.message << " (signal " << outcome.signal << ")";
    unlink(blocker.c_str());
    rmdir(dir);
}

}  // namespace
