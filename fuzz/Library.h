// The library under the fuzzer, which may do nothing to the machine.

#ifndef FUZZ_LIBRARY_H
#define FUZZ_LIBRARY_H

#include <json/value.h>

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

#include "AccessTokenDefine.h"
#include "Require.h"
#include "internal/AccessTokenDbApi.h"
#include "internal/JsonText.h"

namespace fuzz {

// While one lives, the process believes that it is root's and that the private directory exists; the database
// is in memory. Two files can be read, EXTRA_FILE and TOKENS_FILE; new files vanish. The clock, the users and
// the log are those of tests/model/World.h.
class Confinement {
public:
    Confinement();
    ~Confinement();
    Confinement(const Confinement&) = delete;
    Confinement& operator=(const Confinement&) = delete;
};

const char* const EXTRA_FILE = "extra.json";    // a JSON object
const char* const TOKENS_FILE = "tokens.jsonl"; // a token as a line of JSON
void setFileTexts(const std::string& strExtra, const std::string& strTokens);

// Opens the database in memory that the code under test gets from sqlite3_open. It lasts as long as any
// connection.
sqlite3* openStore();

// Gives this connection to the next caller of sqlite3_open instead.
void offer(sqlite3* pDb);

// What the tool has written to standard output and to standard error, while confined, since the last call.
std::string takeResult();
std::string takeComplaints();

inline std::string_view viewOf(const uint8_t* pData, size_t cbData)
{
    return {reinterpret_cast<const char*>(pData), cbData};
}

// Takes the first line off a text.
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

// An id of 127 characters with this beginning.
inline std::string tid(const std::string& strStart)
{
    return strStart + std::string(VEMO_ATOKEN_LENGTH_MIN - strStart.size(), 'f');
}

// All tokens of a store.
inline Json::Value tokens(AccessTokenDbApi& db)
{
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
