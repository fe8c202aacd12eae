// Looking tokens up: by filter, by tid and by lists of tids.

#include <type_traits>

#include "OneToken.h"
#include "StandIns.h"

// The signatures that compiled callers link to.
static_assert(std::is_same_v<int (AccessTokenApi::*)(Json::Value&, Json::Value&),
                             decltype(&AccessTokenApi::tokenList)>);
static_assert(std::is_same_v<int (AccessTokenApi::*)(std::string&, Json::Value&),
                             decltype(&AccessTokenApi::tokenGetByTid)>);
static_assert(std::is_same_v<int (AccessTokenApi::*)(Texts&, const char*, Json::Value&),
                             decltype(&AccessTokenApi::VectorParamToJson)>);
static_assert(std::is_same_v<int (AccessTokenApi::*)(Texts&, Json::Value&),
                             decltype(&AccessTokenApi::tokenGetByTidArray)>);

namespace {

class TokenList : public OneToken {
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
    EXPECT_EQ(Texts{}, takeLines());
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
    EXPECT_EQ(Texts{}, tids(R"({"uid":7})"));
}

TEST_F(TokenList, ListsHaveNoSeparator)
{
    insert("o''two", "'',12,-1,0,0,'','{}','{}'");
    EXPECT_EQ((Texts{"one"}), tids(R"({"tid":["one"]})"));
    EXPECT_EQ((Texts{"o'two"}), tids(R"({"tid":["o","two"]})"));
    EXPECT_EQ(Texts{}, tids(R"({"tid":["one","o'two"]})"));
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
    EXPECT_EQ(Texts{}, statements());
}

TEST_F(TokenList, ReportsAFailedStore)
{
    failStatements("SELECT", DISK_ERROR, 2);
    for (const char* szFilter : {"null", "{}"}) {
        Json::Value jFilter = json(szFilter);
        Json::Value jTokens(Json::arrayValue);
        EXPECT_EQ(-1, m_pApi->tokenList(jFilter, jTokens));
        EXPECT_EQ(broken(SELECT + ";", {"0 > runSql(FillList, &jTokenArrayOut)"},
                         {"0 > m_pDb->tokenGet(jFilter, jTokenArrayOut)"}),
                  takeLines());
        EXPECT_EQ(json(szFilter), jFilter);
    }
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

class Lookup : public OneToken {
protected:
    std::string m_strTid = "one";
};

TEST_F(Lookup, GetsATokenByItsTid)
{
    Json::Value jToken = json(R"({"left":"over"})");
    EXPECT_EQ(1, m_pApi->tokenGetByTid(m_strTid, jToken));
    EXPECT_EQ(one(), jToken);
    EXPECT_EQ((Texts{"sqlite3_exec " + SELECT_ONE}), statements());
    EXPECT_EQ(Texts{}, takeLines());
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
    EXPECT_EQ(Texts{}, takeLines());
}

TEST_F(Lookup, RefusesAnEmptyTid)
{
    std::string strTid;
    Json::Value jToken = json(R"({"left":"over"})");
    EXPECT_EQ(-1, m_pApi->tokenGetByTid(strTid, jToken));
    EXPECT_EQ(json(R"({"left":"over"})"), jToken);
    EXPECT_EQ((Texts{failed(SERVICE, "strTid.empty()")}), takeLines());
    EXPECT_EQ(Texts{}, statements());
}

TEST_F(Lookup, ReportsAFailedStore)
{
    failStatements("SELECT", DISK_ERROR);
    Json::Value jToken = json(R"({"left":"over"})");
    EXPECT_EQ(-1, m_pApi->tokenGetByTid(m_strTid, jToken));
    EXPECT_EQ(Json::Value(Json::objectValue), jToken);
    EXPECT_EQ(broken(SELECT_ONE,
                     {"0 > runSql(FillList, &jTokenArrayOut)", "0 > tokenGet(jParam, jTokenArray)"},
                     {GET_ONE_FAILED}),
              takeLines());
}

TEST_F(Lookup, HandsTheStoresNegativeResultOn)
{
    standIns().tokenGetOne = [](const char*, std::string&, Json::Value&) { return -7; };
    Json::Value jToken;
    EXPECT_EQ(-7, m_pApi->tokenGetByTid(m_strTid, jToken));
    EXPECT_EQ((Texts{failed(SERVICE, GET_ONE_FAILED)}), takeLines());
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
    EXPECT_EQ(Texts{}, takeLines());
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
    EXPECT_EQ(Texts{}, takeLines());
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
    standIns().vectorParamToJson = [](Texts&, const char*, Json::Value&) { return -1; };
    EXPECT_EQ(-1, m_pApi->tokenGetByTidArray(strVector, jTokens));
    EXPECT_EQ((Texts{failed(SERVICE, "0 > VectorParamToJson(strTidVector, \"tid\", jParam)")}), takeLines());
    EXPECT_EQ(Texts{}, statements());

    standIns().vectorParamToJson = nullptr;
    failStatements("SELECT", DISK_ERROR);
    EXPECT_EQ(-1, m_pApi->tokenGetByTidArray(strVector, jTokens));
    EXPECT_EQ(broken(SELECT + " WHERE  (tid in ('one' ) );", {"0 > runSql(FillList, &jTokenArrayOut)"},
                     {"0 > m_pDb->tokenGet(jParam, jTokenArrayOut)"}),
              takeLines());
    EXPECT_EQ(Json::Value(Json::arrayValue), jTokens);
}

} // namespace
