// What every part of the service bridge shares: its Android log tag and the
// debug switch that the service start reads from a system property.
#pragma once

// The bridge writes its own lines with ALOGD/ALOGI/ALOGE under this tag; the
// macros read it where they expand, so it is set before log/log.h, which
// would otherwise default it to no tag.
#define LOG_TAG "KivHostCallService-JNI"
#include <log/log.h>

#include <atomic>

// Set by native_init when "kiv.debug.kivhostcall" is a non-zero number and
// never cleared. Read on every Java thread and on the worker; relaxed atomic
// access keeps those unsynchronised reads well defined at no cost.
extern std::atomic<bool> g_debug_enabled;

inline bool bridgeDebugEnabled() { return g_debug_enabled.load(std::memory_order_relaxed); }
