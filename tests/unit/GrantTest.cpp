// Granting tokens: who is granted what, how the uses are counted, and how the store's failures show.

#include <cstring>
#include <functional>

#include "AccessTokenUtil.h"
#include "Statements.h"
#include "StoreTest.h"

using VEMO_ACCESS_TOKEN::debugInfo;

namespace {

const Json::Value UNTOUCHED = "what the caller had";
const std::string SELECT_T = selectSql("t");
const std::string DELETE_T = deleteSql("tid", "t");
const std::string NOT_PERMITTED =
    failed(SERVICE, "0 > (err = checkPermission(jToken, szWebapiName, szWebapiMethod))");

std::string refused(const std::string& strTid, const std::string& strApi, const std::string& strMethod)
{
    return ordinary(SERVICE, "token grant failed!!, strTid=" + strTid + ", szWebapiName=" + strApi +
                                 ", szWebapiMethod=" + strMethod);
}

class Grant : public TableTest {
protected:
    int grant(std::string strTid = "t", const char* szApi = "Api", const char* szMethod = "get")
    {
        m_jToken = UNTOUCHED;
        return api().tokenGrant(strTid, szApi, szMethod, m_jToken);
    }

    Json::Value m_jToken;
};

TEST_F(Grant, SpendsOneUse)
{
    // A grant runs the statement besides the SELECT.
    const auto spends = [&](Json::Int64 nCount, const char* szStored, Json::Int64 nHandedBack,
                            const std::string& strStatement) {
        SCOPED_TRACE(nCount);
        query("DELETE FROM token");
        insert(text(counted(nCount)));
        seam().calls.clear();
        EXPECT_EQ(0, grant());
        EXPECT_EQ(szStored, countOf());
        EXPECT_EQ(counted(nHandedBack), m_jToken);
        EXPECT_EQ(Texts{SELECT_T} + (strStatement.empty() ? Texts{} : Texts{strStatement}),
                  seam().statements());
    };
    spends(3, "2", 2, saveSql("REPLACE", counted(2)));
    spends(2, "1", 1, saveSql("REPLACE", counted(1)));
    spends(1, "", 1, DELETE_T);
    spends(0, "", 0, DELETE_T);
    spends(-1, "-1", -1, "");
    spends(INT64_MIN, "-9223372036854775808", INT64_MIN, "");
    spends(INT64_MAX, "9223372036854775806", INT64_MAX - 1, saveSql("REPLACE", counted(INT64_MAX - 1)));
}

TEST_F(Grant, IsTracedInDebugMode)
{
    const std::string strReplace = saveSql("REPLACE", counted(1));
    const Texts found = {ordinary(STORE, "run sql=" + SELECT_T), ordinary(SERVICE, "get token tid=t")};
    insert(R"({"count":2})");
    debugInfo(true);
    EXPECT_EQ(0, grant());
    EXPECT_LINES(found + Texts{ordinary(STORE, "tokenSave, blCreate=0, jParam=" + text(counted(1))),
                               ordinary(STORE, "run sql=" + strReplace),
                               ordinary(STORE, "run sql=" + strReplace),
                               ordinary(STORE, "change rv=1, run sql=" + strReplace),
                               ordinary(SERVICE, "token grant success!!")});
    EXPECT_EQ(0, grant());
    EXPECT_LINES(found + Texts{ordinary(STORE, "run sql=" + DELETE_T),
                               ordinary(STORE, "change rv=1, run sql=" + DELETE_T),
                               ordinary(STORE, "delete token number=1"),
                               ordinary(SERVICE, "token grant success!!")});
}

TEST_F(Grant, RefusesAndSpendsNothing)
{
    const std::string strNoTid = failed(SERVICE, "strTid.empty()");
    const std::string strNoApi = failed(SERVICE, "!szWebapiName || !szWebapiName[0]");
    const std::string strRecord = ordinary(UTIL, "jToken=" + text(token()));
    const Texts found = {ordinary(STORE, "run sql=" + SELECT_T), ordinary(SERVICE, "get token tid=t")};
    const Texts unlistedApi = {ordinary(UTIL, "webapi=api not in allow list, jToken=" + text(token())),
                               strRecord};
    const auto unlisted = [&](const std::string& strMethod) {
        return found + Texts{ordinary(UTIL, "webapi=Api , method=" + strMethod +
                                                ", not in allow list, jToken=" + text(token())),
                             refused("t", "Api", strMethod)};
    };
    insert();
    for (const bool blDebug : {false, true}) {
        debugInfo(blDebug);
        const auto refuses = [&](const char* szTid, const char* szApi, const char* szMethod,
                                 const Texts& lines, const Texts& debugLines) {
            EXPECT_FAILURE(grant(szTid, szApi, szMethod), blDebug ? debugLines : lines);
            EXPECT_EQ(UNTOUCHED, m_jToken);
        };
        refuses("", "Api", "get", {strNoTid}, {strNoTid, refused("", "Api", "get")});
        refuses("", nullptr, nullptr, {strNoTid}, {strNoTid, refused("", "(null)", "(null)")});
        refuses("t", nullptr, "get", {strNoApi}, {strNoApi, refused("t", "(null)", "get")});
        refuses("t", "", "", {strNoApi}, {strNoApi, refused("t", "", "")});
        refuses("z", "Api", "get", {},
                {ordinary(STORE, "run sql=" + selectSql("z")), refused("z", "Api", "get")});
        refuses(
            "' or ''='", "Api", "get", {},
            {ordinary(STORE, "run sql=" + selectSql("'' or ''''=''")), refused("' or ''='", "Api", "get")});
        refuses("t", "api", nullptr, {NOT_PERMITTED},
                found + unlistedApi + Texts{NOT_PERMITTED, refused("t", "api", "(null)")});
        for (const char* szMethod : {"put", "Get", "ge"}) {
            refuses("t", "Api", szMethod, {}, unlisted(szMethod));
        }
    }
    EXPECT_EQ((Texts{row(token())}), query("SELECT * FROM token"));
    EXPECT_EQ(Texts{}, seam().callsOf({"sqlite3_changes"})); // nothing but a SELECT was run
}

TEST_F(Grant, RefusesRecordsThatAreMalformed)
{
    insert();
    for (const char* szAllow : {"[]", "[\"Api\"]", "\"Api\"", "7", "null", "true"}) {
        query(std::string("UPDATE token SET webapi_allow = '") + szAllow + "'");
        EXPECT_FAILURE(grant("t", "Api", nullptr),
                       failed(UTIL, "jToken[\"webapi_allow\"].type() != Json::objectValue"), NOT_PERMITTED);
    }
    query(R"(UPDATE token SET webapi_allow = '{"Api":{"method":[{}]}}')");
    EXPECT_THROW(grant(), Json::LogicError);
    EXPECT_EQ(UNTOUCHED, m_jToken);
    EXPECT_EQ("3", countOf());

    // A table that another program made may lack columns.
    const std::string strDegrade = failed(SERVICE, "0 > tokenCountDegrade(jToken)");
    const std::pair<const char*, Texts> parts[] = {
        {"uid", {failed(UTIL, "!jToken.isMember(\"webapi_allow\")"), NOT_PERMITTED}},
        {"'{}' AS webapi_allow", {NOT_PERMITTED}},
        {"'{\"Api\":{}}' AS webapi_allow", {failed(SERVICE, "!jToken.isMember(\"uid\")")}},
        {"'{\"Api\":{}}' AS webapi_allow, uid", {failed(SERVICE, "!jToken.isMember(\"count\")"), strDegrade}},
        {"'{\"Api\":{}}' AS webapi_allow, uid, 1 AS count",
         {failed(SERVICE, "!jToken.isMember(\"tid\")"), strDegrade}},
    };
    for (const auto& part : parts) {
        SCOPED_TRACE(part.first);
        seam().sqliteExec = [&](sqlite3* pDb, const char*, SqlCallback callback, void* pArgument,
                                char** pszError) {
            return Seam::exec(pDb, ("SELECT " + std::string(part.first) + " FROM token").c_str(), callback,
                              pArgument, pszError);
        };
        EXPECT_FAILURE(grant("t", "Api", nullptr), part.second);
        EXPECT_EQ(UNTOUCHED, m_jToken);
    }
}

// Nothing is locked between the lookup and the change: another process may come in between.
TEST_F(Grant, OverlapsWithOthersAndLosesWhatTheyDid)
{
    const auto grantElsewhere = [] {
        std::string strTid = "t";
        Json::Value jToken;
        EXPECT_EQ(0, AccessTokenApi().tokenGrant(strTid, "Api", "get", jToken));
    };
    const auto overlaps = [&](int nCount, const std::function<void()>& meanwhile, const char* szStored,
                              int nHandedBack) {
        query("DELETE FROM token");
        insert(text(counted(nCount)));
        beforeStatements([run = meanwhile](const std::string& strSql) mutable {
            if (0 != strSql.find("SELECT")) {
                std::exchange(run, [] {})();
            }
        });
        EXPECT_EQ(0, grant());
        EXPECT_EQ(szStored, countOf());
        EXPECT_EQ(counted(nHandedBack), m_jToken);
    };
    overlaps(3, grantElsewhere, "2", 2); // two grants spend one use
    overlaps(1, grantElsewhere, "", 1);  // both spend the last use
    overlaps(
        3, [&] { query("DELETE FROM token"); }, "2", 2);
}

// Counting by itself, also of records that come from no table

TEST_F(Grant, CountNeedsNothingButTidAndCount)
{
    const std::string strCount = failed(SERVICE, "!jToken.isMember(\"count\")");
    const std::string strObject = failed(SERVICE, "jToken.type() != Json::objectValue");
    const std::string strTid = failed(SERVICE, "!jToken.isMember(\"tid\")");
    const std::string strString = failed(SERVICE, "jToken[\"tid\"].type() != Json::stringValue");
    const std::pair<const char*, Texts> rows[] = {
        {"null", {strObject}},
        {"\"count\"", {strObject}},
        {"{}", {strCount}},
        {R"({"count":1})", {strTid}},
        {R"({"count":1,"tid":7})", {strString}},
        {R"({"count":1,"tid":""})",
         {failed(SERVICE, "strValue.empty()"),
          ordinary(SERVICE, "tokenDeleteByName failed, name=tid, strValue="),
          failed(SERVICE, "0 > tokenDeleteByTid(strTid)")}},
    };
    for (const bool blDebug : {false, true}) {
        debugInfo(blDebug);
        for (const auto& [szRecord, lines] : rows) {
            SCOPED_TRACE(szRecord);
            Json::Value jToken = json(szRecord);
            EXPECT_EQ(-1, api().tokenCountDegrade(jToken));
            const Texts debug = {
                ordinary(SERVICE, std::string("tokenCountDegrade failed, jToken=") + szRecord)};
            EXPECT_LINES(lines + (blDebug ? debug : Texts{}));
            EXPECT_EQ(json(szRecord), jToken);
        }
    }
    for (const char* szRecord :
         {R"({"count":"2","tid":"t"})", R"({"count":18446744073709551615,"tid":"t"})"}) {
        Json::Value jToken = json(szRecord);
        EXPECT_THROW(api().tokenCountDegrade(jToken), Json::LogicError);
        EXPECT_EQ(json(szRecord), jToken);
    }
    for (const char* szRecord :
         {R"({"count":-1})", R"({"count":1,"tid":"gone"})"}) { // tid and count are enough
        Json::Value jToken = json(szRecord);
        EXPECT_EQ(0, api().tokenCountDegrade(jToken));
        EXPECT_EQ(json(szRecord), jToken);
    }
    Json::Value jWhole = counted(3);
    EXPECT_EQ(0, api().tokenCountDegrade(jWhole));
    EXPECT_EQ(counted(2), jWhole);
    seam().calls.clear();
    takeLines(); // of debug mode
    // The count is lowered before the record is saved, and stays so when the save refuses the record.
    Json::Value jToken = json(R"({"count":2,"tid":"t"})");
    EXPECT_EQ(-1, api().tokenCountDegrade(jToken));
    EXPECT_EQ(json(R"({"count":1,"tid":"t"})"), jToken);
    EXPECT_LINES(ordinary(fieldList(4), "lost data member=bind_sid"),
                 failed(SERVICE, "0 > fillDefaultValue(jToken, true)"),
                 ordinary(SERVICE, R"(tokenSaveByOverwrite failed, jToken={"count":1,"tid":"t"})"),
                 failed(SERVICE, "0 > tokenSaveByOverwrite(jToken)"),
                 ordinary(SERVICE, R"(tokenCountDegrade failed, jToken={"count":1,"tid":"t"})"));
    EXPECT_EQ(Texts{}, seam().statements());
}

} // namespace
