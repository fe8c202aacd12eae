// How a target reports that a condition does not hold.

#ifndef FUZZ_REQUIRE_H
#define FUZZ_REQUIRE_H

#include <unistd.h>

#include <cstdio>
#include <cstdlib>

#define FUZZ_REQUIRE(condition)                                                                              \
    do {                                                                                                     \
        if (!(condition)) {                                                                                  \
            dprintf(STDERR_FILENO, "%s:%d does not hold: %s\n", __FILE__, __LINE__, #condition);             \
            abort();                                                                                         \
        }                                                                                                    \
    } while (0)

#endif
