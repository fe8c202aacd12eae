// Token records: JSON text as a value and back, the checks of a record, saving it and creating from it.

#include <cmath>
#include <string>

#include "AccessTokenApi.h"
#include "AccessTokenUtil.h"
#include "Library.h"
#include "internal/AccessTokenDbApi.h"

namespace {

bool isNumber(const std::string& strField)
{
    return strField == "uid" || strField == "deadline" || strField == "count" || strField == "create_time";
}

bool isText(const std::string& strField)
{
    return strField == "tid" || strField == "bind_sid" || strField == "function";
}

bool isWhole(const Json::Value& jValue)
{
    if (jValue.type() != Json::realValue) {
        return jValue.type() == Json::intValue || jValue.type() == Json::uintValue;
    }
    const double dValue = jValue.asDouble();
    return dValue >= -0x1p63 && dValue < 0x1p64 && dValue == std::floor(dValue);
}

bool hasItsType(const std::string& strField, const Json::Value& jValue)
{
    return isNumber(strField) ? isWhole(jValue)
           : isText(strField) ? jValue.type() == Json::stringValue
                              : jValue.type() == Json::objectValue;
}

// What a field comes back as when it has been saved. Throws Json::LogicError where it cannot be.
Json::Value stored(const std::string& strField, const Json::Value& jValue)
{
    return isNumber(strField) ? Json::Value(jValue.asInt64())
           : isText(strField) ? Json::Value(jValue.asCString())
                              : fuzz::json(fuzz::text(jValue));
}

bool canBeStored(const Json::Value& jRecord)
{
    try {
        for (const std::string& strField : fuzz::fields()) {
            if (jRecord.isMember(strField)) {
                stored(strField, jRecord[strField]);
            }
        }
        return true;
    } catch (const Json::LogicError&) {
        return false;
    }
}

// Text is read as what it was written from, and written the same again.
void checkText(const Json::Value& jValue)
{
    const std::string strText = fuzz::text(jValue);
    const Json::Value jRead = fuzz::json(strText);
    FUZZ_REQUIRE(fuzz::text(jRead) == strText);
    FUZZ_REQUIRE(jRead == jValue || std::string::npos != strText.find("NaN"));
}

void checkTypes(Json::Value& jValue)
{
    bool blSound = jValue.type() == Json::objectValue;
    for (const std::string& strField : fuzz::fields()) {
        blSound = blSound && (!jValue.isMember(strField) || hasItsType(strField, jValue[strField]));
    }
    const std::string strBefore = fuzz::text(jValue);
    FUZZ_REQUIRE(VEMO_ACCESS_TOKEN::checkJsonType(jValue) == (blSound ? 0 : -1));
    FUZZ_REQUIRE(fuzz::text(jValue) == strBefore);
}

// Of an object or null: what is there stays, what is missing is added.
void checkDefaults(const Json::Value& jGiven)
{
    Json::Value jRecord = jGiven;
    bool blComplete = true;
    for (const std::string& strField : fuzz::fields()) {
        blComplete = blComplete && jGiven.isMember(strField);
    }
    FUZZ_REQUIRE(VEMO_ACCESS_TOKEN::fillDefaultValue(jRecord, true) == (blComplete ? 0 : -1));
    FUZZ_REQUIRE(fuzz::text(jRecord) == fuzz::text(jGiven));
    FUZZ_REQUIRE(VEMO_ACCESS_TOKEN::fillDefaultValue(jRecord, false) == 0);
    for (const std::string& strField : fuzz::fields()) {
        FUZZ_REQUIRE(jRecord.isMember(strField));
        FUZZ_REQUIRE(jGiven.isMember(strField) || hasItsType(strField, jRecord[strField]));
    }
    for (const std::string& strName : jGiven.getMemberNames()) {
        FUZZ_REQUIRE(fuzz::text(jRecord[strName]) == fuzz::text(jGiven[strName]));
    }
}

// A record of the given fields and the defaults is saved and comes back, or nothing is.
void checkSaving(AccessTokenDbApi& db, const Json::Value& jGiven)
{
    Json::Value jRecord = jGiven;
    VEMO_ACCESS_TOKEN::fillDefaultValue(jRecord, false);
    if (!canBeStored(jRecord)) {
        FUZZ_REQUIRE(fuzz::throwsLogicError([&] { db.tokenCreate(jRecord); }));
        FUZZ_REQUIRE(fuzz::tokens(db).empty());
        return;
    }
    FUZZ_REQUIRE(0 == db.tokenCreate(jRecord));
    FUZZ_REQUIRE(-1 == db.tokenCreate(jRecord)); // it exists
    FUZZ_REQUIRE(0 == db.tokenUpdate(jRecord));
    Json::Value jStored(Json::objectValue);
    for (const std::string& strField : fuzz::fields()) {
        jStored[strField] = stored(strField, jRecord[strField]);
    }
    const Json::Value jTokens = fuzz::tokens(db);
    FUZZ_REQUIRE(jTokens.size() == 1 && fuzz::text(jTokens[0U]) == fuzz::text(jStored));
}

void checkField(const Json::Value& jToken, const Json::Value& jGiven, const std::string& strField)
{
    if (jGiven.isMember(strField)) {
        FUZZ_REQUIRE(fuzz::text(jToken[strField]) == fuzz::text(stored(strField, jGiven[strField])));
    }
}

// Creates a token with the input as its options, and changes it by the input.
void checkService(AccessTokenApi& api, Json::Value jGiven)
{
    unsigned int uid = 7;
    std::string strFunction = "fuzz";
    std::string strTid = fuzz::tid("x");
    Json::Value jToken;
    bool blCreated = false;
    const bool blThrew = fuzz::throwsLogicError(
        [&] { blCreated = 0 == api.tokenCreateByTid(uid, strFunction, jGiven, strTid); });
    FUZZ_REQUIRE(!blThrew || !canBeStored(jGiven) || !jGiven["deadline"].isInt());
    FUZZ_REQUIRE(api.tokenGetByTid(strTid, jToken) == (blCreated ? 1 : 0));
    if (blCreated) {
        FUZZ_REQUIRE(0 == VEMO_ACCESS_TOKEN::checkJsonType(jToken));
        FUZZ_REQUIRE(jToken["uid"].asInt64() == uid && jToken["function"] == strFunction);
        for (const char* szField : {"bind_sid", "count", "webapi_allow", "extra"}) {
            checkField(jToken, jGiven, szField);
        }
    }
    jGiven.removeMember("tid");
    bool blUpdated = false;
    if (fuzz::throwsLogicError([&] { blUpdated = 0 == api.tokenUpdateByTid(strTid, jGiven); })) {
        FUZZ_REQUIRE(!canBeStored(jGiven));
    } else if (blCreated && blUpdated) {
        FUZZ_REQUIRE(1 == api.tokenGetByTid(strTid, jToken));
        for (const std::string& strField : fuzz::fields()) {
            checkField(jToken, jGiven, strField);
        }
    }
    FUZZ_REQUIRE(api.tokenDeleteAll() == (blCreated ? 1 : 0));
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* pData, size_t cbData)
{
    const fuzz::Confinement confinement;
    static AccessTokenDbApi& db = fuzz::store();
    static AccessTokenApi api;
    Json::Value jValue = fuzz::json(fuzz::viewOf(pData, cbData));
    checkText(jValue);
    checkTypes(jValue);
    if (!jValue.isObject() && !jValue.isNull()) {
        FUZZ_REQUIRE(fuzz::throwsLogicError([&] { VEMO_ACCESS_TOKEN::fillDefaultValue(jValue, false); }));
        return 0;
    }
    checkDefaults(jValue);
    checkSaving(db, jValue);
    db.m_strSql = "DELETE FROM token;";
    FUZZ_REQUIRE(0 <= db.runSql());
    checkService(api, jValue);
    return 0;
}
