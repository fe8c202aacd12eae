// Compares calls of the library with its model (tests/model). The input is a line with an API, a line with a
// method ("none" for none), and JSON, which is used as a record, as the options of a creation, as an update
// and as a filter.
//
// A filter can contain SQL: a string for a number field becomes part of the statement. For such a filter it
// is enough that the process survives.

#include <sqlite3.h>

#include <algorithm>
#include <map>
#include <string>

#include "Library.h"
#include "ModelCalls.h"
#include "Table.h"

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

// A filter with SQL may not leave the transaction or open other databases.
int isAllowed(void*, int nAction, const char*, const char*, const char*, const char*)
{
    return SQLITE_ATTACH == nAction || SQLITE_PRAGMA == nAction || SQLITE_TRANSACTION == nAction ||
                   SQLITE_SAVEPOINT == nAction
               ? SQLITE_DENY
               : SQLITE_OK;
}

int isTooLong(void*)
{
    return ++g_nSteps > STEPS_MAX;
}

sqlite3* database()
{
    static sqlite3* const pDb = fuzz::openStore();
    return pDb;
}

// Uses that connection alone, so that one transaction covers all. Lives until the process ends.
Library& library()
{
    static Library* pLibrary = nullptr;
    if (!pLibrary) {
        fuzz::offer(database());
        pLibrary = new Library;
        fuzz::offer(database());
        FUZZ_REQUIRE(0 == pLibrary->store.createTable());
    }
    return *pLibrary;
}

Model& model()
{
    static Model theModel;
    return theModel;
}

void requireSameTable()
{
    static const Table table(database());
    const std::string strDifference = table.differenceFrom(model().store.rows());
    if (!strDifference.empty()) {
        dprintf(STDERR_FILENO, "%s\n", strDifference.c_str());
    }
    FUZZ_REQUIRE(strDifference.empty());
}

// Runs an operation on the library and on the model, which must agree. Returns the arguments afterwards.
Json::Value both(const std::string& strOperation, const std::map<std::string, Json::Value>& arguments)
{
    Json::Value jCall(Json::objectValue);
    for (const auto& [strName, jArgument] : arguments) {
        jCall[strName] = jArgument;
    }
    const auto pOperation = std::find_if(operations().begin(), operations().end(),
                                         [&](const Operation& each) { return each.szName == strOperation; });
    g_nSteps = 0;
    const Outcome ours = pOperation->run(library(), jCall);
    const Outcome expected = pOperation->run(model(), jCall);
    const std::string strOurs = fuzz::text(ours.jCall);
    const std::string strExpected = fuzz::text(expected.jCall);
    const bool blSame =
        ours.nResult == expected.nResult && ours.strThrown == expected.strThrown && strOurs == strExpected;
    if (!blSame) {
        dprintf(STDERR_FILENO, "%s gives %d %s %s instead of %d %s %s\n", pOperation->szName, ours.nResult,
                ours.strThrown.c_str(), strOurs.c_str(), expected.nResult, expected.strThrown.c_str(),
                strExpected.c_str());
    }
    FUZZ_REQUIRE(blSame);
    requireSameTable();
    return ours.jCall;
}

void run(const char* szSql)
{
    FUZZ_REQUIRE(SQLITE_OK == sqlite3_exec(database(), szSql, nullptr, nullptr, nullptr));
}

// Runs a check in a transaction, and rolls it back.
template <typename Check>
void undone(Check check)
{
    const ModelStore before = model().store;
    run("BEGIN");
    g_nSteps = 0;
    check();
    sqlite3_set_authorizer(database(), nullptr, nullptr);
    g_nSteps = 0;
    if (!sqlite3_get_autocommit(database())) { // a statement that takes too long is rolled back by SQLite
        run("ROLLBACK");
    }
    model().store = before;
    requireSameTable();
}

// A value that is written and read again is equal.
void checkText(const Json::Value& jValue)
{
    const std::string strText = fuzz::text(jValue);
    const Json::Value jRead = fuzz::json(strText);
    FUZZ_REQUIRE(fuzz::text(jRead) == strText);
    FUZZ_REQUIRE(jRead == jValue || std::string::npos != strText.find("NaN"));
}

void checkRecord(const Json::Value& jValue, const Json::Value& jApi, const Json::Value& jMethod)
{
    const std::string strTid = fuzz::tid("t");
    both("checkJsonType", {{"record", jValue}});
    both("checkPermission", {{"record", jValue}, {"webapi", jApi}, {"method", jMethod}});
    both("fillDefaultValue", {{"record", jValue}, {"flag", true}});
    Json::Value jRecord = both("fillDefaultValue", {{"record", jValue}, {"flag", false}})["record"];
    for (const bool blCreate : {true, true, false}) {
        both("tokenSave of the store", {{"record", jRecord}, {"flag", blCreate}});
    }
    if (jRecord.isObject()) {
        jRecord["tid"] = strTid;
        both("tokenSaveByOverwrite", {{"record", jRecord}});
        both("tokenGrant", {{"granted", strTid}, {"webapi", jApi}, {"method", jMethod}, {"answer", ""}});
    }
    both("tokenDeleteByTid", {{"tid", strTid}});
    both("tokenCreateByTid", {{"uid", 7U}, {"function", "fuzz"}, {"option", jValue}, {"fresh", strTid}});
    both("tokenUpdateByTid", {{"tid", strTid}, {"param", jValue}});
    both("tokenGetByTid", {{"tid", strTid}, {"answer", ""}});
}

