// Calls of functions while memory is scarce.

#ifndef TESTS_TOOL_SCARCE_MEMORY_H
#define TESTS_TOOL_SCARCE_MEMORY_H

#include <json/value.h>

#include <new>
#include <set>

#include "Seam.h"

inline int g_nUntilFailure = 0; // allocations

// The results of a function while one of its allocations fails: the first, the second and so on, and in the
// end none.
template <typename Call>
auto resultsWhileMemoryFails(Call call)
{
    std::set<decltype(call())> results;
    for (int n = 1; 0 >= g_nUntilFailure; ++n) {
        g_nUntilFailure = n;
        g_pAllocation = [] {
            if (0 == --g_nUntilFailure) {
                throw std::bad_alloc();
            }
        };
        try {
            results.insert(call());
        } catch (const std::bad_alloc&) {
        } catch (const Json::RuntimeError&) { // jsoncpp may report it so
        }
        g_pAllocation = nullptr;
    }
    g_nUntilFailure = 0;
    return results;
}

#endif
