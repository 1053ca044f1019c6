// The library's time base: microseconds of the local wall clock read as UTC.
#pragma once

#include <cstddef>

#include "xpl/XplExport.h"

XPL_EXPORT long long xtimeNow();
XPL_EXPORT long long xtimeToUtc(long long t);
XPL_EXPORT size_t xtimeStrf(char* buf, size_t size, const char* fmt, long long t);
XPL_EXPORT void xtimeSleep(unsigned long long us);
XPL_EXPORT void xtime_init();
