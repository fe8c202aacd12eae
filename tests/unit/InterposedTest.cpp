// Exported functions that a program replaces by its own: the library calls these too, and passes their
// failures on. Nothing else can cause such failures.

#include <dlfcn.h>
#include <unistd.h>

#include <functional>

#include "AccessTokenUtil.h"
#include "StoreTest.h"
#include "vemo-access-token.h"

namespace {

// What the functions below return, where the tests need more than one result.
int g_nNames = 0;
int g_nSymbols = 0;
int g_nList = 0;
std::function<Json::ValueType()> g_typeOfObjects; // when set

} // namespace

int VEMO_ACCESS_TOKEN::fillDefaultValue(Json::Value&, bool)
{
    return -1;
}

int VEMO_ACCESS_TOKEN::getTimeAfterNow(int, long&)
{
    return -1;
}

int AccessTokenDbApi::SqlExpandCreateTable(std::string&)
{
    return -1;
}

int AccessTokenDbApi::SqlExpandMemberName(std::string&)
{
    return g_nNames;
}

int AccessTokenDbApi::SqlExpandMemberSymbol(std::string& strSql)
{
    strSql.clear();
    return g_nSymbols;
}

int AccessTokenDbApi::tokenGetOne(const char*, std::string&, Json::Value&)
{
    return -7;
}

int AccessTokenApi::VectorParamToJson(std::vector<std::string>&, const char*, Json::Value&)
{
    return g_nList;
}

int VemoAccessTokenGrantEx(std::string&, const char*, const char*, Json::Value&)
{
    return 0;
}

// Of the JSON library.
__attribute__((visibility("default"))) Json::ValueType Json::Value::type() const
{
    typedef Json::ValueType Function(const Json::Value*);
    static auto* const pType = reinterpret_cast<Function*>(dlsym(RTLD_NEXT, "_ZNK4Json5Value4typeEv"));
    const Json::ValueType type = pType(this);
    return Json::objectValue == type && g_typeOfObjects ? g_typeOfObjects() : type;
}

