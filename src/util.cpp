#include "AccessTokenUtil.h"

#include <atomic>
#include <ctime>

#include "internal/AccessTokenLog.h"
#include "internal/Fields.h"
#include "internal/JsonAccess.h"
#include "internal/JsonText.h"
#include "vemorandom.h"

namespace {

std::atomic<bool> g_blLogToStdout(false);
std::atomic<bool> g_blDebugInfo(false);

struct TypeCheck {
    std::string_view strType;
    bool (Json::Value::*pAccepts)() const;
};

// These are more types than the fields have today, so that fields of any of them can be added.
constexpr TypeCheck g_rgTypeCheck[] = {
    {"int", &Json::Value::isIntegral},
    {"long long", &Json::Value::isIntegral},
    {"uid_t", &Json::Value::isIntegral},
    {"time_t", &Json::Value::isIntegral},
    {"bool", &Json::Value::isBool},
    {"string", &Json::Value::isString},
    {"Json::arrayValue", &Json::Value::isArray},
    {"Json::objectValue", &Json::Value::isObject},
};

const TypeCheck* findTypeCheck(std::string_view strType)
{
    for (const TypeCheck& check : g_rgTypeCheck) {
        if (strType == check.strType) {
            return &check;
        }
    }
    return nullptr;
}

} // namespace

