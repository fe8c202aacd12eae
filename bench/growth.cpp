// What a grant costs as the number of tokens grows, without and with an administrator's indexes, beside the
// bare engine's; and what the indexes cost that only deletions use.
//
// A store takes turns with one of ten tokens, or of fewer indexes, so that the ratio of the two is not that
// of two moments of the machine. The call that comes first in a turn finds the processor's caches as the
// other store left them, and does not count. Each benchmark of growth reports
//
//   median_us, few_us   of the library's grants in the two stores
//   ratio, bare_ratio   of the two medians: the library's, and the bare engine's

#include <benchmark/benchmark.h>

#include <algorithm>
#include <fstream>
#include <memory>
#include <stdexcept>
#include <string>

#include "Run.h"
#include "Samples.h"
#include "Store.h"
#include "vemo-access-token.h"

namespace {

const int FEW = 10;

// Both grant in the store that is in use.
void grant(int nToken, Samples& samples)
{
    std::string strTid = tokenOf(nToken).strTid;
    Json::Value jToken;
    if (0 != samples.time([&] { return VemoAccessTokenGrantEx(strTid, webapi(), method(), jToken); })) {
        throw std::runtime_error("the grant failed");
    }
}

void grantBare(int nToken, Samples& samples)
{
    const std::string strTid = tokenOf(nToken).strTid;
    samples.time([&] {
        BareEngine engine;
        engine.purge();
        engine.grant(strTid);
        return 0;
    });
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

// The two take turns at being first. A different token each time: the pages of one would stay in the caches.
void grantByBoth(const Store& store, int nTokens, int nTurn, Samples& ours, Samples& bare)
{
    Samples first;
    int nToken = 3 * nTurn;
    const auto next = [&nToken, nTokens] { return nToken++ * 7919 % nTokens; };
    store.use();
    grant(next(), first);
    if (nTurn % 2) {
        grantBare(next(), bare);
    }
    grant(next(), ours);
    if (!(nTurn % 2)) {
        grantBare(next(), bare);
    }
}

void growth(benchmark::State& state, Place place, bool blIndexes, int nTokens)
{
    const auto pMany = makeStore(place, blIndexes, nTokens);
    const auto pFew = makeStore(place, blIndexes, FEW);
    Samples many;
    Samples few;
    Samples bareMany;
    Samples bareFew;
    int nTurn = 0;
    for (auto _ : state) {
        grantByBoth(*pMany, nTokens, nTurn, many, bareMany);
        grantByBoth(*pFew, FEW, nTurn, few, bareFew);
        ++nTurn;
        state.SetIterationTime(many.last());
    }
    state.counters["median_us"] = many.percentile(50) * 1e6;
    state.counters["few_us"] = few.percentile(50) * 1e6;
    state.counters["ratio"] = many.percentile(50) / few.percentile(50);
    state.counters["bare_ratio"] = bareMany.percentile(50) / bareFew.percentile(50);
}

// The bytes that this process has written, as the kernel counts them.
double bytesWritten()
{
    std::ifstream file("/proc/self/io");
    std::string strName;
    double dBytes = 0;
    while (file >> strName >> dBytes && strName != "wchar:") {
    }
    return dBytes;
}

// Grants and deletions with the index on the deadline alone beside those with all three.
void indexes(benchmark::State& state, Place place, int nTokens)
{
    const auto pOne = makeStore(place, false, nTokens);
    pOne->makeDeadlineIndex();
    const auto pThree = makeStore(place, true, nTokens);
    Samples grants[2];
    Samples deletions[2];
    Samples written[2];
    Samples firsts;
    int nCall = 0;
    for (auto _ : state) {
        for (const bool blThree : {false, true}) {
            const Store& store = blThree ? *pThree : *pOne;
            store.use();
            deletions[blThree].time(
                [] { return VemoAccessTokenDeleteByBindSid("a session without tokens"); });
            grant(nCall * 7919 % nTokens, firsts);
            const double dBefore = bytesWritten();
            grant((nCall + 1) * 7919 % nTokens, grants[blThree]);
            written[blThree].add(bytesWritten() - dBefore);
        }
        nCall += 2;
        state.SetIterationTime(grants[true].last());
    }
    for (const bool blThree : {false, true}) {
        const std::string strPrefix = blThree ? "three_" : "one_";
        state.counters[strPrefix + "us"] = grants[blThree].percentile(50) * 1e6;
        state.counters[strPrefix + "kB"] = written[blThree].percentile(50) / 1e3;
        state.counters[strPrefix + "delete_us"] = deletions[blThree].percentile(50) * 1e6;
    }
}

} // namespace

void registerBenchmarks()
{
    for (const Place place : {Place::Memory, Place::Disk}) {
        for (const int nTokens : {1000, 10000, 100000}) {
            const std::string strName =
                std::string("Growth/") + nameOf(place) + "/indexes/" + std::to_string(nTokens);
            benchmark::RegisterBenchmark(strName.c_str(), indexes, place, nTokens)
                ->UseManualTime()
                ->Iterations(300);
        }
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
