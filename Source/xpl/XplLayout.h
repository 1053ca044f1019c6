// Compile-time checks that an exported record keeps its declared layout:
// its members in their order, each right after the one before with only the
// padding its alignment needs, and nothing after the last. Callers built
// against the record rely on it.
#pragma once

#include <cstddef>

#define XPL_ALIGNED_END(Record, member, next)                                            \
    ((offsetof(Record, member) + sizeof(decltype(Record::member)) + alignof(next) - 1) / \
     alignof(next) * alignof(next))

// offsetof on records holding standard containers is supported by every
// compiler the library is built with, though not promised by the language.
#define XPL_LAYOUT_CHECK(condition, message)                                                \
    _Pragma("GCC diagnostic push") _Pragma(                                                 \
        "GCC diagnostic ignored \"-Winvalid-offsetof\"") static_assert(condition, message); \
    _Pragma("GCC diagnostic pop")

#define XPL_LAYOUT_FIRST(Record, first) \
    XPL_LAYOUT_CHECK(offsetof(Record, first) == 0, #first " opens " #Record)
#define XPL_LAYOUT_FOLLOWS(Record, before, after)                                            \
    XPL_LAYOUT_CHECK(                                                                        \
        offsetof(Record, after) == XPL_ALIGNED_END(Record, before, decltype(Record::after)), \
        #after " follows " #before " in " #Record)
#define XPL_LAYOUT_LAST(Record, last)                                         \
    XPL_LAYOUT_CHECK(sizeof(Record) == XPL_ALIGNED_END(Record, last, Record), \
                     #last " closes " #Record)
