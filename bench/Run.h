// What each benchmark program defines; its main() is in Run.cpp.

#ifndef VEMO_ACCESS_TOKEN_BENCH_RUN_H
#define VEMO_ACCESS_TOKEN_BENCH_RUN_H

#include <benchmark/benchmark.h>

#include <string>

// Registers the benchmarks, which main() then runs as the arguments say; the versions of compiler and
// libraries go into the results. A failure throws: the times of failures are worth nothing.
void registerBenchmarks();

// Registers run(state, arguments...). It reports its measurements as counters, because the times that Google
// Benchmark measures include the preparations.
template <typename Run, typename... Arguments>
void add(const std::string& strName, int nIterations, Run run, Arguments... arguments)
{
    benchmark::RegisterBenchmark(strName.c_str(), run, arguments...)->Iterations(nIterations);
}

// The number after the name in a file of /proc. There must be one.
double procValue(const std::string& strFile, const std::string& strName);

#endif
