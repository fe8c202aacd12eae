// What a grant costs as the number of tokens grows, without and with an administrator's indexes.
//
// Calls alternate with calls on a store of ten tokens, so that changes of the machine's speed do not change
// the ratio. The first call after a change of the store does not count: the processor's caches hold the other
// one.

#include <benchmark/benchmark.h>

#include <algorithm>
#include <memory>
#include <stdexcept>
#include <string>

#include "Run.h"
#include "Samples.h"
#include "Store.h"
#include "vemo-access-token.h"

namespace {

const int FEW = 10;

void grant(const Store& store, int nToken, Samples& samples)
{
    std::string strTid = tokenOf(nToken).strTid;
    Json::Value jToken;
    store.use();
    if (0 != samples.time([&] { return VemoAccessTokenGrantEx(strTid, webapi(), method(), jToken); })) {
        throw std::runtime_error("the grant failed");
    }
}

std::unique_ptr<Store> makeStore(Place place, bool blIndexes, int nTokens)
{
    auto pStore = std::make_unique<Store>(place);
    pStore->grow(nTokens);
    if (blIndexes) {
        pStore->makeIndexes();
    }
    return pStore;
}

void growth(benchmark::State& state, Place place, bool blIndexes, int nTokens)
{
    const auto pMany = makeStore(place, blIndexes, nTokens);
    const auto pFew = makeStore(place, blIndexes, FEW);
    Samples many;
    Samples few;
    Samples firsts;
    int nCall = 0;
    for (auto _ : state) {
        // A different token each time: the pages of one would stay in the caches.
        grant(*pMany, nCall * 7919 % nTokens, firsts);
        grant(*pMany, (nCall + 1) * 7919 % nTokens, many);
        grant(*pFew, nCall % FEW, firsts);
        grant(*pFew, (nCall + 1) % FEW, few);
        nCall += 2;
        state.SetIterationTime(many.last());
    }
    state.counters["median_us"] = many.percentile(50) * 1e6;
    state.counters["few_us"] = few.percentile(50) * 1e6;
    state.counters["ratio"] = many.percentile(50) / few.percentile(50);
}

} // namespace

void registerBenchmarks()
{
    for (const Place place : {Place::Memory, Place::Disk}) {
        for (const bool blIndexes : {false, true}) {
            for (const int nTokens : {10, 100, 1000, 10000, 100000, 1000000}) {
                const std::string strName = std::string("Growth/") + nameOf(place) +
                                            (blIndexes ? "/indexed/" : "/plain/") + std::to_string(nTokens);
                const int nCalls = blIndexes || nTokens <= 10000 ? 300 : 3000000 / nTokens;
                benchmark::RegisterBenchmark(strName.c_str(), growth, place, blIndexes, nTokens)
                    ->UseManualTime()
                    ->Iterations(std::max(nCalls, 15));
            }
        }
    }
}
