// What decoding costs, in time and memory: listing all tokens, compared with a plain query that builds the
// same values.

#include <benchmark/benchmark.h>
#include <malloc.h>

#include <fstream>
#include <memory>
#include <stdexcept>

#include "AccessTokenApi.h"
#include "Run.h"
#include "Samples.h"
#include "Store.h"

namespace {

const int TOKENS = 100000;

// Values that the plain query does not read from the row: numbers and JSON.
struct KnownValues {
    Json::Value jUid;
    Json::Value jDeadline;
    Json::Value jCount;
    Json::Value jCreateTime;
    Json::Value jWebapiAllow;
    Json::Value jExtra;
};

KnownValues knownValues()
{
    KnownValues known;
    known.jUid = Json::Int64(1000);
    known.jDeadline = Json::Int64(1800000000);
    known.jCount = Json::Int64(1000000);
    known.jCreateTime = Json::Int64(1800000000);
    known.jWebapiAllow["Example.File"]["method"].append("get");
    known.jWebapiAllow["Example.File"]["method"].append("list");
    known.jExtra = Json::Value(Json::objectValue);
    return known;
}

int appendRow(void* pArray, int /* nine */, char** rgszValue, char** /* names */)
{
    static const KnownValues known = knownValues();
    Json::Value jToken(Json::objectValue);
    jToken[Json::StaticString("tid")] = rgszValue[0];
    jToken[Json::StaticString("bind_sid")] = rgszValue[1];
    jToken[Json::StaticString("uid")] = known.jUid;
    jToken[Json::StaticString("deadline")] = known.jDeadline;
    jToken[Json::StaticString("count")] = known.jCount;
    jToken[Json::StaticString("create_time")] = known.jCreateTime;
    jToken[Json::StaticString("function")] = rgszValue[6];
    jToken[Json::StaticString("webapi_allow")] = known.jWebapiAllow;
    jToken[Json::StaticString("extra")] = known.jExtra;
    static_cast<Json::Value*>(pArray)->append(std::move(jToken));
    return 0;
}

Json::Value listBare(BareEngine& engine)
{
    Json::Value jTokens(Json::arrayValue);
    engine.run("SELECT tid,bind_sid,uid,deadline,count,create_time,function,webapi_allow,extra FROM token ;",
               appendRow, &jTokens);
    return jTokens;
}

Json::Value listOurs(AccessTokenApi& api)
{
    Json::Value jAll;
    Json::Value jTokens(Json::arrayValue);
    if (0 != api.tokenList(jAll, jTokens) || TOKENS != jTokens.size()) {
        throw std::runtime_error("the library failed");
    }
    return jTokens;
}

void listingTime(benchmark::State& state)
{
    Store store(Place::Memory);
    store.grow(TOKENS);
    AccessTokenApi api;
    BareEngine engine;
    Samples ours;
    Samples bare;
    for (auto _ : state) {
        malloc_trim(0);
        bare.time([&] { return listBare(engine); });
        malloc_trim(0);
        ours.time([&] { return listOurs(api); });
        state.SetIterationTime(ours.last());
    }
    state.counters["ours_us"] = ours.percentile(50) * 1e6;
    state.counters["bare_us"] = bare.percentile(50) * 1e6;
    state.counters["ratio"] = ours.percentile(50) / bare.percentile(50);
}

// A line of the kernel's status of this process, in kB.
long status(const std::string& strName)
{
    std::ifstream file("/proc/self/status");
    std::string strLine;
    while (std::getline(file, strLine)) {
        if (0 == strLine.compare(0, strName.size(), strName)) {
            return std::stol(strLine.substr(strName.size()));
        }
    }
    return 0;
}

void listingMemory(benchmark::State& state)
{
    Store store(Place::Memory);
    store.grow(TOKENS);
    for (auto _ : state) {
        auto pApi = std::make_unique<AccessTokenApi>();
        malloc_trim(0);
        if (!(std::ofstream("/proc/self/clear_refs") << "5" << std::flush)) { // the peak is now what there is
            state.SkipWithError("the kernel does not forget the peak");
            return;
        }
        const long nBefore = status("VmRSS:");
        const Json::Value jTokens = listOurs(*pApi);
        const long nPeak = status("VmHWM:") - nBefore;
        pApi.reset();
        malloc_trim(0);
        const long nValues = status("VmRSS:") - nBefore;
        state.counters["peak_kB"] = static_cast<double>(nPeak);
        state.counters["values_kB"] = static_cast<double>(nValues);
        state.counters["ratio"] = static_cast<double>(nPeak) / static_cast<double>(nValues);
    }
}

} // namespace

void registerBenchmarks()
{
    benchmark::RegisterBenchmark("Listing/time", listingTime)->UseManualTime()->Iterations(10);
    benchmark::RegisterBenchmark("Listing/memory", listingMemory)->Iterations(1);
}
