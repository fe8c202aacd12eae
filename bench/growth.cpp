// The cost of a grant as the number of tokens grows, without and with an administrator's indexes, compared
// with the bare engine's; and the cost of the indexes that only deletions use.
//
// A store takes turns with one of ten tokens, or of fewer indexes, so that other load on the machine affects
// both. The first call of a turn finds the other store's data in the processor's caches, and does not count.
// Each benchmark of growth reports
//
//   median_us, few_us   of the library's grants in the two stores
//   ratio, bare_ratio   of the two medians: the library's, and the bare engine's

#include <algorithm>
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
    int nResult = -1;
    samples.time([&] { nResult = VemoAccessTokenGrantEx(strTid, WEBAPI, METHOD, jToken); });
    if (0 != nResult) {
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
    });
}

// Each is first in every other turn. Each time another token: the pages of one would stay in the caches.
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

void growth(benchmark::State& state, Place place, const std::string& strTuning, int nTokens)
{
    const Store storeOfMany(place, nTokens, strTuning);
    const Store storeOfFew(place, FEW, strTuning);
    Samples many;
    Samples few;
    Samples bareMany;
    Samples bareFew;
    int nTurn = 0;
    for (auto _ : state) {
        grantByBoth(storeOfMany, nTokens, nTurn, many, bareMany);
        grantByBoth(storeOfFew, FEW, nTurn, few, bareFew);
        ++nTurn;
    }
    state.counters["median_us"] = many.median();
    state.counters["few_us"] = few.median();
    state.counters["ratio"] = many.median() / few.median();
    state.counters["bare_ratio"] = bareMany.median() / bareFew.median();
}

// Grants and deletions with the index on the deadline alone, compared with those with all three.
void indexes(benchmark::State& state, Place place, int nTokens)
{
    const Store one(place, nTokens, DEADLINE_INDEX);
    const Store three(place, nTokens, INDEXES);
    Samples grants[2];
    Samples deletions[2];
    Samples written[2];
    Samples firsts;
    int nCall = 0;
    for (auto _ : state) {
        for (const bool blThree : {false, true}) {
            (blThree ? three : one).use();
            deletions[blThree].time(
                [] { return VemoAccessTokenDeleteByBindSid("a session without tokens"); });
            grant(nCall * 7919 % nTokens, firsts);
            const double dBefore = procValue("self/io", "wchar:");
            grant((nCall + 1) * 7919 % nTokens, grants[blThree]);
            written[blThree].add(procValue("self/io", "wchar:") - dBefore);
        }
        nCall += 2;
    }
    for (const bool blThree : {false, true}) {
        const std::string strPrefix = blThree ? "three_" : "one_";
        state.counters[strPrefix + "us"] = grants[blThree].median();
        state.counters[strPrefix + "kB"] = written[blThree].median() / 1e3;
        state.counters[strPrefix + "delete_us"] = deletions[blThree].median();
    }
}

} // namespace

void registerBenchmarks()
{
    for (const Place place : {Place::Memory, Place::Disk}) {
        const std::string strName = std::string("Growth/") + nameOf(place);
        for (const int nTokens : {1000, 10000, 100000}) {
            add(strName + "/indexes/" + std::to_string(nTokens), 300, indexes, place, nTokens);
        }
        for (const bool blIndexes : {false, true}) {
            for (const int nTokens : {10, 100, 1000, 10000, 100000, 1000000}) {
                const int nCalls = blIndexes || nTokens <= 10000 ? 300 : 3000000 / nTokens;
                add(strName + (blIndexes ? "/indexed/" : "/plain/") + std::to_string(nTokens),
                    std::max(nCalls, 15), growth, place, blIndexes ? INDEXES : "", nTokens);
            }
        }
    }
}
