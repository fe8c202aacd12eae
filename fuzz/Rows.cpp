// A hostile database: SQL that makes it, or the bytes of its file. Whatever it contains, the library decodes
// the rows that SQLite returns, or reports a failure.

#include <sqlite3.h>

#include <cstdlib>
#include <cstring>
#include <optional>
#include <string>

#include "AccessTokenApi.h"
#include "Library.h"
#include "ModelRow.h"

namespace {

const char FILE_START[] = "SQLite format 3"; // with its NUL

void makeHostile(const TokenStore& store, const std::string& strInput)
{
    const bool blFile = 0 == strInput.compare(0, sizeof(FILE_START), FILE_START, sizeof(FILE_START));
    store.setFiles({{DATABASE, blFile ? strInput : ""}});
    if (!blFile) {
        sqlite3_exec(store.open().get(), strInput.c_str(), nullptr, nullptr, nullptr);
    }
}

Json::Value decoded(Kind kind, const char* szText)
{
    return Kind::Json == kind   ? fuzz::json(szText)
           : Kind::Text == kind ? Json::Value(szText)
                                : Json::Value(Json::Int64{strtoll(szText, nullptr, 10)});
}

// Adds the token of a row, from the texts that SQLite returns. Ends the reading if a value is missing: it is
// NULL, or the column's name differs from the field's.
int addToken(void* pTokens, int nColumns, char** szTexts, char** szNames)
{
    Json::Value& jToken = static_cast<Json::Value*>(pTokens)->append(Json::Value(Json::objectValue));
    for (int i = 0; i < nColumns; ++i) {
        const Field& field = FIELDS[static_cast<size_t>(i)];
        if (!szTexts[i] || 0 != strcmp(field.szName, szNames[i])) {
            return 1;
        }
        jToken[field.szName] = decoded(field.kind, szTexts[i]);
    }
    return 0;
}

// The tokens, or nothing if reading them fails.
std::optional<std::string> tokensOf(sqlite3* pDb)
{
    const char* szSql =
        "SELECT tid,bind_sid,uid,deadline,count,create_time,function,webapi_allow,extra FROM token ;";
    Json::Value jTokens(Json::arrayValue);
    return SQLITE_OK == sqlite3_exec(pDb, szSql, addToken, &jTokens, nullptr)
               ? std::optional<std::string>(fuzz::text(jTokens))
               : std::nullopt;
}

void checkReading(AccessTokenApi& api, sqlite3* pDb)
{
    const auto strExpected = tokensOf(pDb);
    Json::Value jTokens(Json::arrayValue);
    Json::Value jAll(Json::objectValue);
    const int nResult = api.tokenList(jAll, jTokens);
    FUZZ_REQUIRE(0 == nResult || -1 == nResult);
    if (strExpected == tokensOf(pDb)) { // and the table is not a view that depends on the time
        FUZZ_REQUIRE(strExpected.has_value() == (0 == nResult));
        FUZZ_REQUIRE(!strExpected || fuzz::text(jTokens) == *strExpected);
    }
}

// Runs an operation, which may return any result that the headers name. It may also throw Json::LogicError: a
// grant does when a method list contains arrays.
template <typename Operation>
void run(Operation operation)
{
    fuzz::mayThrow([&] { FUZZ_REQUIRE(-1 <= operation()); });
}

void checkOperations(AccessTokenApi& api)
{
    std::string strTid = idOf("t");
    std::string strShort = "t";
    std::string strName = "f";
    unsigned int uid = 0;
    Json::Value jToken;
    Json::Value jChange;
    jChange["count"] = 7;
    run([&] { return api.tokenGetByTid(strShort, jToken); });
    run([&] { return api.tokenGrant(strShort, "a", "get", jToken); });
    run([&] { return api.cleanExpireToken(true); });
    run([&] { return api.tokenUpdateByTid(strShort, jChange); });
    run([&] { return api.tokenCreateByTid(uid, strName, jChange, strTid); });
    run([&] { return api.tokenGrant(strTid, "a", nullptr, jToken); });
    run([&] { return api.tokenDeleteByFunction(strName); });
    run([&] { return api.tokenDeleteAll(); });
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* pData, size_t cbData)
{
    static const TokenStore store;
    makeHostile(store, std::string(fuzz::viewOf(pData, cbData)));
    AccessTokenApi api;
    checkReading(api, store.open().get());
    checkOperations(api);
    return 0;
}