// Whether the predicate holds for any field in the filter.
template <typename Predicate>
bool isAnyField(const Json::Value& jFilter, Predicate predicate)
{
    return std::any_of(FIELDS.begin(), FIELDS.end(), [&](const Field& field) {
        return jFilter.isMember(field.szName) && predicate(field.kind, jFilter[field.szName]);
    });
}

// Whether the filter has one value of the right kind for each field, and no paging.
bool isPlain(const Json::Value& jFilter)
{
    return !jFilter.isMember("sort_by") && !jFilter.isMember("limit") &&
           !isAnyField(jFilter, [](Kind kind, const Json::Value& jValues) {
               const Json::Value& jValue = jValues.isArray() && jValues.size() == 1 ? jValues[0U] : jValues;
               return Kind::Number == kind ? !jValue.isIntegral() && !jValue.isBool()
                                           : jValue.isArray() || jValue.isObject();
           });
}

// Whether the filter can contain SQL: a string for a number field.
bool isSql(const Json::Value& jFilter)
{
    const auto isString = [](const Json::Value& jElement) { return jElement.isString(); };
    return isAnyField(jFilter, [&](Kind kind, const Json::Value& jValue) {
        return Kind::Number == kind &&
               (jValue.isString() ||
                (jValue.isArray() && std::any_of(jValue.begin(), jValue.end(), isString)));
    });
}

// The condition is appended, and does not end the statement.
void checkCondition(Json::Value jFilter, bool blAnd)
{
    const std::string strStart = "SELECT 1 FROM token WHERE 1 and";
    std::string strSql = strStart;
    int nResult = -1;
    fuzz::mayThrow([&] { nResult = library().store.SqlWhereFromJson(jFilter, strSql, blAnd); });
    FUZZ_REQUIRE(-1 <= nResult && nResult <= 1);
    FUZZ_REQUIRE(0 == strSql.compare(0, strStart.size(), strStart));
    const bool blFields = isAnyField(jFilter, [](Kind, const Json::Value&) { return true; });
    FUZZ_REQUIRE(1 != nResult || !blFields);
    if (0 == nResult && isPlain(jFilter)) {
        sqlite3_stmt* pStatement = nullptr;
        const char* szTail = nullptr;
        FUZZ_REQUIRE(SQLITE_OK == sqlite3_prepare_v2(database(), strSql.c_str(), -1, &pStatement, &szTail));
        FUZZ_REQUIRE(szTail == strSql.c_str() + strSql.size());
        sqlite3_finalize(pStatement);
    }
}

// A plain filter selects and deletes the same tokens as in the model.
void checkPlainFilter(const Json::Value& jFilter)
{
    both("tokenGet of the store", {{"filter", jFilter}, {"list", Json::arrayValue}});
    for (const bool blAll : {false, true}) {
        both("tokenDelete of the store", {{"filter", jFilter}, {"rare_flag", blAll}});
    }
}

// Any other filter gives a result that the headers name, and deletes as many tokens as it reports.
void checkOddFilter(Json::Value jFilter)
{
    AccessTokenDbApi& db = library().store;
    sqlite3_set_authorizer(database(), isAllowed, nullptr);
    Json::Value jFound(Json::arrayValue);
    fuzz::mayThrow([&] {
        const int nResult = db.tokenGet(jFilter, jFound);
        FUZZ_REQUIRE(0 == nResult || -1 == nResult);
    });
    if (!isSql(jFilter)) { // or there may be no table any more
        requireSameTable();
    }
    g_nSteps = 0;
    int nDeleted = -1;
    fuzz::mayThrow([&] { nDeleted = db.tokenDelete(jFilter, false); });
    FUZZ_REQUIRE(-1 <= nDeleted);
    if (!isSql(jFilter)) {
        FUZZ_REQUIRE(static_cast<int>(std::size(TOKENS) - fuzz::tokens(db).size()) == std::max(nDeleted, 0));
    }
}

void prepare()
{
    static bool blPrepared = false;
    if (!blPrepared) {
        library();
        for (const char* szToken : TOKENS) {
            both("tokenSave of the store", {{"record", fuzz::json(szToken)}, {"flag", true}});
        }
        sqlite3_progress_handler(database(), 1000, isTooLong, nullptr);
        sqlite3_limit(database(), SQLITE_LIMIT_LENGTH, LENGTH_MAX);
        blPrepared = true;
    }
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* pData, size_t cbData)
{
    const fuzz::Confinement confinement;
    prepare();
    std::string_view strRest = fuzz::viewOf(pData, cbData);
    const Json::Value jApi = fuzz::takeLine(strRest);
    const std::string strMethod = fuzz::takeLine(strRest);
    const Json::Value jMethod = strMethod == "none" ? Json::Value() : Json::Value(strMethod);
    const Json::Value jValue = fuzz::json(strRest);
    checkText(jValue);
    undone([&] { checkRecord(jValue, jApi, jMethod); });
    undone([&] {
        if (jValue.isObject()) {
            checkCondition(jValue, true);
            checkCondition(jValue, false);
        }
        if (!jValue.isObject() || isPlain(jValue)) {
            checkPlainFilter(jValue);
        } else {
            checkOddFilter(jValue);
        }
    });
    return 0;
}
