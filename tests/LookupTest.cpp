// Looking tokens up and changing them.

#include <dlfcn.h>

#include <climits>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <type_traits>

#include "AccessTokenApi.h"
#include "AccessTokenUtil.h"
#include "StoreTest.h"
#include "internal/AccessTokenDbApi.h"

typedef std::vector<std::string> Texts;

// The signatures that compiled callers link to.
static_assert(std::is_same_v<int (AccessTokenApi::*)(Json::Value&, Json::Value&),
                             decltype(&AccessTokenApi::tokenList)>);
static_assert(std::is_same_v<int (AccessTokenApi::*)(std::string&, Json::Value&),
                             decltype(&AccessTokenApi::tokenGetByTid)>);
static_assert(std::is_same_v<int (AccessTokenApi::*)(Texts&, const char*, Json::Value&),
                             decltype(&AccessTokenApi::VectorParamToJson)>);
static_assert(std::is_same_v<int (AccessTokenApi::*)(Texts&, Json::Value&),
                             decltype(&AccessTokenApi::tokenGetByTidArray)>);
static_assert(std::is_same_v<int (AccessTokenApi::*)(std::string&, Json::Value&),
                             decltype(&AccessTokenApi::tokenUpdateByTid)>);
static_assert(
    std::is_same_v<int (AccessTokenApi::*)(Json::Value&), decltype(&AccessTokenApi::tokenSaveByOverwrite)>);

namespace {

const char* const SERVICE = "AccessTokenApi.cpp";
const char* const STORE = "AccessTokenSqlite.cpp";
const char* const UTIL = "util.cpp";
const std::string SELECT = std::string("SELECT ") + COLUMNS + " FROM token ";
const char* const GET_BY_TID_FAILED = "0 > (nCount = tokenGetByTid(strTid, jToken))";

int g_nLookupResult = 0;
bool g_blListingFails = false;

} // namespace

// Two functions whose failures only a stand-in can bring about: the store's lookup has no negative
// result but -1, and a list under a good name never fails. A lookup that pretends to find something
// leaves the record as it is.
int AccessTokenDbApi::tokenGetOne(const char* szName, std::string& strValue, Json::Value& jTokenOut)
{
    typedef int Function(AccessTokenDbApi*, const char*, std::string&, Json::Value&);
    const char* szMangled = "_ZN16AccessTokenDbApi11tokenGetOneEPKcRNSt7__cxx1112basic_string"
                            "IcSt11char_traitsIcESaIcEEERN4Json5ValueE";
    return 0 != g_nLookupResult
               ? g_nLookupResult
               : reinterpret_cast<Function*>(dlsym(RTLD_NEXT, szMangled))(this, szName, strValue, jTokenOut);
}

int AccessTokenApi::VectorParamToJson(Texts& strVector, const char* szField, Json::Value& jParamOut)
{
    typedef int Function(AccessTokenApi*, Texts&, const char*, Json::Value&);
    const char* szMangled = "_ZN14AccessTokenApi17VectorParamToJsonERSt6vectorINSt7__cxx1112basic_string"
                            "IcSt11char_traitsIcESaIcEEESaIS6_EEPKcRN4Json5ValueE";
    return g_blListingFails ? -1
                            : reinterpret_cast<Function*>(dlsym(RTLD_NEXT, szMangled))(this, strVector,
                                                                                       szField, jParamOut);
}

