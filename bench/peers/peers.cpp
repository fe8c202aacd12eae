// The same grant on this library, on Redis and on PostgreSQL, side by side. with-peers starts the
// servers and runs this program.
//
// Each contender holds 1000 tokens. One more is made and granted until its last use deletes it; only these
// grants are timed. Each repetition starts with fresh data, so repetitions can be interleaved
// (--benchmark_enable_random_interleaving). It reports the median and the 99th percentile of its calls.

#include <algorithm>
#include <cstdlib>
#include <ctime>
#include <memory>
#include <optional>
#include <stdexcept>

#include "AccessTokenApi.h"
#include "Contender.h"
#include "Process.h"
#include "Redis.h"
#include "Run.h"
#include "Samples.h"
#include "Store.h"
#include "vemo-access-token.h"

namespace {

const int USES = 10;
const int CALLS = 200; // of a repetition: some tokens, from creation to deletion

const char* const g_szRedisAlways = getenv("VEMO_BENCH_REDIS_ALWAYS");
const char* const g_szRedisEverysec = getenv("VEMO_BENCH_REDIS_EVERYSEC");
const char* const g_szPostgresql = getenv("VEMO_BENCH_POSTGRESQL");

// What an administrator can do.
const std::string TUNED = INDEXES + WRITE_AHEAD;

struct Ours {
    explicit Ours(const std::string& strTuning) : store(Place::Disk, TOKENS, strTuning) {}

    const Store store;
    std::unique_ptr<Process> pBystander;
    std::optional<AccessTokenApi> held;

    long long grant(std::string& strTid, const char* szWebapi, const char* szMethod)
    {
        Json::Value jToken;
        if (held) {
            held->cleanExpireToken(false);
        }
        const int nResult = held ? held->tokenGrant(strTid, szWebapi, szMethod, jToken)
                                 : VemoAccessTokenGrantEx(strTid, szWebapi, szMethod, jToken);
        return 0 == nResult ? jToken["count"].asInt64() : REFUSED;
    }
};

Contender makeOurs(const std::string& strTuning, Connection connection)
{
    const auto pOurs = std::make_shared<Ours>(strTuning);
    if (Connection::PerCallBesideAnother == connection) {
        pOurs->pBystander = startBystander();
    } else if (Connection::Held == connection) {
        pOurs->held.emplace();
    }
    // A write-ahead journal that stays grows to some size, and after that is overwritten. Only the later
    // phase is measured.
    std::string strTid = tokenOf(0).strTid;
    for (int i = 0; i < 400; ++i) {
        pOurs->grant(strTid, WEBAPI, METHOD);
    }
    return {[](const BareToken& token) { BareEngine().create(token); },
            [pOurs](std::string& strToken, const char* szWebapi, const char* szMethod) {
                return pOurs->grant(strToken, szWebapi, szMethod);
            }};
}

Contender makeRedis(const char* szSocket, Connection connection)
{
    const Redis::Words rgszField = {"count",    "webapi_allow", "tid",      "bind_sid", "uid",
                                    "deadline", "create_time",  "function", "extra"};
    const auto pRedis = std::make_shared<Redis>(szSocket, TOKENS, rgszField, 1);
    return {[pRedis](const BareToken& token) { pRedis->create(token); },
            [=](std::string& strTid, const char* szWebapi, const char* szMethod) {
                const Redis::Words rgszWord = pRedis->grant(strTid, szWebapi, szMethod);
                const Redis::Reply pRecord = Connection::Held == connection
                                                 ? pRedis->run(rgszWord)
                                                 : Redis::run(pRedis->connect(), rgszWord);
                return REDIS_REPLY_ARRAY == pRecord->type ? std::stoll(pRecord->element[0]->str) : REFUSED;
            }};
}

struct Entry {
    const char* szName;
    Contender (*make)();
};

const Entry g_rgEntry[] = {
    {"ours-plain-per-call", [] { return makeOurs("", Connection::PerCall); }},
    {"ours-plain-held", [] { return makeOurs("", Connection::Held); }},
    {"ours-tuned-per-call", [] { return makeOurs(TUNED, Connection::PerCall); }},
    {"ours-tuned-per-call-beside-another", [] { return makeOurs(TUNED, Connection::PerCallBesideAnother); }},
    {"ours-tuned-held", [] { return makeOurs(TUNED, Connection::Held); }},
    {"redis-always-per-call", [] { return makeRedis(g_szRedisAlways, Connection::PerCall); }},
    {"redis-always-held", [] { return makeRedis(g_szRedisAlways, Connection::Held); }},
    {"redis-everysec-per-call", [] { return makeRedis(g_szRedisEverysec, Connection::PerCall); }},
    {"redis-everysec-held", [] { return makeRedis(g_szRedisEverysec, Connection::Held); }},
    {"postgresql-per-call", [] { return makePostgresql(g_szPostgresql, Connection::PerCall); }},
    {"postgresql-held", [] { return makePostgresql(g_szPostgresql, Connection::Held); }},
};

void require(bool blHolds, const Entry& entry, const char* szWhat)
{
    if (!blHolds) {
        throw std::runtime_error(std::string(entry.szName) + " does not " + szWhat);
    }
}

// Throws unless the contender works as it should.
void verify(const Entry& entry)
{
    const Contender contender = entry.make();
    BareToken token = tokenOf(FRESH);
    const auto grant = [&](const char* szWebapi, const char* szMethod) {
        return contender.grant(token.strTid, szWebapi, szMethod);
    };
    token.nCount = USES;
    contender.create(token);
    require(REFUSED == grant("Example.Other", METHOD), entry, "refuse a wrong API");
    require(REFUSED == grant(WEBAPI, "delete"), entry, "refuse a wrong method");
    for (long long nLeft = USES - 1; 0 <= nLeft; --nLeft) {
        require(std::max(1LL, nLeft) == grant(WEBAPI, METHOD), entry, "count each use");
    }
    require(REFUSED == grant(WEBAPI, METHOD), entry, "delete the token with its last use");

    token.nDeadline = time(nullptr) - 1;
    contender.create(token);
    require(REFUSED == grant(WEBAPI, METHOD), entry, "refuse an expired token");
}

void measure(benchmark::State& state, const Entry& entry)
{
    const Contender contender = entry.make();
    BareToken token = tokenOf(FRESH);
    token.nCount = USES;
    Samples samples;
    int nCall = 0;
    for (auto _ : state) {
        if (0 == nCall++ % USES) {
            contender.create(token);
        }
        long long nCount = REFUSED;
        samples.time([&] { nCount = contender.grant(token.strTid, WEBAPI, METHOD); });
        require(REFUSED != nCount, entry, "grant");
    }
    state.counters["median_us"] = samples.median();
    state.counters["p99_us"] = samples.percentile(99);
}

} // namespace

void registerBenchmarks()
{
    if (!g_szRedisAlways || !g_szRedisEverysec || !g_szPostgresql) {
        throw std::runtime_error("to be run through with-peers, which starts the servers");
    }
    for (const Entry& entry : g_rgEntry) {
        verify(entry);
        add(std::string("Peers/") + entry.szName, CALLS, measure, entry);
    }
}
