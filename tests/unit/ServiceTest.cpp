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

// An object whose store could not be allocated.
TEST_F(ServiceObject, FailsInEachOperationThatNeedsAStoreWithoutOne)
{
    seam().fail("operator new", 0);
    AccessTokenApi api;
    EXPECT_EQ((Texts{"operator new"}), seam().calls);
    EXPECT_LINES(ordinary(SERVICE, "new AccessTokenDbApi failed"));

    unsigned int uid = 1026;
    std::string strTid = tid();
    std::string strA = "a";
    Texts strVector{"a"};
    Json::Value jNull;
    Json::Value jObject(Json::objectValue);
    Json::Value jArray(Json::arrayValue);
    Json::Value jLastUse = token(R"({"tid":"a","count":1})");
    Json::Value jToken = token(R"({"tid":"a","count":2})");
    const std::string strCreate =
        "tokenCreate failed, tid=" + strTid + ", uid=1026, strFunction=a, jTokenOption=null";
    const std::string strSave = "tokenSaveByOverwrite failed, jToken=" + text(jLastUse);
    const auto byArray = [](const std::string& strName) {
        return Texts{"!m_pDb", "tokenDeleteByArray failed, name=" + strName + ", strVector=a"};
    };
    const auto byName = [&](const std::string& strName) {
        return byArray(strName) + Texts{"0 > (err = tokenDeleteByArray(strVector, szName))",
                                        "tokenDeleteByName failed, name=" + strName + ", strValue=a"};
    };
    // The messages are conditions, and the operations' own lines, which say "failed".
    const auto fails = [](int nResult, const Texts& messages) {
        EXPECT_EQ(-1, nResult);
        Texts lines;
        for (const std::string& strMessage : messages) {
            const bool blOwnLine = std::string::npos != strMessage.find(" failed, ");
            lines.push_back(blOwnLine ? ordinary(SERVICE, strMessage) : failed(SERVICE, strMessage));
        }
        EXPECT_LINES(lines);
    };
    errno = 0;
    fails(api.tokenCreateByTid(uid, strA, jNull, strTid), {"!m_pDb", strCreate});
    fails(api.tokenList(jObject, jArray), {"!m_pDb"});
    fails(api.tokenGetByTid(strA, jNull), {"!m_pDb"});
    fails(api.tokenGetByTidArray(strVector, jArray), {"!m_pDb"});
    fails(api.tokenUpdateByTid(strA, jObject), {"!m_pDb", "0 > (nCount = tokenGetByTid(strTid, jToken))"});
    fails(api.tokenSaveByOverwrite(jLastUse), {"!m_pDb", strSave});
    fails(api.tokenDeleteByArray(strVector, "tid"), byArray("tid"));
    fails(api.tokenDeleteByName(strA, "tid"), byName("tid"));
    fails(api.tokenDeleteByTid(strA), byName("tid"));
    fails(api.tokenDeleteByBindSid(strA), byName("bind_sid"));
    fails(api.tokenDeleteByFunction(strA), byName("function"));
    fails(api.tokenDeleteByTidArray(strVector), byArray("tid"));
    fails(api.tokenDeleteAll(), {"!m_pDb"});
    fails(api.cleanExpireToken(true), {"!m_pDb"});
    fails(api.cleanExpireToken(false), {});
    fails(api.tokenGrant(strA, "Api", "get", jNull), {"!m_pDb", "0 > (err = tokenGetByTid(strTid, jToken))"});
    fails(api.tokenCountDegrade(jToken), {"!m_pDb", strSave, "0 > tokenSaveByOverwrite(jToken)"});
    fails(api.tokenCountDegrade(jLastUse), byName("tid") + Texts{"0 > tokenDeleteByTid(strTid)"});
    EXPECT_EQ(-1, api.tokenCreate(uid, strA, jNull, strA));
    EXPECT_EQ(3u, takeLines().size()); // they hold a random id
    EXPECT_EQ("a", strA);
    EXPECT_EQ(Json::Value(), jNull);
    EXPECT_EQ(Json::Value(Json::arrayValue), jArray);

    VEMO_ACCESS_TOKEN::debugInfo(true);
    errno = 0;
    EXPECT_FAILURE(api.cleanExpireToken(false),
                   fail(SERVICE, "run fail 0 > m_pDb->cleanExpireToken(blLogErr)"));
    // Some operations need none.
    EXPECT_EQ(0, api.VectorParamToJson(strVector, "tid", jNull));
    Json::Value jUnlimited = json(R"({"count":-1})");
    EXPECT_EQ(0, api.tokenCountDegrade(jUnlimited));
    EXPECT_EQ(Texts{}, seam().callsOf(OPENING_CALLS));
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

    // What is logged of a statement that failed at its first try.
    static Texts broken(const std::string& strSql, const Texts& inStore, const std::string& strInService)
    {
        return failureOf(strSql, DISK_ERROR.szError, EIO) + allFailed(STORE, inStore, EIO) +
               Texts{failed(SERVICE, strInService, EIO)};
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
        failStatements("SELECT", DISK_ERROR);
        EXPECT_FAILURE(api().tokenList(jFilter, m_jArray),
                       broken(strSql + ";", {RUN_FAILED}, "0 > m_pDb->tokenGet(jFilter, jTokenArrayOut)"));
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
    EXPECT_LINES(broken(selectSql("t"), {RUN_FAILED, "0 > tokenGet(jParam, jTokenArray)"},
                        "0 > (rv = m_pDb->tokenGetOne(\"tid\", strTid, jTokenOut))"));
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
    } rows[] = {{{"t"}, "'t'", "t"},
                {{"unknown"}, "'unknown'", ""},
                {{"t", "a'b"}, "'t''a''b'", ""},
                {{"a", "b"}, "'a''b'", "a'b"},
                {{""}, "''", ""}};
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
    failStatements("SELECT", DISK_ERROR);
    EXPECT_FAILURE(api().tokenGetByTidArray(none = {"t"}, m_jArray),
                   broken(SELECT + " WHERE  (tid in ('t' ) );", {RUN_FAILED},
                          "0 > m_pDb->tokenGet(jParam, jTokenArrayOut)"));
    EXPECT_EQ(json("[5]"), m_jArray);
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
