// A hostile database: SQL that makes it, or the bytes of its file. Whatever it contains, the library decodes
// the rows as SQLite returns them, or reports a failure.

#include <sqlite3.h>

#include <cstdlib>
#include <cstring>
#include <optional>
#include <string>
#include <vector>

#include "AccessTokenApi.h"
#include "Library.h"
#include "ModelRow.h"
#include "internal/AccessTokenDbApi.h"

namespace {

const int STEPS_MAX = 20; // thousands of instructions of a statement
const int LENGTH_MAX = 1 << 20;
const char FILE_START[] = "SQLite format 3"; // with its NUL

int g_nSteps = 0;

int isTooLong(void*)
{
    return ++g_nSteps > STEPS_MAX;
}

// Random values would make two readings differ.
int isAllowed(void*, int nAction, const char* szName, const char* szFunction, const char*, const char*)
{
    const bool blChance =
        SQLITE_FUNCTION == nAction && 0 == strncasecmp(szFunction, "random", strlen("random"));
    const bool blPragma = SQLITE_PRAGMA == nAction && 0 != strcmp(szName, "encoding");
    return blChance || blPragma || SQLITE_ATTACH == nAction ? SQLITE_DENY : SQLITE_OK;
}

// Opens a copy of the bytes as the database.
void readFile(sqlite3* pDb, std::string_view strFile)
{
    auto* pCopy = static_cast<unsigned char*>(sqlite3_malloc64(strFile.size()));
    FUZZ_REQUIRE(pCopy);
    memcpy(pCopy, strFile.data(), strFile.size());
    const auto cbFile = static_cast<sqlite3_int64>(strFile.size());
    const unsigned int nFlags = SQLITE_DESERIALIZE_FREEONCLOSE | SQLITE_DESERIALIZE_RESIZEABLE;
    FUZZ_REQUIRE(SQLITE_OK == sqlite3_deserialize(pDb, "main", pCopy, cbFile, cbFile, nFlags));
}

sqlite3* hostile(std::string_view strInput)
{
    sqlite3* pDb = nullptr;
    FUZZ_REQUIRE(SQLITE_OK == sqlite3_open_v2(":memory:", &pDb, SQLITE_OPEN_READWRITE, nullptr));
    sqlite3_limit(pDb, SQLITE_LIMIT_LENGTH, LENGTH_MAX);
    sqlite3_progress_handler(pDb, 1000, isTooLong, nullptr);
    g_nSteps = 0;
    if (0 == strInput.compare(0, sizeof(FILE_START), std::string_view(FILE_START, sizeof(FILE_START)))) {
        readFile(pDb, strInput);
    }
    sqlite3_set_authorizer(pDb, isAllowed, nullptr);
    if (0 != strInput.compare(0, sizeof(FILE_START), std::string_view(FILE_START, sizeof(FILE_START)))) {
        sqlite3_exec(pDb, std::string(strInput).c_str(), nullptr, nullptr, nullptr);
    }
    return pDb;
}

// The texts of the rows as SQLite returns them, up to the first NUL. A value is missing if it is NULL or if
// the column's name has other letters than the field's. No rows if reading them fails.
typedef std::vector<std::optional<std::string>> Texts;
std::optional<std::vector<Texts>> rowsOf(sqlite3* pDb)
{
    const std::string strSql =
        "SELECT tid,bind_sid,uid,deadline,count,create_time,function,webapi_allow,extra FROM token ;";
    std::vector<Texts> rows;
    sqlite3_stmt* pStatement = nullptr;
    g_nSteps = 0;
    if (SQLITE_OK != sqlite3_prepare_v2(pDb, strSql.c_str(), -1, &pStatement, nullptr)) {
        return std::nullopt;
    }
    int nResult = SQLITE_ROW;
    while (SQLITE_ROW == (nResult = sqlite3_step(pStatement))) {
        rows.emplace_back();
        for (int i = 0; i < sqlite3_column_count(pStatement); ++i) {
            const auto* szText = reinterpret_cast<const char*>(sqlite3_column_text(pStatement, i));
            const bool blNamed =
                0 == strcmp(FIELDS[static_cast<size_t>(i)].szName, sqlite3_column_name(pStatement, i));
            rows.back().push_back(szText && blNamed ? std::optional<std::string>(szText) : std::nullopt);
        }
    }
    sqlite3_finalize(pStatement);
    return SQLITE_DONE == nResult ? std::optional<std::vector<Texts>>(rows) : std::nullopt;
}

Json::Value decoded(Kind kind, const std::string& strText)
{
    return Kind::Json == kind   ? fuzz::json(strText)
           : Kind::Text == kind ? Json::Value(strText)
                                : Json::Value(Json::Int64{strtoll(strText.c_str(), nullptr, 10)});
}

// The tokens of the rows, or nothing if one cannot be decoded.
std::optional<Json::Value> tokensOf(const std::optional<std::vector<Texts>>& rows)
{
    if (!rows) {
        return std::nullopt;
    }
    Json::Value jTokens(Json::arrayValue);
    for (const Texts& row : *rows) {
        Json::Value& jToken = jTokens.append(Json::Value(Json::objectValue));
        for (size_t i = 0; i < row.size(); ++i) {
            if (!row[i]) {
                return std::nullopt;
            }
            jToken[FIELDS[i].szName] = decoded(FIELDS[i].kind, *row[i]);
        }
    }
    return jTokens;
}

void checkReading(AccessTokenApi& api, sqlite3* pDb)
{
    const auto before = rowsOf(pDb);
    Json::Value jTokens(Json::arrayValue);
    Json::Value jAll(Json::objectValue);
    g_nSteps = 0;
    const int nResult = api.tokenList(jAll, jTokens);
    FUZZ_REQUIRE(0 == nResult || -1 == nResult);
    if (before != rowsOf(pDb)) {
        return; // a view of the time
    }
    const auto jExpected = tokensOf(before);
    FUZZ_REQUIRE(jExpected.has_value() == (0 == nResult));
    FUZZ_REQUIRE(!jExpected || fuzz::text(jTokens) == fuzz::text(*jExpected));
}

// Runs an operation, which may return any result that the headers name. It may also throw Json::LogicError: a
// grant does when a method list contains arrays.
template <typename Operation>
void run(Operation operation)
{
    g_nSteps = 0;
    fuzz::mayThrow([&] { FUZZ_REQUIRE(-1 <= operation()); });
}

void checkOperations(AccessTokenApi& api)
{
    std::string strTid = fuzz::tid("t");
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
    const fuzz::Confinement confinement;
    sqlite3* pDb = hostile(fuzz::viewOf(pData, cbData));
    fuzz::offer(pDb);
    AccessTokenApi api;
    checkReading(api, pDb);
    checkOperations(api);
    return 0;
}
