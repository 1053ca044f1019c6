// The order in which the library builds its four global records at load:
// g_thr_pool, g_hcall, the logger record g_xlog points to, g_xtimer. Exit-time
// destructors run in the reverse order, so g_hcall closes the connection
// before g_thr_pool drops its queue. Without explicit priorities the order
// would follow the order in which a build happens to list its sources, and
// the CMake and Android builds list them differently. Prioritised objects are
// built before every other static object of the library.
#pragma once

enum : int {
    XPL_LOAD_ORDER_THR_POOL = 1000,
    XPL_LOAD_ORDER_HCALL,
    XPL_LOAD_ORDER_XLOG,
    XPL_LOAD_ORDER_XTIMER,
};

#define XPL_LOAD_ORDER(rank) __attribute__((init_priority(rank)))

// A priority can be given to an object of class type only: for the records
// reached through a pointer, an object of this type creates the record at its
// rank (or finds it created by an earlier use).
struct XplLoadStep {
    explicit XplLoadStep(void (*step)()) { step(); }
};
