// Log configuration and the support library's start-up.
#include <gtest/gtest.h>
#include <unistd.h>

#include <algorithm>
#include <cctype>
#include <cstring>
#include <filesystem>

#include "support/AndroidLogCapture.h"
#include "support/ChildProcess.h"
#include "support/LogRecorder.h"
#include "support/TempDir.h"
#include "xpl/Xlog.h"
#include "xpl/Xpl.h"

namespace {

int levelOf(int module) { return g_xlog->modules[module].level; }

TEST(XlogConfig, LibInitAndSetLevels_FixTheLevelsThenApplyTokensUntilAMalformedOne) {
    AndroidLogCapture capture;
    ASSERT_EQ(xlogLibInit(nullptr, "", "*:I"), XERR_SUCCESS);
    EXPECT_TRUE(capture.lines().empty()) << "XLOG is at I when its D lines are tested";
    std::string tags;
    for (int m = 0; m < XLOG_NUM_MODULES; ++m)
        tags += g_xlog->modules[m].tag + std::string(levelOf(m) == XLOG_LEVEL_I ? " " : "=D ");
    EXPECT_EQ(tags,
              "AGA APN APPC AUD BRIDGE CAM CLD CONF CSM DCRD GCALL GR GRM HCALL HVUTL HST "
              "IMAP IMGD INP IPC KMM MIM MNS PGA PGAIPC PLR SER UI UTL VMMGR VMSG WERH XCOND "
              "XFILE XJSON XLIB XLOCK XLOG XMEM=D XMUTEX XPROC XSOCK XSTR XTHR XTIME XTIMER ");
    EXPECT_EQ(xlogShouldLog(-1, XLOG_LEVEL_E) + xlogShouldLog(46, XLOG_LEVEL_E), 0) << "no module";
    // After "*:I XMEM:D": + where the level string is taken, then the levels of HCALL and XMEM.
    // clang-format off
    const struct { const char *levels, *want; } rows[] = {
        {"*:D XMEM:Q", "-DD"}, {"*:I ", "-II"},     {"", "-ID"},       {"  HCALL:Verbose", "+VD"},
        {"XMEM:D:V", "-ID"},   {"XMEM::W", "+IW"},  {":D", "-ID"},     {"hcall:V NOSUCH:E", "+ID"},
        {"HCALL=D", "-ID"},    {"HCALL:d", "-ID"},  {"HCALL:W x XMEM:E", "-WD"},
        {"HCALL:E *:W HCALL:V", "+VW"},             {"\tHCALL\t:\tE\t", "+ED"},
    };
    // clang-format on
    for (const auto& row : rows) {
        ASSERT_EQ(xlogSetLevels("*:I XMEM:D"), XERR_SUCCESS);
        const xerr_t err = xlogSetLevels(row.levels);
        std::string got = err == XERR_SUCCESS ? "+" : err == XERR_INVAL ? "-" : xerrStr(err);
        for (int m : {XLOG_MODULE_HCALL, XLOG_MODULE_XMEM}) got += levelLetter(levelOf(m));
        EXPECT_EQ(got, row.want) << row.levels;
    }
}

// Each row (the caller's logger given?, log file, result, `lines`) runs in a child put back
// to the state at load. `lines`: the caller's logger's, then the Android log's less digits.
TEST(XlogConfig, XplLibInit_StartsCodesThenLoggerAndStopsAtAFailure) {
    TempDir dir;
    dir.write("plain", "");
    const std::tuple<bool, std::string, xerr_t, const char*> rows[] = {
        {false, "", XERR_SUCCESS, ""},
        {true, "", XERR_SUCCESS,
         "D Source/xpl/Xlog xerr_t xlogLibInit(const XlogLogger *, const string &, const string "
         "&): xlog inited using logger\n"
         "D Source/xpl/Xlog xerr_t xlogSetLevels(const string &): Change log levels with: *:V\n"},
        {false, dir / "plain/log", XERR_NOTDIR,
         "6 FATAL: DEBUG BREAK: Source/xpl/Xlog: xlogLibInit()\n"},
    };
    for (const auto& row : rows) {
        ChildOutcome outcome = runInChild([&]() -> std::string {
            const auto& [callersLogger, logFile, want, expected] = row;
            LogRecorder recorder;
            const XlogLogger callers = *xlogGetLogger();
            std::memset(g_xerr_xlat_table, 0, sizeof(g_xerr_xlat_table));
            for (const char*& name : g_xlog->levelNames) name = nullptr;
            for (XlogModule& module : g_xlog->modules) module = XlogModule{0, nullptr};
            g_xlog->fileName.clear();
            g_xlog->logger = XlogLogger{xlogShouldLog, xlogPrint};
            recorder.clear();
            AndroidLogCapture capture;
            xerr_t err = xplLibInit(callersLogger ? &callers : nullptr, logFile);
            if (err != want || xerrFromNative(EINVAL) != XERR_INVAL) return xerrStr(err);
            if (g_xlog->fileName != logFile) return "log file " + g_xlog->fileName;
            const bool filled = want == XERR_SUCCESS && !callersLogger;
            int levels = 0;  // 45 at I, XMEM at D
            for (const XlogModule& module : g_xlog->modules) levels += module.level;
            if (levels != 93 * filled) return "levels " + std::to_string(levels);
            // Regression: unfilled tables were read through null level letters.
            if ((xlogSetLevels("*:V") == XERR_SUCCESS) != filled || levelOf(0) != 4 * filled)
                return "levels on unfilled tables";
            std::string lines;
            for (const LoggedLine& line : recorder.lines(XLOG_MODULE_XLOG))
                lines += levelLetter(line.level) + " " + line.file + " " + line.function + ": " +
                         line.text + "\n";
            for (AndroidLogLine line : capture.lines()) {
                line.text.erase(std::remove_if(line.text.begin(), line.text.end(), ::isdigit),
                                line.text.end());
                lines += std::to_string(line.priority) + " " + line.text + "\n";
            }
            return lines == expected ? "" : "printed\n" + lines;
        });
        EXPECT_TRUE(outcome.ok()) << std::get<1>(row) << std::get<0>(row) << outcome.describe();
    }
}

TEST(XlogConfig, SetFile_AppendsAndRotatesFromTheThresholdOn) {
    TempDir dir;
    const std::string logFile = dir / "logs/service.log";  // the folder is made
    for (const char* text : {"one\n", "two\n"}) {
        ASSERT_EQ(xlogSetFile(logFile), XERR_SUCCESS);
        ASSERT_EQ(write(g_xlog->file.fd, text, 4), 4);
    }
    EXPECT_EQ(std::filesystem::file_size(logFile), 8) << "appended, never truncated";
    const int fd = g_xlog->file.fd;
    EXPECT_EQ(xlogSetFile(""), XERR_SUCCESS);
    xlogSetProcessTag("svc"), xlogSetFormat(true, true, false);
    const bool* f = g_xlog->formatFlags;
    EXPECT_EQ(g_xlog->processTag + std::to_string(f[0] * 100 + f[1] * 10 + f[2]), "svc110");
    EXPECT_EQ(g_xlog->fileName + std::to_string(g_xlog->file.fd), logFile + std::to_string(fd))
        << "an empty name changes nothing";
    constexpr long long kRotateSize = 10485760;
    for (long long size : {kRotateSize - 1, kRotateSize, kRotateSize + 1}) {
        const std::string name = dir / std::to_string(size);
        for (const auto& [suffix, length] : {std::pair{"", size}, {".1", 5LL}, {".2", 9LL}}) {
            dir.write(std::to_string(size) + suffix, "");
            ASSERT_EQ(truncate((name + suffix).c_str(), length), 0);  // sparse: no disk space
        }
        ASSERT_EQ(xlogSetFile(name), XERR_SUCCESS);
        const bool rotated = size >= kRotateSize;  // the file becomes .1, .1 becomes .2
        EXPECT_EQ(std::filesystem::file_size(name), rotated ? 0 : size) << size;
        EXPECT_EQ(std::filesystem::file_size(name + ".1"), rotated ? size : 5) << size;
        EXPECT_EQ(std::filesystem::file_size(name + ".2"), rotated ? 5 : 9) << size;
    }
    // Regression: a size of 0 or less became a huge size_t and the stamp was
    // written past the caller's buffer.
    for (int size : {5, 0, -1}) {
        std::string area(40, '#');
        xlogCurrentTime(&area[0], size);
        const size_t cut = size > 0 ? 4 : 0;  // a stamp cut to 4 characters, then its terminator
        EXPECT_EQ(area.find('\0'), size > 0 ? cut : std::string::npos) << size;
        EXPECT_EQ(area.find_first_not_of('#', cut + (size > 0)), std::string::npos) << size;
    }
}

}  // namespace
