// Each exported function beside the bare engine: what the library adds to what must be executed.
//
// The two take turns, call by call, so that whatever else the machine does meets both. Each benchmark
// reports
//
//   ours_us, bare_us   medians of single calls
//   ratio              of the medians

#include <benchmark/benchmark.h>

#include <cstdio>
#include <cstdlib>
#include <memory>
#include <string>

#include "Operations.h"
#include "Run.h"
#include "Samples.h"
#include "Store.h"

namespace {

const int MANY = 100000; // tokens, with which a call takes so long that fewer must do

// The store of the last benchmark serves the next of its kind.
void useStore(Place place, int nTokens)
{
    static std::unique_ptr<Store> pStore; // static, so that exit() removes it
    static Place placeOfStore;
    static int nTokensOfStore;
    if (!pStore || place != placeOfStore || nTokens != nTokensOfStore) {
        pStore = std::make_unique<Store>(place);
        pStore->grow(nTokens);
        placeOfStore = place;
        nTokensOfStore = nTokens;
    }
}

void runOurs(const Operation& operation, Call& call, Samples& samples)
{
    operation.prepare(call);
    if (operation.nExpected != samples.time([&] { return operation.run(call); })) {
        fprintf(stderr, "the library failed\n");
        exit(1);
    }
}

void runBare(const Operation& operation, Call& call, Samples& samples)
{
    operation.prepare(call);
    samples.time([&] {
        operation.runBare(call);
        return 0;
    });
}

void overhead(benchmark::State& state, const Operation& operation, Place place, int nTokens)
{
    useStore(place, nTokens);
    Samples ours;
    Samples bare;
    Call call;
    for (auto _ : state) {
        runOurs(operation, call, ours);
        state.SetIterationTime(ours.last());
        runBare(operation, call, bare);
    }
    removeFreshTokens();
    state.counters["ours_us"] = ours.percentile(50) * 1e6;
    state.counters["bare_us"] = bare.percentile(50) * 1e6;
    state.counters["ratio"] = ours.percentile(50) / bare.percentile(50);
}

void registerBenchmarks(Place place, int nTokens)
{
    const int nCalls = MANY == nTokens ? 60 : Place::Memory == place ? 2000 : 300;
    for (const Operation& operation : operations()) {
        if (operation.runBare) {
            const std::string strName = std::string("Overhead/") + operation.szName + "/" + nameOf(place) +
                                        "/" + std::to_string(nTokens);
            benchmark::RegisterBenchmark(strName.c_str(), overhead, operation, place, nTokens)
                ->UseManualTime()
                ->Iterations(nCalls);
        }
    }
}

} // namespace

int main(int argc, char** argv)
{
    for (const Place place : {Place::Memory, Place::Disk}) {
        for (const int nTokens : {10, 1000, MANY}) {
            registerBenchmarks(place, nTokens);
        }
    }
    return runBenchmarks(argc, argv);
}
