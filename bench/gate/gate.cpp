// The gate beside Redis, beside the library's calls and behind nginx. with-peers starts Redis and runs this
// program.
//
// All data is on the disk. Unless stated otherwise there are 1000 tokens with many uses. Clients run in a
// closed loop. The program fails unless the gate has spent exactly one use for each reply.

#include <benchmark/benchmark.h>

#include <cstdlib>
#include <memory>
#include <stdexcept>
#include <utility>

#include "Callers.h"
#include "Load.h"
#include "Run.h"
#include "Servers.h"
#include "Store.h"

namespace {

const int TOKENS = 1000;
const int MANY_TOKENS = 100000;
const size_t CLIENTS = 64;
const double SECONDS = 2;

std::vector<std::string> httpRequests(int nTokens, const std::string& strTarget)
{
    std::vector<std::string> strRequests;
    for (int i = 0; i < nTokens; ++i) {
        strRequests.push_back("GET " + strTarget + " HTTP/1.1\r\nHost: bench\r\nAuthorization: Bearer " +
                              tokenOf(i).strTid + "\r\n\r\n");
    }
    return strRequests;
}

std::string word(const std::string& strText)
{
    return "$" + std::to_string(strText.size()) + "\r\n" + strText + "\r\n";
}

std::vector<std::string> redisRequests(int nTokens, const std::string& strScript)
{
    std::vector<std::string> strRequests;
    for (int i = 0; i < nTokens; ++i) {
        strRequests.push_back("*6\r\n" + word("EVALSHA") + word(strScript) + word("1") +
                              word(tokenOf(i).strTid) + word(webapi()) + word(method()));
    }
    return strRequests;
}

long long usesLeft(int nTokens)
{
    BareEngine engine;
    long long nLeft = 0;
    for (int i = 0; i < nTokens; ++i) {
        nLeft += engine.read(tokenOf(i).strTid).nCount;
    }
    return nLeft;
}

void report(benchmark::State& state, const Loaded& loaded)
{
    if (loaded.nReplies != loaded.nGranted) {
        throw std::runtime_error("a call was not granted");
    }
    state.SetIterationTime(loaded.dSeconds);
    state.counters["per_second"] = static_cast<double>(loaded.nReplies) / loaded.dSeconds;
    state.counters["median_us"] = loaded.dMedian * 1e6;
    state.counters["p99_us"] = loaded.d99th * 1e6;
}

// Returns the number of replies.
long long ask(benchmark::State& state, const std::string& strPath, std::vector<std::string> strRequests,
              ReplyReader read, size_t nClients)
{
    Load load;
    load.strPath = strPath;
    load.strRequests = std::move(strRequests);
    load.readReply = std::move(read);
    load.nClients = nClients;
    load.dSeconds = SECONDS;
    long long nReplies = 0;
    for (auto _ : state) {
        const Loaded loaded = run(load);
        report(state, loaded);
        nReplies += static_cast<long long>(loaded.nReplies);
    }
    return nReplies;
}

enum class Journal { Rollback, WriteAhead };

std::unique_ptr<Store> makeStore(Journal journal, int nTokens)
{
    auto pStore = std::make_unique<Store>(Place::Disk);
    pStore->grow(nTokens);
    BareEngine().run("UPDATE token SET uid = 0"); // an owner whom each machine knows
    if (Journal::WriteAhead == journal) {
        pStore->useWriteAheadLog();
    }
    return pStore;
}

void requireSpent(long long nReplies, long long nSpent)
{
    if (nReplies != nSpent) {
        throw std::runtime_error(std::to_string(nReplies) + " replies, but " + std::to_string(nSpent) +
                                 " uses are gone");
    }
}

// nUsed: how many of the tokens the clients use.
void gate(benchmark::State& state, Journal journal, int nTokens, int nUsed, size_t nClients)
{
    const std::unique_ptr<Store> pStore = makeStore(journal, nTokens);
    const long long nBefore = usesLeft(nUsed);
    const Gate server(*pStore);
    const std::string strTarget = std::string("/grant/") + webapi() + "/" + method();
    const long long nReplies =
        ask(state, server.path(), httpRequests(nUsed, strTarget), readHttpReply, nClients);
    state.counters["memory_MB"] = server.memory() / 1e6;
    requireSpent(nReplies, nBefore - usesLeft(nUsed));
}

void behindNginx(benchmark::State& state, bool blGate)
{
    const std::unique_ptr<Store> pStore = makeStore(Journal::WriteAhead, TOKENS);
    const Gate server(*pStore);
    const Nginx nginx(*pStore, blGate ? server.path() : "");
    const long long nBefore = usesLeft(TOKENS);
    const long long nReplies =
        ask(state, nginx.path(), httpRequests(TOKENS, "/page"), readHttpReply, CLIENTS);
    requireSpent(blGate ? nReplies : 0, nBefore - usesLeft(TOKENS));
}

void redis(benchmark::State& state, int nUsed, size_t nClients)
{
    const std::string strPath = getenv("VEMO_BENCH_REDIS_ALWAYS");
    ask(state, strPath, redisRequests(nUsed, fillRedis(strPath, TOKENS)), readRedisReply, nClients);
}

// Programs that call the library; with blGate, while a gate holds the store open.
void callers(benchmark::State& state, Journal journal, int nProcesses, Calls calls, bool blGate)
{
    const std::unique_ptr<Store> pStore = makeStore(journal, TOKENS);
    const std::unique_ptr<Gate> pGate = blGate ? std::make_unique<Gate>(*pStore) : nullptr;
    if (blGate) { // it opens the store with the first call
        Load load;
        load.strPath = pGate->path();
        load.strRequests = httpRequests(1, std::string("/grant/") + webapi());
        load.readReply = readHttpReply;
        load.dSeconds = 0;
        run(load);
    }
    for (auto _ : state) {
        state.counters["per_second"] = grantsPerSecond(grantAtOnce(nProcesses, TOKENS, SECONDS, calls));
        state.SetIterationTime(SECONDS);
    }
}

template <typename... Arguments>
void add(const std::string& strName, Arguments... arguments)
{
    benchmark::RegisterBenchmark(("Gate/" + strName).c_str(), arguments...)
        ->UseManualTime()
        ->Unit(benchmark::kSecond)
        ->Iterations(1);
}

} // namespace

void registerBenchmarks()
{
    if (!getenv("VEMO_BENCH_REDIS_ALWAYS")) {
        throw std::runtime_error("to be run through with-peers, which starts Redis");
    }
    for (const size_t nClients : {1, 8, 64, 256}) {
        const std::string strClients = "/" + std::to_string(nClients);
        add("write-ahead" + strClients, gate, Journal::WriteAhead, TOKENS, TOKENS, nClients);
        add("rollback" + strClients, gate, Journal::Rollback, TOKENS, TOKENS, nClients);
        add("redis" + strClients, redis, TOKENS, nClients);
    }
    add("one-token/64", gate, Journal::WriteAhead, TOKENS, 1, CLIENTS);
    add("redis-one-token/64", redis, 1, CLIENTS);
    add("many-tokens/64", gate, Journal::WriteAhead, MANY_TOKENS, TOKENS, CLIENTS);
    add("nginx-at-once/64", behindNginx, false);
    add("nginx/64", behindNginx, true);
    add("calls/64", callers, Journal::Rollback, 64, Calls::Plain, false);
    add("calls-locked/64", callers, Journal::Rollback, 64, Calls::Serialised, false);
    add("call/1", callers, Journal::WriteAhead, 1, Calls::Plain, false);
    add("call-beside/1", callers, Journal::WriteAhead, 1, Calls::Plain, true);
}
