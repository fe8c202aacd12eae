// The service object: its database, what it does without one, and how it looks tokens up.

#include <climits>
#include <type_traits>

#include "AccessTokenUtil.h"
#include "Statements.h"
#include "StoreTest.h"

// Compiled callers hold the object in the space of a pointer.
static_assert(sizeof(AccessTokenApi) == sizeof(void*));
static_assert(!std::is_polymorphic_v<AccessTokenApi>);
static_assert(!std::is_copy_constructible_v<AccessTokenApi> && !std::is_copy_assignable_v<AccessTokenApi>);

namespace {

const std::string RUN_FAILED = "0 > runSql(FillList, &jTokenArrayOut)";
const Json::Value UNTOUCHED = "what the caller had";

class ServiceObject : public StoreTest {};

TEST_F(ServiceObject, OpensTheDatabaseOfItsOwnAndClosesItAtItsEnd)
{
    for (const bool blNew : {true, false}) {
        seam().calls.clear();
        {
            AccessTokenApi api;
            EXPECT_EQ((Texts{"operator new", UID, RAISE, ACCESS}) +
                          (blNew ? Texts{TOUCH, CHMOD, OPEN, CREATE, CHANGES} : Texts{OPEN}) + Texts{RAISE},
                      seam().calls);
            seam().calls.clear();
            AccessTokenApi another;
            EXPECT_EQ((Texts{OPEN}), seam().callsOf({"sqlite3_open"}));
            seam().calls.clear();
        }
        EXPECT_EQ((Texts{CLOSE, CLOSE}), seam().calls);
    }
    EXPECT_EQ(Texts{}, rows());
}

TEST_F(ServiceObject, OpensAgainAfterAFailedOpening)
{
    Json::Value jFilter;
    Json::Value jTokens(Json::arrayValue);
    seam().fail("seteuid", EPERM, 1, 4); // each opening raises and puts back
    AccessTokenApi api;
    EXPECT_LINES(NOT_ROOT);
    EXPECT_FAILURE(api.tokenList(jFilter, jTokens),
                   NOT_OPENED +
                       Texts{failed(STORE, RUN_FAILED, EPERM),
                             failed(SERVICE, "0 > m_pDb->tokenGet(jFilter, jTokenArrayOut)", EPERM)});
    EXPECT_EQ(Texts{}, seam().callsOf({"access", "sqlite3_open"}));
    EXPECT_EQ(0, api.tokenList(jFilter, jTokens));
    EXPECT_EQ((Texts{OPEN}), seam().callsOf({"sqlite3_open"}));
}

// A caller may have a failure of its last operation still to report.
TEST_F(ServiceObject, KeepsErrnoAtItsEndAndTriesTwiceToClose)
{
    seam().sqliteClose = [](sqlite3* pDb) {
        const bool blFirst = 1 == seam().counts["sqlite3_close"];
        errno = blFirst ? EIO : errno;
        return blFirst ? SQLITE_BUSY : sqlite3_close(pDb);
    };
    {
        AccessTokenApi api;
        errno = EACCES;
    }
    EXPECT_EQ(EACCES, errno);
    EXPECT_EQ((Texts{CLOSE, CLOSE}), seam().callsOf({CLOSE}));
    EXPECT_LINES(failed(STORE, "SQLITE_OK != sqlite3_close(m_pDb)", EIO));
}

// Below the service there is no store, SQLite refuses a statement, or a statement had to wait for a lock and
// has taken effect. Each step tells of it, up to the operation.
class FailedStore : public TableTest {
protected:
    // Conditions of the service, and its operations' own lines, which say "failed".
    static Texts lines(const Texts& messages, int nErrno)
    {
        Texts lines;
        for (const std::string& strMessage : messages) {
            const bool blOwnLine = std::string::npos != strMessage.find(" failed, ");
            lines.push_back(blOwnLine ? ordinary(SERVICE, strMessage) : failed(SERVICE, strMessage, nErrno));
        }
        return lines;
    }
};

TEST_F(FailedStore, FailsEachOperation)
{
    unsigned int uid = 1026;
    std::string strTid = "t", strLast = "last", strSid = "S1", strFunction = "VPN", strNew = tid();
    Texts tids{"t"};
    Json::Value jNull;
    Json::Value jAll(Json::objectValue);
    Json::Value jArray(Json::arrayValue);
    Json::Value jOut = UNTOUCHED;
    Json::Value jToken = counted(2);
    Json::Value jSaved = counted(1);
    Json::Value jLastUse = token(R"({"tid":"last","count":1})");
    const std::string strInsert =
        saveSql("INSERT", json(R"({"bind_sid":"","count":1,"create_time":1700000000,"deadline":1700086400,
                                   "extra":{},"function":"VPN","tid":")" +
                               strNew + R"(","uid":1026,"webapi_allow":{}})"));
    const std::string strReplace = saveSql("REPLACE", jSaved);

    // The conditions above a statement: in the store, and the last at the service's call of the store.
    const Texts toCreate = {"0 > runSql()", "0 > m_pDb->tokenCreate(jParam)"};
    const Texts toUpdate = {"0 > runSql()", "0 > m_pDb->tokenUpdate(jToken)"};
    const Texts toDelete = {"0 > (err = runSql())", "0 > (err = m_pDb->tokenDelete(jParam))"};
    const Texts toList = {RUN_FAILED, "0 > m_pDb->tokenGet(jFilter, jTokenArrayOut)"};
    const Texts toGetAll = {RUN_FAILED, "0 > m_pDb->tokenGet(jParam, jTokenArrayOut)"};
    const Texts toGet = {RUN_FAILED, "0 > tokenGet(jParam, jTokenArray)",
                         "0 > (rv = m_pDb->tokenGetOne(\"tid\", strTid, jTokenOut))"};
    // What the service logs above that.
    const Texts created = {"tokenCreate failed, tid=" + strNew +
                           ", uid=1026, strFunction=VPN, jTokenOption=null"};
    const Texts saved = {"tokenSaveByOverwrite failed, jToken=" + text(jSaved)};
    const Texts overwritten = saved + Texts{"0 > tokenSaveByOverwrite(jToken)"};
    const auto byArray = [](const std::string& strName, const std::string& strValue) {
        return Texts{"tokenDeleteByArray failed, name=" + strName + ", strVector=" + strValue};
    };
    const auto byName = [&](const std::string& strName, const std::string& strValue) {
        return byArray(strName, strValue) +
               Texts{"0 > (err = tokenDeleteByArray(strVector, szName))",
                     "tokenDeleteByName failed, name=" + strName + ", strValue=" + strValue};
    };
    const Texts lastUsed = byName("tid", "last") + Texts{"0 > tokenDeleteByTid(strTid)"};
    const Texts degraded = {"0 > tokenCountDegrade(jToken)"};

    seam().fail("operator new", 0);
    AccessTokenApi apiWithoutStore;
    EXPECT_EQ((Texts{"operator new"}), seam().calls);
    EXPECT_LINES(ordinary(SERVICE, "new AccessTokenDbApi failed"));
    const auto fails = [&](const std::function<int(AccessTokenApi&)>& operate, const std::string& strSql,
                           const Texts& conditions, const Texts& above) {
        SCOPED_TRACE(strSql + joined(above, " "));
        const Texts inStore(conditions.begin(), conditions.end() - 1);
        const Texts inService = lines(Texts{conditions.back()} + above, EIO);
        query("DELETE FROM token");
        insert(R"({"count":2})");
        insert(R"({"tid":"last","count":1})");
        const Texts before = rows();
        seam().calls.clear();
        failStatements(strSql, DISK_ERROR);
        EXPECT_FAILURE(operate(api()), failureOf(strSql, DISK_ERROR.szError, EIO) +
                                           allFailed(STORE, inStore, EIO) + inService);
        EXPECT_EQ(before, rows());
        failStatements(strSql, LOCKED);
        EXPECT_FAILURE(operate(api()), Texts{fail(STORE, "sql error, sql=" + strSql, EIO)} +
                                           allFailed(STORE, Texts(inStore.begin() + 1, inStore.end()), EIO) +
                                           inService);
        EXPECT_EQ(0 == strSql.find("SELECT"), before == rows());
        EXPECT_EQ(UNTOUCHED, jOut);
        if (strSql == seam().statements().front()) { // without a store, nothing comes before
            reset();
            EXPECT_FAILURE(operate(apiWithoutStore), lines(Texts{"!m_pDb"} + above, 0));
            EXPECT_EQ(Texts{}, seam().callsOf(OPENING_CALLS));
        }
    };
#define CALL(operation) [&](AccessTokenApi& a) { return a.operation; }
    fails(CALL(tokenCreateByTid(uid, strFunction, jNull, strNew)), strInsert, toCreate, created);
    fails(CALL(tokenList(jAll, jArray)), SELECT + ";", toList, {});
    fails(CALL(tokenGetByTid(strTid, jNull)), selectSql("t"), toGet, {});
    fails(CALL(tokenGetByTidArray(tids, jArray)), SELECT + " WHERE  (tid in ('t' ) );", toGetAll, {});
    fails(CALL(tokenUpdateByTid(strTid, jAll)), selectSql("t"), toGet,
          {"0 > (nCount = tokenGetByTid(strTid, jToken))"});
    fails(CALL(tokenUpdateByTid(strTid, jSaved)), strReplace, toUpdate, overwritten);
    fails(CALL(tokenSaveByOverwrite(jSaved)), strReplace, toUpdate, saved);
    fails(CALL(tokenDeleteByArray(tids, "tid")), deleteSql("tid", "t"), toDelete, byArray("tid", "t"));
    fails(CALL(tokenDeleteByTidArray(tids)), deleteSql("tid", "t"), toDelete, byArray("tid", "t"));
    fails(CALL(tokenDeleteByName(strTid, "tid")), deleteSql("tid", "t"), toDelete, byName("tid", "t"));
    fails(CALL(tokenDeleteByTid(strTid)), deleteSql("tid", "t"), toDelete, byName("tid", "t"));
    fails(CALL(tokenDeleteByBindSid(strSid)), deleteSql("bind_sid", "S1"), toDelete,
          byName("bind_sid", "S1"));
    fails(CALL(tokenDeleteByFunction(strFunction)), deleteSql("function", "VPN"), toDelete,
          byName("function", "VPN"));
    fails(CALL(tokenGrant(strTid, "Api", "get", jOut)), selectSql("t"), toGet,
          {"0 > (err = tokenGetByTid(strTid, jToken))"});
    fails(CALL(tokenGrant(strTid, "Api", "get", jOut)), strReplace, toUpdate, overwritten + degraded);
    fails(CALL(tokenGrant(strLast, "Api", "get", jOut)), deleteSql("tid", "last"), toDelete,
          lastUsed + degraded);
    fails(CALL(tokenCountDegrade(jToken = counted(2))), strReplace, toUpdate, overwritten);
    fails(CALL(tokenCountDegrade(jLastUse)), deleteSql("tid", "last"), toDelete, lastUsed);
#undef CALL
    failStatements("DELETE", DISK_ERROR);
    EXPECT_FAILURE(api().tokenDeleteAll(), failureOf("DELETE FROM token;", DISK_ERROR.szError, EIO) +
                                               Texts{failed(STORE, "0 > (err = runSql())", EIO)});

    errno = 0;
    EXPECT_FAILURE(apiWithoutStore.tokenDeleteAll(), failed(SERVICE, "!m_pDb"));
    EXPECT_EQ(-1, apiWithoutStore.tokenCreate(uid, strFunction, jNull, strTid));
    EXPECT_EQ(3u, takeLines().size()); // they hold a random id
    EXPECT_EQ("t", strTid);
    EXPECT_FAILURE(apiWithoutStore.cleanExpireToken(true), failed(SERVICE, "!m_pDb"));
    EXPECT_EQ(-1, apiWithoutStore.cleanExpireToken(false));
    VEMO_ACCESS_TOKEN::debugInfo(true);
    EXPECT_FAILURE(apiWithoutStore.cleanExpireToken(false),
                   fail(SERVICE, "run fail 0 > m_pDb->cleanExpireToken(blLogErr)"));
    // These need none.
    EXPECT_EQ(0, apiWithoutStore.VectorParamToJson(tids, "tid", jAll));
    EXPECT_EQ(0, apiWithoutStore.tokenCountDegrade(jToken = counted(-1)));
}

// Looking tokens up. QueryTest shows how filters become statements.
class Lookup : public TableTest {
protected:
    void SetUp() override
    {
        TableTest::SetUp();
        insert();
        insert(R"({"tid":"a'b","deadline":1})"); // no lookup cares about deadlines
    }

    Json::Value m_jOut = json(R"({"left":"over"})");
    Json::Value m_jArray = json("[5]");
};

TEST_F(Lookup, ListsWhatTheFilterSelects)
{
    const std::pair<const char*, std::string> rows[] = {
        {"null", SELECT},
        {"{}", SELECT},
        {R"({"tid":"t","sort_by":"uid"})", SELECT + " WHERE  (tid='t' ) order by 'uid'"}};
    for (const auto& [szFilter, strSql] : rows) {
        Json::Value jFilter = json(szFilter);
        m_jArray = json("[5]");
        EXPECT_EQ(0, api().tokenList(jFilter, m_jArray));
        EXPECT_EQ(json(szFilter), jFilter);
        EXPECT_EQ(Json::Value(5), m_jArray[0]);
        EXPECT_EQ(token(), m_jArray[1]);
        EXPECT_EQ(strSql + ";", seam().statements().back());
    }
}

TEST_F(Lookup, ListRefusesArgumentsOfAWrongType)
{
    const char* szFilter = "jFilter.type() != Json::objectValue && jFilter.type() != Json::nullValue";
    const char* szArray = "jTokenArrayOut.type() != Json::arrayValue";
    const struct {
        const char *szFilter, *szArray, *szCondition;
    } rows[] = {{R"("tid")", "[]", szFilter}, {R"("")", "[]", szFilter}, {"[]", "[]", szFilter},
                {"0", "[]", szFilter},        {"false", "[]", szFilter}, {"5", "null", szFilter},
                {"null", "null", szArray},    {"null", "{}", szArray},   {"{}", "null", szArray},
                {"{}", R"("[]")", szArray}};
    for (const auto& row : rows) {
        SCOPED_TRACE(std::string(row.szFilter) + " " + row.szArray);
        Json::Value jFilter = json(row.szFilter);
        Json::Value jTokens = json(row.szArray);
        EXPECT_EQ(-1, api().tokenList(jFilter, jTokens));
        EXPECT_EQ(json(row.szFilter), jFilter);
        EXPECT_EQ(json(row.szArray), jTokens);
        EXPECT_LINES(failed(SERVICE, row.szCondition));
    }
    EXPECT_EQ(Texts{}, seam().statements());
}

TEST_F(Lookup, GetsATokenByItsId)
{
    std::string strTid = "t";
    EXPECT_EQ(1, api().tokenGetByTid(strTid, m_jOut));
    EXPECT_EQ(token(), m_jOut);
    for (std::string strUnknown : {"two", "T", "t ", "%", "x' OR '1'='1", "t'--"}) {
        m_jOut = json(R"({"left":"over"})");
        EXPECT_EQ(0, api().tokenGetByTid(strUnknown, m_jOut)) << strUnknown;
        EXPECT_EQ(json("{}"), m_jOut);
    }
    failStatements("SELECT", DISK_ERROR);
    m_jOut = json(R"({"left":"over"})");
    EXPECT_EQ(-1, api().tokenGetByTid(strTid, m_jOut));
    EXPECT_EQ(json("{}"), m_jOut);
    takeLines();
    errno = 0;
    m_jOut = json(R"({"left":"over"})");
    EXPECT_EQ(-1, api().tokenGetByTid(strTid = "", m_jOut));
    EXPECT_EQ(json(R"({"left":"over"})"), m_jOut);
    EXPECT_LINES(failed(SERVICE, "strTid.empty()"));
}

// A list of several ids is one text, without separators.
TEST_F(Lookup, GetsOneTokenByAListOfIds)
{
    const struct {
        Texts ids;
        const char *szList, *szFound;
    } rows[] = {{{"t"}, "'t'", "t"}, {{"t", "a'b"}, "'t''a''b'", ""}, {{"a", "b"}, "'a''b'", "a'b"}};
    for (const auto& row : rows) {
        SCOPED_TRACE(row.szList);
        Texts ids = row.ids;
        m_jArray = json("[5]");
        EXPECT_EQ(0, api().tokenGetByTidArray(ids, m_jArray));
        EXPECT_EQ(Json::Value(5), m_jArray[0]);
        EXPECT_EQ(row.szFound[0] ? 2u : 1u, m_jArray.size());
        EXPECT_EQ(row.szFound, m_jArray.get(1U, Json::Value(Json::objectValue))["tid"].asString());
        EXPECT_EQ(row.ids, ids);
        EXPECT_EQ(SELECT + " WHERE  (tid in (" + row.szList + " ) );", seam().statements().back());
    }
    seam().calls.clear();
    Texts none;
    for (const char* szArray : {"null", "{}", R"("")", "0"}) {
        Json::Value jTokens = json(szArray);
        EXPECT_EQ(-1, api().tokenGetByTidArray(none, jTokens));
        EXPECT_EQ(json(szArray), jTokens);
        EXPECT_LINES(failed(SERVICE, "jTokenArrayOut.type() != Json::arrayValue"));
    }
    EXPECT_FAILURE(api().tokenGetByTidArray(none, m_jArray), failed(SERVICE, "0 >= strTidVector.size()"));
    EXPECT_EQ(Texts{}, seam().calls);
}

TEST_F(Lookup, MakesListsForFilters)
{
    const std::string strType =
        "jParamOut.type() != Json::objectValue && jParamOut.type() != Json::nullValue";
    const std::string strName = "!szField || !szField[0]";
    // The condition is that of the failure, "" when the list is made.
    const auto makes = [&](const Texts& list, const char* szField, const char* szParam, const char* szResult,
                           const std::string& strCondition) {
        SCOPED_TRACE(szResult);
        Texts values = list;
        Json::Value jParam = json(szParam);
        EXPECT_EQ(strCondition.empty() ? 0 : -1, api().VectorParamToJson(values, szField, jParam));
        EXPECT_EQ(json(szResult), jParam);
        EXPECT_EQ(list, values);
        EXPECT_LINES(strCondition.empty() ? Texts{} : Texts{failed(SERVICE, strCondition)});
    };
    makes({"a"}, "tid", "null", R"({"tid":["a"]})", "");
    makes({"b", "a", "b", ""}, "bind_sid", "{}", R"({"bind_sid":["b","a","b",""]})", "");
    makes({}, "tid", R"({"tid":["old"]})", R"({"tid":[]})", "");
    makes({"1"}, "tid", R"({"tid":"old","uid":5})", R"({"tid":["1"],"uid":5})", "");
    makes({"it's \""}, "no field", R"({"tid":"t"})", R"({"no field":["it's \""],"tid":"t"})", "");
    makes({"a"}, nullptr, "{}", "{}", strName);
    makes({"a"}, "", "null", "null", strName);
    makes({"a"}, "tid", "[]", "[]", strType);
    makes({"a"}, "tid", R"("")", R"("")", strType);
    makes({"a"}, "tid", "0", "0", strType);
    makes({"a"}, nullptr, "[]", "[]", strType);
}

} // namespace
