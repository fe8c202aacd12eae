// Calls of functions while memory is scarce.

#ifndef TESTS_TOOL_SCARCE_MEMORY_H
#define TESTS_TOOL_SCARCE_MEMORY_H

#include <json/value.h>

#include <new>
#include <set>

#include "Seam.h"

inline int g_nUntilFailure = 0; // allocations

// What a function gives, if anything, while one of its allocations fails: the first, the second and so on,
// and none in the end.
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
            auto result = call();
            g_pAllocation = nullptr;
            results.insert(result);
        } catch (const std::bad_alloc&) {
            g_pAllocation = nullptr;
        } catch (const Json::RuntimeError&) { // how jsoncpp can tell it
            g_pAllocation = nullptr;
        }
    }
    g_nUntilFailure = 0;
    return results;
}

#endif
