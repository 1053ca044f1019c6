#include "xpl/Xmem.h"

#include <cstdlib>
#include <cstring>

void* xmem_alloc(unsigned long size) { return std::malloc(size); }

void* xmem_calloc(unsigned long count, unsigned long size) { return std::calloc(count, size); }

void xmem_free(void* p) { std::free(p); }

void* xmem_set(void* p, int value, unsigned long size) { return std::memset(p, value, size); }

void* xmem_cpy(void* dst, const void* src, unsigned long size) {
    return std::memcpy(dst, src, size);
}
