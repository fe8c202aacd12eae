// The permission check and the grant: a line with an API, a line with a method (none: no method is named),
// and a token record as JSON.

#include <string>

#include "AccessTokenApi.h"
#include "AccessTokenUtil.h"
#include "Library.h"
#include "internal/AccessTokenDbApi.h"

namespace {

// A call: what it asks for.
struct Call {
    std::string strApi;
    std::string strMethod;
    bool blMethod;

    const char* method() const { return blMethod ? strMethod.c_str() : nullptr; }
};

enum Verdict { ERROR = -1, NOT_LISTED = 0, ALLOWED = 1, THROWS = 2 };

// The rule, in other words. Names end at their first NUL, as the caller's do; those of a record do not.
Verdict verdict(const Json::Value& jRecord, const Call& call)
{
    const std::string strApi = call.strApi.c_str();
    const std::string strMethod = call.strMethod.c_str();
    if (!jRecord.isObject() || strApi.empty()) {
        return ERROR;
    }
    const Json::Value jAllow = jRecord["webapi_allow"];
    if (!jAllow.isObject() || !jAllow.isMember(strApi)) {
        return ERROR;
    }
    if (!call.blMethod || strMethod.empty()) {
        return ALLOWED;
    }
    const Json::Value jEntry = jAllow[strApi];
    if (!jEntry.isObject() || !jEntry["method"].isArray()) {
        return ERROR;
    }
    for (const Json::Value& jMethod : jEntry["method"]) {
        if (jMethod.isArray() || jMethod.isObject()) {
            return THROWS;
        }
        if (jMethod.asString() == strMethod) {
            return ALLOWED;
        }
    }
    return NOT_LISTED;
}

void checkRule(Json::Value& jRecord, const Call& call)
{
    const Verdict expected = verdict(jRecord, call);
    const std::string strBefore = fuzz::text(jRecord);
    int nResult = THROWS;
    fuzz::throwsLogicError(
        [&] { nResult = VEMO_ACCESS_TOKEN::checkPermission(jRecord, call.strApi.c_str(), call.method()); });
    FUZZ_REQUIRE(nResult == expected);
    FUZZ_REQUIRE(fuzz::text(jRecord) == strBefore);
}

// What the store holds after a grant of a token that allows it.
Json::Value spent(const Json::Value& jToken)
{
    const Json::Int64 nCount = jToken["count"].asInt64();
    Json::Value jTokens(Json::arrayValue);
    if (nCount < 0 || nCount > 1) {
        jTokens.append(jToken)["count"] = nCount < 0 ? nCount : nCount - 1;
    }
    return jTokens;
}

void checkGrant(AccessTokenApi& api, AccessTokenDbApi& db, const Json::Value& jRecord, const Call& call)
{
    std::string strTid = fuzz::tid("t");
    Json::Value jToken(Json::objectValue);
    jToken["tid"] = strTid;
    for (const char* szField : {"webapi_allow", "count"}) {
        if (jRecord.isMember(szField)) {
            jToken[szField] = jRecord[szField];
        }
    }
    VEMO_ACCESS_TOKEN::fillDefaultValue(jToken, false);
    if (!jToken["count"].isInt64() || 0 > api.tokenSaveByOverwrite(jToken)) {
        FUZZ_REQUIRE(fuzz::tokens(db).empty());
        return;
    }
    const Json::Value jBefore = fuzz::tokens(db);
    const Verdict expected = verdict(jBefore[0U], call);
    Json::Value jGranted;
    int nResult = THROWS;
    fuzz::throwsLogicError(
        [&] { nResult = api.tokenGrant(strTid, call.strApi.c_str(), call.method(), jGranted); });
    FUZZ_REQUIRE(nResult == (expected == ALLOWED ? 0 : expected == THROWS ? THROWS : -1));
    FUZZ_REQUIRE(jGranted.isNull() == (0 != nResult));
    const Json::Value jAfter = fuzz::tokens(db);
    FUZZ_REQUIRE(fuzz::text(jAfter) == fuzz::text(0 == nResult ? spent(jBefore[0U]) : jBefore));
    FUZZ_REQUIRE(api.tokenDeleteAll() == static_cast<int>(jAfter.size()));
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* pData, size_t cbData)
{
    const fuzz::Confinement confinement;
    static AccessTokenDbApi& db = fuzz::store();
    static AccessTokenApi api;
    std::string_view strRest = fuzz::viewOf(pData, cbData);
    Call call;
    call.strApi = fuzz::takeLine(strRest);
    call.strMethod = fuzz::takeLine(strRest);
    call.blMethod = call.strMethod != "none";
    Json::Value jRecord = fuzz::json(strRest);
    checkRule(jRecord, call);
    if (jRecord.isObject()) {
        checkGrant(api, db, jRecord, call);
    }
    return 0;
}
