// Filters: what a JSON filter makes SQLite do.
//
// Strings in the place of numbers go into statements as they are, so a filter can hold any SQL; what must
// hold for those is only that the process lives. All other filters select and delete what they name, and no
// more.

#include <sqlite3.h>

#include <algorithm>
#include <string>

#include "Library.h"
#include "internal/AccessTokenDbApi.h"

namespace {

const int STEPS_MAX = 20; // thousands of instructions of a statement
const int LENGTH_MAX = 1 << 20;
const char* const TOKENS[] = {
    R"({"tid":"a","bind_sid":"","uid":0,"deadline":4102444800,"count":1,"create_time":1,"function":"f",)"
    R"("webapi_allow":{},"extra":{}})",
    R"({"tid":"b","bind_sid":"s","uid":1024,"deadline":-1,"count":-1,"create_time":0,"function":"a'b",)"
    R"("webapi_allow":{"A":{"method":["get"]}},"extra":{"x":[1]}})",
    R"({"tid":"ab","bind_sid":"s","uid":12,"deadline":9223372036854775807,"count":2,"create_time":1,)"
    R"("function":"f","webapi_allow":{},"extra":{"y":null}})"};

int g_nSteps = 0;

int isTooLong(void*)
{
    return ++g_nSteps > STEPS_MAX;
}

// What a statement may not do, since the check stands in a transaction and must stay alone.
int isAllowed(void*, int nAction, const char*, const char*, const char*, const char*)
{
    return SQLITE_ATTACH == nAction || SQLITE_PRAGMA == nAction || SQLITE_TRANSACTION == nAction ||
                   SQLITE_SAVEPOINT == nAction
               ? SQLITE_DENY
               : SQLITE_OK;
}

AccessTokenDbApi& filledStore()
{
    AccessTokenDbApi& db = fuzz::store();
    for (const char* szToken : TOKENS) {
        Json::Value jToken = fuzz::json(szToken);
        FUZZ_REQUIRE(0 == db.tokenCreate(jToken));
    }
    sqlite3_progress_handler(db.m_pDb, 1000, isTooLong, nullptr);
    sqlite3_limit(db.m_pDb, SQLITE_LIMIT_LENGTH, LENGTH_MAX);
    return db;
}

// The members of a filter that name fields.
std::vector<std::string> fieldsOf(const Json::Value& jFilter)
{
    std::vector<std::string> strFields;
    for (const std::string& strField : fuzz::fields()) {
        if (jFilter.isMember(strField)) {
            strFields.push_back(strField);
        }
    }
    return strFields;
}

bool isNumberField(const std::string& strField)
{
    static const Json::Value jToken = fuzz::json(TOKENS[0]);
    return jToken[strField].isIntegral();
}

// The one value that a filter gives a field, also as a list of one.
Json::Value valueOf(const Json::Value& jFilter, const std::string& strField)
{
    const Json::Value& jValue = jFilter[strField];
    return jValue.isArray() && jValue.size() == 1 ? jValue[0U] : jValue;
}

// Whether the filter does what it says: one value for each field, of the field's kind.
bool isPlain(const Json::Value& jFilter)
{
    const std::vector<std::string> strFields = fieldsOf(jFilter);
    return std::all_of(strFields.begin(), strFields.end(), [&jFilter](const std::string& strField) {
        const Json::Value jValue = valueOf(jFilter, strField);
        return isNumberField(strField) ? jValue.isIntegral() || jValue.isBool()
                                       : !jValue.isArray() && !jValue.isObject();
    });
}

// Whether a string in the place of a number makes the filter any SQL.
bool isSql(const Json::Value& jFilter)
{
    const std::vector<std::string> strFields = fieldsOf(jFilter);
    return std::any_of(strFields.begin(), strFields.end(), [&jFilter](const std::string& strField) {
        const Json::Value& jValue = jFilter[strField];
        const auto isString = [](const Json::Value& jElement) { return jElement.isString(); };
        return isNumberField(strField) &&
               (jValue.isString() ||
                (jValue.isArray() && std::any_of(jValue.begin(), jValue.end(), isString)));
    });
}

bool isPaging(const Json::Value& jFilter)
{
    return jFilter.isMember("sort_by") || jFilter.isMember("limit");
}

// Exact for all integers.
long double numberOf(const Json::Value& jValue)
{
    return jValue.type() == Json::realValue   ? static_cast<long double>(jValue.asDouble())
           : jValue.type() == Json::uintValue ? static_cast<long double>(jValue.asUInt64())
                                              : static_cast<long double>(jValue.asInt64());
}

bool matches(const Json::Value& jHas, const Json::Value& jWanted)
{
    return jHas.isIntegral() ? numberOf(jHas) == numberOf(jWanted)
           : jHas.isObject() ? fuzz::text(jHas) == fuzz::text(jWanted)
                             : jHas.asString() == jWanted.asString().c_str(); // up to the first NUL
}

// The tokens that a plain filter selects.
Json::Value selected(const Json::Value& jTokens, const Json::Value& jFilter)
{
    const std::vector<std::string> strFields = fieldsOf(jFilter);
    Json::Value jSelected(Json::arrayValue);
    for (const Json::Value& jToken : jTokens) {
        if (std::all_of(strFields.begin(), strFields.end(), [&](const std::string& strField) {
                return matches(jToken[strField], valueOf(jFilter, strField));
            })) {
            jSelected.append(jToken);
        }
    }
    return jSelected;
}

// The condition is appended, and is one that cannot end the statement.
void checkCondition(AccessTokenDbApi& db, Json::Value& jFilter, bool blAnd)
{
    const std::string strStart = "SELECT 1 FROM token WHERE 1 and";
    std::string strSql = strStart;
    const int nResult = db.SqlWhereFromJson(jFilter, strSql, blAnd);
    FUZZ_REQUIRE(-1 <= nResult && nResult <= 1);
    FUZZ_REQUIRE(0 == strSql.compare(0, strStart.size(), strStart));
    FUZZ_REQUIRE((1 == nResult) == fieldsOf(jFilter).empty());
    if (0 == nResult && isPlain(jFilter)) {
        sqlite3_stmt* pStatement = nullptr;
        const char* szTail = nullptr;
        FUZZ_REQUIRE(SQLITE_OK == sqlite3_prepare_v2(db.m_pDb, strSql.c_str(), -1, &pStatement, &szTail));
        FUZZ_REQUIRE(szTail == strSql.c_str() + strSql.size());
        sqlite3_finalize(pStatement);
    }
}

void checkSelecting(AccessTokenDbApi& db, Json::Value& jFilter, const Json::Value& jAll)
{
    Json::Value jFound(Json::arrayValue);
    const int nResult = db.tokenGet(jFilter, jFound);
    FUZZ_REQUIRE(0 == nResult || -1 == nResult);
    if (isPlain(jFilter) && !isPaging(jFilter)) {
        FUZZ_REQUIRE(0 == nResult);
        FUZZ_REQUIRE(fuzz::text(jFound) == fuzz::text(selected(jAll, jFilter)));
    }
}

void checkDeleting(AccessTokenDbApi& db, Json::Value& jFilter, const Json::Value& jAll, bool blAll)
{
    const int nDeleted = db.tokenDelete(jFilter, blAll);
    FUZZ_REQUIRE(-1 <= nDeleted);
    if (isSql(jFilter)) {
        return; // there may be no table any more
    }
    const Json::Value jLeft = fuzz::tokens(db);
    FUZZ_REQUIRE(static_cast<int>(jAll.size() - jLeft.size()) == std::max(nDeleted, 0));
    if (isPlain(jFilter)) {
        const bool blRefused = !blAll && fieldsOf(jFilter).empty();
        FUZZ_REQUIRE(nDeleted == (blRefused ? -1 : static_cast<int>(selected(jAll, jFilter).size())));
        FUZZ_REQUIRE(blRefused || selected(jLeft, jFilter).empty());
    }
}

void run(AccessTokenDbApi& db, const char* szSql)
{
    FUZZ_REQUIRE(SQLITE_OK == sqlite3_exec(db.m_pDb, szSql, nullptr, nullptr, nullptr));
}

// Makes the check in a transaction, which is undone.
template <typename Check>
void undone(AccessTokenDbApi& db, Check check)
{
    run(db, "BEGIN");
    g_nSteps = 0;
    sqlite3_set_authorizer(db.m_pDb, isAllowed, nullptr);
    fuzz::throwsLogicError(check);
    sqlite3_set_authorizer(db.m_pDb, nullptr, nullptr);
    g_nSteps = 0;
    if (!sqlite3_get_autocommit(db.m_pDb)) { // what took too long has been undone
        run(db, "ROLLBACK");
    }
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* pData, size_t cbData)
{
    const fuzz::Confinement confinement;
    static AccessTokenDbApi& db = filledStore();
    static const Json::Value jAll = fuzz::tokens(db);
    Json::Value jFilter = fuzz::json(fuzz::viewOf(pData, cbData));
    if (!jFilter.isObject()) {
        Json::Value jFound;
        FUZZ_REQUIRE(-1 == db.tokenGet(jFilter, jFound) && -1 == db.tokenDelete(jFilter, true));
        return 0;
    }
    undone(db, [&] { checkCondition(db, jFilter, true); });
    undone(db, [&] { checkCondition(db, jFilter, false); });
    undone(db, [&] { checkSelecting(db, jFilter, jAll); });
    undone(db, [&] { checkDeleting(db, jFilter, jAll, false); });
    undone(db, [&] { checkDeleting(db, jFilter, jAll, true); });
    FUZZ_REQUIRE(fuzz::text(fuzz::tokens(db)) == fuzz::text(jAll));
    return 0;
}
