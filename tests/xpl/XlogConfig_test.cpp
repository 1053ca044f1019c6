// Log configuration and the support library's start-up: tables, levels and
// level specifications, a caller's logger, the log file and its rotation, the
// time stamp's bounds (its text is checked per zone in Xtime_test).
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cctype>
#include <cerrno>
#include <cstring>
#include <sstream>
#include <string>

#include "support/AndroidLogCapture.h"
#include "support/ChildProcess.h"
#include "support/LogRecorder.h"
#include "support/TempDir.h"
#include "xpl/Xlog.h"
#include "xpl/Xpl.h"

namespace {

int levelOf(int module) { return g_xlog->modules[module].level; }

long long sizeOf(const std::string& path) {
    struct stat info {};
    return stat(path.c_str(), &info) == 0 ? static_cast<long long>(info.st_size) : -1;
}

class XlogConfig : public ::testing::Test {
  protected:
    void SetUp() override {
        ASSERT_EQ(xerrLibInit(), XERR_SUCCESS);
        const XlogLogger defaults{xlogShouldLog, xlogPrint};
        ASSERT_EQ(xlogLibInit(&defaults, "", ""), XERR_SUCCESS);
    }
    TempDir dir_;
};

TEST_F(XlogConfig, LibInitDefault_FillsTablesSetsTheFixedLevelsAndPrintsNothing) {
    AndroidLogCapture capture;
    ASSERT_EQ(xlogLibInit(nullptr, "", "*:I"), XERR_SUCCESS);
    EXPECT_TRUE(capture.lines().empty()) << "XLOG is at I when its D lines are tested";
    for (int level = 0; level < XLOG_NUM_LEVELS; ++level)
        EXPECT_EQ(g_xlog->levelNames[level], std::string(1, "EWIDV"[level]));
    std::istringstream tags(
        "AGA APN APPC AUD BRIDGE CAM CLD CONF CSM DCRD GCALL GR GRM HCALL HVUTL HST IMAP IMGD INP "
        "IPC KMM MIM MNS PGA PGAIPC PLR SER UI UTL VMMGR VMSG WERH XCOND XFILE XJSON XLIB XLOCK "
        "XLOG XMEM XMUTEX XPROC XSOCK XSTR XTHR XTIME XTIMER");
    std::string tag;
    for (int module = 0; module < XLOG_NUM_MODULES && tags >> tag; ++module) {
        EXPECT_STREQ(g_xlog->modules[module].tag, tag.c_str()) << module;
        EXPECT_EQ(levelOf(module), tag == "XMEM" ? XLOG_LEVEL_D : XLOG_LEVEL_I) << tag;
    }
    EXPECT_EQ(xlogShouldLog(XLOG_MODULE_XMEM, XLOG_LEVEL_D), 1) << "each module its own level";
    EXPECT_EQ(xlogShouldLog(XLOG_MODULE_HCALL, XLOG_LEVEL_D), 0);
    EXPECT_EQ(xlogShouldLog(-1, XLOG_LEVEL_E) + xlogShouldLog(46, XLOG_LEVEL_E), 0) << "no module";
}

TEST_F(XlogConfig, SetLevels_AppliesTokensInOrderUntilAMalformedOne) {
    ASSERT_EQ(xlogLibInit(nullptr, "", ""), XERR_SUCCESS);
    const struct {
        const char* spec;
        xerr_t result;
        int hcall, xmem;  // the levels afterwards, from I and D
    } rows[] = {
        {"*:D XMEM:Q", XERR_INVAL, XLOG_LEVEL_D, XLOG_LEVEL_D},
        {"*:I ", XERR_INVAL, XLOG_LEVEL_I, XLOG_LEVEL_I},
        {"", XERR_INVAL, XLOG_LEVEL_I, XLOG_LEVEL_D},
        {"  HCALL:Verbose", XERR_SUCCESS, XLOG_LEVEL_V, XLOG_LEVEL_D},
        {"hcall:V NOSUCH:E", XERR_SUCCESS, XLOG_LEVEL_I, XLOG_LEVEL_D},
        {"XMEM:D:V", XERR_INVAL, XLOG_LEVEL_I, XLOG_LEVEL_D},
        {"XMEM::W", XERR_SUCCESS, XLOG_LEVEL_I, XLOG_LEVEL_W},
        {":D", XERR_INVAL, XLOG_LEVEL_I, XLOG_LEVEL_D},
        {"HCALL=D", XERR_INVAL, XLOG_LEVEL_I, XLOG_LEVEL_D},
        {"HCALL:d", XERR_INVAL, XLOG_LEVEL_I, XLOG_LEVEL_D},
        {"HCALL:E *:W HCALL:V", XERR_SUCCESS, XLOG_LEVEL_V, XLOG_LEVEL_W},
        {"HCALL:W x XMEM:E", XERR_INVAL, XLOG_LEVEL_W, XLOG_LEVEL_D},
        {"\tHCALL\t:\tE\t", XERR_SUCCESS, XLOG_LEVEL_E, XLOG_LEVEL_D},
    };
    for (const auto& row : rows) {
        ASSERT_EQ(xlogSetLevels("*:I XMEM:D"), XERR_SUCCESS);
        EXPECT_EQ(xlogSetLevels(row.spec), row.result) << row.spec;
        EXPECT_EQ(levelOf(XLOG_MODULE_HCALL) * 10 + levelOf(XLOG_MODULE_XMEM),
                  row.hcall * 10 + row.xmem)
            << row.spec;
    }
}

// Each case in a child put back to the state at load (no translations, the
// logger record unfilled). What the logger printed, the caller's lines first,
// then the Android log's (digits dropped), must be `lines`; a later
// xlogSetLevels("*:V") adds its own line where XLOG's D lines pass.
TEST_F(XlogConfig, XplLibInit_StartsCodesThenLoggerAndStopsAtAFailure) {
    dir_.write("plain", "");
    const struct {
        const char* name;
        bool callersLogger;
        std::string logFile;
        xerr_t want;  // a file error translated: the codes were filled first
        const char* lines;
    } rows[] = {
        {"defaults", false, "", XERR_SUCCESS, ""},
        {"a caller's logger", true, "", XERR_SUCCESS,
         "D Source/xpl/Xlog xerr_t xlogLibInit(const XlogLogger *, const string &, const string "
         "&): xlog inited using logger\n"
         "D Source/xpl/Xlog xerr_t xlogSetLevels(const string &): Change log levels with: *:V\n"},
        {"a log file that cannot be opened", false, dir_ / "plain/log", XERR_NOTDIR,
         "6 FATAL: DEBUG BREAK: Source/xpl/Xlog: xlogLibInit()\n"},
    };
    for (const auto& row : rows) {
        ChildOutcome outcome = runInChild([&]() -> std::string {
            LogRecorder recorder;
            const XlogLogger callers = *xlogGetLogger();
            std::memset(g_xerr_xlat_table, 0, sizeof(g_xerr_xlat_table));
            for (const char*& name : g_xlog->levelNames) name = nullptr;
            for (XlogModule& module : g_xlog->modules) module = XlogModule{0, nullptr};
            g_xlog->fileName.clear();
            g_xlog->logger = XlogLogger{xlogShouldLog, xlogPrint};
            recorder.clear();
            AndroidLogCapture capture;
            xerr_t err = xplLibInit(row.callersLogger ? &callers : nullptr, row.logFile);
            if (err != row.want || xerrFromNative(EINVAL) != XERR_INVAL) return xerrStr(err);
            if (g_xlog->fileName != row.logFile) return "log file " + g_xlog->fileName;
            const bool filled = row.want == XERR_SUCCESS && !row.callersLogger;
            for (int module = 0; module < XLOG_NUM_MODULES; ++module) {
                const int want = !filled                      ? 0
                                 : module == XLOG_MODULE_XMEM ? XLOG_LEVEL_D
                                                              : XLOG_LEVEL_I;
                if (levelOf(module) != want) return "module " + std::to_string(module);
            }
            // Regression: unfilled tables were read through null level letters.
            if ((xlogSetLevels("*:V") == XERR_SUCCESS) != filled || levelOf(0) != 4 * filled)
                return "levels on unfilled tables";
            std::string lines;
            for (const LoggedLine& line : recorder.lines(XLOG_MODULE_XLOG)) {
                lines += std::string(1, "EWIDV"[line.level]) + " " + line.file + " " +
                         line.function + ": " + line.text + "\n";
            }
            for (AndroidLogLine line : capture.lines()) {
                line.text.erase(std::remove_if(line.text.begin(), line.text.end(), ::isdigit),
                                line.text.end());
                lines += std::to_string(line.priority) + " " + line.text + "\n";
            }
            return lines == row.lines ? "" : "printed\n" + lines;
        });
        EXPECT_TRUE(outcome.ok()) << row.name << ": " << outcome.describe();
    }
}

TEST_F(XlogConfig, SetFile_AppendsAndRotatesFromTheThresholdOn) {
    const std::string logFile = dir_ / "logs/service.log";  // the folder is made
    for (const char* text : {"one\n", "two\n"}) {
        ASSERT_EQ(xlogSetFile(logFile), XERR_SUCCESS);
        ASSERT_EQ(write(g_xlog->file.fd, text, 4), 4);
    }
    EXPECT_EQ(sizeOf(logFile), 8) << "appended, never truncated";
    const int fd = g_xlog->file.fd;
    EXPECT_EQ(xlogSetFile(""), XERR_SUCCESS);
    EXPECT_EQ(g_xlog->fileName + std::to_string(g_xlog->file.fd), logFile + std::to_string(fd))
        << "an empty name changes nothing";

    constexpr long long kRotateSize = 10485760;
    for (long long size : {kRotateSize - 1, kRotateSize, kRotateSize + 1}) {
        const std::string name = dir_ / std::to_string(size);
        for (const auto& [suffix, length] : {std::pair{"", size}, {".1", 5LL}, {".2", 9LL}}) {
            dir_.write(std::to_string(size) + suffix, "");
            ASSERT_EQ(truncate((name + suffix).c_str(), length), 0);  // sparse: no disk space
        }
        ASSERT_EQ(xlogSetFile(name), XERR_SUCCESS);
        const bool rotated = size >= kRotateSize;
        EXPECT_EQ(sizeOf(name), rotated ? 0 : size) << size;
        EXPECT_EQ(sizeOf(name + ".1"), rotated ? size : 5) << "the full file becomes .1";
        EXPECT_EQ(sizeOf(name + ".2"), rotated ? 5 : 9) << ".1 becomes .2, the old .2 goes";
    }
}

// Regression: a size of 0 or less became a huge size_t and the stamp was
// written past the caller's buffer.
TEST_F(XlogConfig, CurrentTime_StaysInsideTheBuffer) {
    for (int size : {5, 0, -1}) {
        std::string area(40, '#');
        xlogCurrentTime(&area[0], size);
        const size_t end = size > 0 ? 5 : 0;  // a cut stamp of 4 characters, its terminator
        EXPECT_EQ(area.find_first_not_of('#', end), std::string::npos) << size;
        EXPECT_EQ(area.find('\0'), size > 0 ? 4 : std::string::npos) << size;
    }
}

}  // namespace
