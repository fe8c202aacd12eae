// Each exported function compared with the bare engine: what the library adds.
//
// Their calls alternate, so that other load on the machine affects both. Each benchmark reports
//
//   ours_us, bare_us   medians of single calls
//   ratio              median of the ratios of neighbours: two calls of each
//
// Control compares the bare engine with itself: how far its ratio is from 1 shows the error of the others.

#include <map>
#include <stdexcept>
#include <string>
#include <utility>

#include "MeasuredCalls.h"
#include "Run.h"
#include "Samples.h"
#include "Store.h"

namespace {

const int FEW = 10;      // tokens
const int MANY = 100000; // with these a call takes long, so fewer calls are made

// Keeps the store for the other benchmarks of the same place and size.
void useStore(Place place, int nTokens)
{
    static std::map<std::pair<Place, int>, Store> stores;
    stores.try_emplace({place, nTokens}, place, nTokens).first->second.use();
}

double runBare(const Operation& operation, Call& call, Samples& samples)
{
    operation.prepare(call);
    return samples.time([&] { operation.runBare(call); });
}

double runOurs(const Operation& operation, Call& call, Samples& samples)
{
    if (!operation.run) {
        return runBare(operation, call, samples);
    }
    operation.prepare(call);
    int nResult = 0;
    const double dTime = samples.time([&] { nResult = operation.run(call); });
    if (operation.nExpected != nResult) {
        throw std::runtime_error("the library failed");
    }
    return dTime;
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
    }
    removeFreshTokens();
    state.counters["ours_us"] = ours.median();
    state.counters["bare_us"] = bare.median();
    state.counters["ratio"] = ratios.median();
}

// More turns where the library's share of the time is larger.
int turnsOf(Place place, int nTokens)
{
    if (MANY == nTokens) {
        return 30;
    }
    return Place::Memory == place ? 1500 : FEW == nTokens ? 750 : 150;
}

} // namespace

void registerBenchmarks()
{
    for (const Place place : {Place::Memory, Place::Disk}) {
        for (const int nTokens : {FEW, 1000, MANY}) {
            for (const Operation& operation : operations()) {
                if (operation.runBare) {
                    add(std::string("Overhead/") + operation.szName + "/" + nameOf(place) + "/" +
                            std::to_string(nTokens),
                        turnsOf(place, nTokens), overhead, operation, place, nTokens);
                }
            }
        }
    }
}
