#include "AccessTokenApi.h"

#include <ctime>
#include <new>

#include "AccessTokenUtil.h"
#include "internal/AccessTokenDbApi.h"
#include "internal/AccessTokenLog.h"
#include "internal/JsonAccess.h"
#include "internal/JsonText.h"

using namespace VEMO_ACCESS_TOKEN;

namespace {

const int DEFAULT_LIFETIME_SEC = 86400;

std::string joinByComma(const std::vector<std::string>& strVector)
{
    std::string strJoined;
    for (const std::string& strElement : strVector) {
        if (&strElement != &strVector.front()) {
            strJoined.append(",");
        }
        strJoined.append(strElement);
    }
    return strJoined;
}

} // namespace

AccessTokenApi::AccessTokenApi() : m_pDb(new (std::nothrow) AccessTokenDbApi())
{
    if (!m_pDb) {
        VEMO_ATOKEN_LOG("new AccessTokenDbApi failed", VEMO_ATOKEN_HERE);
        return;
    }
    // The first operation reports a failure. It tries again when there is no handle yet.
    m_pDb->initDb();
}

AccessTokenApi::~AccessTokenApi()
{
    // The caller may still have to report errno of its last operation.
    const ErrnoKeeper keeper;
    if (m_pDb) {
        m_pDb->freeDb();
    }
}

int AccessTokenApi::tokenCreateByTid(unsigned int& uid, std::string& strFunction, Json::Value& jTokenOption,
                                     std::string& strTidIn)
{
    Json::Value jParam = jTokenOption;

    VEMO_ATOKEN_CHECK_GOTO(uid == UID_ERR, Error);
    VEMO_ATOKEN_CHECK_GOTO(strFunction.empty(), Error);
    VEMO_ATOKEN_CHECK_GOTO(strTidIn.length() < VEMO_ATOKEN_LENGTH_MIN, Error);
    VEMO_ATOKEN_CHECK_GOTO(jTokenOption.type() != Json::objectValue && jTokenOption.type() != Json::nullValue,
                           Error);

    jParam["tid"] = strTidIn;
    jParam["uid"] = uid;
    jParam["function"] = strFunction;
    jParam["create_time"] = static_cast<Json::Int64>(time(nullptr));
    // The option is a lifetime in seconds. -1 is not special: the token has already expired.
    if (jParam.isMember("deadline")) {
        jParam["deadline"] =
            static_cast<Json::Int64>(jParam["deadline"].asInt()) + jParam["create_time"].asInt();
    } else {
        jParam["deadline"] = jParam["create_time"].asInt64() + DEFAULT_LIFETIME_SEC;
    }

    VEMO_ATOKEN_CHECK_GOTO(0 > fillDefaultValue(jParam, false), Error);
    VEMO_ATOKEN_CHECK_GOTO(0 > checkJsonType(jParam), Error);
    VEMO_ATOKEN_CHECK_GOTO(!m_pDb, Error);
    // Written before the store is called, so also when the store then refuses the token.
    VEMO_ATOKEN_DEBUG("create token ok, token=%s", VEMO_ATOKEN_HERE, toString(jParam).c_str());
    VEMO_ATOKEN_CHECK_GOTO(0 > m_pDb->tokenCreate(jParam), Error);
    return 0;

Error:
    VEMO_ATOKEN_LOG("tokenCreate failed, tid=%s, uid=%d, strFunction=%s, jTokenOption=%s", VEMO_ATOKEN_HERE,
                    strTidIn.c_str(), static_cast<int>(uid), strFunction.c_str(),
                    toString(jTokenOption).c_str());
    return -1;
}

