#include <algorithm>
#include <cstring>

#include "Model.h"
#include "World.h"

namespace {

const unsigned int UID_NOBODY = 4294967295;
const size_t TID_MIN = 127;
const size_t TID_MAX = 255;
const int DAY = 86400;

bool isGiven(const char* szText)
{
    return szText && szText[0];
}

bool isAlphanumeric(char c)
{
    return ('0' <= c && c <= '9') || ('a' <= c && c <= 'z') || ('A' <= c && c <= 'Z');
}

bool isObjectOrNull(const Json::Value& jValue)
{
    return jValue.isObject() || jValue.isNull();
}

bool isOfKind(Kind kind, const Json::Value& jValue)
{
    return Kind::Text == kind   ? jValue.isString()
           : Kind::Json == kind ? jValue.isObject()
                                : jValue.isIntegral();
}

} // namespace

// Fields that are there are of their type.
int ModelRules::checkJsonType(Json::Value& jToken)
{
    const bool blSound =
        jToken.isObject() && std::all_of(FIELDS.begin(), FIELDS.end(), [&](const Field& field) {
            return !jToken.isMember(field.szName) || isOfKind(field.kind, jToken[field.szName]);
        });
    return blSound ? 0 : -1;
}

int ModelRules::fillDefaultValue(Json::Value& jToken, bool blCheck)
{
    for (const Field& field : FIELDS) {
        if (jToken.isMember(field.szName)) {
            continue;
        }
        if (blCheck) {
            return -1;
        }
        jToken[field.szName] =
            std::string("create_time") == field.szName ? Json::Int64(worldClock()) : field.jDefault;
    }
    return 0;
}

int ModelRules::checkPermission(Json::Value& jToken, const char* szWebapiName, const char* szWebapiMethod)
{
    const Json::Value& jRecord = jToken;
    if (!jRecord.isObject() || !isGiven(szWebapiName)) {
        return -1;
    }
    const Json::Value& jAllow = jRecord["webapi_allow"];
    if (!jAllow.isObject() || !jAllow.isMember(szWebapiName)) {
        return -1;
    }
    if (!isGiven(szWebapiMethod)) {
        return 1;
    }
    const Json::Value& jEntry = jAllow[szWebapiName];
    if (!jEntry.isObject() || !jEntry["method"].isArray()) {
        return -1;
    }
    return std::any_of(jEntry["method"].begin(), jEntry["method"].end(),
                       [&](const Json::Value& jMethod) { return jMethod.asString() == szWebapiMethod; });
}

void ModelService::setGenerated(const std::string& strTid)
{
    const bool blId = TID_MIN <= strTid.size() && strTid.size() <= TID_MAX &&
                      std::all_of(strTid.begin(), strTid.end(), &isAlphanumeric);
    m_strGenerated = blId ? strTid : std::string(TID_MIN, '?');
}

int ModelService::tokenGenerate(std::string& strTidOut)
{
    strTidOut = m_strGenerated;
    return 0;
}

int ModelService::tokenCreateByTid(unsigned int& uid, std::string& strFunction, Json::Value& jTokenOption,
                                   std::string& strTidIn)
{
    if (!isObjectOrNull(jTokenOption) || uid == UID_NOBODY || strFunction.empty() ||
        strTidIn.length() < TID_MIN) {
        return -1;
    }
    Json::Value jToken = jTokenOption;
    jToken["tid"] = strTidIn;
    jToken["uid"] = uid;
    jToken["function"] = strFunction;
    jToken["create_time"] = static_cast<Json::Int64>(worldClock());
    if (jToken.isMember("deadline")) {
        // Both are numbers of 32 bits, which the clock is until 2038.
        jToken["deadline"] = Json::Int64(jToken["create_time"].asInt()) + jToken["deadline"].asInt();
    } else {
        jToken["deadline"] = jToken["create_time"].asInt64() + DAY;
    }
    ModelRules().fillDefaultValue(jToken, false);
    return 0 == ModelRules().checkJsonType(jToken) ? m_store.tokenSave(jToken, true) : -1;
}

int ModelService::tokenCreate(unsigned int& uid, std::string& strFunction, Json::Value& jTokenOption,
                              std::string& strTidOut)
{
    std::string strTid;
    tokenGenerate(strTid);
    if (0 > tokenCreateByTid(uid, strFunction, jTokenOption, strTid)) {
        return -1;
    }
    strTidOut = strTid;
    return 0;
}

int ModelService::tokenList(Json::Value& jFilter, Json::Value& jTokenArrayOut)
{
    if (!isObjectOrNull(jFilter) || !jTokenArrayOut.isArray()) {
        return -1;
    }
    Json::Value jAll(Json::objectValue);
    return m_store.tokenGet(jFilter.isNull() ? jAll : jFilter, jTokenArrayOut);
}

