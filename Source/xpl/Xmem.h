// Thin memory wrappers: the array helpers and directory creation allocate
// through them so that one place can change the allocator.
#pragma once

#include "xpl/XplExport.h"

XPL_EXPORT void* xmem_alloc(unsigned long size);
XPL_EXPORT void* xmem_calloc(unsigned long count, unsigned long size);
XPL_EXPORT void xmem_free(void* p);
XPL_EXPORT void* xmem_set(void* p, int value, unsigned long size);
XPL_EXPORT void* xmem_cpy(void* dst, const void* src, unsigned long size);
