// The library under the fuzzer. It uses the tests' store (tests/faults/TokenStore.h) and their replacements
// for the system (tests/model/World.h).

#ifndef FUZZ_LIBRARY_H
#define FUZZ_LIBRARY_H

#include <json/value.h>

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

#include "AccessTokenDefine.h"
#include "Require.h"
#include "TokenStore.h"
#include "internal/AccessTokenDbApi.h"
#include "internal/JsonText.h"

namespace fuzz {

inline std::string_view viewOf(const uint8_t* pData, size_t cbData)
{
    return {reinterpret_cast<const char*>(pData), cbData};
}

// Removes the first line from a text and returns it.
inline std::string takeLine(std::string_view& strRest)
{
    const size_t cbLine = strRest.find('\n');
    const std::string strLine(strRest.substr(0, cbLine));
    strRest = std::string_view::npos == cbLine ? std::string_view() : strRest.substr(cbLine + 1);
    return strLine;
}

// The library's own reading and writing of JSON.
inline Json::Value json(std::string_view strText)
{
    Json::Value jValue;
    VEMO_ACCESS_TOKEN::fromString(strText, jValue);
    return jValue;
}

inline std::string text(const Json::Value& jValue)
{
    return VEMO_ACCESS_TOKEN::toString(jValue);
}

// All tokens of the store.
inline Json::Value tokens()
{
    AccessTokenDbApi db;
    Json::Value jAll(Json::objectValue);
    Json::Value jTokens(Json::arrayValue);
    FUZZ_REQUIRE(0 == db.tokenGet(jAll, jTokens));
    return jTokens;
}

// Makes a call, which may throw the exception that the library's headers allow. It must not throw another.
template <typename Call>
void mayThrow(Call call)
{
    try {
        call();
    } catch (const Json::LogicError&) {
    }
}

} // namespace fuzz

#endif
