// Filters as SQL conditions.

#include "FilterTest.h"

using VEMO_ACCESS_TOKEN::tokenType;

namespace {

const std::string MATCH_TEXT_FAILED = "NULL == (szSql = sqlite3_mprintf(\"%q\", jParam.asString().c_str()))";
const std::string MATCH_JSON_FAILED = "NULL == (szSql = sqlite3_mprintf(\"%q\", jParam.toString().c_str()))";
const std::string LIST_TEXT_FAILED = "NULL == (szSql = sqlite3_mprintf(\"%q\", jList[i].asString().c_str()))";
const std::string LIST_JSON_FAILED = "NULL == (szSql = sqlite3_mprintf(\"%q\", jList[i].toString().c_str()))";
const std::string MATCH_FAILED = "0 > SqlMakeByMatchField(jmFieldName[i], jTmp, strSqlWhereOut)";
const std::string LIST_FAILED = "0 > SqlMakeByListField(jmFieldName[i].c_str(), jTmp, strSqlWhereOut)";

class Filter : public FilterTest {};
class FilterWhere : public FilterTest {};
class FilterMatch : public FilterTest {};
class FilterList : public FilterTest {};

TEST_F(FilterWhere, MakesOneConditionOfTheFields)
{
    const struct {
        const char* szFilter;
        bool bAnd;
        const char* szOutput;
        int nResult;
    } rows[] = {
        {R"({"tid":"Ab12"})", true, " (tid='Ab12' )", 0},
        {R"({"uid":1024,"function":"VPN"})", true, " (function='VPN' and uid=1024 )", 0},
        {R"({"uid":1024,"function":"VPN"})", false, " (function='VPN' or uid=1024 )", 0},
        {R"({"bind_sid":"s'1"})", true, " (bind_sid='s''1' )", 0},
        {R"({"tid":["Ab12"]})", true, " (tid in ('Ab12' ) )", 0},
        {R"({"tid":["a","b"],"count":0})", true, " (count=0 and tid in ('a''b' ) )", 0},
        {R"({"uid":[1,2]})", true, " (uid in (12 ) )", 0},
        {R"({"uid":[]})", true, " ( )", 0},
        {R"({"sort_by":"uid","limit":5})", true, "", 1},
        // Nothing but what names no field.
        {"{}", true, "", 1},
        {"{}", false, "", 1},
        {R"({"sort_by":"uid","sort_direction":"desc","limit":1,"offset":2})", true, "", 1},
        {R"({"foo":{"a":1},"":[1],"Tid":"x","tid ":"x","tid\u0000":"x","TID":null})", true, "", 1},
        // Such names beside fields, of whatever type their values are.
        {R"({"foo":{},"uid":1,"limit":{},"zzz":[[]]})", true, " (uid=1 )", 0},
        // An empty list leaves the joining words.
        {R"({"count":1,"uid":[]})", true, " (count=1 and  )", 0},
        {R"({"count":[],"uid":1})", true, " ( and uid=1 )", 0},
        {R"({"count":[],"deadline":[],"uid":[]})", false, " ( or  or  )", 0},
        {R"({"bind_sid":"s","tid":[],"uid":1})", true, " (bind_sid='s' and  and uid=1 )", 0},
        {R"({"tid":null,"uid":null})", true, " (tid='' and uid= )", 0},
        {R"({"extra":[{"a":1}],"webapi_allow":"x"})", true,
         R"( (extra in ('{"a":1}' ) and webapi_allow='"x"' ))", 0},
        {R"({"tid":"x' OR '1'='1"})", true, " (tid='x'' OR ''1''=''1' )", 0},
        {R"({"uid":"7 or 1=1"})", true, " (uid=7 or 1=1 )", 0},
    };

    for (const auto& row : rows) {
        for (const std::string strBefore : {"", "held (before"}) {
            SCOPED_TRACE(std::string(row.szFilter) + " after '" + strBefore + "'");
            m_strOut = strBefore;
            EXPECT_EQ(row.nResult, where(row.szFilter, row.bAnd));
            EXPECT_EQ(strBefore + row.szOutput, m_strOut);
            EXPECT_EQ(Texts{}, takeLines());
        }
    }
}

TEST_F(FilterWhere, VisitsFieldsInAscendingOrderOfTheirBytes)
{
    tokenType()["Z"].append("string");
    tokenType()["tid2"].append("string");
    tokenType()["\xc3\xa9"].append("string");

    EXPECT_EQ(0, where("{\"\xc3\xa9\":1,\"webapi_allow\":1,\"uid\":1,\"tid2\":1,\"tid\":1,\"function\":1,"
                       "\"extra\":1,\"deadline\":1,\"create_time\":1,\"count\":1,\"bind_sid\":1,\"Z\":1}"));

    EXPECT_EQ(" (Z='1' and bind_sid='1' and count=1 and create_time=1 and deadline=1 and extra='1' and "
              "function='1' and tid='1' and tid2='1' and uid=1 and webapi_allow='1' and \xc3\xa9='1' )",
              m_strOut);
}

TEST_F(FilterWhere, RefusesWhatIsNoObject)
{
    for (const char* szFilter : {"null", "[1,2]", "[]", R"("tid")", "5", "1.5", "true"}) {
        SCOPED_TRACE(szFilter);
        m_strOut = "held";
        EXPECT_EQ(-1, where(szFilter));
        EXPECT_EQ((Texts{failed(STORE, "jTokenParam.type() != Json::objectValue")}), takeLines());
        EXPECT_EQ(-1, condition(json(szFilter)));
        EXPECT_EQ((Texts{failed(STORE, "jFilter.type() != Json::objectValue")}), takeLines());
        EXPECT_EQ("held", m_strOut);
    }
}

TEST_F(FilterWhere, RefusesObjectAsValueAndKeepsWhatItWrote)
{
    const struct {
        const char* szFilter;
        const char* szOutput;
    } rows[] = {
        {R"({"extra":{"a":1}})", " ("},
        {R"({"webapi_allow":{}})", " ("},
        {R"({"tid":{}})", " ("},
        {R"({"count":1,"uid":{"a":1},"webapi_allow":{}})", " (count=1 and "},
    };

    for (const auto& row : rows) {
        for (const int nErrno : {0, EIO}) {
            SCOPED_TRACE(row.szFilter);
            m_strOut = "held";
            m_nErrno = nErrno;
            EXPECT_EQ(-1, where(row.szFilter));
            EXPECT_EQ(std::string("held") + row.szOutput, m_strOut);
            EXPECT_EQ((Texts{fail(STORE, "err input type, jTokenParam=(null)", nErrno)}), takeLines());
        }
    }
}

TEST_F(FilterWhere, ReportsLackOfMemoryForEachKindOfText)
{
    const struct {
        const char* szFilter;
        int nCall; // the one that finds no memory
        const char* szKept;
        std::string strInner, strOuter;
    } rows[] = {
        {R"({"tid":"a"})", 1, "held (", MATCH_TEXT_FAILED, MATCH_FAILED},
        {R"({"uid":7})", 1, "held (", MATCH_TEXT_FAILED, MATCH_FAILED},
        {R"({"extra":7})", 1, "held (", MATCH_JSON_FAILED, MATCH_FAILED},
        {R"({"count":1,"uid":7})", 2, "held (count=1 and ", MATCH_TEXT_FAILED, MATCH_FAILED},
        {R"({"tid":["a"]})", 1, "held (", LIST_TEXT_FAILED, LIST_FAILED},
        {R"({"uid":[7]})", 1, "held (", LIST_TEXT_FAILED, LIST_FAILED},
        {R"({"extra":[{}]})", 1, "held (", LIST_JSON_FAILED, LIST_FAILED},
        {R"({"tid":["a","b"]})", 2, "held (", LIST_TEXT_FAILED, LIST_FAILED},
        {R"({"count":[1],"uid":[1,2,3]})", 4, "held (count in (1 ) and ", LIST_TEXT_FAILED, LIST_FAILED},
    };

    for (const auto& row : rows) {
        SCOPED_TRACE(row.szFilter);
        m_strOut = "held";
        seam().counts.clear();
        seam().fail("sqlite3_mprintf", ENOMEM, row.nCall, row.nCall);
        EXPECT_EQ(-1, where(row.szFilter));
        EXPECT_EQ(row.szKept, m_strOut);
        EXPECT_EQ((Texts{failed(STORE, row.strInner, ENOMEM), failed(STORE, row.strOuter, ENOMEM)}),
                  takeLines());
    }
}

// How a value is written, in a condition of its own and as an element of a list.
enum Class { TEXT, JSON, NUMBER };

const struct {
    const char* szValue;
    const char* rendered[3];
} VALUES[] = {
    {"null", {"''", "'null'", ""}},
    {"true", {"'true'", "'true'", "true"}},
    {"false", {"'false'", "'false'", "false"}},
    {"0", {"'0'", "'0'", "0"}},
    {"-7", {"'-7'", "'-7'", "-7"}},
    {"-9223372036854775808", {"'-9223372036854775808'", "'-9223372036854775808'", "-9223372036854775808"}},
    {"18446744073709551615", {"'18446744073709551615'", "'18446744073709551615'", "18446744073709551615"}},
    {"1.5", {"'1.5'", "'1.5'", "1.5"}},
    {"2.0", {"'2.0'", "'2.0'", "2.0"}},
    {R"("")", {"''", R"('""')", ""}},
    {R"("7")", {"'7'", R"('"7"')", "7"}},
    {R"("it's")", {"'it''s'", R"('"it''s"')", "it''s"}},
    {R"("''")", {"''''''", R"('"''''"')", "''''"}},
    {R"("x'; DROP TABLE token; --")",
     {"'x''; DROP TABLE token; --'", R"('"x''; DROP TABLE token; --"')", "x''; DROP TABLE token; --"}},
    {R"("%s%n%q%Q")", {"'%s%n%q%Q'", R"('"%s%n%q%Q"')", "%s%n%q%Q"}},
    {R"("a\"b\\c")", {R"('a"b\c')", R"('"a\"b\\c"')", R"(a"b\c)"}},
    {R"("a\nb")", {"'a\nb'", R"('"a\nb"')", "a\nb"}},
    {"\"gr\xc3\xbc\xc3\x9f\"", {"'gr\xc3\xbc\xc3\x9f'", "'\"gr\xc3\xbc\xc3\x9f\"'", "gr\xc3\xbc\xc3\x9f"}},
    // Text ends at its first zero byte.
    {R"("a\u0000b")", {"'a'", R"('"a\u0000b"')", "a"}},
};

const std::pair<const char*, Class> FIELDS[] = {
    {"tid", TEXT},        {"bind_sid", TEXT},     {"uid", NUMBER},
    {"deadline", NUMBER}, {"count", NUMBER},      {"create_time", NUMBER},
    {"function", TEXT},   {"webapi_allow", JSON}, {"extra", JSON},
};

TEST_F(FilterMatch, WritesEachKindOfValueAsItsFieldDemands)
{
    for (const auto& [szField, fieldClass] : FIELDS) {
        for (const auto& value : VALUES) {
            SCOPED_TRACE(std::string(szField) + "=" + value.szValue);
            m_strOut = "held ";
            EXPECT_EQ(0, match(szField, json(value.szValue)));
            EXPECT_EQ(std::string("held ") + szField + "=" + value.rendered[fieldClass], m_strOut);
        }
    }
    EXPECT_EQ(Texts{}, takeLines());
}

TEST_F(FilterList, WritesEachKindOfElementAsItsFieldDemands)
{
    for (const auto& [szField, fieldClass] : FIELDS) {
        for (const auto& value : VALUES) {
            SCOPED_TRACE(std::string(szField) + "=" + value.szValue);
            const std::string strValue = value.szValue;
            const std::string strRendered = value.rendered[fieldClass];
            m_strOut = "held ";
            EXPECT_EQ(0, list(szField, json("[" + strValue + "]")));
            EXPECT_EQ(std::string("held ") + szField + " in (" + strRendered + " )", m_strOut);

            // Nothing separates elements.
            m_strOut.clear();
            EXPECT_EQ(0, list(szField, json("[" + strValue + "," + strValue + "," + strValue + "]")));
            EXPECT_EQ(szField + (" in (" + strRendered + strRendered + strRendered + " )"), m_strOut);
        }
    }
    EXPECT_EQ(Texts{}, takeLines());
}

TEST_F(FilterMatch, WritesTextThatIsNotUtf8AsItIs)
{
    EXPECT_EQ(0, match("tid", "\xff\xc3'"));
    EXPECT_EQ(0, match("extra", "\xff\xc3'"));
    EXPECT_EQ("tid='\xff\xc3'''extra='\"\xff\xc3''\"'", m_strOut);
}

TEST_F(FilterMatch, TakesNestedValuesForJsonFieldsOnly)
{
    const std::pair<const char*, const char*> values[] = {
        {"{}", "{}"},
        {"[]", "[]"},
        {R"({ "b" : [1, null], "a" : "it's" })", R"({"a":"it''s","b":[1,null]})"},
    };

    for (const auto& [szValue, szText] : values) {
        SCOPED_TRACE(szValue);
        const Json::Value jValue = json(szValue);
        Json::Value jList;
        jList.append(jValue);

        m_strOut.clear();
        EXPECT_EQ(0, match("extra", jValue));
        EXPECT_EQ(std::string("extra='") + szText + "'", m_strOut);
        m_strOut.clear();
        EXPECT_EQ(0, list("webapi_allow", jList));
        EXPECT_EQ(std::string("webapi_allow in ('") + szText + "' )", m_strOut);
        for (const char* szField : {"tid", "uid"}) {
            EXPECT_THROW(match(szField, jValue), Json::Exception);
            EXPECT_THROW(list(szField, jList), Json::Exception);
        }
    }
    EXPECT_THROW(where(R"({"tid":[["a"]]})"), Json::Exception);
    EXPECT_THROW(where(R"({"uid":[1,{}]})"), Json::Exception);
    EXPECT_EQ(Texts{}, takeLines());
}

TEST_F(FilterMatch, ClassifiesByTheTypeThatTheTableHoldsNow)
{
    const std::pair<Class, Texts> types[] = {
        {TEXT, {"string"}},
        {JSON, {"Json::Value", "Json::objectValue", "Json::arrayValue"}},
        {NUMBER, {"long long", "int", "bool", "uid_t", "time_t", "", "String", "string ", "Json::", "Json"}},
    };
    const char* const rendered[] = {"'it''s'", R"('"it''s"')", "it''s"};

    EXPECT_EQ(1, where(R"({"colour":"it's"})"));
    for (const auto& [fieldClass, names] : types) {
        for (const std::string& strType : names) {
            SCOPED_TRACE(strType);
            tokenType()["colour"] = Json::Value(Json::arrayValue);
            tokenType()["colour"].append(strType);
            m_strOut.clear();
            EXPECT_EQ(0, where(R"({"colour":"it's"})"));
            EXPECT_EQ(0, where(R"({"colour":["it's"]})"));
            const std::string strRendered = rendered[fieldClass];
            EXPECT_EQ(" (colour=" + strRendered + " ) (colour in (" + strRendered + " ) )", m_strOut);
        }
    }

    // The library's own fields are no exception.
    tokenType()["uid"][0U] = "string";
    tokenType().removeMember("tid");
    m_strOut.clear();
    EXPECT_EQ(0, where(R"({"tid":"a","uid":7})"));
    EXPECT_EQ(" (uid='7' )", m_strOut);
    EXPECT_EQ(-1, match("tid", "a"));
    EXPECT_EQ((Texts{failed(STORE, "!jTokenType.isMember(strField)")}), takeLines());
}

TEST_F(FilterMatch, RefusesWhatIsNoField)
{
    m_strOut = "held";
    for (const std::string& strField : {std::string(""), std::string("foo"), std::string("TID"),
                                        std::string("limit"), std::string("tid\0", 4)}) {
        SCOPED_TRACE(strField);
        EXPECT_EQ(-1, match(strField, "a"));
        EXPECT_EQ((Texts{failed(STORE, "!jTokenType.isMember(strField)")}), takeLines());
    }
    EXPECT_EQ("held", m_strOut);
}

TEST_F(FilterMatch, FailsWhenMemoryRunsOut)
{
    m_strOut = "held";
    seam().fail("sqlite3_mprintf", ENOMEM);

    EXPECT_EQ(-1, match("tid", "a"));

    EXPECT_EQ("held", m_strOut);
    EXPECT_EQ((Texts{failed(STORE, MATCH_TEXT_FAILED, ENOMEM)}), takeLines());
}

TEST_F(FilterList, RefusesWhatIsNoFieldOrNoList)
{
    const std::string NO_NAME = "!szField || !szField[0]";
    const std::string NO_FIELD = "!jTokenType.isMember(szField)";
    const std::string NO_LIST = "jList.type() != Json::arrayValue";
    const struct {
        const char *szField, *szList;
        std::string strCondition;
    } rows[] = {
        {nullptr, R"(["a"])", NO_NAME}, {nullptr, "{}", NO_NAME},       {"", R"(["a"])", NO_NAME},
        {"foo", R"(["a"])", NO_FIELD},  {"foo", "{}", NO_FIELD},        {"TID", "[]", NO_FIELD},
        {"tid", R"("a")", NO_LIST},     {"tid", R"({"a":1})", NO_LIST}, {"tid", "null", NO_LIST},
        {"extra", "{}", NO_LIST},       {"uid", "7", NO_LIST},
    };

    m_strOut = "held";
    for (const auto& row : rows) {
        SCOPED_TRACE(row.szField ? row.szField : "(null)");
        EXPECT_EQ(-1, list(row.szField, json(row.szList)));
        EXPECT_EQ((Texts{failed(STORE, row.strCondition)}), takeLines());
    }
    EXPECT_EQ("held", m_strOut);
}

TEST_F(FilterList, ReadsGapsAsNullAndLeavesThem)
{
    Json::Value jList;
    jList[2] = "a";
    EXPECT_EQ(0, list("tid", jList));
    EXPECT_EQ(0, list("extra", jList));
    EXPECT_EQ("tid in ('''''a' )extra in ('null''null''\"a\"' )", m_strOut);
}

TEST_F(FilterList, ReachesTheOutputWholeOrNotAtAll)
{
    m_strOut = "held";
    EXPECT_EQ(0, list("tid", Json::Value(Json::arrayValue)));
    seam().fail("sqlite3_mprintf", ENOMEM, 3, 3);
    EXPECT_EQ(-1, list("tid", json(R"(["a","b","c"])")));
    EXPECT_EQ("held", m_strOut);
    EXPECT_EQ((Texts{failed(STORE, LIST_TEXT_FAILED, ENOMEM)}), takeLines());

    EXPECT_EQ(0, list("tid", json(R"(["a","b","c"])")));
    EXPECT_EQ("heldtid in ('a''b''c' )", m_strOut);
}

TEST_F(Filter, TracesNothingInDebugModeAndReleasesItsTexts)
{
    VEMO_ACCESS_TOKEN::debugInfo(true);
    sqlite3_initialize();
    const sqlite3_int64 nUsed = sqlite3_memory_used();

    EXPECT_EQ(0, where(R"({"extra":[{},1],"tid":"a","uid":[1,2]})"));
    EXPECT_EQ(0, condition(json(R"({"sort_by":"uid"})")));

    EXPECT_EQ((Texts{"sqlite3_mprintf %q", "sqlite3_mprintf %q", "sqlite3_mprintf %q", "sqlite3_mprintf %q",
                     "sqlite3_mprintf %q", "sqlite3_mprintf  order by '%q'"}),
              seam().callsOf({"sqlite3_mprintf", "sqlite3_exec", "printf"}));
    EXPECT_EQ(nUsed, sqlite3_memory_used());
    EXPECT_EQ(Texts{}, takeLines());
}

class FilterInSystemLog : public FilterTest {
protected:
    FilterInSystemLog() : FilterTest(Destination::Syslog) {}
};

TEST_F(FilterInSystemLog, TellsTheErrorInFrontWhenThereIsOne)
{
    for (const int nErrno : {0, ENOMEM}) {
        seam().counts.clear();
        seam().fail("sqlite3_mprintf", nErrno);
        m_nErrno = nErrno;

        EXPECT_EQ(-1, where(R"({"tid":"a"})"));
        EXPECT_EQ(-1, where(R"({"tid":{}})"));

        EXPECT_EQ(inSystemLog({failed(STORE, MATCH_TEXT_FAILED, nErrno), failed(STORE, MATCH_FAILED, nErrno),
                               fail(STORE, "err input type, jTokenParam=(null)", nErrno)},
                              nErrno),
                  takeLines(Destination::Syslog));
    }
}

} // namespace
