// The service object: its database, what it does without one, and what its lookups and deletions refuse.

#include <type_traits>

#include "AccessTokenUtil.h"
#include "Statements.h"
#include "StoreTest.h"

// Compiled callers expect the object to have the size of a pointer.
static_assert(sizeof(AccessTokenApi) == sizeof(void*));
static_assert(!std::is_polymorphic_v<AccessTokenApi>);
static_assert(!std::is_copy_constructible_v<AccessTokenApi> && !std::is_copy_assignable_v<AccessTokenApi>);

namespace {

const std::string RUN_FAILED = "0 > runSql(FillList, &jTokenArrayOut)";
const Json::Value UNTOUCHED = "what the caller had";

class ServiceObject : public StoreTest {};

TEST_F(ServiceObject, OpensAgainAfterAFailedOpening)
{
    Json::Value jFilter;
    Json::Value jTokens(Json::arrayValue);
    seam().fail("seteuid", EPERM, 1, 4); // each opening raises the uid and restores it
    AccessTokenApi api;
    EXPECT_LINES(NOT_ROOT);
    EXPECT_FAILURE(api.tokenList(jFilter, jTokens),
                   Texts{NOT_ROOT} + allFailed(STORE, {"0 > initDb()", RUN_FAILED}, EPERM) +
                       Texts{failed(SERVICE, "0 > m_pDb->tokenGet(jFilter, jTokenArrayOut)", EPERM)});
    EXPECT_EQ(Texts{}, seam().callsOf({"access", "sqlite3_open"}));
    EXPECT_EQ(0, api.tokenList(jFilter, jTokens));
    EXPECT_EQ((Texts{OPEN}), seam().callsOf({"sqlite3_open"}));
}

// A caller may still have to report the failure of its last operation.
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

// The service has no store, SQLite refuses a statement, or a statement had to wait for a lock and has taken
// effect. Each level logs a line, up to the operation.
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
    unsigned int uid = 1000;
    std::string strTid = "t", strLast = "last", strSid = "S1", strFunction = "VPN", strNew = tid();
    Texts tids{"t"};
    Json::Value jNull;
    Json::Value jAll(Json::objectValue);
    Json::Value jArray(Json::arrayValue);
    Json::Value jOut = UNTOUCHED;
    Json::Value jToken = counted(2);
    Json::Value jSaved = counted(1);
    Json::Value jLastUse = token(R"({"tid":"last","count":1})");
    const std::string strInsert = saveSql("INSERT", created(strNew));
    const std::string strReplace = saveSql("REPLACE", jSaved);

    // The conditions that fail after a statement: in the store, and the last in the service.
    const Texts toCreate = {"0 > runSql()", "0 > m_pDb->tokenCreate(jParam)"};
    const Texts toUpdate = {"0 > runSql()", "0 > m_pDb->tokenUpdate(jToken)"};
    const Texts toDelete = {"0 > (err = runSql())", "0 > (err = m_pDb->tokenDelete(jParam))"};
    const Texts toList = {RUN_FAILED, "0 > m_pDb->tokenGet(jFilter, jTokenArrayOut)"};
    const Texts toGetAll = {RUN_FAILED, "0 > m_pDb->tokenGet(jParam, jTokenArrayOut)"};
    const Texts toGet = {RUN_FAILED, "0 > tokenGet(jParam, jTokenArray)",
                         "0 > (rv = m_pDb->tokenGetOne(\"tid\", strTid, jTokenOut))"};
    // What the service logs after them.
    const Texts notCreated = {"tokenCreate failed, tid=" + strNew +
                              ", uid=1000, strFunction=VPN, jTokenOption=null"};
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
        if (strSql == seam().statements().front()) { // only the first statement can fail for lack of a store
            reset();
            EXPECT_FAILURE(operate(apiWithoutStore), lines(Texts{"!m_pDb"} + above, 0));
            EXPECT_EQ(Texts{}, seam().callsOf(OPENING_CALLS));
        }
    };
#define CALL(operation) [&](AccessTokenApi& a) { return a.operation; }
    fails(CALL(tokenCreateByTid(uid, strFunction, jNull, strNew)), strInsert, toCreate, notCreated);
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
    EXPECT_EQ(3u, takeLines().size()); // they contain a random id
    EXPECT_EQ("t", strTid);
    EXPECT_FAILURE(apiWithoutStore.cleanExpireToken(true), failed(SERVICE, "!m_pDb"));
    EXPECT_EQ(-1, apiWithoutStore.cleanExpireToken(false));
    VEMO_ACCESS_TOKEN::debugInfo(true);
    EXPECT_FAILURE(apiWithoutStore.cleanExpireToken(false),
                   fail(SERVICE, "run fail 0 > m_pDb->cleanExpireToken(blLogErr)"));
    // These need no store.
    EXPECT_EQ(0, apiWithoutStore.VectorParamToJson(tids, "tid", jAll));
    EXPECT_EQ(0, apiWithoutStore.tokenCountDegrade(jToken = counted(-1)));
}

