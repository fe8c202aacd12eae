// Compares calls of the library with its model (tests/model). The input is a line with an API, a line with a
// method ("none" for none), and JSON, which is used as a record, as the options of a creation, as an update
// and as a filter.
//
// The model does not cover each filter with a string or a fraction for a number field (isOddFilter): such a
// string becomes part of the statement. With these the process must only survive.

#include <algorithm>
#include <map>
#include <string>

#include "Library.h"
#include "ModelCalls.h"
#include "Table.h"

namespace {

const char* const TOKENS[] = {
    R"({"tid":"a","bind_sid":"","uid":0,"deadline":4102444800,"count":1,"create_time":1,"function":"f",)"
    R"("webapi_allow":{},"extra":{}})",
    R"({"tid":"b","bind_sid":"s","uid":1024,"deadline":-1,"count":-1,"create_time":0,"function":"a'b",)"
    R"("webapi_allow":{"A":{"method":["get"]}},"extra":{"x":[1]}})",
    R"({"tid":"ab","bind_sid":"s","uid":12,"deadline":9223372036854775807,"count":2,"create_time":1,)"
    R"("function":"f","webapi_allow":{},"extra":{"y":null}})"};

void requireNone(const std::string& strDifference)
{
    if (!strDifference.empty()) {
        dprintf(STDERR_FILENO, "%s\n", strDifference.c_str());
    }
    FUZZ_REQUIRE(strDifference.empty());
}

std::string shown(const Outcome& outcome)
{
    return std::to_string(outcome.nResult) + " " + outcome.strThrown + " " + fuzz::text(outcome.jCall);
}

const TokenStore& emptyStore()
{
    static const TokenStore store;
    store.setFiles({});
    return store;
}

// The library and its model, with the same tokens.
class Pair {
public:
    Pair()
    {
        for (const char* szToken : TOKENS) {
            run("tokenSave of the store", {{"record", fuzz::json(szToken)}, {"flag", true}});
        }
    }

    // Runs an operation on both, which must agree. Returns the arguments afterwards.
    Json::Value run(const std::string& strOperation, const std::map<std::string, Json::Value>& arguments)
    {
        Json::Value jCall(Json::objectValue);
        for (const auto& [strName, jArgument] : arguments) {
            jCall[strName] = jArgument;
        }
        const auto pOperation =
            std::find_if(operations().begin(), operations().end(),
                         [&](const Operation& each) { return each.szName == strOperation; });
        const Outcome ours = pOperation->run(m_library, jCall);
        const std::string strOurs = shown(ours);
        const std::string strExpected = shown(pOperation->run(m_model, jCall));
        requireNone(strOurs == strExpected ? ""
                                           : strOperation + " gives " + strOurs + ", not " + strExpected);
        requireSameTable();
        return ours.jCall;
    }

    void requireSameTable() const { requireNone(Table(m_pDb.get()).differenceFrom(m_model.rows())); }

