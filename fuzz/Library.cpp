#include "Library.h"

#include "AccessTokenDefine.h"
#include "internal/AccessTokenDbApi.h"
#include "internal/JsonText.h"

namespace fuzz {

std::string_view viewOf(const uint8_t* pData, size_t cbData)
{
    return {reinterpret_cast<const char*>(pData), cbData};
}

std::string takeLine(std::string_view& strRest)
{
    const size_t cbLine = strRest.find('\n');
    const std::string strLine(strRest.substr(0, cbLine));
    strRest = std::string_view::npos == cbLine ? std::string_view() : strRest.substr(cbLine + 1);
    return strLine;
}

Json::Value json(std::string_view strText)
{
    Json::Value jValue;
    VEMO_ACCESS_TOKEN::fromString(strText, jValue);
    return jValue;
}

std::string text(const Json::Value& jValue)
{
    return VEMO_ACCESS_TOKEN::toString(jValue);
}

std::string tid(const std::string& strStart)
{
    return strStart + std::string(VEMO_ATOKEN_LENGTH_MIN - strStart.size(), 'f');
}

AccessTokenDbApi& store()
{
    static AccessTokenDbApi db;
    FUZZ_REQUIRE(0 == db.createTable());
    return db;
}

Json::Value tokens(AccessTokenDbApi& db)
{
    Json::Value jAll(Json::objectValue);
    Json::Value jTokens(Json::arrayValue);
    FUZZ_REQUIRE(0 == db.tokenGet(jAll, jTokens));
    return jTokens;
}

} // namespace fuzz
