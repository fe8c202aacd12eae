// Granting tokens: what is run, refused and logged. The test of the model shows which calls are granted, and
// how many uses are left.

#include <functional>

#include "AccessTokenUtil.h"
#include "Statements.h"
#include "StoreTest.h"

using VEMO_ACCESS_TOKEN::debugInfo;

namespace {

const Json::Value UNTOUCHED = "what the caller had";
const std::string DELETE_T = deleteSql("tid", "t");
const std::string NOT_PERMITTED =
    failed(SERVICE, "0 > (err = checkPermission(jToken, szWebapiName, szWebapiMethod))");
const std::string NO_COUNT = failed(SERVICE, "!jToken.isMember(\"count\")");
const std::string NO_TID = failed(SERVICE, "!jToken.isMember(\"tid\")");
const Texts FOUND = {ordinary(STORE, "run sql=" + selectSql("t")), ordinary(SERVICE, "get token tid=t")};

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

TEST_F(Grant, SpendsOneUseAndLogsTheStepsInDebugMode)
{
    const std::string strReplace = saveSql("REPLACE", counted(1));
    const std::string strSuccess = ordinary(SERVICE, "token grant success!!");
    debugInfo(true);
    const auto spends = [&](int nCount, const char* szStored, int nHandedBack, const Texts& change) {
        SCOPED_TRACE(nCount);
        query("DELETE FROM token");
        insert(text(counted(nCount)));
        EXPECT_EQ(0, grant());
        EXPECT_EQ(szStored, countOf());
        EXPECT_EQ(counted(nHandedBack), m_jToken);
        EXPECT_LINES(FOUND + change + Texts{strSuccess});
    };
    const Texts deletion = {ordinary(STORE, "run sql=" + DELETE_T),
                            ordinary(STORE, "change rv=1, run sql=" + DELETE_T),
                            ordinary(STORE, "delete token number=1")};
    spends(2, "1", 1,
           {ordinary(STORE, "tokenSave, blCreate=0, jParam=" + text(counted(1))),
            ordinary(STORE, "run sql=" + strReplace), ordinary(STORE, "run sql=" + strReplace),
            ordinary(STORE, "change rv=1, run sql=" + strReplace)});
    spends(1, "", 1, deletion);
    spends(0, "", 0, deletion);
    spends(-1, "-1", -1, {});
}

TEST_F(Grant, SpendsNothingWhenItRefuses)
{
    const std::string strNoTid = failed(SERVICE, "strTid.empty()");
    const std::string strNoApi = failed(SERVICE, "!szWebapiName || !szWebapiName[0]");
    const std::string strRecord = "jToken=" + text(token());
    const Texts unlistedApi = {ordinary(UTIL, "webapi=api not in allow list, " + strRecord),
                               ordinary(UTIL, strRecord), NOT_PERMITTED};
    insert();
    for (const bool blDebug : {false, true}) {
        debugInfo(blDebug);
        const auto refuses = [&](const char* szTid, const char* szApi, const char* szMethod,
                                 const Texts& lines, const Texts& debugLines) {
            EXPECT_FAILURE(grant(szTid, szApi, szMethod), blDebug ? debugLines : lines);
            EXPECT_EQ(UNTOUCHED, m_jToken);
        };
        refuses("", nullptr, nullptr, {strNoTid}, {strNoTid, refused("", "(null)", "(null)")});
        refuses("t", nullptr, "get", {strNoApi}, {strNoApi, refused("t", "(null)", "get")});
        refuses("t", "", "", {strNoApi}, {strNoApi, refused("t", "", "")});
        refuses("z", "Api", "get", {},
                {ordinary(STORE, "run sql=" + selectSql("z")), refused("z", "Api", "get")});
        refuses("t", "api", nullptr, {NOT_PERMITTED},
                FOUND + unlistedApi + Texts{refused("t", "api", "(null)")});
        refuses("t", "Api", "put", {},
                FOUND + Texts{ordinary(UTIL, "webapi=Api , method=put, not in allow list, " + strRecord),
                              refused("t", "Api", "put")});
    }
    EXPECT_EQ((Texts{row(token())}), rows());
}

// A table that another program has made may lack columns.
TEST_F(Grant, RefusesRecordsThatLackMembers)
{
    const std::string strDegrade = failed(SERVICE, "0 > tokenCountDegrade(jToken)");
    const std::pair<std::string, Texts> parts[] = {
        {"uid", {failed(UTIL, "!jToken.isMember(\"webapi_allow\")"), NOT_PERMITTED}},
        {"'{\"Api\":{}}' AS webapi_allow", {failed(SERVICE, "!jToken.isMember(\"uid\")")}},
        {"'{\"Api\":{}}' AS webapi_allow, uid", {NO_COUNT, strDegrade}},
        {"'{\"Api\":{}}' AS webapi_allow, uid, 1 AS count", {NO_TID, strDegrade}},
    };
    insert();
    for (const auto& part : parts) {
        SCOPED_TRACE(part.first);
        seam().sqliteExec = [&](sqlite3* pDb, const char*, SqlCallback callback, void* pArgument,
                                char** pszError) {
            return Seam::exec(pDb, ("SELECT " + part.first + " FROM token").c_str(), callback, pArgument,
                              pszError);
        };
        EXPECT_FAILURE(grant("t", "Api", nullptr), part.second);
        EXPECT_EQ(UNTOUCHED, m_jToken);
    }
}

// Nothing is locked between the lookup and the change: another process can make a change in between.
TEST_F(Grant, OverwritesOverlappingChanges)
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

// The counting alone, also for records that are not from a table. With a use left, a save needs all fields;
// if the save is refused, the count in the record stays lowered.
TEST_F(Grant, CountNeedsOnlyTidAndCountAtTheLastUse)
{
    const struct {
        const char *szRecord, *szAfter;
        Texts lines;
    } rows[] = {
        {"null", "null", {failed(SERVICE, "jToken.type() != Json::objectValue")}},
        {"{}", "{}", {NO_COUNT}},
        {R"({"count":1})", R"({"count":1})", {NO_TID}},
        {R"({"count":1,"tid":7})",
         R"({"count":1,"tid":7})",
         {failed(SERVICE, "jToken[\"tid\"].type() != Json::stringValue")}},
        {R"({"count":1,"tid":""})",
         R"({"count":1,"tid":""})",
         {failed(SERVICE, "strValue.empty()"),
          ordinary(SERVICE, "tokenDeleteByName failed, name=tid, strValue="),
          failed(SERVICE, "0 > tokenDeleteByTid(strTid)")}},
        {R"({"count":2,"tid":"t"})",
         R"({"count":1,"tid":"t"})",
         {ordinary(fieldList(4), "lost data member=bind_sid"),
          failed(SERVICE, "0 > fillDefaultValue(jToken, true)"),
          ordinary(SERVICE, R"(tokenSaveByOverwrite failed, jToken={"count":1,"tid":"t"})"),
          failed(SERVICE, "0 > tokenSaveByOverwrite(jToken)")}},
    };
    for (const bool blDebug : {false, true}) {
        debugInfo(blDebug);
        for (const auto& row : rows) {
            SCOPED_TRACE(row.szRecord);
            Json::Value jToken = json(row.szRecord);
            EXPECT_EQ(-1, api().tokenCountDegrade(jToken));
            EXPECT_EQ(json(row.szAfter), jToken);
            const std::string strDebug =
                ordinary(SERVICE, std::string("tokenCountDegrade failed, jToken=") + row.szAfter);
            EXPECT_LINES(row.lines + (blDebug ? Texts{strDebug} : Texts{}));
        }
    }
    EXPECT_EQ(Texts{}, seam().statements());
}

} // namespace
