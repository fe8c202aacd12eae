// The gate beside Redis, beside the library's calls and behind nginx. with-peers starts Redis and runs this
// program.
//
// All data is on the disk. Unless stated otherwise there are 1000 tokens with many uses. Clients run in a
// closed loop. The program fails unless the gate has spent exactly one use for each reply.

#include <unistd.h>

#include <cstdlib>
#include <fstream>
#include <memory>
#include <optional>
#include <stdexcept>

#include "../peers/Redis.h"
#include "Callers.h"
#include "Load.h"
#include "Process.h"
#include "Run.h"
#include "Store.h"

namespace {

const int TOKENS = 1000;
const int MANY_TOKENS = 100000;
const size_t CLIENTS = 64;
const double SECONDS = 2;

const char* const g_szRedis = getenv("VEMO_BENCH_REDIS_ALWAYS");

const std::string OWNED = "UPDATE token SET uid = 0;"; // by a user who exists on each machine

// Requests with the tokens 0 to nTokens - 1.
Load httpLoad(const std::string& strSocket, int nTokens, const std::string& strTarget, const char* szReplyEnd)
{
    Load load = {strSocket, "HTTP/1.1 200 ", szReplyEnd, {}};
    for (int i = 0; i < nTokens; ++i) {
        load.strRequests.push_back("GET " + strTarget + " HTTP/1.1\r\nHost: bench\r\nAuthorization: Bearer " +
                                   tokenOf(i).strTid + "\r\n\r\n");
    }
    return load;
}

// A gate that has opened its store.
class Gate {
public:
    explicit Gate(const Store& store)
        : m_strSocket(store.directory() + "/calls"), m_process([this] {
              execl(VEMO_BENCH_GATE, VEMO_BENCH_GATE, "--socket", m_strSocket.c_str(), "--user", "nobody",
                    nullptr);
          })
    {
        run(load(1), 1, 0);
    }

    // Clients that use the first nTokens tokens.
    Load load(int nTokens) const
    {
        return httpLoad(m_strSocket, nTokens, std::string("/grant/") + WEBAPI + "/" + METHOD, "\r\n\r\n");
    }

