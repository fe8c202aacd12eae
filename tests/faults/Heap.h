// Replaces malloc, calloc, realloc and free in this process: counts allocations, and makes those fail that a
// test chooses.
// Included in one file of a program.

#ifndef TESTS_HEAP_H
#define TESTS_HEAP_H

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
int64_t g_nLive = 0; // blocks, not bytes: how far a size is rounded up depends on the other blocks

bool isFailing()
{
    const bool blFails = g_allocations.fails();
    errno = blFails ? ENOMEM : errno;
    return blFails;
}

void* counted(void* pBlock)
{
    g_nLive += pBlock ? 1 : 0;
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
    void* pMoved = __libc_realloc(pBlock, cb);
    if (pBlock && (pMoved || 0 == cb)) {
        --g_nLive;
    }
    return counted(pMoved);
}

void free(void* pBlock)
{
    g_nLive -= pBlock ? 1 : 0;
    __libc_free(pBlock);
}

} // extern "C"

#endif
