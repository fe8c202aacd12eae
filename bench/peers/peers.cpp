// The same grant on this library, on Redis and on PostgreSQL, side by side. with-peers starts the
// servers and runs this program.
//
// Each contender holds 1000 tokens. One more is made and granted until its last use deletes it; only these
// grants are timed. Each repetition starts with fresh data, so repetitions can be interleaved
// (--benchmark_enable_random_interleaving). It reports the median and the 99th percentile of its calls.

#include <benchmark/benchmark.h>

#include <algorithm>
#include <cstdlib>
#include <ctime>
#include <stdexcept>

#include "Contender.h"
#include "Run.h"
#include "Samples.h"
#include "Store.h"

namespace {

const int TOKENS = 1000;
const int USES = 10;
const int CALLS = 200; // of a repetition: the whole lives of some tokens

const char* const REDIS_ALWAYS = "VEMO_BENCH_REDIS_ALWAYS";
const char* const REDIS_EVERYSEC = "VEMO_BENCH_REDIS_EVERYSEC";
const char* const POSTGRESQL = "VEMO_BENCH_POSTGRESQL";

template <Tuning tuning, Connection connection>
std::unique_ptr<Contender> ours()
{
    return makeOurs(TOKENS, tuning, connection);
}

template <Connection connection>
std::unique_ptr<Contender> redisAlways()
{
    return makeRedis(TOKENS, getenv(REDIS_ALWAYS), connection);
}

template <Connection connection>
std::unique_ptr<Contender> redisEverysec()
{
    return makeRedis(TOKENS, getenv(REDIS_EVERYSEC), connection);
}

template <Connection connection>
std::unique_ptr<Contender> postgresql()
{
    return makePostgresql(TOKENS, getenv(POSTGRESQL), connection);
}

struct Entry {
    const char* szSlug;
    std::unique_ptr<Contender> (*make)();
};

const Entry g_rgEntry[] = {
    {"ours-plain-per-call", ours<Tuning::Plain, Connection::PerCall>},
    {"ours-plain-held", ours<Tuning::Plain, Connection::Held>},
    {"ours-tuned-per-call", ours<Tuning::Tuned, Connection::PerCall>},
    {"ours-tuned-per-call-beside-another", ours<Tuning::Tuned, Connection::PerCallBesideAnother>},
    {"ours-tuned-held", ours<Tuning::Tuned, Connection::Held>},
    {"redis-always-per-call", redisAlways<Connection::PerCall>},
    {"redis-always-held", redisAlways<Connection::Held>},
    {"redis-everysec-per-call", redisEverysec<Connection::PerCall>},
    {"redis-everysec-held", redisEverysec<Connection::Held>},
    {"postgresql-per-call", postgresql<Connection::PerCall>},
    {"postgresql-held", postgresql<Connection::Held>},
};

void require(bool blHolds, const Entry& entry, const char* szWhat)
{
    if (!blHolds) {
        throw std::runtime_error(std::string(entry.szSlug) + " does not " + szWhat);
    }
}

// Throws unless the contender works as it should.
void verify(const Entry& entry)
{
    const std::unique_ptr<Contender> pContender = entry.make();
    BareToken token = tokenOf(FRESH);
    const auto granted = [&](const char* szWebapi, const char* szMethod) {
        return pContender->grant(token.strTid, szWebapi, szMethod);
    };
    token.nCount = USES;
    pContender->create(token);
    require(TOKENS + 1 == pContender->size(), entry, "hold the tokens");

    require(!granted("Example.Other", method()), entry, "refuse a wrong API");
    require(!granted(webapi(), "delete"), entry, "refuse a wrong method");
    for (int nUsesLeft = USES - 1; 0 <= nUsesLeft; --nUsesLeft) {
        require(granted(webapi(), method()), entry, "grant each use");
        token.nCount = std::max(1, nUsesLeft);
        require(recordOf(textsOf(token)) == pContender->answer(), entry, "return the record");
    }
    require(!granted(webapi(), method()), entry, "refuse a use too many");
    require(TOKENS == pContender->size(), entry, "delete the token with its last use");

    token.nDeadline = time(nullptr) - 1;
    pContender->create(token);
    require(!granted(webapi(), method()), entry, "refuse an expired token");
}

void measure(benchmark::State& state, const Entry& entry)
{
    const std::unique_ptr<Contender> pContender = entry.make();
    BareToken token = tokenOf(FRESH);
    token.nCount = USES;
    Samples samples;
    int nUsesLeft = 0;
    for (auto _ : state) {
        if (0 == nUsesLeft) {
            pContender->create(token);
            nUsesLeft = USES;
        }
        const bool blGranted =
            samples.time([&] { return pContender->grant(token.strTid, webapi(), method()); });
        state.SetIterationTime(samples.last());
        require(blGranted, entry, "grant");
        --nUsesLeft;
    }
    state.counters["median_us"] = samples.percentile(50) * 1e6;
    state.counters["p99_us"] = samples.percentile(99) * 1e6;
}

} // namespace

void registerBenchmarks()
{
    if (!getenv(REDIS_ALWAYS) || !getenv(REDIS_EVERYSEC) || !getenv(POSTGRESQL)) {
        throw std::runtime_error("to be run through with-peers, which starts the servers");
    }
    for (const Entry& entry : g_rgEntry) {
        verify(entry);
        benchmark::RegisterBenchmark((std::string("Peers/") + entry.szSlug).c_str(), measure, entry)
            ->UseManualTime()
            ->Iterations(CALLS);
    }
}
