// What every part of the service bridge shares: its Android log tag and the
// debug switch that the service start reads from a system property.
#pragma once

#include <android/log.h>

#include <atomic>

constexpr const char* kBridgeLogTag = "KivHostCallService-JNI";

// Set by native_init when "kiv.debug.kivhostcall" is a non-zero number and
// never cleared. Read on every Java thread and on the worker; relaxed atomic
// access keeps those unsynchronised reads well defined at no cost.
extern std::atomic<bool> g_debug_enabled;

inline bool bridgeDebugEnabled() { return g_debug_enabled.load(std::memory_order_relaxed); }
