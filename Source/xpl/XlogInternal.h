// Shared between the logger core and its configuration; not exported.
#pragma once

#include "xpl/Xlog.h"

// The one logger record, created on first use. Every path into the logger
// goes through here rather than through g_xlog, so a logging statement in
// another file's static initialiser never meets an unconstructed record.
XlogState* xlogState();
