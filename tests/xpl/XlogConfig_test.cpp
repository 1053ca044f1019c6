#include <android/log.h>
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstdarg>
#include <cstdio>
#include <cstring>
#include <string>
#include <vector>

#include "support/AndroidLogCapture.h"
#include "support/ChildProcess.h"
#include "xpl/Xerr.h"
#include "xpl/Xlog.h"

namespace {

constexpr long long kRotateSize = 10485760;
constexpr const char* kLibInitSignature =
    "xerr_t xlogLibInit(const XlogLogger *, const string &, const string &)";

int levelOf(int module) { return g_xlog->modules[module].level; }

// Whether `text` has the shape of `pattern`: '9' stands for a digit, '+' for
// either sign, any other character for itself.
bool hasShape(const std::string& text, const std::string& pattern) {
    if (text.size() != pattern.size()) return false;
    for (size_t i = 0; i < text.size(); ++i) {
        char p = pattern[i];
        char c = text[i];
        bool ok = p == '9' ? (c >= '0' && c <= '9') : p == '+' ? (c == '+' || c == '-') : c == p;
        if (!ok) return false;
    }
    return true;
}

// The fatal line of xlogLibInit, whatever its source line number.
bool isLibInitFatalLine(const std::string& text) {
    const std::string head = "FATAL: DEBUG BREAK: Source/xpl/Xlog:";
    const std::string tail = " xlogLibInit()";
    if (text.size() <= head.size() + tail.size()) return false;
    if (text.compare(0, head.size(), head) != 0) return false;
    if (text.compare(text.size() - tail.size(), tail.size(), tail) != 0) return false;
    std::string line = text.substr(head.size(), text.size() - head.size() - tail.size());
    return line.find_first_not_of("0123456789") == std::string::npos;
}

// Puts the record back into its load-time state (as in a process where
// nothing has started the logger yet).
void resetToLoadState() {
    for (const char*& name : g_xlog->levelNames) name = nullptr;
    for (XlogModule& module : g_xlog->modules) module = XlogModule{0, nullptr};
    g_xlog->utcOffset.clear();
}

// A caller-supplied logger that records what reaches it.
struct RecordedLine {
    int level;
    int module;
    std::string file;
    std::string function;
    std::string text;
};
std::vector<RecordedLine> g_recorded;
int g_recordingAnswer = 1;

int recordingShouldLog(int, int) { return g_recordingAnswer; }

__attribute__((format(printf, 6, 7))) void recordingPrint(int level, int module, const char* file,
                                                          const char* function, int,
                                                          const char* format, ...) {
    char text[256];
    va_list args;
    va_start(args, format);
    vsnprintf(text, sizeof(text), format, args);
    va_end(args);
    g_recorded.push_back({level, module, file, function, text});
}

class XlogConfigTest : public ::testing::Test {
  protected:
    void SetUp() override {
        ASSERT_EQ(xerrLibInit(), XERR_SUCCESS);
        // Back to the default operations, then the default start-up.
        const XlogLogger defaults{xlogShouldLog, xlogPrint};
        ASSERT_EQ(xlogLibInit(&defaults, "", ""), XERR_SUCCESS);
        ASSERT_EQ(xlogLibInit(nullptr, "", "*:I"), XERR_SUCCESS);
        g_recorded.clear();
        g_recordingAnswer = 1;
        char dir[] = "/tmp/xlog_config_XXXXXX";
        ASSERT_NE(mkdtemp(dir), nullptr);
        dir_ = dir;
    }
    void TearDown() override {
        std::string command = "rm -rf '" + dir_ + "'";
        ASSERT_EQ(system(command.c_str()), 0);
    }

