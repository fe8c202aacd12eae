#include "StandIns.h"

#include "AccessTokenApi.h"
#include "AccessTokenUtil.h"
#include "internal/AccessTokenDbApi.h"
#include "vemo-access-token.h"

#define STRING "NSt7__cxx1112basic_stringIcSt11char_traitsIcESaIcEEE"

StandIns& standIns()
{
    static StandIns theStandIns;
    return theStandIns;
}

int VEMO_ACCESS_TOKEN::fillDefaultValue(Json::Value& jToken, bool blCheck)
{
    typedef int Function(Json::Value&, bool);
    static Function* const pNext = next<Function>("_ZN17VEMO_ACCESS_TOKEN16fillDefaultValueERN4Json5ValueEb");
    const auto& standIn = standIns().fillDefaultValue;
    return standIn ? standIn(jToken, blCheck) : pNext(jToken, blCheck);
}

int VEMO_ACCESS_TOKEN::getTimeAfterNow(int offsetSecond, long& now)
{
    typedef int Function(int, long&);
    static Function* const pNext = next<Function>("_ZN17VEMO_ACCESS_TOKEN15getTimeAfterNowEiRl");
    const auto& standIn = standIns().getTimeAfterNow;
    return standIn ? standIn(offsetSecond, now) : pNext(offsetSecond, now);
}

typedef int Expand(AccessTokenDbApi*, std::string&);

int AccessTokenDbApi::SqlExpandMemberName(std::string& strSql)
{
    static Expand* const pNext = next<Expand>("_ZN16AccessTokenDbApi19SqlExpandMemberNameER" STRING);
    const auto& standIn = standIns().sqlExpandMemberName;
    return standIn ? standIn(strSql) : pNext(this, strSql);
}

int AccessTokenDbApi::SqlExpandMemberSymbol(std::string& strSql)
{
    static Expand* const pNext = next<Expand>("_ZN16AccessTokenDbApi21SqlExpandMemberSymbolER" STRING);
    const auto& standIn = standIns().sqlExpandMemberSymbol;
    return standIn ? standIn(strSql) : pNext(this, strSql);
}

int AccessTokenDbApi::SqlExpandCreateTable(std::string& strSql)
{
    static Expand* const pNext = next<Expand>("_ZN16AccessTokenDbApi20SqlExpandCreateTableER" STRING);
    const auto& standIn = standIns().sqlExpandCreateTable;
    return standIn ? standIn(strSql) : pNext(this, strSql);
}

int AccessTokenDbApi::tokenGetOne(const char* szName, std::string& strValue, Json::Value& jTokenOut)
{
    typedef int Function(AccessTokenDbApi*, const char*, std::string&, Json::Value&);
    static Function* const pNext =
        next<Function>("_ZN16AccessTokenDbApi11tokenGetOneEPKcR" STRING "RN4Json5ValueE");
    const auto& standIn = standIns().tokenGetOne;
    return standIn ? standIn(szName, strValue, jTokenOut) : pNext(this, szName, strValue, jTokenOut);
}

int AccessTokenApi::VectorParamToJson(std::vector<std::string>& strVector, const char* szField,
                                      Json::Value& jParamOut)
{
    typedef int Function(AccessTokenApi*, std::vector<std::string>&, const char*, Json::Value&);
    static Function* const pNext =
        next<Function>("_ZN14AccessTokenApi17VectorParamToJsonERSt6vectorINSt7__cxx1112basic_string"
                       "IcSt11char_traitsIcESaIcEEESaIS6_EEPKcRN4Json5ValueE");
    const auto& standIn = standIns().vectorParamToJson;
    return standIn ? standIn(strVector, szField, jParamOut) : pNext(this, strVector, szField, jParamOut);
}

int VemoAccessTokenGrantEx(std::string& strTid, const char* szWebapiName, const char* szWebapiMethod,
                           Json::Value& jToken)
{
    typedef int Function(std::string&, const char*, const char*, Json::Value&);
    static Function* const pNext = next<Function>("VemoAccessTokenGrantEx");
    const auto& standIn = standIns().grantEx;
    return standIn ? standIn(strTid, szWebapiName, szWebapiMethod, jToken)
                   : pNext(strTid, szWebapiName, szWebapiMethod, jToken);
}