int AccessTokenApi::tokenCreate(unsigned int& uid, std::string& strFunction, Json::Value& jTokenOption,
                                std::string& strTidOut)
{
    std::string strTid;

    VEMO_ATOKEN_CHECK_RETURN(uid == UID_ERR, -1);
    VEMO_ATOKEN_CHECK_RETURN(strFunction.empty(), -1);
    VEMO_ATOKEN_CHECK_RETURN(0 > tokenGenerate(strTid), -1);
    VEMO_ATOKEN_CHECK_RETURN(0 > tokenCreateByTid(uid, strFunction, jTokenOption, strTid), -1);
    strTidOut.swap(strTid);
    return 0;
}

int AccessTokenApi::tokenList(Json::Value& jFilter, Json::Value& jTokenArrayOut)
{
    VEMO_ATOKEN_CHECK_RETURN(jFilter.type() != Json::objectValue && jFilter.type() != Json::nullValue, -1);
    if (jFilter.isNull()) {
        // The store accepts objects only. The caller's filter stays null.
        Json::Value jAll(Json::objectValue);
        return tokenList(jAll, jTokenArrayOut);
    }
    VEMO_ATOKEN_CHECK_RETURN(jTokenArrayOut.type() != Json::arrayValue, -1);
    VEMO_ATOKEN_CHECK_RETURN(!m_pDb, -1);
    VEMO_ATOKEN_CHECK_RETURN(0 > m_pDb->tokenGet(jFilter, jTokenArrayOut), -1);
    return 0;
}

int AccessTokenApi::tokenGetByTid(std::string& strTid, Json::Value& jTokenOut)
{
    int rv = -1;

    VEMO_ATOKEN_CHECK_RETURN(strTid.empty(), -1);
    VEMO_ATOKEN_CHECK_RETURN(!m_pDb, -1);
    VEMO_ATOKEN_CHECK_RETURN(0 > (rv = m_pDb->tokenGetOne("tid", strTid, jTokenOut)), rv);
    return rv;
}

int AccessTokenApi::VectorParamToJson(std::vector<std::string>& strVector, const char* szField,
                                      Json::Value& jParamOut)
{
    Json::Value jList(Json::arrayValue);

    VEMO_ATOKEN_CHECK_RETURN(jParamOut.type() != Json::objectValue && jParamOut.type() != Json::nullValue,
                             -1);
    VEMO_ATOKEN_CHECK_RETURN(!szField || !szField[0], -1);
    for (const std::string& strElement : strVector) {
        jList.append(strElement);
    }
    jParamOut[szField].swap(jList);
    return 0;
}

int AccessTokenApi::tokenGetByTidArray(std::vector<std::string>& strTidVector, Json::Value& jTokenArrayOut)
{
    Json::Value jParam(Json::objectValue);

    VEMO_ATOKEN_CHECK_RETURN(jTokenArrayOut.type() != Json::arrayValue, -1);
    VEMO_ATOKEN_CHECK_RETURN(0 >= strTidVector.size(), -1);
    VEMO_ATOKEN_CHECK_RETURN(0 > VectorParamToJson(strTidVector, "tid", jParam), -1);
    VEMO_ATOKEN_CHECK_RETURN(!m_pDb, -1);
    VEMO_ATOKEN_CHECK_RETURN(0 > m_pDb->tokenGet(jParam, jTokenArrayOut), -1);
    return 0;
}

