// Each exported function compared with the bare engine: what the library adds.
//
// Their calls alternate, so that other load on the machine affects both. Each benchmark reports
//
//   ours_us, bare_us   medians of single calls
//   ratio              median of the ratios of neighbours: two calls of each
//
// Control compares the bare engine with itself: how far its ratio is from 1 shows the error of the others.

#include <benchmark/benchmark.h>

#include <memory>
#include <stdexcept>
#include <string>

#include "MeasuredCalls.h"
#include "Run.h"
#include "Samples.h"
#include "Store.h"

namespace {

const int FEW = 10;      // tokens
const int MANY = 100000; // with which a call takes so long that fewer calls must do

// Keeps the store for the next benchmark with the same place and size.
void useStore(Place place, int nTokens)
{
    static std::unique_ptr<Store> pStore;
    static Place placeOfStore;
    static int nTokensOfStore;
    if (!pStore || place != placeOfStore || nTokens != nTokensOfStore) {
        pStore = std::make_unique<Store>(place);
        pStore->grow(nTokens);
        placeOfStore = place;
        nTokensOfStore = nTokens;
    }
}

// Both return the seconds of the call.
double runOurs(const Operation& operation, Call& call, Samples& samples)
{
    operation.prepare(call);
    if (operation.nExpected != samples.time([&] { return operation.run(call); })) {
        throw std::runtime_error("the library failed");
    }
    return samples.last();
}

double runBare(const Operation& operation, Call& call, Samples& samples)
{
    operation.prepare(call);
    samples.time([&] {
        operation.runBare(call);
        return 0;
    });
    return samples.last();
}

void overhead(benchmark::State& state, const Operation& operation, Place place, int nTokens)
{
    useStore(place, nTokens);
    Samples ours;
    Samples bare;
    Samples ratios;
    Call call;
    for (auto _ : state) {
        // In this order, both come first and second, and follow each other, equally often.
        const double dBareFirst = runBare(operation, call, bare);
        const double dOurs = runOurs(operation, call, ours) + runOurs(operation, call, ours);
        const double dBare = dBareFirst + runBare(operation, call, bare);
        ratios.add(dOurs / dBare);
        state.SetIterationTime(dOurs);
    }
    removeFreshTokens();
    state.counters["ours_us"] = ours.percentile(50) * 1e6;
    state.counters["bare_us"] = bare.percentile(50) * 1e6;
    state.counters["ratio"] = ratios.percentile(50);
}

// More turns where the library's share of the time is larger.
int turnsOf(Place place, int nTokens)
{
    if (MANY == nTokens) {
        return 30;
    }
    return Place::Memory == place ? 1500 : FEW == nTokens ? 750 : 150;
}

void registerBenchmark(const Operation& operation, Place place, int nTokens)
{
    const std::string strName =
        std::string("Overhead/") + operation.szName + "/" + nameOf(place) + "/" + std::to_string(nTokens);
    benchmark::RegisterBenchmark(strName.c_str(), overhead, operation, place, nTokens)
        ->UseManualTime()
        ->Iterations(turnsOf(place, nTokens));
}

void registerOperations(Place place, int nTokens)
{
    for (const Operation& operation : operations()) {
        if (operation.runBare) {
            registerBenchmark(operation, place, nTokens);
        }
    }
    registerBenchmark(control(), place, nTokens);
}

} // namespace

void registerBenchmarks()
{
    for (const Place place : {Place::Memory, Place::Disk}) {
        for (const int nTokens : {FEW, 1000, MANY}) {
            registerOperations(place, nTokens);
        }
    }
}
