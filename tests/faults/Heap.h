// Replaces malloc, calloc, realloc and free in this process: counts allocations, and makes those fail that a
// test chooses.
// Included in one file of a program.

#ifndef TESTS_HEAP_H
#define TESTS_HEAP_H

#include <malloc.h>

#include <cerrno>
#include <cstddef>

#include "Oracle.h"

// The C library's own functions, under the names that it offers to those who replace them.
extern "C" void* __libc_malloc(size_t cb);
extern "C" void* __libc_calloc(size_t nElements, size_t cb);
extern "C" void* __libc_realloc(void* pBlock, size_t cb);
extern "C" void __libc_free(void* pBlock);

namespace {

Injection g_allocations;
int64_t g_cbLive = 0;

bool isFailing()
{
    const bool blFails = g_allocations.fails();
    errno = blFails ? ENOMEM : errno;
    return blFails;
}

int64_t sizeOf(void* pBlock)
{
    return static_cast<int64_t>(malloc_usable_size(pBlock));
}

void* counted(void* pBlock)
{
    g_cbLive += sizeOf(pBlock);
    return pBlock;
}

} // namespace

extern "C" {

void* malloc(size_t cb)
{
    return isFailing() ? nullptr : counted(__libc_malloc(cb));
}

void* calloc(size_t nElements, size_t cb)
{
    return isFailing() ? nullptr : counted(__libc_calloc(nElements, cb));
}

void* realloc(void* pBlock, size_t cb)
{
    if (isFailing()) {
        return nullptr;
    }
    const int64_t cbBefore = sizeOf(pBlock);
    void* pMoved = __libc_realloc(pBlock, cb);
    if (pMoved || 0 == cb) {
        g_cbLive -= cbBefore;
    }
    return counted(pMoved);
}

void free(void* pBlock)
{
    g_cbLive -= sizeOf(pBlock);
    __libc_free(pBlock);
}

} // extern "C"

#endif
