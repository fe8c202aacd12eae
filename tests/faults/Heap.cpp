#include "Heap.h"

#include <malloc.h>

#include <cerrno>
#include <cstddef>

// The C library's own functions, under the names that it offers to those who replace them.
extern "C" void* __libc_malloc(size_t cb);
extern "C" void* __libc_calloc(size_t nElements, size_t cb);
extern "C" void* __libc_realloc(void* pBlock, size_t cb);
extern "C" void __libc_free(void* pBlock);

namespace {

bool g_blCounting = false;
int64_t g_nFirst = 0;
int64_t g_nLast = 0;
int64_t g_nAllocations = 0;
int64_t g_cbLive = 0;

bool fails()
{
    if (!g_blCounting) {
        return false;
    }
    ++g_nAllocations;
    if (g_nAllocations < g_nFirst || g_nLast < g_nAllocations) {
        return false;
    }
    errno = ENOMEM;
    return true;
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

void Heap::failFrom(int64_t nFirst, int64_t nLast)
{
    g_nFirst = nFirst;
    g_nLast = nLast;
    g_nAllocations = 0;
    g_blCounting = true;
}

void Heap::failNone()
{
    g_blCounting = false;
}

int64_t Heap::allocations()
{
    return g_nAllocations;
}

int64_t Heap::liveBytes()
{
    return g_cbLive;
}

extern "C" {

void* malloc(size_t cb)
{
    return fails() ? nullptr : counted(__libc_malloc(cb));
}

void* calloc(size_t nElements, size_t cb)
{
    return fails() ? nullptr : counted(__libc_calloc(nElements, cb));
}

void* realloc(void* pBlock, size_t cb)
{
    if (fails()) {
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