namespace {

std::string text(const Json::Value& jValue)
{
    Json::StreamWriterBuilder builder;
    builder["indentation"] = "";
    return Json::writeString(builder, jValue);
}

struct Field {
    const char* szName;
    int nLine; // in the field list
    const char* szValue;
    const char* szStored;
    const char* szWrong;
};

// In the field list's order, with a new value, what the column then holds, and a value of a wrong type.
const std::vector<Field> FIELDS = {
    {"tid", 2, R"("new")", "new", "5"},
    {"bind_sid", 4, R"("S'2")", "S'2", "null"},
    {"uid", 6, "0", "0", R"("0")"},
    {"deadline", 8, "3600", "3600", "1.5"}, // absolute, unlike a deadline at creation
    {"count", 10, "-1", "-1", R"("5")"},
    {"create_time", 14, "-5", "-5", "[]"},
    {"function", 16, R"("")", "", "{}"},
    {"webapi_allow", 18, R"({"B":{}})", R"({"B":{}})", "[]"},
    {"extra", 22, R"({"z":null})", R"({"z":null})", R"("{}")"},
};

std::string entry(int nLine)
{
    return FIELD_LIST + (":" + std::to_string(nLine));
}

// A service over tokens of which the one under test is "one". Its deadline is long over: no
// operation here cares.
class Lookup : public StoreTest {
protected:
    void SetUp() override
    {
        StoreTest::SetUp();
        makeDatabase();
        insert("one", R"('S1',1026,1000,3,900,'VPN','{"A":{"method":["get"]}}','{"a":1,"b":[2]}')");
        m_pApi = std::make_unique<AccessTokenApi>();
        seam().calls.clear();
        // SQLite leaves in errno whatever it met on its way. Statements that start with m_strBreak
        // fail, or find the database locked for once.
        seam().sqliteExec = [this](sqlite3* pDb, const char* szSql, auto callback, void* pArgument,
                                   char** pszError) {
            const bool blBreak = !m_strBreak.empty() && 0 == std::string(szSql).find(m_strBreak);
            if (blBreak) {
                *pszError = sqlite3_mprintf("%s", m_blLockedOnce ? "database is locked" : "disk I/O error");
                m_strBreak = m_blLockedOnce ? "" : m_strBreak;
                errno = m_blLockedOnce ? 0 : EIO;
                return m_blLockedOnce ? SQLITE_BUSY : SQLITE_IOERR;
            }
            const int nResult = sqlite3_exec(pDb, szSql, callback, pArgument, pszError);
            errno = 0;
            return nResult;
        };
        m_rows = rows();
        errno = 0;
    }

    Texts rows() const { return query("SELECT * FROM token ORDER BY tid"); }
    Texts statements() const { return seam().callsOf({"sqlite3_exec"}); }

    // What the store logs of a statement that failed with EIO.
    Texts broken(const std::string& strSql, const Texts& conditions) const
    {
        Texts lines = {ordinary(STORE, "i=0,run sql failed, error=disk I/O error, sql=" + strSql),
                       fail(STORE, "run sql failed, sql=" + strSql, EIO)};
        for (const std::string& strCondition : conditions) {
            const bool blService = std::string::npos != strCondition.find("m_pDb->") ||
                                   std::string::npos != strCondition.find("(strTid, jToken)") ||
                                   std::string::npos != strCondition.find("Overwrite");
            lines.push_back(failed(blService ? SERVICE : STORE, strCondition, EIO));
        }
        return lines;
    }

    Json::Value one() const
    {
        return json(R"({"tid":"one","bind_sid":"S1","uid":1026,"deadline":1000,"count":3,"create_time":900,
                        "function":"VPN","webapi_allow":{"A":{"method":["get"]}},"extra":{"a":1,"b":[2]}})");
    }

    std::string replacement() const
    {
        return std::string("REPLACE INTO token (") + COLUMNS +
               R"() VALUES ('one','S1',1026,1000,3,900,'VPN','{"A":{"method":["get"]}}','{"a":1,"b":[2]}'))";
    }

    std::string overwriteFailed(const Json::Value& jToken) const
    {
        return ordinary(SERVICE, "tokenSaveByOverwrite failed, jToken=" + text(jToken));
    }

    // The update, which only reads what it is given.
    int update(const std::string& strParam, std::string strTid = "one")
    {
        const std::string strTidBefore = strTid;
        Json::Value jParam = json(strParam);
        const Json::Value jBefore = jParam;
        errno = 0;
        const int rv = m_pApi->tokenUpdateByTid(strTid, jParam);
        EXPECT_EQ(strTidBefore, strTid);
        EXPECT_EQ(jBefore, jParam);
        return rv;
    }

    int overwrite(Json::Value jToken)
    {
        const Json::Value jBefore = jToken;
        errno = 0;
        const int rv = m_pApi->tokenSaveByOverwrite(jToken);
        EXPECT_EQ(jBefore, jToken);
        return rv;
    }

    std::unique_ptr<AccessTokenApi> m_pApi;
    std::string m_strTid = "one";
    Texts m_rows; // at the start
    std::string m_strBreak;
    bool m_blLockedOnce = false;
};

class TokenList : public Lookup {
protected:
    // The tids that the filter selects, after what the array held.
    Texts tids(const std::string& strFilter, Json::Value jTokens = Json::Value(Json::arrayValue))
    {
        Json::Value jFilter = json(strFilter);
        const Json::Value jBefore = jFilter;
        EXPECT_EQ(0, m_pApi->tokenList(jFilter, jTokens));
        EXPECT_EQ(jBefore, jFilter);
        Texts tids;
        for (const Json::Value& jToken : jTokens) {
            tids.push_back(jToken.isObject() ? jToken["tid"].asString() : "no object");
        }
        return tids;
    }
};

TEST_F(TokenList, NullAndEmptyFiltersSelectAll)
{
    insert("two", "'',0,-1,0,0,'','{}','{}'");
    EXPECT_EQ((Texts{"one", "two"}), tids("null"));
    EXPECT_EQ((Texts{"one", "two"}), tids("{}"));
    EXPECT_EQ(Texts(2, "sqlite3_exec " + SELECT + ";"), statements());
    EXPECT_EQ((Texts{}), takeLines());
}

TEST_F(TokenList, AppendsWholeRecordsAfterWhatTheArrayHolds)
{
    Json::Value jFilter;
    Json::Value jTokens = json(R"(["before"])");
    EXPECT_EQ(0, m_pApi->tokenList(jFilter, jTokens));
    EXPECT_EQ(2u, jTokens.size());
    EXPECT_EQ("before", jTokens[0].asString());
    EXPECT_EQ(one(), jTokens[1]);
}

TEST_F(TokenList, PassesConditionsSortingAndPagingOn)
{
    struct Case {
        const char* szFilter;
        const char* szWhere;
    };
    const std::vector<Case> cases = {
        {R"({"uid":1026,"sort_by":"create_time","sort_direction":"desc"})",
         " (uid=1026 ) order by 'create_time' DESC"},
        {R"({"function":"VPN","bind_sid":"S1"})", " (bind_sid='S1' and function='VPN' )"},
        {R"({"tid":"one","limit":7,"offset":8})", " (tid='one' )"},
    };
    for (const Case& testCase : cases) {
        SCOPED_TRACE(testCase.szFilter);
        seam().calls.clear();
        EXPECT_EQ((Texts{"one"}), tids(testCase.szFilter));
        EXPECT_EQ((Texts{"sqlite3_exec " + SELECT + " WHERE " + testCase.szWhere + ";"}), statements());
    }
    EXPECT_EQ((Texts{}), tids(R"({"uid":7})"));
}

TEST_F(TokenList, ListsHaveNoSeparator)
{
    insert("o''two", "'',12,-1,0,0,'','{}','{}'");
    EXPECT_EQ((Texts{"one"}), tids(R"({"tid":["one"]})"));
    EXPECT_EQ((Texts{"o'two"}), tids(R"({"tid":["o","two"]})"));
    EXPECT_EQ((Texts{}), tids(R"({"tid":["one","o'two"]})"));
    EXPECT_EQ((Texts{"o'two"}), tids(R"({"uid":[1,2]})"));
    EXPECT_EQ("sqlite3_exec " + SELECT + " WHERE  (tid in ('o''two' ) );", statements()[1]);
}

TEST_F(TokenList, RefusesArgumentsOfAWrongType)
{
    const std::string strFilter =
        failed(SERVICE, "jFilter.type() != Json::objectValue && jFilter.type() != Json::nullValue");
    const std::string strArray = failed(SERVICE, "jTokenArrayOut.type() != Json::arrayValue");
    struct Case {
        const char* szFilter;
        const char* szArray;
        std::string strLine;
    };
    for (const Case& testCase : std::vector<Case>{{R"("tid")", "[]", strFilter},
                                                  {R"("")", "[]", strFilter},
                                                  {"[]", "[]", strFilter},
                                                  {"0", "[]", strFilter},
                                                  {"false", "[]", strFilter},
                                                  {"5", "null", strFilter},
                                                  {"null", "null", strArray},
                                                  {"null", "{}", strArray},
                                                  {"{}", "null", strArray},
                                                  {"{}", R"("[]")", strArray}}) {
        SCOPED_TRACE(testing::Message() << testCase.szFilter << " " << testCase.szArray);
        Json::Value jFilter = json(testCase.szFilter);
        Json::Value jTokens = json(testCase.szArray);
        EXPECT_EQ(-1, m_pApi->tokenList(jFilter, jTokens));
        EXPECT_EQ(json(testCase.szFilter), jFilter);
        EXPECT_EQ(json(testCase.szArray), jTokens);
        EXPECT_EQ((Texts{testCase.strLine}), takeLines());
    }
    EXPECT_EQ((Texts{}), statements());
}

TEST_F(TokenList, ReportsAFailedStore)
{
    m_strBreak = "SELECT";
    for (const char* szFilter : {"null", "{}"}) {
        Json::Value jFilter = json(szFilter);
        Json::Value jTokens(Json::arrayValue);
        EXPECT_EQ(-1, m_pApi->tokenList(jFilter, jTokens));
        EXPECT_EQ(broken(SELECT + ";", {"0 > runSql(FillList, &jTokenArrayOut)",
                                        "0 > m_pDb->tokenGet(jFilter, jTokenArrayOut)"}),
                  takeLines());
        EXPECT_EQ(json(szFilter), jFilter);
    }
}

TEST_F(Lookup, GetsATokenByItsTid)
{
    Json::Value jToken = json(R"({"left":"over"})");
    EXPECT_EQ(1, m_pApi->tokenGetByTid(m_strTid, jToken));
    EXPECT_EQ(one(), jToken);
    EXPECT_EQ((Texts{"sqlite3_exec " + SELECT + " WHERE  (tid='one' );"}), statements());
    EXPECT_EQ((Texts{}), takeLines());
}

TEST_F(Lookup, MissingTokenIsNoFailureAndEmptiesTheOutput)
{
    for (const char* szTid : {"two", "ONE", "one ", "%", "x' OR '1'='1", "one'--"}) {
        SCOPED_TRACE(szTid);
        std::string strTid = szTid;
        Json::Value jToken = json(R"({"left":"over"})");
        EXPECT_EQ(0, m_pApi->tokenGetByTid(strTid, jToken));
        EXPECT_EQ(Json::Value(Json::objectValue), jToken);
        EXPECT_EQ(szTid, strTid);
    }
    EXPECT_EQ((Texts{}), takeLines());
}

TEST_F(Lookup, RefusesAnEmptyTid)
{
    std::string strTid;
    Json::Value jToken = json(R"({"left":"over"})");
    EXPECT_EQ(-1, m_pApi->tokenGetByTid(strTid, jToken));
    EXPECT_EQ(json(R"({"left":"over"})"), jToken);
    EXPECT_EQ((Texts{failed(SERVICE, "strTid.empty()")}), takeLines());
    EXPECT_EQ((Texts{}), statements());
}

TEST_F(Lookup, ReportsAFailedStore)
{
    m_strBreak = "SELECT";
    Json::Value jToken = json(R"({"left":"over"})");
    EXPECT_EQ(-1, m_pApi->tokenGetByTid(m_strTid, jToken));
    EXPECT_EQ(Json::Value(Json::objectValue), jToken);
    EXPECT_EQ(broken(SELECT + " WHERE  (tid='one' );",
                     {"0 > runSql(FillList, &jTokenArrayOut)", "0 > tokenGet(jParam, jTokenArray)",
                      "0 > (rv = m_pDb->tokenGetOne(\"tid\", strTid, jTokenOut))"}),
              takeLines());
}

TEST_F(Lookup, HandsTheStoresNegativeResultOn)
{
    g_nLookupResult = -7;
    Json::Value jToken;
    EXPECT_EQ(-7, m_pApi->tokenGetByTid(m_strTid, jToken));
    const std::string strLine = failed(SERVICE, "0 > (rv = m_pDb->tokenGetOne(\"tid\", strTid, jTokenOut))");
    EXPECT_EQ((Texts{strLine}), takeLines());
    // An update makes -1 of it.
    EXPECT_EQ(-1, update("{}"));
    EXPECT_EQ((Texts{strLine, failed(SERVICE, GET_BY_TID_FAILED)}), takeLines());
}

TEST_F(Lookup, MakesListsForFilters)
{
    struct Case {
        Texts strVector;
        const char* szField;
        const char* szParam;
        const char* szResult;
    };
    for (const Case& testCase : std::vector<Case>{
             {{"a"}, "tid", "null", R"({"tid":["a"]})"},
             {{"b", "a", "b", ""}, "bind_sid", "{}", R"({"bind_sid":["b","a","b",""]})"},
             {{}, "tid", "null", R"({"tid":[]})"},
             {{}, "tid", R"({"tid":["old"]})", R"({"tid":[]})"},
             {{"1"}, "tid", R"({"tid":"old","uid":5})", R"({"tid":["1"],"uid":5})"},
             {{"it's \""}, "no field", R"({"tid":"t"})", R"({"no field":["it's \""],"tid":"t"})"},
         }) {
        SCOPED_TRACE(testCase.szResult);
        Texts strVector = testCase.strVector;
        Json::Value jParam = json(testCase.szParam);
        EXPECT_EQ(0, m_pApi->VectorParamToJson(strVector, testCase.szField, jParam));
        EXPECT_EQ(testCase.szResult, text(jParam));
        EXPECT_EQ(testCase.strVector, strVector);
    }
    EXPECT_EQ((Texts{}), takeLines());
}

TEST_F(Lookup, MakesNoListWithoutANameOrAnObject)
{
    const char* szType = "jParamOut.type() != Json::objectValue && jParamOut.type() != Json::nullValue";
    const char* szName = "!szField || !szField[0]";
    struct Case {
        const char* szField;
        const char* szParam;
        const char* szCondition;
    };
    for (const Case& testCase : std::vector<Case>{{nullptr, "{}", szName},
                                                  {"", "null", szName},
                                                  {"tid", "[]", szType},
                                                  {"tid", R"("")", szType},
                                                  {"tid", "0", szType},
                                                  {"tid", "false", szType},
                                                  {nullptr, "[]", szType}}) {
        SCOPED_TRACE(testing::Message() << testCase.szParam << testCase.szCondition);
        Texts strVector{"a"};
        Json::Value jParam = json(testCase.szParam);
        EXPECT_EQ(-1, m_pApi->VectorParamToJson(strVector, testCase.szField, jParam));
        EXPECT_EQ(json(testCase.szParam), jParam);
        EXPECT_EQ((Texts{failed(SERVICE, testCase.szCondition)}), takeLines());
    }
}

TEST_F(Lookup, GetsOneTokenByAListAndNoneBySeveral)
{
    insert("two", "'',0,-1,0,0,'','{}','{}'");
    struct Case {
        Texts strVector;
        unsigned int nFound;
        const char* szList;
    };
    for (const Case& testCase : std::vector<Case>{{{"one"}, 1, "'one'"},
                                                  {{"unknown"}, 0, "'unknown'"},
                                                  {{"one", "two"}, 0, "'one''two'"},
                                                  {{"one", "one"}, 0, "'one''one'"},
                                                  {{""}, 0, "''"}}) {
        SCOPED_TRACE(testCase.szList);
        seam().calls.clear();
        Texts strVector = testCase.strVector;
        Json::Value jTokens = json("[5]");
        EXPECT_EQ(0, m_pApi->tokenGetByTidArray(strVector, jTokens));
        EXPECT_EQ(1 + testCase.nFound, jTokens.size());
        EXPECT_EQ(5, jTokens[0].asInt());
        EXPECT_EQ(testCase.nFound ? one() : Json::Value(), jTokens.get(1U, Json::Value()));
        EXPECT_EQ(testCase.strVector, strVector);
        EXPECT_EQ((Texts{"sqlite3_exec " + SELECT + " WHERE  (tid in (" + testCase.szList + " ) );"}),
                  statements());
    }
    EXPECT_EQ((Texts{}), takeLines());
}

TEST_F(Lookup, AListOfSeveralFindsTheirConcatenation)
{
    insert("a''b", "'',0,-1,0,0,'','{}','{}'"); // the id a'b
    Texts strVector{"a", "b"};
    Json::Value jTokens(Json::arrayValue);
    EXPECT_EQ(0, m_pApi->tokenGetByTidArray(strVector, jTokens));
    ASSERT_EQ(1u, jTokens.size());
    EXPECT_EQ("a'b", jTokens[0]["tid"].asString());
}

TEST_F(Lookup, RefusesBadListsOfTids)
{
    const std::string strArray = failed(SERVICE, "jTokenArrayOut.type() != Json::arrayValue");
    Texts strVector;
    for (const char* szArray : {"null", "{}", R"("")", "0"}) {
        SCOPED_TRACE(szArray);
        Json::Value jTokens = json(szArray);
        EXPECT_EQ(-1, m_pApi->tokenGetByTidArray(strVector, jTokens));
        EXPECT_EQ(json(szArray), jTokens);
        EXPECT_EQ((Texts{strArray}), takeLines());
    }
    Json::Value jTokens(Json::arrayValue);
    EXPECT_EQ(-1, m_pApi->tokenGetByTidArray(strVector, jTokens));
    EXPECT_EQ((Texts{failed(SERVICE, "0 >= strTidVector.size()")}), takeLines());

    strVector = {"one"};
    g_blListingFails = true;
    EXPECT_EQ(-1, m_pApi->tokenGetByTidArray(strVector, jTokens));
    EXPECT_EQ((Texts{failed(SERVICE, "0 > VectorParamToJson(strTidVector, \"tid\", jParam)")}), takeLines());
    EXPECT_EQ((Texts{}), statements());

    g_blListingFails = false;
    m_strBreak = "SELECT";
    EXPECT_EQ(-1, m_pApi->tokenGetByTidArray(strVector, jTokens));
    EXPECT_EQ(broken(SELECT + " WHERE  (tid in ('one' ) );", {"0 > runSql(FillList, &jTokenArrayOut)",
                                                              "0 > m_pDb->tokenGet(jParam, jTokenArrayOut)"}),
              takeLines());
    EXPECT_EQ(Json::Value(Json::arrayValue), jTokens);
}

TEST_F(TokenList, FailsWhereTheStatementIsNone)
{
    struct Case {
        const char* szFilter;
        const char* szWhere;
    };
    for (const Case& testCase :
         std::vector<Case>{{R"({"tid":[]})", " ( )"},
                           {R"({"sort_by":"uid"})", " order by 'uid'"},
                           {R"({"function":"VPN","limit":0})", " (function='VPN' ) LIMIT "}}) {
        SCOPED_TRACE(testCase.szFilter);
        seam().calls.clear();
        Json::Value jFilter = json(testCase.szFilter);
        Json::Value jTokens(Json::arrayValue);
        EXPECT_EQ(-1, m_pApi->tokenList(jFilter, jTokens));
        EXPECT_EQ((Texts{"sqlite3_exec " + SELECT + " WHERE " + testCase.szWhere + ";"}), statements());
        const Texts lines = takeLines();
        ASSERT_EQ(4u, lines.size());
        EXPECT_EQ(failed(SERVICE, "0 > m_pDb->tokenGet(jFilter, jTokenArrayOut)"), lines[3]);
    }
}

class TokenUpdate : public Lookup {};

TEST_F(TokenUpdate, ReplacesEachFieldAlone)
{
    for (const Field& field : FIELDS) {
        SCOPED_TRACE(field.szName);
        query("DELETE FROM token");
        insert("one", R"('S1',1026,1000,3,900,'VPN','{"A":{"method":["get"]}}','{"a":1,"b":[2]}')");
        EXPECT_EQ(0, update(std::string("{\"") + field.szName + "\":" + field.szValue + "}"));

        // All else is as it was, and the old row stays beside one of another tid.
        Texts expected;
        for (const Field& column : FIELDS) {
            const Json::Value jOld = one()[column.szName];
            const std::string strOld = jOld.isObject() ? text(jOld) : jOld.asString();
            expected.push_back(&column == &field ? field.szStored : strOld);
        }
        std::string strRow;
        for (const std::string& strColumn : expected) {
            strRow.append(&strColumn == &expected[0] ? "" : "|").append(strColumn);
        }
        const bool blCopy = std::string("tid") == field.szName;
        EXPECT_EQ((blCopy ? Texts{strRow, m_rows[0]} : Texts{strRow}), rows());
    }
    EXPECT_EQ((Texts{}), takeLines());
}

TEST_F(TokenUpdate, ReplacesObjectsAsAWhole)
{
    EXPECT_EQ(0, update(R"({"extra":{"b":{}},"webapi_allow":{}})"));
    EXPECT_EQ((Texts{R"({}|{"b":{}})"}), query("SELECT webapi_allow,extra FROM token"));
}

TEST_F(TokenUpdate, RewritesTheTokenUnchangedWhenNoFieldIsGiven)
{
    for (const char* szParam : {R"({"colour":"red"})", "{}", R"({"Count":9,"sort_by":"tid","limit":0})"}) {
        SCOPED_TRACE(szParam);
        seam().calls.clear();
        EXPECT_EQ(0, update(szParam));
        EXPECT_EQ(
            (Texts{"sqlite3_exec " + SELECT + " WHERE  (tid='one' );", "sqlite3_exec " + replacement()}),
            statements());
        EXPECT_EQ(m_rows, rows());
    }
    EXPECT_EQ((Texts{}), takeLines());
}

TEST_F(TokenUpdate, MissingTokenIsNoFailureAndNothingIsWritten)
{
    EXPECT_EQ(0, update(R"({"count":5,"tid":"new"})", "unknown"));
    EXPECT_EQ((Texts{"sqlite3_exec " + SELECT + " WHERE  (tid='unknown' );"}), statements());
    EXPECT_EQ(m_rows, rows());
    EXPECT_EQ((Texts{}), takeLines());
}

TEST_F(TokenUpdate, AnotherTokensTidOverwritesThatToken)
{
    insert("two", "'',0,-1,0,0,'','{}','{}'");
    EXPECT_EQ(0, update(R"({"tid":"two"})"));
    EXPECT_EQ((Texts{"one|1026|VPN", "two|1026|VPN"}), query("SELECT tid,uid,function FROM token"));
}

TEST_F(TokenUpdate, RefusesBadArguments)
{
    EXPECT_EQ(-1, update("{}", ""));
    EXPECT_EQ((Texts{failed(SERVICE, "strTid.empty()")}), takeLines());
    EXPECT_EQ(-1, update("null", ""));
    EXPECT_EQ((Texts{failed(SERVICE, "strTid.empty()")}), takeLines());
    for (const char* szParam : {"null", "[]", R"("{}")", "0", "true"}) {
        SCOPED_TRACE(szParam);
        EXPECT_EQ(-1, update(szParam));
        EXPECT_EQ((Texts{failed(SERVICE, "jParam.type() != Json::objectValue")}), takeLines());
    }
    EXPECT_EQ((Texts{}), statements());
}

TEST_F(TokenUpdate, FieldOfAWrongTypeLeavesTheStoredTokenAlone)
{
    for (const Field& field : FIELDS) {
        SCOPED_TRACE(field.szName);
        seam().calls.clear();
        Json::Value jMerged = one();
        jMerged[field.szName] = json(field.szWrong);
        EXPECT_EQ(-1, update(std::string("{\"") + field.szName + "\":" + field.szWrong + "}"));
        EXPECT_EQ((Texts{fail(UTIL, std::string("type failed, jmList[i]=") + field.szName +
                                        ", jTokenParam=" + text(jMerged)),
                         failed(SERVICE, "0 > checkJsonType(jToken)"), overwriteFailed(jMerged),
                         failed(SERVICE, "0 > tokenSaveByOverwrite(jToken)")}),
                  takeLines());
        EXPECT_EQ(1u, statements().size());
    }
    EXPECT_EQ(m_rows, rows());
}

TEST_F(TokenUpdate, NumberBeyond64BitsThrowsAndLeavesTheStoredTokenAlone)
{
    EXPECT_THROW(update(R"({"count":18446744073709551615})"), Json::LogicError);
    EXPECT_EQ(m_rows, rows());
}

TEST_F(TokenUpdate, TracesOverwrittenFieldsInTheListsOrderInDebugMode)
{
    Json::Value jParam = json(R"({"colour":"red"})");
    Json::Value jNew;
    VEMO_ACCESS_TOKEN::debugInfo(true);
    const std::string strSelect = SELECT + " WHERE  (tid='one' );";
    const std::string strReplace = std::string("REPLACE INTO token (") + COLUMNS +
                                   R"() VALUES ('new','S''2',0,3600,-1,-5,'','{"B":{}}','{"z":null}'))";
    Texts lines{ordinary(STORE, "run sql=" + strSelect)};
    for (const Field& field : FIELDS) {
        jParam[field.szName] = jNew[field.szName] = json(field.szValue);
        lines.push_back(ordinary(entry(field.nLine), std::string("overwrite token[") + field.szName + "]"));
    }
    lines.push_back(ordinary(STORE, "tokenSave, blCreate=0, jParam=" + text(jNew)));
    lines.push_back(ordinary(STORE, "run sql=" + strReplace)); // by tokenSave
    lines.push_back(ordinary(STORE, "run sql=" + strReplace)); // by runSqlEx
    lines.push_back(ordinary(STORE, "change rv=1, run sql=" + strReplace));
    EXPECT_EQ(0, update(text(jParam)));
    EXPECT_EQ(lines, takeLines());
}

TEST_F(TokenUpdate, TracesOnlyGivenFieldsAndNoneOfAMissingTokenInDebugMode)
{
    VEMO_ACCESS_TOKEN::debugInfo(true);
    for (const Field& field : FIELDS) {
        SCOPED_TRACE(field.szName);
        EXPECT_EQ(-1, update(std::string("{\"") + field.szName + "\":" + field.szWrong + "}"));
        const Texts lines = takeLines();
        ASSERT_EQ(6u, lines.size());
        EXPECT_EQ(ordinary(entry(field.nLine), std::string("overwrite token[") + field.szName + "]"),
                  lines[1]);
    }
    EXPECT_EQ(0, update(R"({"count":5})", "unknown"));
    EXPECT_EQ((Texts{ordinary(STORE, "run sql=" + SELECT + " WHERE  (tid='unknown' );")}), takeLines());
}

TEST_F(TokenUpdate, ReportsAFailedRead)
{
    m_strBreak = "SELECT";
    EXPECT_EQ(-1, update(R"({"count":5})"));
    EXPECT_EQ(broken(SELECT + " WHERE  (tid='one' );",
                     {"0 > runSql(FillList, &jTokenArrayOut)", "0 > tokenGet(jParam, jTokenArray)",
                      "0 > (rv = m_pDb->tokenGetOne(\"tid\", strTid, jTokenOut))", GET_BY_TID_FAILED}),
              takeLines());
    EXPECT_EQ(m_rows, rows());
}

TEST_F(TokenUpdate, ReportsAFailedWrite)
{
    m_strBreak = "REPLACE";
    EXPECT_EQ(-1, update("{}"));
    Texts lines = broken(replacement(), {"0 > runSql()", "0 > m_pDb->tokenUpdate(jToken)",
                                         "0 > tokenSaveByOverwrite(jToken)"});
    lines.insert(lines.end() - 1, overwriteFailed(one()));
    EXPECT_EQ(lines, takeLines());
    EXPECT_EQ(m_rows, rows());
}

TEST_F(TokenUpdate, ReportsFailureAfterWaitingForALock)
{
    m_blLockedOnce = true;
    m_strBreak = "SELECT";
    EXPECT_EQ(-1, update(R"({"count":5})")); // nothing is written after a read that had to wait
    EXPECT_EQ((Texts{fail(STORE, "sql error, sql=" + SELECT + " WHERE  (tid='one' );"),
                     failed(STORE, "0 > tokenGet(jParam, jTokenArray)"),
                     failed(SERVICE, "0 > (rv = m_pDb->tokenGetOne(\"tid\", strTid, jTokenOut))"),
                     failed(SERVICE, GET_BY_TID_FAILED)}),
              takeLines());
    EXPECT_EQ(m_rows, rows());

    m_strBreak = "REPLACE";
    EXPECT_EQ(-1, update(R"({"count":5})")); // and a write that had to wait has been made
    EXPECT_EQ((Texts{"5"}), query("SELECT count FROM token"));
    EXPECT_EQ(4u, takeLines().size());
}

// No transaction holds reading and writing together.
TEST_F(TokenUpdate, WinsWholeOverWhatOthersDidSinceItsRead)
{
    for (const char* szOthers : {"UPDATE token SET uid = 7, count = 8", "DELETE FROM token"}) {
        SCOPED_TRACE(szOthers);
        const auto next = seam().sqliteExec;
        seam().sqliteExec = [&, next](sqlite3* pDb, const char* szSql, auto callback, void* pArgument,
                                      char** pszError) {
            if (0 == std::string(szSql).find("REPLACE")) {
                query(szOthers);
            }
            return next(pDb, szSql, callback, pArgument, pszError);
        };
        EXPECT_EQ(0, update(R"({"count":5})"));
        seam().sqliteExec = next;
        EXPECT_EQ((Texts{"one|1026|5"}), query("SELECT tid,uid,count FROM token"));
    }
}

class TokenOverwrite : public Lookup {};

TEST_F(TokenOverwrite, WritesOverAStoredTokenOrMakesANewOne)
{
    Json::Value jToken = one();
    EXPECT_EQ(0, overwrite(jToken));
    EXPECT_EQ((Texts{"sqlite3_exec " + replacement()}), statements());
    EXPECT_EQ(m_rows, rows());
    jToken["count"] = 2;
    jToken["colour"] = "red"; // no field, dropped
    EXPECT_EQ(0, overwrite(jToken));
    jToken["tid"] = "new";
    EXPECT_EQ(0, overwrite(jToken));
    EXPECT_EQ((Texts{"new|2", "one|2"}), query("SELECT tid,count FROM token ORDER BY tid"));
    EXPECT_EQ((Texts{}), takeLines());
}

TEST_F(TokenOverwrite, RefusesWhatIsNoObject)
{
    for (const char* szToken : {"null", "[]", "[{}]", R"("{}")", "5", "1.5", "false"}) {
        SCOPED_TRACE(szToken);
        EXPECT_EQ(-1, overwrite(json(szToken)));
        EXPECT_EQ((Texts{failed(SERVICE, "jToken.type() != Json::objectValue"),
                         ordinary(SERVICE, std::string("tokenSaveByOverwrite failed, jToken=") + szToken)}),
                  takeLines());
    }
    EXPECT_EQ((Texts{}), statements());
}

TEST_F(TokenOverwrite, RefusesARecordThatLacksAFieldAndAddsNothing)
{
    // First the last field goes, then the one before it as well, ...: the first missing is told.
    Json::Value jAll = one();
    for (auto field = FIELDS.rbegin(); FIELDS.rend() != field; ++field) {
        Json::Value jLacksOne = one();
        jLacksOne.removeMember(field->szName);
        jAll.removeMember(field->szName);
        for (const Json::Value& jToken : {jLacksOne, jAll}) {
            SCOPED_TRACE(text(jToken));
            EXPECT_EQ(-1, overwrite(jToken));
            EXPECT_EQ((Texts{ordinary(entry(field->nLine), std::string("lost data member=") + field->szName),
                             failed(SERVICE, "0 > fillDefaultValue(jToken, true)"), overwriteFailed(jToken)}),
                      takeLines());
        }
    }
    EXPECT_EQ((Texts{}), statements());
}

TEST_F(TokenOverwrite, RefusesAFieldOfAWrongType)
{
    for (const Field& field : FIELDS) {
        SCOPED_TRACE(field.szName);
        Json::Value jToken = one();
        jToken[field.szName] = json(field.szWrong);
        EXPECT_EQ(-1, overwrite(jToken));
        EXPECT_EQ((Texts{fail(UTIL, std::string("type failed, jmList[i]=") + field.szName +
                                        ", jTokenParam=" + text(jToken)),
                         failed(SERVICE, "0 > checkJsonType(jToken)"), overwriteFailed(jToken)}),
                  takeLines());
    }
    EXPECT_EQ((Texts{}), statements());
}

TEST_F(TokenOverwrite, ReportsAFailedStore)
{
    m_strBreak = "REPLACE";
    EXPECT_EQ(-1, overwrite(one()));
    Texts lines = broken(replacement(), {"0 > runSql()", "0 > m_pDb->tokenUpdate(jToken)"});
    lines.push_back(overwriteFailed(one()));
    EXPECT_EQ(lines, takeLines());
}

TEST_F(TokenOverwrite, FailureLinesTellErrno)
{
    Json::Value jToken;
    errno = EACCES;
    EXPECT_EQ(-1, m_pApi->tokenSaveByOverwrite(jToken));
    EXPECT_EQ((Texts{failed(SERVICE, "jToken.type() != Json::objectValue", EACCES),
                     overwriteFailed(Json::Value())}),
              takeLines(Destination::Stdout));
    EXPECT_EQ(EACCES, errno);
}

TEST(LookupSystemLog, TellsErrnoInFrontOfEachLineWhenThereIsOne)
{
    setenv("VEMO_REDIRECT_DIR", "/nonexistent", 1);
    seam() = Seam();
    seam().fail("seteuid", EPERM, 1, INT_MAX); // the store stays closed
    VEMO_ACCESS_TOKEN::debugInfo(true);
    AccessTokenApi api;
    takeLines();
    const auto check = [](const char* szCondition, int nErrno) {
        const std::string strError = strerror(nErrno);
        return ordinary(SERVICE,
                        std::string("(") + SERVICE + ":#)(" + strError + ")Failed [" + szCondition +
                            "], err=" + strError + "\n",
                        nErrno);
    };
    g_nLookupResult = 1;
    std::string strTid = "one";
    Json::Value jParam = json(R"({"count":5})");
    for (int nErrno : {0, EACCES}) {
        errno = nErrno;
        EXPECT_EQ(-1, api.tokenUpdateByTid(strTid, jParam));
        EXPECT_EQ((Texts{ordinary(entry(10), "overwrite token[count]", nErrno),
                         ordinary(entry(2), "lost data member=tid", nErrno),
                         check("0 > fillDefaultValue(jToken, true)", nErrno),
                         ordinary(SERVICE, R"(tokenSaveByOverwrite failed, jToken={"count":5})", nErrno),
                         check("0 > tokenSaveByOverwrite(jToken)", nErrno)}),
                  takeLines(Destination::Syslog));
    }
}

} // namespace
