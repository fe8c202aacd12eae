// Processes that grant one shared token at the same time, each as fast as it can for three seconds.
//
// Plain calls wait for SQLite's locks, which the library tries again; serialised calls wait for the call lock
// first. Each benchmark reports
//
//   grants_per_second   calls that returned 0
//   median_us, p99_us   times of single calls, those that returned -1 included
//   failed              share of the calls that returned -1 and had no effect
//   false_failures      share of the calls that returned -1 although the use was spent
//   beyond_count        share of the spent uses that did not lower the stored count: overlapping calls
//                       had read the same count, or wrote back an older one

#include <stdexcept>
#include <string>

#include "Callers.h"
#include "Run.h"
#include "Samples.h"
#include "Store.h"

namespace {

const int TOKENS = 1000;
const long long USES = 100000000;
const double SECONDS = 3;

void report(benchmark::State& state, const std::vector<GrantCall>& calls, long long nLowered)
{
    Samples times;
    double dSpent = 0;
    double dFailed = 0;
    double dFalse = 0;
    for (const GrantCall& call : calls) {
        if (call.blGranted && !call.blSpent) {
            throw std::runtime_error("a grant spent no use");
        }
        times.add((call.dEnd - call.dStart) * 1e6);
        dSpent += call.blSpent;
        dFailed += !call.blGranted && !call.blSpent;
        dFalse += !call.blGranted && call.blSpent;
    }
    const double dCalls = static_cast<double>(calls.size());
    state.counters["grants_per_second"] = grantsPerSecond(calls);
    state.counters["median_us"] = times.median();
    state.counters["p99_us"] = times.percentile(99);
    state.counters["failed"] = dFailed / dCalls;
    state.counters["false_failures"] = dFalse / dCalls;
    state.counters["beyond_count"] = (dSpent - static_cast<double>(nLowered)) / dSpent;
}

void contention(benchmark::State& state, const std::string& strTuning, Calls calls, int nProcesses)
{
    const Store store(Place::Disk, TOKENS, strTuning);
    BareToken token = tokenOf(0);
    token.nCount = USES;
    BareEngine().save(token);
    for (auto _ : state) {
        const std::vector<GrantCall> made = grantAtOnce(nProcesses, 1, SECONDS, calls);
        report(state, made, USES - BareEngine().read(token.strTid).nCount);
    }
}

} // namespace

void registerBenchmarks()
{
    for (const std::string& strTuning : {std::string(), WRITE_AHEAD}) {
        for (const Calls calls : {Calls::Plain, Calls::Serialised}) {
            for (int nProcesses = 1; nProcesses <= 64; nProcesses *= 2) {
                add(std::string("Contention/") + (strTuning.empty() ? "rollback/" : "wal/") +
                        (Calls::Plain == calls ? "plain/" : "serialised/") + std::to_string(nProcesses),
                    1, contention, strTuning, calls, nProcesses);
            }
        }
    }
}