// The test of the model shows what is found and deleted.
class Arguments : public TableTest {};

TEST_F(Arguments, OfLookupsAreCheckedInOrder)
{
    const std::string strFilter = "jFilter.type() != Json::objectValue && jFilter.type() != Json::nullValue";
    const std::string strList = "jTokenArrayOut.type() != Json::arrayValue";
    const std::string strParam =
        "jParamOut.type() != Json::objectValue && jParamOut.type() != Json::nullValue";
    const std::string strName = "!szField || !szField[0]";
    std::string strEmpty;
    Texts none;
    Json::Value jNull, jText = UNTOUCHED, jArray(Json::arrayValue);
    const auto refuses = [](int nResult, const std::string& strCondition) {
        EXPECT_EQ(-1, nResult);
        EXPECT_LINES(failed(SERVICE, strCondition));
    };
    refuses(api().tokenList(jText, jText), strFilter);
    refuses(api().tokenList(jNull, jText), strList);
    refuses(api().tokenList(jNull, jNull), strList);
    refuses(api().tokenGetByTid(strEmpty, jText), "strTid.empty()");
    refuses(api().tokenGetByTidArray(none, jNull), strList);
    refuses(api().tokenGetByTidArray(none, jArray), "0 >= strTidVector.size()");
    refuses(api().VectorParamToJson(none, nullptr, jText), strParam);
    refuses(api().VectorParamToJson(none, nullptr, jNull), strName);
    refuses(api().VectorParamToJson(none, "", jNull), strName);
    EXPECT_EQ(UNTOUCHED, jText);
    EXPECT_EQ(Texts{}, seam().calls);
    // A list of ids is taken for one text.
    Texts ids = {"a", "b"};
    insert(R"({"tid":"a'b"})");
    EXPECT_EQ(0, api().tokenGetByTidArray(ids, jArray));
    EXPECT_EQ(token(R"({"tid":"a'b"})"), jArray[0]);
}

TEST_F(Arguments, OfDeletionsAreCheckedInOrder)
{
    const std::string strField = "!jType.isMember(szName)";
    const std::string strNoName = "!szName || !szName[0]";
    const std::string strNoString = "jType[szName][0].asString() != \"string\"";
    // The operation's own line shows its arguments.
    const auto byArray = [&](Texts values, const char* szName, const std::string& strCondition,
                             const std::string& strShown) {
        EXPECT_FAILURE(api().tokenDeleteByArray(values, szName), failed(SERVICE, strCondition, EACCES),
                       ordinary(SERVICE, "tokenDeleteByArray failed, " + strShown));
    };
    const auto byName = [&](std::string strValue, const char* szName, const std::string& strCondition,
                            const std::string& strShown) {
        EXPECT_FAILURE(api().tokenDeleteByName(strValue, szName), failed(SERVICE, strCondition, EACCES),
                       ordinary(SERVICE, "tokenDeleteByName failed, " + strShown));
    };
    errno = EACCES;
    byArray({}, nullptr, "0 >= strVector.size()", "name=(null), strVector=");
    byArray({"a", "b", "c"}, nullptr, strNoName, "name=(null), strVector=a,b,c");
    byArray({"a", "b", "c"}, "", strNoName, "name=, strVector=a,b,c");
    byArray({"a"}, "x", strField, "name=x, strVector=a");
    byArray({"a,b", "%s%n"}, "create_time", strNoString, "name=create_time, strVector=a,b,%s%n");
    byName("", nullptr, "strValue.empty()", "name=(null), strValue=");
    byName("a", nullptr, strNoName, "name=(null), strValue=a");
    byName("a", "", strNoName, "name=, strValue=a");
    byName("a", "x", strField, "name=x, strValue=a");
    // tokenDeleteByName leaves the check of the type to tokenDeleteByArray, and both log.
    std::string strUid = "1000";
    EXPECT_FAILURE(api().tokenDeleteByName(strUid, "uid"), failed(SERVICE, strNoString, EACCES),
                   ordinary(SERVICE, "tokenDeleteByArray failed, name=uid, strVector=1000"),
                   failed(SERVICE, "0 > (err = tokenDeleteByArray(strVector, szName))", EACCES),
                   ordinary(SERVICE, "tokenDeleteByName failed, name=uid, strValue=1000"));
    EXPECT_EQ(Texts{}, seam().statements());
    // The present table of types decides.
    VEMO_ACCESS_TOKEN::tokenType()["uid"][0] = "string";
    EXPECT_EQ(0, api().tokenDeleteByName(strUid, "uid"));
}

} // namespace
