// A logger for fuzz targets that asks for every line and formats it in full,
// so the sanitizers see each argument a log line reads, and writes nothing.
#pragma once

#include <cstdarg>
#include <cstdio>
#include <cstring>
#include <string>

#include "xpl/Xlog.h"

namespace fuzz {

inline int wantEveryLine(int /*module*/, int /*level*/) { return 1; }

// The host-call exit lines ("returning [%d] from ..."), counted, and the last.
inline int g_exitLines = 0;
inline std::string g_lastExitLine;

__attribute__((format(printf, 6, 7))) inline void formatAndDrop(int /*level*/, int module,
                                                                const char* file,
                                                                const char* function, int /*line*/,
                                                                const char* format, ...) {
    char text[512];
    va_list args;
    va_start(args, format);
    // vsnprintf reads every %s to its end even when the text is cut.
    std::vsnprintf(text, sizeof text, format, args);
    va_end(args);
    if (module == XLOG_MODULE_HCALL && std::strncmp(text, "returning [", 11) == 0) {
        ++g_exitLines;
        g_lastExitLine = text;
    }
    std::snprintf(text, sizeof text, "%s %s", file, function);
}

// Installs the formatting logger in place of the default one (which would
// write to the kernel and Android logs).
inline void installFormattingLogger() {
    static const XlogLogger logger = {wantEveryLine, formatAndDrop};
    xlogLibInit(&logger, "", "");
}

}  // namespace fuzz
