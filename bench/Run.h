// What each benchmark program defines; its main() is in Run.cpp.

#ifndef VEMO_ACCESS_TOKEN_BENCH_RUN_H
#define VEMO_ACCESS_TOKEN_BENCH_RUN_H

// Registers the benchmarks, which main() then runs as the arguments say; the versions of compiler and
// libraries go into the results. What fails throws: a benchmark of failures would be worth nothing.
void registerBenchmarks();

#endif
