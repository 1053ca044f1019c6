// Start-up and settings of the logger: tables, level strings, the log
// file and its rotation, the time stamp.
#include <string>
#include <vector>

#include "xpl/Xfile.h"
#include "xpl/Xlog.h"
#include "xpl/XlogInternal.h"
#include "xpl/Xstr.h"
#include "xpl/Xtime.h"

namespace {

constexpr const char* kSourcePath = "Source/xpl/Xlog";
constexpr const char* kDefaultLevels = "*:I XMEM:D";
constexpr const char* kLibInitSignature =
    "xerr_t xlogLibInit(const XlogLogger *, const string &, const string &)";
constexpr long long kRotateSize = 10485760;
constexpr size_t kTimeTextSize = 128;
constexpr long long kMicrosPerSecond = 1000000;
constexpr long long kMicrosPerMilli = 1000;

constexpr const char* kLevelNames[] = {"E", "W", "I", "D", "V"};
static_assert(sizeof(kLevelNames) / sizeof(kLevelNames[0]) == XLOG_NUM_LEVELS,
              "one letter per level");

constexpr const char* kModuleTags[] = {
#define XLOG_TAG_ROW(tag) #tag,
    XLOG_MODULES(XLOG_TAG_ROW)
#undef XLOG_TAG_ROW
};
static_assert(sizeof(kModuleTags) / sizeof(kModuleTags[0]) == XLOG_NUM_MODULES,
              "one tag per module");

// Whether `file` of the record holds a descriptor this logger opened.
bool s_fileOpen = false;

void fillTables(XlogState* state) {
    for (int level = 0; level < XLOG_NUM_LEVELS; ++level) {
        state->levelNames[level] = kLevelNames[level];
    }
    for (int module = 0; module < XLOG_NUM_MODULES; ++module) {
        state->modules[module].tag = kModuleTags[module];
        state->modules[module].level = XLOG_LEVEL_I;
    }
}

// The zone's offset from UTC as a sign and four digits, from the library's
// time base: the base reads local time as UTC, so the offset is the gap
// between a value and its conversion back to UTC.
std::string utcOffsetSuffix() {
    long long now = xtimeNow();
    long long utc = xtimeToUtc(now);
    char text[kTimeTextSize] = "";
    if (now > utc) {
        xtimeStrf(text, sizeof(text), "+%H%M", now - utc);
    } else {
        xtimeStrf(text, sizeof(text), "-%H%M", utc - now);
    }
    return text;
}

// The level whose letter starts `part`, or -1. Letters not yet filled in
// (before the default start-up) match nothing.
int levelOf(const XlogState* state, const std::string& part) {
    for (int level = 0; level < XLOG_NUM_LEVELS; ++level) {
        const char* name = state->levelNames[level];
        if (name != nullptr && !part.empty() && part[0] == name[0]) return level;
    }
    return -1;
}

xerr_t applyToken(XlogState* state, const std::string& token) {
    std::vector<std::string> parts = xstrSplit(token, ":");
    if (parts.size() != 2) return XERR_INVAL;
    int level = levelOf(state, parts[1]);
    if (level < 0) return XERR_INVAL;
    const std::string& target = parts[0];
    for (XlogModule& module : state->modules) {
        if (target == "*" || (module.tag != nullptr && target == module.tag)) {
            module.level = level;
        }
    }
    return XERR_SUCCESS;
}

}  // namespace

xerr_t xlogLibInit(const XlogLogger* logger, const std::string& logFile,
                   const std::string& /*levels*/) {
    XlogState* state = xlogState();
    if (logger != nullptr) {
        state->logger = *logger;
        XLOG_AT(XLOG_MODULE_XLOG, XLOG_LEVEL_D, kSourcePath, kLibInitSignature,
                "xlog inited using logger");
        return XERR_SUCCESS;
    }
    xerr_t err = xlogSetFile(logFile);
    if (err != XERR_SUCCESS) {
        // The caller recovers from a log file it cannot open; no break.
        XLOG_FATAL_LINE(XLOG_MODULE_XLOG, kSourcePath, kLibInitSignature, "xlogLibInit");
        return err;
    }
    fillTables(state);
    // The start-up always ends at the fixed levels; `levels` would only be
    // overridden by them.
    xlogSetLevels(kDefaultLevels);
    state->utcOffset = utcOffsetSuffix();
    XLOG_AT(XLOG_MODULE_XLOG, XLOG_LEVEL_D, kSourcePath, kLibInitSignature, "xlog lib init done.");
    return XERR_SUCCESS;
}

xerr_t xlogSetLevels(const std::string& levels) {
    XLOG_AT(XLOG_MODULE_XLOG, XLOG_LEVEL_D, kSourcePath, "xerr_t xlogSetLevels(const string &)",
            "Change log levels with: %s", levels.c_str());
    XlogState* state = xlogState();
    xerr_t err = XERR_SUCCESS;
    // Tokens apply as read: a malformed one stops the rest, earlier ones stay.
    for (const std::string& token : xstrSplit(levels, " ")) {
        err = applyToken(state, token);
        if (err != XERR_SUCCESS) break;
    }
    return err;
}

xerr_t xlogSetFile(const std::string& logFile) {
    if (logFile.empty()) return XERR_SUCCESS;
    XlogState* state = xlogState();
    long long size = 0;
    if (xfileSizeByName(logFile, &size) != XERR_SUCCESS) size = 0;
    if (size >= kRotateSize) {
        // Best effort: a failed move leaves the file in place and it grows on.
        xfileMove(logFile + ".1", logFile + ".2");
        xfileMove(logFile, logFile + ".1");
    }
    if (&logFile != &state->fileName) state->fileName = logFile;
    Xfile previous = state->file;
    xerr_t err = xfileOpen(&state->file, state->fileName, XFILE_MODE_APPEND);
    if (err == XERR_SUCCESS) {
        // A second log file replaces the first rather than leaking it.
        if (s_fileOpen) xfileClose(&previous);
        s_fileOpen = true;
    }
    return err;
}

void xlogSetProcessTag(const std::string& processTag) {
    XlogState* state = xlogState();
    if (&processTag != &state->processTag) state->processTag = processTag;
}

void xlogSetFormat(bool first, bool second, bool third) {
    XlogState* state = xlogState();
    state->formatFlags[0] = first;
    state->formatFlags[1] = second;
    state->formatFlags[2] = third;
}

void xlogCurrentTime(char* buf, int size) {
    if (buf == nullptr || size <= 0) return;
    long long now = xtimeNow();
    char dateTime[kTimeTextSize] = "";
    xtimeStrf(dateTime, sizeof(dateTime), "%Y-%m-%d %H:%M:%S", now);
    int millis = static_cast<int>((now % kMicrosPerSecond) / kMicrosPerMilli);
    xstr_snprintf(buf, static_cast<size_t>(size), "%s.%03d%s", dateTime, millis,
                  xlogState()->utcOffset.c_str());
}
