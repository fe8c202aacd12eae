// Processes that call the library at the same time, as many programs of a machine do.

#ifndef VEMO_ACCESS_TOKEN_BENCH_CALLERS_H
#define VEMO_ACCESS_TOKEN_BENCH_CALLERS_H

#include <vector>

struct GrantCall {
    double dStart; // seconds on the clock that all processes share
    double dEnd;
    bool blGranted;
    bool blSpent; // whatever it returned
};

enum class Calls { Plain, Serialised };

// Has nProcesses processes grant the first nTokens tokens of the store in use, each as fast as it can, and
// returns the calls of all. Serialised calls queue for the call lock, and the wait is part of their time.
std::vector<GrantCall> grantAtOnce(int nProcesses, int nTokens, double dSeconds, Calls calls);

// How many a second were granted, from the start of the first call to the end of the last.
double grantsPerSecond(const std::vector<GrantCall>& calls);

#endif
