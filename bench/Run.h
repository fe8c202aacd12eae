// The end of each benchmark program's main().

#ifndef VEMO_ACCESS_TOKEN_BENCH_RUN_H
#define VEMO_ACCESS_TOKEN_BENCH_RUN_H

// Runs the registered benchmarks as the arguments say; the versions of compiler and libraries go into
// the results. Returns the program's exit status.
int runBenchmarks(int argc, char** argv);

#endif
