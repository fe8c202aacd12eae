#include "Run.h"

#include <benchmark/benchmark.h>
#include <json/version.h>
#include <sqlite3.h>

#include <cstdio>
#include <exception>

int main(int argc, char** argv)
{
    benchmark::Initialize(&argc, argv);
    if (benchmark::ReportUnrecognizedArguments(argc, argv)) {
        return 2;
    }
    benchmark::AddCustomContext("library", VEMO_ATOKEN_VERSION);
    benchmark::AddCustomContext("compiler", VEMO_ATOKEN_COMPILER);
    benchmark::AddCustomContext("sqlite", sqlite3_libversion());
    benchmark::AddCustomContext("jsoncpp", JSONCPP_VERSION_STRING);
    try {
        registerBenchmarks();
        benchmark::RunSpecifiedBenchmarks();
        return 0;
    } catch (const std::exception& exception) {
        fprintf(stderr, "%s: %s\n", argv[0], exception.what());
        return 1;
    }
}