namespace VEMO_ACCESS_TOKEN {

bool logToStdout(bool blOn)
{
    if (blOn) {
        g_blLogToStdout = true;
    }
    return g_blLogToStdout;
}

bool logToStdoutGet()
{
    return g_blLogToStdout;
}

bool debugInfo(bool blOn)
{
    if (blOn) {
        g_blDebugInfo = true;
    }
    return g_blDebugInfo;
}

bool debugInfoGet()
{
    return g_blDebugInfo;
}

void logFailed(const char* szCondition, const char* szFile, int nLine)
{
    VEMO_ATOKEN_WRITE_LINE("(%s:%d)(%m)Failed [%s], err=%m\n", szFile, nLine, szFile, nLine, szCondition);
}

Json::Value& tokenType()
{
    static Json::Value jTokenType;

    if (jTokenType.isNull()) {
        Json::Value jTable(Json::objectValue);
#define VEMO_ATOKEN_DATA_MEMBER(name, type, column, value)                                                   \
    jTable[#name].append(type);                                                                              \
    jTable[#name].append(Json::Value(value));
#include "internal/vemo-access-token-data-member"
#undef VEMO_ATOKEN_DATA_MEMBER
        jTokenType.swap(jTable);
    }
    return jTokenType;
}

int checkJsonType(Json::Value& jTokenParam)
{
    VEMO_ATOKEN_CHECK_RETURN(!jTokenParam.isObject(), -1);

    const Json::Value& jTypes = tokenType();
    auto itType = jTypes.begin();
    const auto typesEnd = jTypes.end();
    const auto end = jTokenParam.end();
    for (auto it = jTokenParam.begin(); it != end; ++it) {
        const std::string_view strName = nameOf(it);
        const Json::Value* pEntry = findNext(itType, typesEnd, strName);
        if (!pEntry) {
            continue;
        }
        const TypeCheck* pCheck = findTypeCheck(textOf((*pEntry)[0U]));
        if (!pCheck) {
            VEMO_ATOKEN_FAIL("type not found!!, key=%s", VEMO_ATOKEN_HERE, strName.data());
            return -1;
        }
        if (!((*it).*pCheck->pAccepts)()) {
            VEMO_ATOKEN_FAIL("type failed, jmList[i]=%s, jTokenParam=%s", VEMO_ATOKEN_HERE, strName.data(),
                             toString(jTokenParam).c_str());
            return -1;
        }
    }
    return 0;
}

int fillDefaultValue(Json::Value& jToken, bool blCheck)
{
    const auto rgMember = fieldMembers(jToken);
#define VEMO_ATOKEN_DATA_MEMBER(name, type, column, value)                                                   \
    if (!rgMember[FIELD_##name]) {                                                                           \
        if (blCheck) {                                                                                       \
            VEMO_ATOKEN_LOG("lost data member=%s", VEMO_ATOKEN_HERE_IN_LIST, #name);                         \
            return -1;                                                                                       \
        }                                                                                                    \
        jToken[#name] = Json::Value(value);                                                                  \
    }
#include "internal/vemo-access-token-data-member"
#undef VEMO_ATOKEN_DATA_MEMBER
    return 0;
}

int tokenGenerate(std::string& strTid)
{
    const std::string strAlphabet = "0987654321abcdefghijklmnopqrstuvwxyzABCDEFGHIJKLMNOPQRSTUVWXYZ";
    VEMO::RANDOM::VEMORandom source;

    const int nLength = source.random(VEMO_ATOKEN_LENGTH_MIN, 255);
    if (0 > nLength) {
        return nLength;
    }
    return source.getString(strAlphabet, static_cast<unsigned int>(nLength), strTid);
}

int getTimeAfterNow(int offsetSecond, long& now)
{
    now = time(nullptr) + offsetSecond;
    return 0;
}

int getTimeAfterNow(int offsetSecond, std::string& strTime)
{
    long now = 0;
    VEMO_ATOKEN_CHECK_RETURN(0 > getTimeAfterNow(offsetSecond, now), -1);

    struct tm tmNow = {};
    char szTime[64] = "";
    gmtime_r(&now, &tmNow);
    strftime(szTime, sizeof(szTime), "%a, %d %b %Y %T GMT", &tmNow);
    strTime = szTime;
    return 0;
}

int checkPermission(Json::Value& jToken, const char* szWebapiName, const char* szWebapiMethod)
{
    const Json::Value* pAllow = nullptr;
    const Json::Value* pEntry = nullptr;
    const Json::Value* pMethods = nullptr;

    VEMO_ATOKEN_CHECK_GOTO(jToken.type() != Json::objectValue, Error);
    VEMO_ATOKEN_CHECK_GOTO(!szWebapiName || !szWebapiName[0], Error);
    pAllow = findMember(jToken, "webapi_allow");
    VEMO_ATOKEN_CHECK_GOTO_AS(!pAllow, "!jToken.isMember(\"webapi_allow\")", Error);
    VEMO_ATOKEN_CHECK_GOTO_AS(pAllow->type() != Json::objectValue,
                              "jToken[\"webapi_allow\"].type() != Json::objectValue", Error);
    pEntry = findMember(*pAllow, szWebapiName);
    if (!pEntry) {
        VEMO_ATOKEN_DEBUG("webapi=%s not in allow list, jToken=%s", VEMO_ATOKEN_HERE, szWebapiName,
                          toString(jToken).c_str());
        goto Error;
    }

    // A caller who names no method only asks whether the API is listed, whatever its entry is.
    if (!szWebapiMethod || !szWebapiMethod[0]) {
        return 1;
    }

    VEMO_ATOKEN_CHECK_GOTO_AS(pEntry->type() != Json::objectValue,
                              "jToken[\"webapi_allow\"][szWebapiName].type() != Json::objectValue", Error);
    pMethods = findMember(*pEntry, "method");
    VEMO_ATOKEN_CHECK_GOTO_AS(!pMethods, "!jToken[\"webapi_allow\"][szWebapiName].isMember(\"method\")",
                              Error);
    VEMO_ATOKEN_CHECK_GOTO_AS(pMethods->type() != Json::arrayValue,
                              "jToken[\"webapi_allow\"][szWebapiName][\"method\"].type() != Json::arrayValue",
                              Error);
    for (const Json::Value& jMethod : *pMethods) {
        if (jMethod.asString() == szWebapiMethod) {
            return 1;
        }
    }
    VEMO_ATOKEN_DEBUG("webapi=%s , method=%s, not in allow list, jToken=%s", VEMO_ATOKEN_HERE, szWebapiName,
                      szWebapiMethod, toString(jToken).c_str());
    return 0;

Error:
    VEMO_ATOKEN_DEBUG("jToken=%s", VEMO_ATOKEN_HERE, toString(jToken).c_str());
    return -1;
}

} // namespace VEMO_ACCESS_TOKEN
