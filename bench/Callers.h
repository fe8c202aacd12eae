// Many processes call the library at the same time.

#ifndef VEMO_ACCESS_TOKEN_BENCH_CALLERS_H
#define VEMO_ACCESS_TOKEN_BENCH_CALLERS_H

#include "Samples.h"

enum class Calls { Plain, Serialised };

struct CallsMade {
    Samples took;                // µs
    double dGrantsPerSecond = 0; // from the start of the first call to the end of the last
    double dAll = 0;
    double dSpent = 0;  // those that spent a use, whatever they returned
    double dFailed = 0; // those that returned -1 and had no effect
    double dFalse = 0;  // those that returned -1 although the use was spent
};

// nProcesses processes grant the first nTokens tokens of the store in use, as fast as they can. Serialised
// calls wait for the call lock, and their time includes that.
CallsMade grantAtOnce(int nProcesses, int nTokens, double dSeconds, Calls calls);

#endif
