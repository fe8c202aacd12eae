// A model of the library: a table in memory, and operations with the same names and arguments. It uses
// neither the library nor SQL.
// Operations throw Json::LogicError where the library does: when a value cannot be converted.

#ifndef TESTS_MODEL_H
#define TESTS_MODEL_H

#include <algorithm>
#include <cstring>

#include "ModelFilter.h"
#include "ModelRow.h"
#include "World.h"

typedef std::vector<std::string> Texts;

const unsigned int UID_NOBODY = 4294967295;
const size_t TID_MIN = 127;
const size_t TID_MAX = 255;
const time_t DAY = 86400;

inline bool isGiven(const char* szText)
{
    return szText && szText[0];
}

inline bool isObjectOrNull(const Json::Value& jValue)
{
    return jValue.isObject() || jValue.isNull();
}

inline bool isOfKind(Kind kind, const Json::Value& jValue)
{
    return Kind::Text == kind   ? jValue.isString()
           : Kind::Json == kind ? jValue.isObject()
                                : jValue.isIntegral();
}

// Removes rows and returns how many.
template <typename Predicate>
int removeIf(std::vector<Row>& rows, Predicate predicate)
{
    const auto end = std::remove_if(rows.begin(), rows.end(), predicate);
    const int nRemoved = static_cast<int>(rows.end() - end);
    rows.erase(end, rows.end());
    return nRemoved;
}

class Model {
public:
    // Returns 0 if the record's fields have their types.
    int checkJsonType(const Json::Value& jToken)
    {
        const bool blSound =
            jToken.isObject() && std::all_of(FIELDS.begin(), FIELDS.end(), [&](const Field& field) {
                return !jToken.isMember(field.szName) || isOfKind(field.kind, jToken[field.szName]);
            });
        return blSound ? 0 : -1;
    }

    int fillDefaultValue(Json::Value& jToken, bool blCheck)
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

    int checkPermission(const Json::Value& jToken, const char* szWebapiName, const char* szWebapiMethod)
    {
        if (!jToken.isObject() || !isGiven(szWebapiName)) {
            return -1;
        }
        const Json::Value& jAllow = jToken["webapi_allow"];
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

    int tokenSave(Json::Value& jRecord, bool blCreate)
    {
        if (0 > fillDefaultValue(jRecord, true)) {
            return -1;
        }
        const Row row = rowOf(jRecord);
        const auto isSame = [&](const Row& other) { return other.columns[0] == row.columns[0]; };
        if (blCreate && std::any_of(m_rows.begin(), m_rows.end(), isSame)) {
            return -1;
        }
        removeIf(m_rows, isSame);
        m_rows.push_back(row);
        return 0;
    }

    int tokenGet(const Json::Value& jFilter, Json::Value& jTokenArrayOut)
    {
        if (!jFilter.isObject() || (!jTokenArrayOut.isNull() && !jTokenArrayOut.isArray())) {
            return -1;
        }
        const Where where(jFilter);
        if (where.blRefused || isSpoiledByPaging(jFilter, where.blEmpty) || where.blBroken) {
            return -1;
        }
        for (const Row& row : m_rows) {
            if (where.matches(row)) {
                jTokenArrayOut.append(row.jRecord);
            }
        }
        return 0;
    }

    int tokenGetOne(const char* szName, const std::string& strValue, Json::Value& jTokenOut)
    {
        if (!isGiven(szName) || strValue.empty()) {
            return -1;
        }
        jTokenOut = Json::Value(Json::objectValue);
        Json::Value jFilter;
        Json::Value jFound;
        jFilter[szName] = strValue;
        if (0 > tokenGet(jFilter, jFound)) {
            return -1;
        }
        if (jFound.empty()) {
            return 0;
        }
        jTokenOut = jFound[0];
        return 1;
    }

    int tokenDelete(const Json::Value& jFilter, bool blAll)
    {
        if (!jFilter.isObject()) {
            return -1;
        }
        const Where where(jFilter);
        if (where.blRefused || where.blBroken || (where.blEmpty && !blAll)) {
            return -1;
        }
        return removeIf(m_rows, [&](const Row& row) { return where.matches(row); });
    }

    int cleanExpireToken(bool)
    {
        if (worldClock() < YEAR_10000) { // later there is no date to compare with
            removeIf(m_rows, [](const Row& row) { return row.jRecord["deadline"].asInt64() < worldClock(); });
        }
        return 0;
    }

    // In the order of the table: sorted by when they were last written.
    const std::vector<Row>& rows() const { return m_rows; }

    // Gives the model the id that the library has generated; its form must be right.
    void setGenerated(const std::string& strTid)
    {
        const bool blId =
            TID_MIN <= strTid.size() && strTid.size() <= TID_MAX &&
            std::all_of(strTid.begin(), strTid.end(), [](unsigned char c) { return isalnum(c); });
        m_strGenerated = blId ? strTid : std::string(TID_MIN, '?');
    }

    int tokenGenerate(std::string& strTidOut)
    {
        strTidOut = m_strGenerated;
        return 0;
    }

    int tokenCreateByTid(unsigned int uid, const std::string& strFunction, const Json::Value& jTokenOption,
                         const std::string& strTidIn)
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
        fillDefaultValue(jToken, false);
        return 0 == checkJsonType(jToken) ? tokenSave(jToken, true) : -1;
    }

