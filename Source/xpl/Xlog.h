// The process-wide levelled logger: per-module levels, a replaceable pair of
// operations, and the statements every part of the library logs through.
#pragma once

#include <cstdint>
#include <string>

#include "xpl/Xdbg.h"
#include "xpl/Xerr.h"
#include "xpl/Xfile.h"
#include "xpl/XplExport.h"

enum : int {
    XLOG_LEVEL_E = 0,
    XLOG_LEVEL_W = 1,
    XLOG_LEVEL_I = 2,
    XLOG_LEVEL_D = 3,
    XLOG_LEVEL_V = 4,
};
constexpr int XLOG_NUM_LEVELS = 5;

// The module tags in module-number order; the number is the place in the list.
// clang-format off
#define XLOG_MODULES(X)                                                                    \
    X(AGA) X(APN) X(APPC) X(AUD) X(BRIDGE) X(CAM) X(CLD) X(CONF) X(CSM) X(DCRD) X(GCALL) \
    X(GR) X(GRM) X(HCALL) X(HVUTL) X(HST) X(IMAP) X(IMGD) X(INP) X(IPC) X(KMM) X(MIM)    \
    X(MNS) X(PGA) X(PGAIPC) X(PLR) X(SER) X(UI) X(UTL) X(VMMGR) X(VMSG) X(WERH) X(XCOND) \
    X(XFILE) X(XJSON) X(XLIB) X(XLOCK) X(XLOG) X(XMEM) X(XMUTEX) X(XPROC) X(XSOCK)       \
    X(XSTR) X(XTHR) X(XTIME) X(XTIMER)
// clang-format on

enum : int {
#define XLOG_DECLARE_MODULE(tag) XLOG_MODULE_##tag,
    XLOG_MODULES(XLOG_DECLARE_MODULE)
#undef XLOG_DECLARE_MODULE
        XLOG_NUM_MODULES
};
static_assert(XLOG_NUM_MODULES == 46, "the module table has 46 tags");
static_assert(XLOG_MODULE_HCALL == 13 && XLOG_MODULE_HVUTL == 14 && XLOG_MODULE_HST == 15 &&
                  XLOG_MODULE_VMSG == 30 && XLOG_MODULE_XFILE == 33 && XLOG_MODULE_XLOG == 37 &&
                  XLOG_MODULE_XTHR == 43,
              "module numbers are part of the log configuration format");

// The logger interface. Note the argument order: shouldLog takes the module
// first, print the level first.
struct XlogLogger {
    int (*shouldLog)(int module, int level);
    void (*print)(int level, int module, const char* file, const char* function, int line,
                  const char* format, ...) __attribute__((format(printf, 6, 7)));
};

struct XlogModule {
    int32_t level;
    const char* tag;
};

struct XlogState {
    Xfile file;
    std::string fileName;
    std::string processTag;
    std::string utcOffset;
    const char* levelNames[XLOG_NUM_LEVELS];
    XlogModule modules[XLOG_NUM_MODULES];
    bool formatFlags[3];
    XlogLogger logger;
};

// Points at the one logger record for the life of the process.
XPL_EXPORT extern XlogState* g_xlog;

extern "C" XPL_EXPORT XlogLogger* xlogGetLogger();

// What xlogGetLogger() returns, asked once per shared object or program: the
// address never changes, so a statement need not call through the dynamic
// linker's table for it every time. Installing a logger changes what lies
// there, which every statement still reads afresh.
__attribute__((visibility("hidden"))) inline XlogLogger* xlogActiveLogger() {
    static XlogLogger* const logger = xlogGetLogger();
    return logger;
}

XPL_EXPORT int xlogShouldLog(int module, int level);
XPL_EXPORT void xlogPrint(int level, int module, const char* file, const char* function, int line,
                          const char* format, ...) __attribute__((format(printf, 6, 7)));

// Log configuration.
XPL_EXPORT xerr_t xlogLibInit(const XlogLogger* logger, const std::string& logFile,
                              const std::string& levels);
XPL_EXPORT xerr_t xlogSetLevels(const std::string& levels);
XPL_EXPORT xerr_t xlogSetFile(const std::string& logFile);
XPL_EXPORT void xlogSetProcessTag(const std::string& processTag);
XPL_EXPORT void xlogSetFormat(bool first, bool second, bool third);
XPL_EXPORT void xlogCurrentTime(char* buf, int size);

// The logging statement: ask the active logger, and only on a yes evaluate the
// message arguments and print. `file` is the caller's source path and
// `function` its signature text.
#define XLOG_AT(module, level, file, function, ...)                                            \
    do {                                                                                       \
        XlogLogger* xlog_logger_ = xlogActiveLogger();                                         \
        if (xlog_logger_->shouldLog((module), (level)))                                        \
            xlog_logger_->print((level), (module), (file), (function), __LINE__, __VA_ARGS__); \
    } while (0)

// The fatal line alone, for failures the caller recovers from.
#define XLOG_FATAL_LINE(module, file, function, shortName)                                        \
    XLOG_AT((module), XLOG_LEVEL_E, (file), (function), "FATAL: DEBUG BREAK: %s:%d %s()", (file), \
            __LINE__, (shortName))

// The fatal-error statement: the fatal line, then the debug break.
#define XLOG_FATAL(module, file, function, shortName)               \
    do {                                                            \
        XLOG_FATAL_LINE((module), (file), (function), (shortName)); \
        xdbgBreak();                                                \
    } while (0)