namespace {

class Interposed : public TableTest {};

TEST_F(Interposed, FailuresArePassedOn)
{
    const std::string strGetOne = "0 > (rv = m_pDb->tokenGetOne(\"tid\", strTid, jTokenOut))";
    const std::string strSummary = ordinary(SERVICE, "tokenDeleteByArray failed, name=tid, strVector=a,b");
    unsigned int uid = 1000;
    std::string strTid = tid(), strFunction = "VPN", strTime = "before";
    Texts values{"a", "b"};
    Json::Value jToken = token(), jAll(Json::objectValue), jArray(Json::arrayValue), jNull;
    char szUser[] = "before";
    insert();
    m_db.m_strSql = "earlier";

    EXPECT_FAILURE(VEMO_ACCESS_TOKEN::getTimeAfterNow(3600, strTime),
                   failed(UTIL, "0 > getTimeAfterNow(offsetSecond, now)"));
    EXPECT_EQ("before", strTime);
    EXPECT_FAILURE(m_db.createTable(), failed(STORE, "0 > AccessTokenDbApi::SqlExpandCreateTable(strSql)"));
    g_nNames = -1;
    EXPECT_FAILURE(m_db.tokenGet(jAll, jArray),
                   failed(STORE, "0 > SqlExpandMemberName(VEMO_ATOKEN_SELECT_SQL)"));
    EXPECT_FAILURE(m_db.tokenSave(jToken, true), failed(STORE, "0 > SqlExpandMemberName(strSqlPrefix)"));
    g_nNames = 0;
    g_nSymbols = -1;
    EXPECT_FAILURE(m_db.tokenSave(jToken, true), failed(STORE, "0 > SqlExpandMemberSymbol(strSqlPrefix)"));
    g_nSymbols = 0;
    EXPECT_FAILURE(m_db.tokenSave(jToken, true), failed(STORE, "!szSql || !szSql[0]"));
    EXPECT_FAILURE(api().tokenCreateByTid(uid, strFunction, jNull, strTid),
                   failed(SERVICE, "0 > fillDefaultValue(jParam, false)"),
                   ordinary(SERVICE, "tokenCreate failed, tid=" + strTid +
                                         ", uid=1000, strFunction=VPN, jTokenOption=null"));
    EXPECT_EQ(-7, api().tokenGetByTid(strTid, jToken)); // any negative result of the store
    EXPECT_FAILURE(
        api().tokenUpdateByTid(strTid, jToken),
        allFailed(SERVICE, {strGetOne, strGetOne, "0 > (nCount = tokenGetByTid(strTid, jToken))"}));
    // Even if the filter is wrong, a deletion by value never empties the table.
    g_nList = -1;
    EXPECT_FAILURE(api().tokenGetByTidArray(values, jArray),
                   failed(SERVICE, "0 > VectorParamToJson(strTidVector, \"tid\", jParam)"));
    EXPECT_FAILURE(api().tokenDeleteByArray(values, "tid"),
                   failed(SERVICE, "0 > VectorParamToJson(strVector, szName, jParam)"), strSummary);
    g_nList = 0;
    EXPECT_FAILURE(api().tokenDeleteByArray(values, "tid"), failed(STORE, "strSql.empty()"),
                   failed(SERVICE, "0 > (err = m_pDb->tokenDelete(jParam))"), strSummary);
    // A grant that returns a record without a uid.
    EXPECT_FAILURE(VemoAccessTokenGrant(strTid, "Api", "get", szUser, sizeof(szUser)),
                   failed(WRAPPER, "!jToken.isMember(\"uid\")"));
    EXPECT_STREQ("before", szUser);
    EXPECT_EQ("earlier", m_db.m_strSql);
    EXPECT_EQ(Texts{}, seam().callsOf({"sqlite3_exec", "getpwuid_r"}));
    EXPECT_EQ("t", tids());
}

TEST_F(Interposed, OpeningSucceedsWithoutATable)
{
    query("DROP TABLE token");
    ASSERT_EQ(0, unlink(path().c_str()));
    EXPECT_EQ(0, m_db.initDb());
    EXPECT_LINES(failed(STORE, "0 > SqlExpandCreateTable(strSql)", ENOENT));
    EXPECT_EQ((Texts{UID, RAISE, ACCESS, TOUCH, CHMOD, OPEN, RAISE}), seam().callsOf(OPENING_CALLS));
}

// A new record is always an object, so only a wrong answer fails the check, which asks once or twice.
TEST_F(Interposed, RowsBecomeRecordsThatAreObjectsOrNull)
{
    Json::Value jAll(Json::objectValue);
    SqlCallback pDecoder = nullptr;
    seam().sqliteExec = [&](sqlite3*, const char*, SqlCallback pCallback, void*, char**) {
        pDecoder = pCallback;
        return SQLITE_OK;
    };
    Json::Value jArray;
    ASSERT_EQ(0, m_db.tokenGet(jAll, jArray));
    char szName[] = "tid", szValue[] = "a";
    char *names[] = {szName}, *values[] = {szValue};
    for (const Json::ValueType type : {Json::arrayValue, Json::nullValue}) {
        g_typeOfObjects = [type, nLies = 2]() mutable { return 0 < nLies-- ? type : Json::objectValue; };
        EXPECT_EQ(Json::nullValue == type ? 0 : -1, pDecoder(&jArray, 1, values, names));
        g_typeOfObjects = nullptr;
    }
    EXPECT_EQ(json(R"([{"tid":"a"}])"), jArray);
    EXPECT_LINES(allFailed(STORE, {"jToken.type() != Json::objectValue && jToken.type() != Json::nullValue",
                                   "0 > (iTmp = FillField(*pjToken, column_name, column_value, i))",
                                   "0 > FillToken(&jTmp, n_column, column_value, column_name)"}));
}

} // namespace
