// Filters as SQL: conditions, order and paging; and queries and deletions that are refused or fail. The test
// of the model shows what is found and deleted.

#include <algorithm>
#include <cstdint>

#include "AccessTokenUtil.h"
#include "Statements.h"
#include "StoreTest.h"

using VEMO_ACCESS_TOKEN::tokenType;

namespace {

const std::string MATCH_TEXT_FAILED = "NULL == (szSql = sqlite3_mprintf(\"%q\", jParam.asString().c_str()))";
const std::string MATCH_JSON_FAILED = "NULL == (szSql = sqlite3_mprintf(\"%q\", jParam.toString().c_str()))";
const std::string LIST_TEXT_FAILED = "NULL == (szSql = sqlite3_mprintf(\"%q\", jList[i].asString().c_str()))";
const std::string LIST_JSON_FAILED = "NULL == (szSql = sqlite3_mprintf(\"%q\", jList[i].toString().c_str()))";
const std::string MATCH_FAILED = "0 > SqlMakeByMatchField(jmFieldName[i], jTmp, strSqlWhereOut)";
const std::string LIST_FAILED = "0 > SqlMakeByListField(jmFieldName[i].c_str(), jTmp, strSqlWhereOut)";

// The builders append their text to m_strOut and change nothing else.
class Filter : public SeamTest {
protected:
    int where(const std::string& strFilter, bool bAnd = true)
    {
        return builds(json(strFilter),
                      [&](Json::Value& j) { return m_db.SqlWhereFromJson(j, m_strOut, bAnd); });
    }
    int match(std::string strName, const Json::Value& jParam)
    {
        return builds(jParam, [&](Json::Value& j) { return m_db.SqlMakeByMatchField(strName, j, m_strOut); });
    }
    int list(const char* szField, const Json::Value& jList)
    {
        return builds(jList, [&](Json::Value& j) { return m_db.SqlMakeByListField(szField, j, m_strOut); });
    }
    int condition(const Json::Value& jFilter)
    {
        return builds(jFilter, [&](Json::Value& j) { return m_db.SqlFilterConditionFromJson(j, m_strOut); });
    }

    // Makes the nCall-th text for SQL fail, counted from now on.
    static void failText(int nCall = 1)
    {
        seam().counts.clear();
        seam().fail("sqlite3_mprintf", ENOMEM, nCall, nCall);
    }

