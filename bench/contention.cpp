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

#include <string>

#include "Callers.h"
#include "Run.h"
#include "Store.h"

namespace {

const int TOKENS = 1000;
const long long USES = 100000000;
const double SECONDS = 3;

void contention(benchmark::State& state, const std::string& strTuning, Calls calls, int nProcesses)
{
    const Store store(Place::Disk, TOKENS, strTuning);
    BareToken token = tokenOf(0);
    token.nCount = USES;
    BareEngine().save(token);
    for (auto _ : state) {
        CallsMade made = grantAtOnce(nProcesses, 1, SECONDS, calls);
        const auto dLowered = static_cast<double>(USES - BareEngine().read(token.strTid).nCount);
        state.counters["grants_per_second"] = made.dGrantsPerSecond;
        state.counters["median_us"] = made.took.median();
        state.counters["p99_us"] = made.took.percentile(99);
        state.counters["failed"] = made.dFailed / made.dAll;
        state.counters["false_failures"] = made.dFalse / made.dAll;
        state.counters["beyond_count"] = (made.dSpent - dLowered) / made.dSpent;
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