    int tokenCreate(unsigned int uid, const std::string& strFunction, const Json::Value& jTokenOption,
                    std::string& strTidOut)
    {
        const int nResult = tokenCreateByTid(uid, strFunction, jTokenOption, m_strGenerated);
        return 0 > nResult ? nResult : tokenGenerate(strTidOut);
    }

    int tokenList(const Json::Value& jFilter, Json::Value& jTokenArrayOut)
    {
        const bool blUsable = isObjectOrNull(jFilter) && jTokenArrayOut.isArray();
        return blUsable ? tokenGet(jFilter.isNull() ? Json::objectValue : jFilter, jTokenArrayOut) : -1;
    }

    int tokenGetByTid(const std::string& strTid, Json::Value& jTokenOut)
    {
        return tokenGetOne("tid", strTid, jTokenOut);
    }

    int VectorParamToJson(const Texts& strVector, const char* szField, Json::Value& jParamOut)
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

    int tokenGetByTidArray(const Texts& strTidVector, Json::Value& jTokenArrayOut)
    {
        Json::Value jFilter;
        if (!jTokenArrayOut.isArray() || strTidVector.empty()) {
            return -1;
        }
        VectorParamToJson(strTidVector, "tid", jFilter);
        return tokenGet(jFilter, jTokenArrayOut);
    }

    int tokenUpdateByTid(const std::string& strTid, const Json::Value& jParam)
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

    int tokenSaveByOverwrite(Json::Value& jToken)
    {
        return 0 == checkJsonType(jToken) ? tokenSave(jToken, false) : -1;
    }

    int tokenDeleteByArray(const Texts& strVector, const char* szName)
    {
        const size_t nField = szName ? fieldNumber(szName) : FIELDS.size();
        if (strVector.empty() || FIELDS.size() == nField || Kind::Text != FIELDS[nField].kind) {
            return -1;
        }
        Json::Value jFilter;
        VectorParamToJson(strVector, szName, jFilter);
        return tokenDelete(jFilter, false);
    }

    int tokenDeleteByName(const std::string& strValue, const char* szName)
    {
        return strValue.empty() ? -1 : tokenDeleteByArray({strValue}, szName);
    }

    int tokenDeleteByTid(const std::string& strTid) { return tokenDeleteByName(strTid, "tid"); }
    int tokenDeleteByBindSid(const std::string& strSid) { return tokenDeleteByName(strSid, "bind_sid"); }
    int tokenDeleteByFunction(const std::string& strName) { return tokenDeleteByName(strName, "function"); }
    int tokenDeleteByTidArray(const Texts& strTids) { return tokenDeleteByArray(strTids, "tid"); }
    int tokenDeleteAll() { return tokenDelete(Json::objectValue, true); }

    int tokenGrant(const std::string& strTid, const char* szWebapiName, const char* szWebapiMethod,
                   Json::Value& jTokenOut)
    {
        Json::Value jToken;
        if (!isGiven(szWebapiName) || 1 != tokenGetByTid(strTid, jToken) ||
            1 != checkPermission(jToken, szWebapiName, szWebapiMethod) || 0 > tokenCountDegrade(jToken)) {
            return -1;
        }
        jTokenOut = jToken;
        return 0;
    }

    int tokenCountDegrade(Json::Value& jToken)
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
        return std::min(0, tokenDeleteByTid(jToken["tid"].asString()));
    }

    // As tokenGrant(), and writes the name of the token's user.
    int grant(const std::string& strTid, const char* szWebapiName, const char* szWebapiMethod, char* szUser,
              size_t cbUser)
    {
        Json::Value jToken;
        if (0 > tokenGrant(strTid, szWebapiName, szWebapiMethod, jToken)) {
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

    int deleteByBindSid(const char* szSid) { return tokenDeleteByBindSid(szSid ? szSid : ""); }

private:
    std::vector<Row> m_rows;
    std::string m_strGenerated;
};

#endif