    AccessTokenDbApi m_db;
    std::string m_strOut = "held";

private:
    template <typename Builder>
    int builds(const Json::Value& jInput, Builder builder)
    {
        const Json::Value jTypes = tokenType();
        Json::Value jCopy = jInput;
        const int nResult = builder(jCopy);
        EXPECT_EQ(jInput, jCopy);
        EXPECT_EQ(jTypes, tokenType());
        EXPECT_EQ("", m_db.m_strSql);
        return nResult;
    }
};

TEST_F(Filter, MakesOneConditionOfTheFields)
{
    const auto makes = [&](const char* szFilter, bool bAnd, const char* szOutput, int nResult) {
        SCOPED_TRACE(szFilter);
        m_strOut = "held (before";
        EXPECT_EQ(nResult, where(szFilter, bAnd));
        EXPECT_EQ(std::string("held (before") + szOutput, m_strOut);
    };
    makes(R"({"tid":"Ab12"})", true, " (tid='Ab12' )", 0);
    makes(R"({"uid":1024,"function":"VPN"})", true, " (function='VPN' and uid=1024 )", 0);
    makes(R"({"uid":1024,"function":"VPN"})", false, " (function='VPN' or uid=1024 )", 0);
    makes(R"({"bind_sid":"s'1"})", true, " (bind_sid='s''1' )", 0);
    makes(R"({"tid":["a","b"],"count":0})", true, " (count=0 and tid in ('a''b' ) )", 0);
    makes(R"({"tid":null,"uid":null})", true, " (tid='' and uid= )", 0);
    makes(R"({"extra":[{"a":1}],"webapi_allow":"x"})", true,
          R"( (extra in ('{"a":1}' ) and webapi_allow='"x"' ))", 0);
    makes(R"({"uid":"7 or 1=1"})", true, " (uid=7 or 1=1 )", 0);
    // Names that are not fields are ignored, whatever their values are.
    makes("{}", true, "", 1);
    makes(R"({"sort_by":"uid","sort_direction":"desc","limit":1,"offset":2})", true, "", 1);
    makes(R"({"foo":{"a":1},"":[1],"Tid":"x","tid ":"x","tid\u0000":"x","TID":null})", true, "", 1);
    makes(R"({"foo":{},"uid":1,"limit":{},"zzz":[[]]})", true, " (uid=1 )", 0);
    // An empty list leaves the words between conditions.
    makes(R"({"count":1,"uid":[]})", true, " (count=1 and  )", 0);
    makes(R"({"count":[],"uid":1})", true, " ( and uid=1 )", 0);
    makes(R"({"count":[],"deadline":[],"uid":[]})", false, " ( or  or  )", 0);
}

TEST_F(Filter, KeepsWhatItWroteBeforeAFailure)
{
    // There is no memory for the text nCall; with 0, the filter is wrong.
    const auto keeps = [&](const char* szFilter, int nCall, const char* szKept, const std::string& strInner,
                           const std::string& strOuter) {
        SCOPED_TRACE(szFilter);
        m_strOut = "held";
        errno = EIO;
        failText(nCall);
        EXPECT_EQ(-1, where(szFilter));
        EXPECT_EQ(szKept, m_strOut);
        EXPECT_LINES(nCall ? allFailed(STORE, {strInner, strOuter}, ENOMEM)
                           : Texts{fail(STORE, "err input type, jTokenParam=(null)", EIO)});
    };
    keeps(R"({"extra":{"a":1}})", 0, "held (", "", "");
    keeps(R"({"count":1,"uid":{"a":1},"webapi_allow":{}})", 0, "held (count=1 and ", "", "");
    keeps(R"({"tid":"a"})", 1, "held (", MATCH_TEXT_FAILED, MATCH_FAILED);
    keeps(R"({"extra":7})", 1, "held (", MATCH_JSON_FAILED, MATCH_FAILED);
    keeps(R"({"count":1,"uid":7})", 2, "held (count=1 and ", MATCH_TEXT_FAILED, MATCH_FAILED);
    keeps(R"({"tid":["a"]})", 1, "held (", LIST_TEXT_FAILED, LIST_FAILED);
    keeps(R"({"extra":[{}]})", 1, "held (", LIST_JSON_FAILED, LIST_FAILED);
    keeps(R"({"tid":["a","b"]})", 2, "held (", LIST_TEXT_FAILED, LIST_FAILED);
    keeps(R"({"count":[1],"uid":[1,2,3]})", 4, "held (count in (1 ) and ", LIST_TEXT_FAILED, LIST_FAILED);
}

TEST_F(Filter, WritesEachValueByTheTypeOfItsField)
{
    // As a single value and as an element of a list, for a field of text, of JSON and of a number.
    const auto writes = [&](const std::string& strValue, const std::string& strText,
                            const std::string& strJson, const std::string& strNumber) {
        for (const Field& field : fields()) {
            const std::string strName = field.szName;
            const std::string strType = field.szType;
            SCOPED_TRACE(strName + "=" + strValue);
            const std::string& strSql = "string" == strType      ? strText
                                        : "long long" == strType ? strNumber
                                                                 : strJson;
            m_strOut = "held ";
            EXPECT_EQ(0, match(strName, json(strValue)));
            EXPECT_EQ("held " + strName + "=" + strSql, m_strOut);
            m_strOut = "held ";
            EXPECT_EQ(0, list(field.szName, json("[" + strValue + "]")));
            EXPECT_EQ("held " + strName + " in (" + strSql + " )", m_strOut);
            // There is no separator between elements.
            m_strOut.clear();
            EXPECT_EQ(0, list(field.szName, json("[" + strValue + "," + strValue + "," + strValue + "]")));
            EXPECT_EQ(strName + " in (" + strSql + strSql + strSql + " )", m_strOut);
        }
    };
    for (const std::string strValue :
         {"true", "false", "0", "-7", "-9223372036854775808", "18446744073709551615", "1.5", "2.0"}) {
        writes(strValue, "'" + strValue + "'", "'" + strValue + "'", strValue);
    }
    writes("null", "''", "'null'", "");
    writes(R"("")", "''", R"('""')", "");
    writes(R"("7")", "'7'", R"('"7"')", "7");
    writes(R"("it's")", "'it''s'", R"('"it''s"')", "it''s");
    writes(R"("x'; DROP TABLE token; --")", "'x''; DROP TABLE token; --'", R"('"x''; DROP TABLE token; --"')",
           "x''; DROP TABLE token; --");
    writes(R"("%s%n%q%Q")", "'%s%n%q%Q'", R"('"%s%n%q%Q"')", "%s%n%q%Q");
    writes(R"("a\"b\\c")", R"('a"b\c')", R"('"a\"b\\c"')", R"(a"b\c)");
    writes(R"("a\nb")", "'a\nb'", R"('"a\nb"')", "a\nb");
    writes("\"gr\xc3\xbc\xc3\x9f\"", "'gr\xc3\xbc\xc3\x9f'", "'\"gr\xc3\xbc\xc3\x9f\"'",
           "gr\xc3\xbc\xc3\x9f");
    writes(R"("a\u0000b")", "'a'", R"('"a\u0000b"')", "a"); // text ends at its first zero byte
}

TEST_F(Filter, FollowsTheTypeTable)
{
    const std::pair<std::string, Texts> types[] = {
        {"'it''s'", {"string"}},
        {R"('"it''s"')", {"Json::Value", "Json::objectValue", "Json::arrayValue"}},
        {"it''s", {"long long", "int", "bool", "uid_t", "time_t", "", "String", "string ", "Json::", "Json"}},
    };
    EXPECT_EQ(1, where(R"({"colour":"it's"})"));
    for (const auto& [strSql, names] : types) {
        for (const std::string& strType : names) {
            SCOPED_TRACE(strType);
            tokenType()["colour"][0] = strType;
            m_strOut.clear();
            EXPECT_EQ(0, where(R"({"colour":"it's"})"));
            EXPECT_EQ(0, where(R"({"colour":["it's"]})"));
            EXPECT_EQ(" (colour=" + strSql + " ) (colour in (" + strSql + " ) )", m_strOut);
        }
    }
    // This is true of the library's own fields too.
    tokenType()["uid"][0] = "string";
    tokenType().removeMember("tid");
    m_strOut.clear();
    EXPECT_EQ(0, where(R"({"tid":"a","uid":7})"));
    EXPECT_EQ(" (uid='7' )", m_strOut);
    EXPECT_FAILURE(match("tid", "a"), failed(STORE, "!jTokenType.isMember(strField)"));
}

TEST_F(Filter, RefusesUnusableValues)
{
    const Json::Value jText = "text";
    const auto refuses = [&](int nResult, const std::string& strCondition, int nErrno = 0) {
        EXPECT_EQ(-1, nResult);
        EXPECT_LINES(failed(STORE, strCondition, nErrno));
    };
    refuses(where("[1,2]"), "jTokenParam.type() != Json::objectValue");
    refuses(condition(jText), "jFilter.type() != Json::objectValue");
    refuses(list(nullptr, jText), "!szField || !szField[0]");
    refuses(list("", jText), "!szField || !szField[0]");
    refuses(list("TID", jText), "!jTokenType.isMember(szField)");
    refuses(list("tid", jText), "jList.type() != Json::arrayValue");
    refuses(match("", jText), "!jTokenType.isMember(strField)");
    refuses(match(std::string("tid\0", 4), jText), "!jTokenType.isMember(strField)");
    // Without memory for the text.
    seam().fail("sqlite3_mprintf", ENOMEM, 1, 3);
    refuses(match("tid", jText), MATCH_TEXT_FAILED, ENOMEM);
    refuses(list("tid", json(R"(["a","b"])")), LIST_TEXT_FAILED, ENOMEM);
    refuses(condition(json(R"({"sort_by":"uid","limit":0})")), "!szSql", ENOMEM);
    EXPECT_EQ("held", m_strOut);
}

TEST_F(Filter, ReadsGapsInListsAsNullAndDoesNotFillThem)
{
    Json::Value jList;
    jList[2] = "a";
    EXPECT_EQ(0, list("tid", jList));
    EXPECT_EQ(0, list("extra", jList));
    EXPECT_EQ("heldtid in ('''''a' )extra in ('null''null''\"a\"' )", m_strOut);
}

TEST_F(Filter, SortsByATextAndInOneOfTwoDirections)
{
    const auto appends = [&](const std::string& strFilter, const std::string& strAppended) {
        SCOPED_TRACE(strFilter);
        m_strOut = "held";
        EXPECT_EQ(0, condition(json(strFilter)));
        EXPECT_EQ("held" + strAppended, m_strOut);
    };
    appends(R"({"sort_by":"create_time"})", " order by 'create_time'");
    appends(R"({"sort_by":"create_time","sort_direction":"desc"})", " order by 'create_time' DESC");
    for (const std::string strOther :
         {R"("asc")", R"("DESC")", R"("desc ")", R"("desc\u0000")", "null", "1"}) {
        appends(R"({"sort_by":"uid","sort_direction":)" + strOther + "}", " order by 'uid' ASC");
    }
    appends(R"({"sort_by":""})", " order by ''");
    appends(R"({"sort_by":"x'; DROP TABLE token; --"})", " order by 'x''; DROP TABLE token; --'");
    appends(R"({"sort_by":"%s%n%q"})", " order by '%s%n%q'");
    appends(R"({"sort_by":"a\u0000b"})", " order by 'a'");
    appends(R"({"sort_by":"uid","sort_direction":"desc","limit":0,"offset":1})",
            " order by 'uid' DESC LIMIT OFFSET ");
    appends(R"({"sort_by":"uid","limit":7})", " order by 'uid'");
    appends(R"({"limit":0,"offset":0})", " LIMIT  OFFSET ");
    appends(R"({"offset":3})", "");
    appends(R"({"tid":"a","foo":1})", "");
    appends(R"({"sort_direction":{},"offset":"x"})", ""); // values that are not read do not matter
}

TEST_F(Filter, WritesTheTailOfTheKeywordThatTheNumberPointsTo)
{
    const Json::Int64 n2To32 = Json::Int64(1) << 32;
    const std::string strLimit = " LIMIT ", strOffset = " OFFSET ";
    // Numbers are positions, modulo 2^32. Other values are read as numbers, and a fraction is cut off.
    const auto points = [&](const Json::Value& jNumber, size_t nFirst) {
        SCOPED_TRACE(jNumber.asString());
        Json::Value jFilter;
        jFilter["limit"] = jNumber;
        m_strOut.clear();
        EXPECT_EQ(0, condition(jFilter));
        EXPECT_EQ(strLimit.substr(std::min(nFirst, strLimit.size())), m_strOut);
        jFilter["limit"] = 8;
        jFilter["offset"] = jNumber;
        m_strOut.clear();
        EXPECT_EQ(0, condition(jFilter));
        EXPECT_EQ(strOffset.substr(std::min(nFirst, strOffset.size())), m_strOut);
    };
    for (unsigned int nFirst = 0; nFirst < 10; ++nFirst) {
        points(nFirst, nFirst);
        points(n2To32 + nFirst, nFirst);
        points(nFirst - n2To32, nFirst);
    }
    for (const Json::Value& jNumber :
         {Json::Value(), Json::Value(false), Json::Value(-0.9), Json::Value(INT64_MIN)}) {
        points(jNumber, 0);
    }
    points(true, 1);
    points(1.9, 1);
    for (const Json::Int64 nNumber : {Json::Int64(-1), n2To32 / 2, n2To32 - 1, Json::Int64(INT64_MAX)}) {
        points(nNumber, 9); // or more
    }
}

// Reading and deleting what a filter selects

class Query : public TableTest {
protected:
    // The operations, with the filter as text.
    int get(const std::string& strFilter, const char* szOut = "null")
    {
        Json::Value jFilter = json(strFilter);
        m_jOut = json(szOut);
        return m_db.tokenGet(jFilter, m_jOut);
    }
    int remove(const std::string& strFilter, bool bAll = false)
    {
        Json::Value jFilter = json(strFilter);
        return m_db.tokenDelete(jFilter, bAll);
    }
    int getOne(const char* szName, std::string strValue)
    {
        m_jOut = json(R"({"old":1})");
        return m_db.tokenGetOne(szName, strValue, m_jOut);
    }

    Json::Value m_jOut;
};

TEST_F(Query, FailsWhenSqliteRefusesTheStatement)
{
    const auto fails = [&](const char* szFilter, const std::string& strCondition,
                           const std::string& strError) {
        SCOPED_TRACE(szFilter);
        const std::string strSql = SELECT + " WHERE " + strCondition + ";";
        errno = EIO;
        EXPECT_EQ(-1, get(szFilter));
        EXPECT_EQ(strError, m_db.m_strErr);
        EXPECT_TRUE(m_jOut.isNull());
        EXPECT_LINES(failureOf(strSql, strError, EIO) +
                     Texts{failed(STORE, "0 > runSql(FillList, &jTokenArrayOut)", EIO)});
    };
    fails(R"({"sort_by":"uid"})", " order by 'uid'", "near \"order\": syntax error");
    fails(R"({"function":"VPN","limit":0})", " (function='VPN' ) LIMIT ", "near \";\": syntax error");
    fails(R"({"limit":2})", "IMIT ", "no such column: IMIT");
    fails(R"({"uid":[]})", " ( )", "near \")\": syntax error");
}

TEST_F(Query, RefusesUnusableArgumentsAndRunsNothing)
{
    const std::string strNoFilter = failed(STORE, "jTokenParam.type() != Json::objectValue");
    const std::string strNoName = failed(STORE, "!szName || !szName[0]");
    const Texts nested = {fail(STORE, "err input type, jTokenParam=(null)"),
                          failed(STORE, "0 > SqlWhereFromJson(jTokenParam, strSql, true)")};
    m_db.m_strSql = "earlier";
    EXPECT_FAILURE(get("null", "{}"), strNoFilter);
    EXPECT_FAILURE(remove("[1,2]", true), strNoFilter);
    EXPECT_FAILURE(get("{}", "{}"), failed(STORE, "jTokenArrayOut.type() != Json::nullValue && "
                                                  "jTokenArrayOut.type() != Json::arrayValue"));
    EXPECT_FAILURE(getOne(nullptr, ""), strNoName);
    EXPECT_FAILURE(getOne("", "x"), strNoName);
    EXPECT_FAILURE(getOne("tid", ""), failed(STORE, "strValue.empty()"));
    EXPECT_EQ(json(R"({"old":1})"), m_jOut);
    EXPECT_FAILURE(get(R"({"tid":{"a":1}})"), nested);
    EXPECT_FAILURE(remove(R"({"tid":{"a":1}})", true), nested);
    EXPECT_FAILURE(remove("{}"), failed(STORE, "strSql.empty()"));
    // The first text is the field's, the second the order's.
    seam().fail("sqlite3_mprintf", ENOMEM, 2, 2);
    EXPECT_FAILURE(
        get(R"({"uid":7,"sort_by":"uid"})"),
        allFailed(STORE, {"!szSql", "0 > SqlFilterConditionFromJson(jTokenParam, strSql)"}, ENOMEM));
    EXPECT_EQ("earlier", m_db.m_strSql);
    EXPECT_EQ(Texts{}, seam().callsOf(OPENING_CALLS));
}

// FailedStore in ServiceTest shows how the service reports it.
TEST_F(Query, FailsAfterWaitingForALockAlthoughItHasTakenEffect)
{
    Json::Value jToken = token();
    failStatements("INSERT", LOCKED);
    EXPECT_FAILURE(m_db.tokenCreate(jToken), fail(STORE, "sql error, sql=" + saveSql("INSERT", jToken), EIO));
    failStatements("SELECT", LOCKED);
    EXPECT_FAILURE(get("{}"), fail(STORE, "sql error, sql=" + SELECT + ";", EIO));
    EXPECT_EQ(1u, m_jOut.size());
    failStatements("SELECT", LOCKED);
    EXPECT_EQ(-1, getOne("tid", "t"));
    EXPECT_EQ(json("{}"), m_jOut);
    EXPECT_EQ(2u, takeLines().size());
    failStatements("DELETE", LOCKED);
    EXPECT_FAILURE(remove("{}", true), fail(STORE, "sql error, sql=DELETE FROM token;", EIO));
    EXPECT_EQ("", tids());
}

} // namespace
