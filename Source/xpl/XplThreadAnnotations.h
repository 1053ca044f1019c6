// The platform's thread-safety annotations (GUARDED_BY, REQUIRES, ...), which
// clang checks with -Wthread-safety (make lint). GCC has no such analysis and
// warns about every attribute it does not know, so there they say nothing.
#pragma once

#include <android-base/thread_annotations.h>

#if !defined(__clang__)
#undef THREAD_ANNOTATION_ATTRIBUTE__
#define THREAD_ANNOTATION_ATTRIBUTE__(x)
#endif