    // The memory of its two processes, in MB.
    double memory() const
    {
        const std::string strPid = std::to_string(m_process.pid());
        std::string strChild;
        std::ifstream("/proc/" + strPid + "/task/" + strPid + "/children") >> strChild;
        return 1.024e-3 *
               (procValue(strPid + "/status", "VmRSS:") + procValue(strChild + "/status", "VmRSS:"));
    }

private:
    const std::string m_strSocket;
    const Process m_process;
};

// Runs the clients and returns the number of replies. Each reply grants a use.
long long ask(benchmark::State& state, const Load& load, size_t nClients)
{
    Loaded loaded;
    for (auto _ : state) {
        loaded = run(load, nClients, SECONDS);
    }
    state.counters["per_second"] = static_cast<double>(loaded.nReplies) / loaded.dSeconds;
    state.counters["median_us"] = loaded.took.median();
    state.counters["p99_us"] = loaded.took.percentile(99);
    return loaded.nReplies;
}

// Of all tokens.
long long usesLeft()
{
    long long nLeft = 0;
    BareEngine().run(
        "SELECT sum(count) FROM token",
        [](void* pLeft, int, char** rgszValue, char**) {
            *static_cast<long long*>(pLeft) = atoll(rgszValue[0]);
            return 0;
        },
        &nLeft);
    return nLeft;
}

void requireSpent(long long nReplies, long long nSpent)
{
    if (nReplies != nSpent) {
        throw std::runtime_error(std::to_string(nReplies) + " replies, but " + std::to_string(nSpent) +
                                 " uses are gone");
    }
}

void gate(benchmark::State& state, const std::string& strTuning, int nTokens, int nUsed, size_t nClients)
{
    const Store store(Place::Disk, nTokens, OWNED + strTuning);
    const Gate gate(store);
    const long long nBefore = usesLeft();
    const long long nReplies = ask(state, gate.load(nUsed), nClients);
    state.counters["memory_MB"] = gate.memory();
    requireSpent(nReplies, nBefore - usesLeft());
}

void behindNginx(benchmark::State& state, bool blGate)
{
    const Store store(Place::Disk, TOKENS, OWNED + WRITE_AHEAD);
    const Gate gate(store);
    std::ofstream(store.directory() + "/page") << "a page\n";
    const Process nginx([&] {
        if (0 == chdir(store.directory().c_str())) {
            execlp("nginx", "nginx", "-p", ".", "-c", VEMO_BENCH_NGINX, nullptr);
        }
    });
    const long long nBefore = usesLeft();
    const std::string strSocket = store.directory() + (blGate ? "/behind-gate" : "/behind-at-once");
    const long long nReplies = ask(state, httpLoad(strSocket, TOKENS, "/page", "a page\n"), CLIENTS);
    requireSpent(blGate ? nReplies : 0, nBefore - usesLeft());
}

void redis(benchmark::State& state, int nUsed, size_t nClients)
{
    // The script reads and returns only what the gate's answer needs.
    const Redis server(g_szRedis, TOKENS, {"count", "webapi_allow", "uid", "function"}, 3);
    Load load = {g_szRedis, "*2\r\n", "\r\n", {}};
    for (int i = 0; i < nUsed; ++i) {
        const std::string strTid = tokenOf(i).strTid;
        Redis::Words rgszWord = server.grant(strTid, WEBAPI, METHOD);
        char* szRequest = nullptr;
        const auto nWords = static_cast<int>(rgszWord.size());
        const auto cbRequest = redisFormatCommandArgv(&szRequest, nWords, rgszWord.data(), nullptr);
        load.strRequests.emplace_back(szRequest, static_cast<size_t>(cbRequest));
        redisFreeCommand(szRequest);
    }
    ask(state, load, nClients);
}

// Programs that call the library; with blGate, while a gate has the store open.
void callers(benchmark::State& state, const std::string& strTuning, int nProcesses, Calls calls, bool blGate)
{
    const Store store(Place::Disk, TOKENS, OWNED + strTuning);
    std::optional<Gate> gate;
    if (blGate) {
        gate.emplace(store);
    }
    for (auto _ : state) {
        state.counters["per_second"] = grantAtOnce(nProcesses, TOKENS, SECONDS, calls).dGrantsPerSecond;
    }
}

} // namespace

void registerBenchmarks()
{
    if (!g_szRedis) {
        throw std::runtime_error("to be run through with-peers, which starts Redis");
    }
    for (const size_t nClients : {1, 8, 64, 256}) {
        const std::string strClients = "/" + std::to_string(nClients);
        add("Gate/write-ahead" + strClients, 1, gate, WRITE_AHEAD, TOKENS, TOKENS, nClients);
        add("Gate/rollback" + strClients, 1, gate, "", TOKENS, TOKENS, nClients);
        add("Gate/redis" + strClients, 1, redis, TOKENS, nClients);
    }
    add("Gate/one-token/64", 1, gate, WRITE_AHEAD, TOKENS, 1, CLIENTS);
    add("Gate/redis-one-token/64", 1, redis, 1, CLIENTS);
    add("Gate/many-tokens/64", 1, gate, WRITE_AHEAD, MANY_TOKENS, TOKENS, CLIENTS);
    add("Gate/nginx-at-once/64", 1, behindNginx, false);
    add("Gate/nginx/64", 1, behindNginx, true);
    add("Gate/calls/64", 1, callers, "", 64, Calls::Plain, false);
    add("Gate/calls-locked/64", 1, callers, "", 64, Calls::Serialised, false);
    add("Gate/call/1", 1, callers, WRITE_AHEAD, 1, Calls::Plain, false);
    add("Gate/call-beside/1", 1, callers, WRITE_AHEAD, 1, Calls::Plain, true);
}
