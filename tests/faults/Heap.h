// Replaces malloc and its kin in this process: counts allocations, and lets those fail that a test chooses.

#ifndef TESTS_HEAP_H
#define TESTS_HEAP_H

#include <cstdint>

struct Heap {
    // Allocations from now on are numbered from 1; those from nFirst to nLast fail.
    static void failFrom(int64_t nFirst, int64_t nLast);
    static void failNone();

    static int64_t allocations(); // since failFrom
    static int64_t liveBytes();
};

#endif
