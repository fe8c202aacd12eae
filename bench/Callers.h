// Many processes call the library at the same time.

#ifndef VEMO_ACCESS_TOKEN_BENCH_CALLERS_H
#define VEMO_ACCESS_TOKEN_BENCH_CALLERS_H

#include <vector>

struct GrantCall {
    double dStart; // seconds on the clock that all processes share
    double dEnd;
    bool blGranted;
    bool blSpent; // whether it spent a use, whatever it returned
};

enum class Calls { Plain, Serialised };

// nProcesses processes grant the first nTokens tokens of the store in use, as fast as they can. Returns all
// their calls. Serialised calls wait for the call lock, and their time includes that.
std::vector<GrantCall> grantAtOnce(int nProcesses, int nTokens, double dSeconds, Calls calls);

// Granted calls a second, from the start of the first call to the end of the last.
double grantsPerSecond(const std::vector<GrantCall>& calls);

#endif
