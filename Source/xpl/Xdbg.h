// The debug break that ends the process after a fatal log line.
#pragma once

#include "xpl/XplExport.h"

[[noreturn]] XPL_EXPORT void xdbgBreak();
