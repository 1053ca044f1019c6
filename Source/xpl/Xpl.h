// One call that starts the support library: result codes, logger, timers.
#pragma once

#include <string>

#include "xpl/Xerr.h"
#include "xpl/Xlog.h"
#include "xpl/XplExport.h"

XPL_EXPORT xerr_t xplLibInit(const XlogLogger* logger, const std::string& logFile);