int AccessTokenApi::tokenUpdateByTid(std::string& strTid, Json::Value& jParam)
{
    Json::Value jToken;
    int nCount = -1;

    VEMO_ATOKEN_CHECK_RETURN(strTid.empty(), -1);
    VEMO_ATOKEN_CHECK_RETURN(jParam.type() != Json::objectValue, -1);
    VEMO_ATOKEN_CHECK_RETURN(0 > (nCount = tokenGetByTid(strTid, jToken)), -1);
    if (0 == nCount) {
        return 0;
    }

    // The tid is a field like any other: a new one saves a copy, and the old row stays.
#define VEMO_ATOKEN_DATA_MEMBER(name, type, column, value)                                                   \
    if (jParam.isMember(#name)) {                                                                            \
        VEMO_ATOKEN_DEBUG("overwrite token[%s]", VEMO_ATOKEN_HERE_IN_LIST, #name);                           \
        jToken[#name] = jParam[#name];                                                                       \
    }
#include "internal/vemo-access-token-data-member"
#undef VEMO_ATOKEN_DATA_MEMBER

    VEMO_ATOKEN_CHECK_RETURN(0 > tokenSaveByOverwrite(jToken), -1);
    return 0;
}

int AccessTokenApi::tokenSaveByOverwrite(Json::Value& jToken)
{
    VEMO_ATOKEN_CHECK_GOTO(jToken.type() != Json::objectValue, Error);
    VEMO_ATOKEN_CHECK_GOTO(0 > fillDefaultValue(jToken, true), Error);
    VEMO_ATOKEN_CHECK_GOTO(0 > checkJsonType(jToken), Error);
    VEMO_ATOKEN_CHECK_GOTO(!m_pDb, Error);
    VEMO_ATOKEN_CHECK_GOTO(0 > m_pDb->tokenUpdate(jToken), Error);
    return 0;

Error:
    VEMO_ATOKEN_LOG("tokenSaveByOverwrite failed, jToken=%s", VEMO_ATOKEN_HERE, toString(jToken).c_str());
    return -1;
}

int AccessTokenApi::tokenDeleteByArray(std::vector<std::string>& strVector, const char* szName)
{
    Json::Value jParam(Json::objectValue);
    const Json::Value& jType = tokenType();
    int err = -1;

    VEMO_ATOKEN_CHECK_GOTO(0 >= strVector.size(), Error);
    VEMO_ATOKEN_CHECK_GOTO(!szName || !szName[0], Error);
    VEMO_ATOKEN_CHECK_GOTO(!jType.isMember(szName), Error);
    VEMO_ATOKEN_CHECK_GOTO(jType[szName][0].asString() != "string", Error);
    VEMO_ATOKEN_CHECK_GOTO(0 > VectorParamToJson(strVector, szName, jParam), Error);
    VEMO_ATOKEN_CHECK_GOTO(!m_pDb, Error);
    VEMO_ATOKEN_CHECK_GOTO_AS(0 > (err = m_pDb->tokenDelete(jParam, false)),
                              "0 > (err = m_pDb->tokenDelete(jParam))", Error);
    return err;

Error:
    VEMO_ATOKEN_LOG("tokenDeleteByArray failed, name=%s, strVector=%s", VEMO_ATOKEN_HERE, textOrNull(szName),
                    joinByComma(strVector).c_str());
    return -1;
}

int AccessTokenApi::tokenDeleteByName(std::string& strValue, const char* szName)
{
    std::vector<std::string> strVector(1, strValue);
    const Json::Value& jType = tokenType();
    int err = -1;

    VEMO_ATOKEN_CHECK_GOTO(strValue.empty(), Error);
    VEMO_ATOKEN_CHECK_GOTO(!szName || !szName[0], Error);
    VEMO_ATOKEN_CHECK_GOTO(!jType.isMember(szName), Error);
    VEMO_ATOKEN_CHECK_GOTO(0 > (err = tokenDeleteByArray(strVector, szName)), Error);
    return err;

Error:
    VEMO_ATOKEN_LOG("tokenDeleteByName failed, name=%s, strValue=%s", VEMO_ATOKEN_HERE, textOrNull(szName),
                    strValue.c_str());
    return -1;
}

int AccessTokenApi::tokenDeleteByTid(std::string& strTid)
{
    return tokenDeleteByName(strTid, "tid");
}

int AccessTokenApi::tokenDeleteByBindSid(std::string& strSid)
{
    return tokenDeleteByName(strSid, "bind_sid");
}

int AccessTokenApi::tokenDeleteByFunction(std::string& strFunction)
{
    return tokenDeleteByName(strFunction, "function");
}

int AccessTokenApi::tokenDeleteByTidArray(std::vector<std::string>& strTidVector)
{
    return tokenDeleteByArray(strTidVector, "tid");
}

int AccessTokenApi::tokenDeleteAll()
{
    Json::Value jAll(Json::objectValue);

    VEMO_ATOKEN_CHECK_RETURN(!m_pDb, -1);
    return m_pDb->tokenDelete(jAll, true);
}

int AccessTokenApi::cleanExpireToken(bool blLogErr)
{
    if (blLogErr) {
        VEMO_ATOKEN_CHECK_RETURN(!m_pDb, -1);
        VEMO_ATOKEN_CHECK_RETURN(0 > m_pDb->cleanExpireToken(blLogErr), -1);
        return 0;
    }
    if (!m_pDb || 0 > m_pDb->cleanExpireToken(blLogErr)) {
        if (debugInfoGet()) {
            VEMO_ATOKEN_FAIL("run fail 0 > m_pDb->cleanExpireToken(blLogErr)", VEMO_ATOKEN_HERE);
        }
        return -1;
    }
    return 0;
}

int AccessTokenApi::tokenGrant(std::string& strTid, const char* szWebapiName, const char* szWebapiMethod,
                               Json::Value& jTokenOut)
{
    Json::Value jToken;
    int err = -1;

    VEMO_ATOKEN_CHECK_GOTO(strTid.empty(), Refused);
    VEMO_ATOKEN_CHECK_GOTO(!szWebapiName || !szWebapiName[0], Refused);
    VEMO_ATOKEN_CHECK_GOTO(0 > (err = tokenGetByTid(strTid, jToken)), Refused);
    if (0 == err) {
        goto Refused;
    }
    VEMO_ATOKEN_DEBUG("get token tid=%s", VEMO_ATOKEN_HERE, strTid.c_str());
    VEMO_ATOKEN_CHECK_GOTO(0 > (err = checkPermission(jToken, szWebapiName, szWebapiMethod)), Refused);
    if (0 == err) {
        goto Refused;
    }
    VEMO_ATOKEN_CHECK_GOTO(!jToken.isMember("uid"), Refused);
    VEMO_ATOKEN_CHECK_GOTO(0 > tokenCountDegrade(jToken), Refused);
    jTokenOut.swap(jToken);
    VEMO_ATOKEN_DEBUG("token grant success!!", VEMO_ATOKEN_HERE);
    return 0;

Refused:
    VEMO_ATOKEN_DEBUG("token grant failed!!, strTid=%s, szWebapiName=%s, szWebapiMethod=%s", VEMO_ATOKEN_HERE,
                      strTid.c_str(), textOrNull(szWebapiName), textOrNull(szWebapiMethod));
    return -1;
}

int AccessTokenApi::tokenCountDegrade(Json::Value& jToken)
{
    std::string strTid;
    const Json::Value* pCount = nullptr;
    Json::Int64 nCount = 0;

    VEMO_ATOKEN_CHECK_GOTO(jToken.type() != Json::objectValue, Error);
    pCount = findMember(jToken, "count");
    VEMO_ATOKEN_CHECK_GOTO_AS(!pCount, "!jToken.isMember(\"count\")", Error);
    nCount = pCount->asInt64();
    if (0 > nCount) {
        return 0;
    }
    if (1 < nCount) {
        jToken["count"] = nCount - 1;
        VEMO_ATOKEN_CHECK_GOTO(0 > tokenSaveByOverwrite(jToken), Error);
        return 0;
    }
    // Both 0 and 1 mean one last use.
    VEMO_ATOKEN_CHECK_GOTO(!jToken.isMember("tid"), Error);
    VEMO_ATOKEN_CHECK_GOTO(jToken["tid"].type() != Json::stringValue, Error);
    strTid = jToken["tid"].asString();
    VEMO_ATOKEN_CHECK_GOTO(0 > tokenDeleteByTid(strTid), Error);
    return 0;

Error:
    VEMO_ATOKEN_DEBUG("tokenCountDegrade failed, jToken=%s", VEMO_ATOKEN_HERE, toString(jToken).c_str());
    return -1;
}