    AccessTokenDbApi& store() { return m_library; }

private:
    const TokenStore& m_files = emptyStore();
    Library m_library;
    Model m_model;
    const Database m_pDb = m_files.open(); // a second connection
};

// A value that is written and read again is equal.
void checkText(const Json::Value& jValue)
{
    const std::string strText = fuzz::text(jValue);
    const Json::Value jRead = fuzz::json(strText);
    FUZZ_REQUIRE(fuzz::text(jRead) == strText);
    FUZZ_REQUIRE(jRead == jValue || std::string::npos != strText.find("NaN"));
}

void checkRecord(Pair& both, const Json::Value& jValue, const Json::Value& jApi, const Json::Value& jMethod)
{
    const std::string strTid = idOf("t");
    both.run("checkJsonType", {{"record", jValue}});
    both.run("checkPermission", {{"record", jValue}, {"webapi", jApi}, {"method", jMethod}});
    both.run("fillDefaultValue", {{"record", jValue}, {"flag", true}});
    Json::Value jRecord = both.run("fillDefaultValue", {{"record", jValue}, {"flag", false}})["record"];
    for (const bool blCreate : {true, true, false}) {
        both.run("tokenSave of the store", {{"record", jRecord}, {"flag", blCreate}});
    }
    if (jRecord.isObject()) {
        jRecord["tid"] = strTid;
        both.run("tokenSaveByOverwrite", {{"record", jRecord}});
        both.run("tokenGrant", {{"granted", strTid}, {"webapi", jApi}, {"method", jMethod}, {"answer", ""}});
    }
    both.run("tokenDeleteByTid", {{"tid", strTid}});
    both.run("tokenCreateByTid", {{"uid", 7U}, {"function", "fuzz"}, {"option", jValue}, {"fresh", strTid}});
    both.run("tokenUpdateByTid", {{"tid", strTid}, {"param", jValue}});
    both.run("tokenGetByTid", {{"tid", strTid}, {"answer", ""}});
}

bool hasField(const Json::Value& jFilter)
{
    return std::any_of(FIELDS.begin(), FIELDS.end(),
                       [&](const Field& field) { return jFilter.isMember(field.szName); });
}

// Whether the filter has a string for a number field, which can be SQL, or a fraction, which SQLite rounds.
bool isOddFilter(const Json::Value& jFilter)
{
    const auto isOddNumber = [](const Json::Value& jValue) {
        return jValue.isString() || Json::realValue == jValue.type();
    };
    return std::any_of(FIELDS.begin(), FIELDS.end(), [&](const Field& field) {
        const Json::Value& jValue = jFilter[field.szName];
        return Kind::Number == field.kind &&
               (isOddNumber(jValue) ||
                (jValue.isArray() && std::any_of(jValue.begin(), jValue.end(), isOddNumber)));
    });
}

// The condition is appended.
void checkCondition(Pair& both, Json::Value jFilter, bool blAnd)
{
    const std::string strStart = "SELECT 1 FROM token WHERE 1 and";
    std::string strSql = strStart;
    int nResult = -1;
    fuzz::mayThrow([&] { nResult = both.store().SqlWhereFromJson(jFilter, strSql, blAnd); });
    FUZZ_REQUIRE(-1 <= nResult && nResult <= 1);
    FUZZ_REQUIRE(0 == strSql.compare(0, strStart.size(), strStart));
    FUZZ_REQUIRE(1 != nResult || !hasField(jFilter));
}

void checkFilter(Pair& both, const Json::Value& jFilter)
{
    both.run("tokenGet of the store", {{"filter", jFilter}, {"list", Json::arrayValue}});
    for (const bool blAll : {false, true}) {
        both.run("tokenDelete of the store", {{"filter", jFilter}, {"rare_flag", blAll}});
    }
}

// An odd filter gives a result that the headers name. It may have deleted the table.
void checkOddFilter(AccessTokenDbApi& store, Json::Value jFilter)
{
    Json::Value jFound(Json::arrayValue);
    fuzz::mayThrow([&] {
        const int nResult = store.tokenGet(jFilter, jFound);
        FUZZ_REQUIRE(0 == nResult || -1 == nResult);
    });
    fuzz::mayThrow([&] { FUZZ_REQUIRE(-1 <= store.tokenDelete(jFilter, false)); });
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* pData, size_t cbData)
{
    std::string_view strRest = fuzz::viewOf(pData, cbData);
    const Json::Value jApi = fuzz::takeLine(strRest);
    const std::string strMethod = fuzz::takeLine(strRest);
    const Json::Value jMethod = strMethod == "none" ? Json::Value() : Json::Value(strMethod);
    const Json::Value jValue = fuzz::json(strRest);
    checkText(jValue);
    Pair both;
    checkRecord(both, jValue, jApi, jMethod);
    if (jValue.isObject()) {
        checkCondition(both, jValue, true);
        checkCondition(both, jValue, false);
    }
    if (jValue.isObject() && isOddFilter(jValue)) {
        checkOddFilter(both.store(), jValue);
    } else {
        checkFilter(both, jValue);
    }
    return 0;
}
