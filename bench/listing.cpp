// The cost of decoding, in time and memory: listing all tokens, compared with a plain query that builds the
// same values.

#include <json/reader.h>
#include <malloc.h>

#include <fstream>
#include <memory>
#include <sstream>
#include <stdexcept>

#include "AccessTokenApi.h"
#include "Run.h"
#include "Samples.h"
#include "Store.h"

namespace {

const int TOKENS = 100000;

Json::Value parsed(const char* szJson)
{
    Json::Value jValue;
    std::istringstream(szJson) >> jValue;
    return jValue;
}

// The plain query does not read numbers and JSON from the row.
int appendRow(void* pArray, int /* nine */, char** rgszValue, char** /* names */)
{
    static const Json::Value jNumber = Json::Int64(1800000000);
    static const Json::Value jWebapiAllow = parsed(R"({"Example.File":{"method":["get","list"]}})");
    static const Json::Value jExtra = parsed("{}");
    Json::Value jToken(Json::objectValue);
    jToken[Json::StaticString("tid")] = rgszValue[0];
    jToken[Json::StaticString("bind_sid")] = rgszValue[1];
    jToken[Json::StaticString("uid")] = jNumber;
    jToken[Json::StaticString("deadline")] = jNumber;
    jToken[Json::StaticString("count")] = jNumber;
    jToken[Json::StaticString("create_time")] = jNumber;
    jToken[Json::StaticString("function")] = rgszValue[6];
    jToken[Json::StaticString("webapi_allow")] = jWebapiAllow;
    jToken[Json::StaticString("extra")] = jExtra;
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

template <typename List>
void timeList(Samples& samples, List list)
{
    malloc_trim(0);
    Json::Value jTokens;
    samples.time([&] { jTokens = list(); });
}

void listingTime(benchmark::State& state)
{
    const Store store(Place::Memory, TOKENS);
    AccessTokenApi api;
    BareEngine engine;
    Samples ours;
    Samples bare;
    for (auto _ : state) {
        timeList(bare, [&] { return listBare(engine); });
        timeList(ours, [&] { return listOurs(api); });
    }
    state.counters["ours_us"] = ours.median();
    state.counters["bare_us"] = bare.median();
    state.counters["ratio"] = ours.median() / bare.median();
}

void listingMemory(benchmark::State& state)
{
    const Store store(Place::Memory, TOKENS);
    for (auto _ : state) {
        auto pApi = std::make_unique<AccessTokenApi>();
        malloc_trim(0);
        if (!(std::ofstream("/proc/self/clear_refs") << "5" << std::flush)) { // resets the peak
            throw std::runtime_error("the kernel does not forget the peak");
        }
        const double dBefore = procValue("self/status", "VmRSS:");
        const Json::Value jTokens = listOurs(*pApi);
        const double dPeak = procValue("self/status", "VmHWM:") - dBefore;
        pApi.reset();
        malloc_trim(0);
        const double dValues = procValue("self/status", "VmRSS:") - dBefore;
        state.counters["peak_kB"] = dPeak;
        state.counters["values_kB"] = dValues;
        state.counters["ratio"] = dPeak / dValues;
    }
}

} // namespace

void registerBenchmarks()
{
    add("Listing/time", 10, listingTime);
    add("Listing/memory", 1, listingMemory);
}