    std::string dir_;
};

TEST_F(XlogConfigTest, LibInitDefault_FillsTablesAndSetsTheFixedLevels) {
    const char* letters[] = {"E", "W", "I", "D", "V"};
    for (int level = 0; level < XLOG_NUM_LEVELS; ++level) {
        EXPECT_STREQ(g_xlog->levelNames[level], letters[level]);
    }
    EXPECT_STREQ(g_xlog->modules[0].tag, "AGA");
    EXPECT_STREQ(g_xlog->modules[13].tag, "HCALL");
    EXPECT_STREQ(g_xlog->modules[14].tag, "HVUTL") << "not alphabetical at 14 and 15";
    EXPECT_STREQ(g_xlog->modules[15].tag, "HST");
    EXPECT_STREQ(g_xlog->modules[30].tag, "VMSG");
    EXPECT_STREQ(g_xlog->modules[38].tag, "XMEM");
    EXPECT_STREQ(g_xlog->modules[45].tag, "XTIMER");
    for (int module = 0; module < XLOG_NUM_MODULES; ++module) {
        int expected = module == XLOG_MODULE_XMEM ? XLOG_LEVEL_D : XLOG_LEVEL_I;
        EXPECT_EQ(levelOf(module), expected) << g_xlog->modules[module].tag;
        EXPECT_EQ(xlogShouldLog(module, XLOG_LEVEL_V), 0) << g_xlog->modules[module].tag;
    }
    EXPECT_EQ(xlogShouldLog(XLOG_MODULE_HCALL, XLOG_LEVEL_D), 0);
    EXPECT_NE(xlogShouldLog(XLOG_MODULE_HCALL, XLOG_LEVEL_I), 0);
}

TEST_F(XlogConfigTest, LibInitDefault_PrintsNoDebugLinesAndTagsTheAndroidLog) {
    AndroidLogCapture capture;
    ASSERT_EQ(xlogLibInit(nullptr, "", "*:I"), XERR_SUCCESS);
    EXPECT_TRUE(capture.lines().empty()) << "XLOG is at level I when the D lines are tested";
    xlogPrint(XLOG_LEVEL_I, XLOG_MODULE_HVUTL, "f", "g", 1, "tagged");
    auto lines = capture.lines();
    ASSERT_EQ(lines.size(), 1u);
    EXPECT_EQ(lines[0].tag, "HVUTL") << "the module's tag is the Android tag";
}

TEST_F(XlogConfigTest, LibInitWithLogger_InstallsACopyAndLeavesTheTables) {
    ASSERT_EQ(xlogSetLevels("*:W"), XERR_SUCCESS);
    XlogLogger* before = xlogGetLogger();
    XlogLogger mine{recordingShouldLog, recordingPrint};
    ASSERT_EQ(xlogLibInit(&mine, "", "*:V"), XERR_SUCCESS);
    EXPECT_EQ(xlogGetLogger(), before) << "installing changes the operations, not the address";
    ASSERT_EQ(g_recorded.size(), 1u);
    EXPECT_EQ(g_recorded[0].text, "xlog inited using logger");
    EXPECT_EQ(g_recorded[0].level, XLOG_LEVEL_D);
    EXPECT_EQ(g_recorded[0].module, XLOG_MODULE_XLOG);
    EXPECT_EQ(g_recorded[0].file, "Source/xpl/Xlog");
    EXPECT_EQ(g_recorded[0].function, kLibInitSignature);
    EXPECT_EQ(levelOf(XLOG_MODULE_HCALL), XLOG_LEVEL_W) << "levels keep their state";

    mine.shouldLog = nullptr;  // the record is copied, not kept
    g_recorded.clear();
    EXPECT_EQ(xlogSetLevels("XMEM:E"), XERR_SUCCESS);
    ASSERT_EQ(g_recorded.size(), 1u);
    EXPECT_EQ(g_recorded[0].text, "Change log levels with: XMEM:E");
    EXPECT_EQ(g_recorded[0].function, "xerr_t xlogSetLevels(const string &)");

    g_recordingAnswer = 0;
    g_recorded.clear();
    mine.shouldLog = recordingShouldLog;
    ASSERT_EQ(xlogLibInit(&mine, "", ""), XERR_SUCCESS);
    EXPECT_TRUE(g_recorded.empty()) << "the line is printed only when the new logger wants it";
}

TEST_F(XlogConfigTest, SetLevels_AppliesTokensInOrderUntilAMalformedOne) {
    const struct {
        const char* levels;
        xerr_t result;
        int hcall;  // HCALL's level afterwards, starting from I
        int xmem;   // XMEM's level afterwards, starting from D
    } cases[] = {
        {"*:D XMEM:Q", XERR_INVAL, XLOG_LEVEL_D, XLOG_LEVEL_D},
        {"*:I ", XERR_INVAL, XLOG_LEVEL_I, XLOG_LEVEL_I},
        {"", XERR_INVAL, XLOG_LEVEL_I, XLOG_LEVEL_D},
        {"  HCALL:Verbose", XERR_SUCCESS, XLOG_LEVEL_V, XLOG_LEVEL_D},
        {"hcall:V", XERR_SUCCESS, XLOG_LEVEL_I, XLOG_LEVEL_D},
        {"XMEM:D:V", XERR_INVAL, XLOG_LEVEL_I, XLOG_LEVEL_D},
        {"XMEM::W", XERR_SUCCESS, XLOG_LEVEL_I, XLOG_LEVEL_W},
        {":D", XERR_INVAL, XLOG_LEVEL_I, XLOG_LEVEL_D},
        {"HCALL:d", XERR_INVAL, XLOG_LEVEL_I, XLOG_LEVEL_D},
        {"HCALL:E *:W HCALL:V", XERR_SUCCESS, XLOG_LEVEL_V, XLOG_LEVEL_W},
        {"\tHCALL\t:\tE\t", XERR_SUCCESS, XLOG_LEVEL_E, XLOG_LEVEL_D},
        {"NOSUCH:E", XERR_SUCCESS, XLOG_LEVEL_I, XLOG_LEVEL_D},
    };
    for (const auto& c : cases) {
        ASSERT_EQ(xlogSetLevels("*:I XMEM:D"), XERR_SUCCESS);
        EXPECT_EQ(xlogSetLevels(c.levels), c.result) << "'" << c.levels << "'";
        EXPECT_EQ(levelOf(XLOG_MODULE_HCALL), c.hcall) << "HCALL after '" << c.levels << "'";
        EXPECT_EQ(levelOf(XLOG_MODULE_XMEM), c.xmem) << "XMEM after '" << c.levels << "'";
    }
}

// Regression: before the tables were filled the level letters were null and
// the parser read through them.
TEST_F(XlogConfigTest, SetLevels_WhenTablesAreNotFilled_ChangesNothing) {
    ChildOutcome outcome = runInChild([] {
        resetToLoadState();
        xerr_t err = xlogSetLevels("*:V HCALL:D");
        if (err == XERR_SUCCESS) return std::string("reported success on unfilled tables");
        for (const XlogModule& module : g_xlog->modules) {
            if (module.level != 0) return std::string("a level changed");
        }
        return std::string();
    });
    EXPECT_TRUE(outcome.ok()) << outcome.message << " (signal " << outcome.signal << ")";
}

TEST_F(XlogConfigTest, LibInit_WhenLogFileCannotBeOpened_PrintsFatalLineAndReturnsTheError) {
    std::string blocker = dir_ + "/plain";
    int fd = open(blocker.c_str(), O_CREAT | O_WRONLY, 0600);
    ASSERT_GE(fd, 0);
    close(fd);
    std::string logFile = blocker + "/log.txt";  // under a regular file
    ChildOutcome outcome = runInChild([&] {
        resetToLoadState();
        AndroidLogCapture capture;
        xerr_t err = xlogLibInit(nullptr, logFile, "*:I");
        if (err != XERR_NOTDIR) return "returned " + xerrStr(err);
        auto lines = capture.lines();
        if (lines.size() != 1 || !isLibInitFatalLine(lines[0].text) ||
            lines[0].priority != ANDROID_LOG_ERROR) {
            return std::string("expected the fatal line alone");
        }
        if (g_xlog->modules[0].tag != nullptr || g_xlog->levelNames[0] != nullptr ||
            !g_xlog->utcOffset.empty() || g_xlog->modules[XLOG_MODULE_XLOG].level != 0) {
            return std::string("tables left their load-time state");
        }
        return std::string();  // reaching here: no debug break followed
    });
    EXPECT_TRUE(outcome.ok()) << outcome.message << " (signal " << outcome.signal << ")";
}

TEST_F(XlogConfigTest, SetFile_OpensForAppendCreatingTheFolder) {
    std::string logFile = dir_ + "/logs/service.log";
    ASSERT_EQ(xlogSetFile(logFile), XERR_SUCCESS);
    EXPECT_EQ(g_xlog->fileName, logFile);
    ASSERT_EQ(write(g_xlog->file.fd, "one\n", 4), 4);
    ASSERT_EQ(xlogSetFile(logFile), XERR_SUCCESS) << "a second open of the same file";
    ASSERT_EQ(write(g_xlog->file.fd, "two\n", 4), 4);
    struct stat info {};
    ASSERT_EQ(stat(logFile.c_str(), &info), 0);
    EXPECT_EQ(info.st_size, 8) << "writes are appended, never truncated";

    int fd = g_xlog->file.fd;
    EXPECT_EQ(xlogSetFile(""), XERR_SUCCESS);
    EXPECT_EQ(g_xlog->fileName, logFile) << "an empty name changes nothing";
    EXPECT_EQ(g_xlog->file.fd, fd);
}

TEST_F(XlogConfigTest, SetFile_RotatesAtTheThreshold) {
    auto makeFile = [](const std::string& path, long long size) {
        int fd = open(path.c_str(), O_CREAT | O_WRONLY | O_TRUNC, 0600);
        ASSERT_GE(fd, 0);
        ASSERT_EQ(ftruncate(fd, size), 0);
        close(fd);
    };
    auto sizeOf = [](const std::string& path) {
        struct stat info {};
        return stat(path.c_str(), &info) == 0 ? static_cast<long long>(info.st_size) : -1LL;
    };
    std::string logFile = dir_ + "/rotating.log";

    makeFile(logFile, kRotateSize - 1);
    ASSERT_EQ(xlogSetFile(logFile), XERR_SUCCESS);
    EXPECT_EQ(sizeOf(logFile), kRotateSize - 1) << "one byte below the threshold stays";
    EXPECT_EQ(sizeOf(logFile + ".1"), -1);

    makeFile(logFile, kRotateSize);
    makeFile(logFile + ".1", 5);
    makeFile(logFile + ".2", 9);
    ASSERT_EQ(xlogSetFile(logFile), XERR_SUCCESS);
    EXPECT_EQ(sizeOf(logFile), 0) << "a fresh file after rotation";
    EXPECT_EQ(sizeOf(logFile + ".1"), kRotateSize) << "the full file becomes .1";
    EXPECT_EQ(sizeOf(logFile + ".2"), 5) << "the old .1 becomes .2; the old .2 is gone";
}

TEST_F(XlogConfigTest, CurrentTime_WritesDateMillisecondsAndOffset) {
    char buf[64];
    xlogCurrentTime(buf, sizeof(buf));
    EXPECT_TRUE(hasShape(buf, "9999-99-99 99:99:99.999+9999")) << buf;
}

// Regression: a size of 0 or less became a huge size_t and the stamp was
// written past the caller's buffer.
TEST_F(XlogConfigTest, CurrentTime_WhenBufferIsSmall_StaysInsideIt) {
    char area[40];
    std::memset(area, '#', sizeof(area));
    xlogCurrentTime(area, 5);
    EXPECT_STREQ(area, std::string(area, 4).c_str());
    EXPECT_EQ(std::strlen(area), 4u) << "truncated with its terminator";
    EXPECT_EQ(area[5], '#');

    for (int size : {0, -1, -100}) {
        std::memset(area, '#', sizeof(area));
        xlogCurrentTime(area, size);
        EXPECT_EQ(std::string(area, sizeof(area)), std::string(sizeof(area), '#'))
            << "size " << size << " allows no byte to be written";
    }
}

TEST_F(XlogConfigTest, UtcOffset_FollowsTheZoneAndItsStandardTime) {
    const struct {
        const char* tz;
        const char* suffix;
    } cases[] = {
        {"UTC0", "-0000"},
        {"IST-5:30", "+0530"},
        {"EST5", "-0500"},
        {"CET-1CEST,M3.5.0,M10.5.0/3", "+0100"},  // the standard offset in any season
        {"CEST-2CET,M10.5.0/3,M3.5.0", "+0200"},  // the same, from the other side of the year
    };
    for (const auto& c : cases) {
        ChildOutcome outcome = runWithTimeZone(c.tz, [&] {
            if (xlogLibInit(nullptr, "", "*:I") != XERR_SUCCESS) return std::string("init failed");
            char buf[64];
            xlogCurrentTime(buf, sizeof(buf));
            std::string stamp(buf);
            if (g_xlog->utcOffset != c.suffix) return "offset " + g_xlog->utcOffset;
            if (stamp.size() < 5 || stamp.substr(stamp.size() - 5) != c.suffix) return stamp;
            return std::string();
        });
        EXPECT_TRUE(outcome.ok()) << c.tz << ": " << outcome.message;
    }
}

}  // namespace
