// Processes that call the library, as many programs of a machine do.

#ifndef VEMO_ACCESS_TOKEN_BENCH_CALLERS_H
#define VEMO_ACCESS_TOKEN_BENCH_CALLERS_H

// How many calls a second nProcesses processes get granted together, each on tokens of its own; under the
// call lock or not. nTokens: of the store, shared among them.
double grantsPerSecond(int nProcesses, int nTokens, double dSeconds, bool blLock);

#endif