int ModelService::tokenGetByTid(std::string& strTid, Json::Value& jTokenOut)
{
    return m_store.tokenGetOne("tid", strTid, jTokenOut);
}

int ModelService::VectorParamToJson(std::vector<std::string>& strVector, const char* szField,
                                    Json::Value& jParamOut)
{
    if (!isObjectOrNull(jParamOut) || !isGiven(szField)) {
        return -1;
    }
    jParamOut[szField] = Json::Value(Json::arrayValue);
    for (const std::string& strElement : strVector) {
        jParamOut[szField].append(strElement);
    }
    return 0;
}

int ModelService::tokenGetByTidArray(std::vector<std::string>& strTidVector, Json::Value& jTokenArrayOut)
{
    Json::Value jFilter;
    if (!jTokenArrayOut.isArray() || strTidVector.empty()) {
        return -1;
    }
    VectorParamToJson(strTidVector, "tid", jFilter);
    return m_store.tokenGet(jFilter, jTokenArrayOut);
}

int ModelService::tokenUpdateByTid(std::string& strTid, Json::Value& jParam)
{
    Json::Value jToken;
    if (!jParam.isObject()) {
        return -1;
    }
    const int nFound = tokenGetByTid(strTid, jToken);
    if (1 > nFound) {
        return nFound;
    }
    for (const Field& field : FIELDS) {
        if (jParam.isMember(field.szName)) {
            jToken[field.szName] = jParam[field.szName];
        }
    }
    return tokenSaveByOverwrite(jToken);
}

int ModelService::tokenSaveByOverwrite(Json::Value& jToken)
{
    const bool blSound =
        0 == ModelRules().checkJsonType(jToken) && 0 == ModelRules().fillDefaultValue(jToken, true);
    return blSound ? m_store.tokenSave(jToken, false) : -1;
}

int ModelService::tokenDeleteByArray(std::vector<std::string>& strVector, const char* szName)
{
    const size_t nField = szName ? fieldNumber(szName) : FIELDS.size();
    if (strVector.empty() || FIELDS.size() == nField || Kind::Text != FIELDS[nField].kind) {
        return -1;
    }
    Json::Value jFilter;
    VectorParamToJson(strVector, szName, jFilter);
    return m_store.tokenDelete(jFilter, false);
}

int ModelService::tokenDeleteByName(std::string& strValue, const char* szName)
{
    std::vector<std::string> strVector = {strValue};
    return strValue.empty() ? -1 : tokenDeleteByArray(strVector, szName);
}

int ModelService::tokenDeleteAll()
{
    Json::Value jAll(Json::objectValue);
    return m_store.tokenDelete(jAll, true);
}

int ModelService::tokenGrant(std::string& strTid, const char* szWebapiName, const char* szWebapiMethod,
                             Json::Value& jTokenOut)
{
    Json::Value jToken;
    if (!isGiven(szWebapiName) || 1 != tokenGetByTid(strTid, jToken) ||
        1 != ModelRules().checkPermission(jToken, szWebapiName, szWebapiMethod) ||
        0 > tokenCountDegrade(jToken)) {
        return -1;
    }
    jTokenOut = jToken;
    return 0;
}

int ModelService::tokenCountDegrade(Json::Value& jToken)
{
    if (!jToken.isObject() || !jToken.isMember("count")) {
        return -1;
    }
    const Json::Int64 nCount = jToken["count"].asInt64();
    if (0 > nCount) {
        return 0;
    }
    if (1 < nCount) {
        jToken["count"] = nCount - 1;
        return tokenSaveByOverwrite(jToken);
    }
    if (!jToken.isMember("tid") || !jToken["tid"].isString()) {
        return -1;
    }
    std::string strTid = jToken["tid"].asString();
    return std::min(0, tokenDeleteByTid(strTid));
}

int ModelFunctions::grant(std::string& strTid, const char* szWebapiName, const char* szWebapiMethod,
                          char* szUser, size_t cbUser)
{
    Json::Value jToken;
    if (0 > grantEx(strTid, szWebapiName, szWebapiMethod, jToken)) {
        return -1;
    }
    if (!szUser || 0 == cbUser) {
        return 0;
    }
    const char* szName = userName(static_cast<uid_t>(jToken["uid"].asInt64()));
    if (!szName) {
        return -1;
    }
    const size_t cchWritten = std::min(strlen(szName), cbUser - 1);
    memcpy(szUser, szName, cchWritten);
    szUser[cchWritten] = '\0';
    return cchWritten < strlen(szName) ? -1 : 0;
}
