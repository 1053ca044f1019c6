// Symbols of the support library, the transport and the host calls are hidden
// by default; only what the platform and other guest components link against
// is marked for export.
#pragma once

#define XPL_EXPORT __attribute__((visibility("default")))
