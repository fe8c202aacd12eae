// Saving records.

#include <dlfcn.h>

#include <cerrno>
#include <cmath>
#include <cstring>
#include <limits>

#include "AccessTokenUtil.h"
#include "StoreTest.h"
#include "internal/AccessTokenDbApi.h"

namespace {

// The expanders never fail by themselves; these stand in for them, when set.
int (*g_pExpandName)(std::string& strSql) = nullptr;
int (*g_pExpandSymbol)(std::string& strSql) = nullptr;

int expandNext(const char* szMangledName, AccessTokenDbApi* pDb, std::string& strSql)
{
    typedef int Expand(AccessTokenDbApi*, std::string&);
    return reinterpret_cast<Expand*>(dlsym(RTLD_NEXT, szMangledName))(pDb, strSql);
}

} // namespace

int AccessTokenDbApi::SqlExpandMemberName(std::string& strSql)
{
    return g_pExpandName ? g_pExpandName(strSql)
                         : expandNext("_ZN16AccessTokenDbApi19SqlExpandMemberNameERNSt7__cxx1112basic_"
                                      "stringIcSt11char_traitsIcESaIcEEE",
                                      this, strSql);
}

int AccessTokenDbApi::SqlExpandMemberSymbol(std::string& strSql)
{
    return g_pExpandSymbol ? g_pExpandSymbol(strSql)
                           : expandNext("_ZN16AccessTokenDbApi21SqlExpandMemberSymbolERNSt7__cxx1112basic_"
                                        "stringIcSt11char_traitsIcESaIcEEE",
                                        this, strSql);
}

namespace {

typedef std::vector<std::string> Lines;

const char* const FILE_NAME = "AccessTokenSqlite.cpp";
const char* const DIRECTIVES = "%Q,%Q,%lld,%lld,%lld,%lld,%Q,%Q,%Q";
const char* const FIELDS[] = {"tid",         "bind_sid", "uid",          "deadline", "count",
                              "create_time", "function", "webapi_allow", "extra"};

// The record of most tests, and its values in SQL.
Json::Value record()
{
    return json(R"({"tid":"a","bind_sid":"sid","uid":1026,"deadline":-1,"count":1,"create_time":1700000000,
                    "function":"f","webapi_allow":{"Example.Api":{"method":["get","list"]}},
                    "extra":{"b":[1,null]}})");
}

const Lines VALUES = {"'a'",
                      "'sid'",
                      "1026",
                      "-1",
                      "1",
                      "1700000000",
                      "'f'",
                      R"('{"Example.Api":{"method":["get","list"]}}')",
                      R"('{"b":[1,null]}')"};
const char* const RECORD_TEXT =
    R"({"bind_sid":"sid","count":1,"create_time":1700000000,"deadline":-1,"extra":{"b":[1,null]},)"
    R"("function":"f","tid":"a","uid":1026,"webapi_allow":{"Example.Api":{"method":["get","list"]}}})";

std::string statement(const std::string& strVerb, const Lines& values = VALUES)
{
    std::string strValues;
    for (const std::string& strValue : values) {
        strValues.append(strValues.empty() ? "" : ",").append(strValue);
    }
    return strVerb + " INTO token (" + COLUMNS + ") VALUES (" + strValues + ")";
}

// What runSqlEx, runSql and the save log of a statement that failed.
Lines failureLines(const std::string& strSql, const std::string& strError, int i = 0)
{
    return {ordinary(FILE_NAME,
                     "i=" + std::to_string(i) + ",run sql failed, error=" + strError + ", sql=" + strSql),
            fail(FILE_NAME, "run sql failed, sql=" + strSql), failed(FILE_NAME, "0 > runSql()")};
}

// SQLite leaves some errno of its own; the lines of these tests are to read the same anywhere.
int execWithoutErrno(sqlite3* pDb, const char* szSql, int (*pCallback)(void*, int, char**, char**),
                     void* pArgument, char** pszError)
{
    const int nResult = sqlite3_exec(pDb, szSql, pCallback, pArgument, pszError);
    errno = 0;
    return nResult;
}

// An open store on an empty table.
class Save : public StoreTest {
protected:
    void SetUp() override
    {
        StoreTest::SetUp();
        makeDatabase();
        ASSERT_EQ(0, m_db.initDb());
        seam() = Seam();
        seam().sqliteExec = execWithoutErrno;
        errno = 0;
    }

    // The record as it comes back.
    Json::Value stored(const std::string& strTid = "a")
    {
        Json::Value jToken;
        std::string strValue = strTid;
        EXPECT_EQ(1, m_db.tokenGetOne("tid", strValue, jToken));
        return jToken;
    }

    AccessTokenDbApi m_db;
};

TEST_F(Save, RunsOneStatement)
{
    const struct {
        const char* szTrace;
        int (*pSave)(AccessTokenDbApi&, Json::Value&);
        const char* szVerb;
    } cases[] = {
        {"tokenCreate", [](AccessTokenDbApi& db, Json::Value& j) { return db.tokenCreate(j); }, "INSERT"},
        {"tokenUpdate", [](AccessTokenDbApi& db, Json::Value& j) { return db.tokenUpdate(j); }, "REPLACE"},
        {"tokenSave false", [](AccessTokenDbApi& db, Json::Value& j) { return db.tokenSave(j, false); },
         "REPLACE"},
        {"tokenSave true", [](AccessTokenDbApi& db, Json::Value& j) { return db.tokenSave(j, true); },
         "INSERT"},
    };
    for (const auto& [szTrace, pSave, szVerb] : cases) {
        SCOPED_TRACE(szTrace);
        query("DELETE FROM token");
        seam().calls.clear();
        m_db.m_strErr = "left over";
        Json::Value jToken = record();

        EXPECT_EQ(0, pSave(m_db, jToken));

        EXPECT_EQ((Lines{statement(std::string("sqlite3_mprintf ") + szVerb, {DIRECTIVES}),
                         "sqlite3_exec " + statement(szVerb), "sqlite3_changes"}),
                  seam().calls);
        EXPECT_EQ(statement(szVerb), m_db.m_strSql);
        EXPECT_EQ("", m_db.m_strErr);
        EXPECT_EQ(record(), jToken);
        EXPECT_EQ(Lines{}, takeLines());
        EXPECT_EQ((Lines{R"(a|sid|1026|-1|1|1700000000|f|{"Example.Api":{"method":["get","list"]}}|)"
                         R"({"b":[1,null]})"}),
                  query("SELECT * FROM token"));
    }
    EXPECT_EQ((Lines{"text|text|integer|integer|integer|integer|text|text|text"}),
              query("SELECT typeof(tid),typeof(bind_sid),typeof(uid),typeof(deadline),typeof(count),"
                    "typeof(create_time),typeof(function),typeof(webapi_allow),typeof(extra) FROM token"));
}

TEST_F(Save, ExpandersAppend)
{
    std::string strSql;
    EXPECT_EQ(0, m_db.SqlExpandMemberName(strSql));
    EXPECT_EQ(COLUMNS, strSql);
    EXPECT_EQ(0, m_db.SqlExpandMemberSymbol(strSql));
    EXPECT_EQ(0, m_db.SqlExpandMemberName(strSql));
    EXPECT_EQ(std::string(COLUMNS) + DIRECTIVES + ")" + COLUMNS, strSql);
}

// Types are the caller's business; what the JSON library converts is written so.
TEST_F(Save, RendersEachField)
{
    const struct {
        size_t nField;
        const char* szMember;
        const char* szSql;
    } cases[] = {
        {0, R"("it's")", "'it''s'"},
        {0, R"("''")", "''''''"},
        {0, R"("%Q %s %n %%")", "'%Q %s %n %%'"},
        {0, R"("a\\\"\n;--")", "'a\\\"\n;--'"},
        {0, R"("x'); DROP TABLE token; --")", "'x''); DROP TABLE token; --'"},
        {1, R"("")", "''"},
        {1, R"("NULL")", "'NULL'"},
        {1, R"("cut\u0000here")", "'cut'"},
        {2, "4294967295", "4294967295"},
        {2, "null", "0"},
        {3, "-9223372036854775808", "-9223372036854775808"},
        {3, "9223372036854775807", "9223372036854775807"},
        {3, "true", "1"},
        {4, "0", "0"},
        {4, "2.9", "2"},
        {5, "null", "0"},
        {6, R"("'")", "''''"},
        {7, "{}", "'{}'"},
        {7, "null", "'null'"},
        {7, R"({"it's":["'"]})", R"('{"it''s":["''"]}')"},
        {8, "[]", "'[]'"},
        {8, R"("text")", R"('"text"')"},
        {8, "-1", "'-1'"},
        {8, R"({"b":1, "a" : {"c":true}})", R"('{"a":{"c":true},"b":1}')"},
        {8, R"("\u0000\u001f\n\u007fü")", "'\"\\u0000\\u001f\\n\x7fü\"'"},
    };
    seam().sqliteExec = [](sqlite3*, const char*, auto, void*, char**) { return SQLITE_OK; };
    for (const auto& [nField, szMember, szSql] : cases) {
        SCOPED_TRACE(std::string(FIELDS[nField]) + " " + szMember);
        Json::Value jToken = record();
        jToken[FIELDS[nField]] = json(szMember);
        Lines values = VALUES;
        values[nField] = szSql;
        EXPECT_EQ(0, m_db.tokenCreate(jToken));
        EXPECT_EQ(statement("INSERT", values), m_db.m_strSql);
    }
}

// What the JSON library cannot convert, it throws at; nothing is run.
TEST_F(Save, ThrowsAtMembersThatDoNotConvert)
{
    const struct {
        const char* szField;
        const char* szMember;
    } cases[] = {{"tid", "null"},      {"tid", "1"},      {"bind_sid", "null"},
                 {"function", "{}"},   {"uid", R"("1")"}, {"deadline", "18446744073709551615"},
                 {"deadline", "1e30"}, {"count", "[]"}};
    m_db.m_strSql = "before";
    for (const auto& [szField, szMember] : cases) {
        SCOPED_TRACE(std::string(szField) + " " + szMember);
        Json::Value jToken = record();
        jToken[szField] = json(szMember);
        EXPECT_THROW(m_db.tokenUpdate(jToken), Json::LogicError);
    }
    Json::Value jArray(Json::arrayValue);
    EXPECT_THROW(m_db.tokenUpdate(jArray), Json::LogicError);
    EXPECT_EQ(Lines{}, seam().calls);
    EXPECT_EQ("before", m_db.m_strSql);
}

TEST_F(Save, RefusesMissingMember)
{
    const struct {
        const char* szField;
        const char* szLine;
    } cases[] = {{"tid", ":2"},       {"bind_sid", ":4"},      {"uid", ":6"},
                 {"deadline", ":8"},  {"count", ":10"},        {"create_time", ":14"},
                 {"function", ":16"}, {"webapi_allow", ":18"}, {"extra", ":22"}};
    m_db.m_strSql = "before";
    for (const auto& [szField, szLine] : cases) {
        for (const int nErrno : {0, EACCES}) {
            SCOPED_TRACE(std::string(szField) + " " + strerror(nErrno));
            Json::Value jToken = record();
            jToken.removeMember(szField);
            errno = nErrno;
            EXPECT_EQ(-1, m_db.tokenSave(jToken, 0 == nErrno));
            EXPECT_EQ((Lines{failed(std::string(FIELD_LIST) + szLine,
                                    std::string("!jParam.isMember(\"") + szField + "\")", nErrno)}),
                      takeLines());
        }
    }
    EXPECT_EQ(Lines{}, seam().callsOf({"sqlite3_mprintf", "sqlite3_exec"}));
    EXPECT_EQ("before", m_db.m_strSql);
}

TEST_F(Save, StopsAtFirstMissingMember)
{
    for (const char* szToken : {"null", "{}", R"({"bind_sid":"","TID":"a"})"}) {
        SCOPED_TRACE(szToken);
        Json::Value jToken = json(szToken);
        EXPECT_EQ(-1, m_db.tokenCreate(jToken));
        EXPECT_EQ((Lines{failed(std::string(FIELD_LIST) + ":2", "!jParam.isMember(\"tid\")")}), takeLines());
        EXPECT_EQ(json(szToken), jToken);
    }
}

TEST_F(Save, RefusesStatementThatCannotBeComposed)
{
    typedef int Expand(std::string&);
    Expand* const pFail = [](std::string&) { return -1; };
    Expand* const pClear = [](std::string& strSql) {
        strSql.clear();
        return 0;
    };
    const struct {
        Expand* pName;
        Expand* pSymbol;
        int nErrno; // of an allocation that fails
        const char* szCondition;
    } cases[] = {{pFail, pFail, 0, "0 > SqlExpandMemberName(strSqlPrefix)"},
                 {nullptr, pFail, 0, "0 > SqlExpandMemberSymbol(strSqlPrefix)"},
                 {nullptr, pClear, 0, "!szSql || !szSql[0]"},
                 {nullptr, nullptr, ENOMEM, "!szSql || !szSql[0]"}};
    m_db.m_strSql = "before";
    for (const auto& [pName, pSymbol, nErrno, szCondition] : cases) {
        SCOPED_TRACE(szCondition);
        g_pExpandName = pName;
        g_pExpandSymbol = pSymbol;
        if (nErrno) {
            seam().fail("sqlite3_mprintf", nErrno, 1, 100);
        }
        Json::Value jToken = record();
        EXPECT_EQ(-1, m_db.tokenUpdate(jToken));
        EXPECT_EQ((Lines{failed(FILE_NAME, szCondition, nErrno)}), takeLines());
    }
    EXPECT_EQ(Lines{}, seam().callsOf({"sqlite3_exec"}));
    EXPECT_EQ("before", m_db.m_strSql);
}

TEST_F(Save, CreateRefusesTakenTid)
{
    Json::Value jToken = record();
    EXPECT_EQ(0, m_db.tokenCreate(jToken));
    jToken["count"] = 5;
    EXPECT_EQ(-1, m_db.tokenCreate(jToken));
    EXPECT_EQ(failureLines(m_db.m_strSql, "UNIQUE constraint failed: token.tid"), takeLines());
    EXPECT_EQ("UNIQUE constraint failed: token.tid", m_db.m_strErr);
    EXPECT_EQ(record(), stored());
}

TEST_F(Save, UpdateInsertsThenReplacesWholeRow)
{
    Json::Value jToken = record();
    EXPECT_EQ(0, m_db.tokenUpdate(jToken));
    EXPECT_EQ(record(), stored());
    jToken = json(R"({"tid":"a","bind_sid":"","uid":0,"deadline":1,"count":2,"create_time":3,"function":"",
                      "webapi_allow":{},"extra":{}})");
    EXPECT_EQ(0, m_db.tokenUpdate(jToken));
    EXPECT_EQ(jToken, stored());
    EXPECT_EQ((Lines{"1"}), query("SELECT count(*) FROM token"));
    EXPECT_EQ(Lines{}, takeLines());
}

// Callers see a failure although the row is there; that stays.
TEST_F(Save, FailsAfterLockThatWasWaitedOut)
{
    sqlite3* pOther = nullptr;
    ASSERT_EQ(SQLITE_OK, sqlite3_open(path().c_str(), &pOther));
    ASSERT_EQ(SQLITE_OK, sqlite3_exec(pOther, "BEGIN EXCLUSIVE", nullptr, nullptr, nullptr));
    int nSleeps = 0;
    seam().sleep = [&](useconds_t) {
        return 2 == ++nSleeps ? sqlite3_exec(pOther, "COMMIT", nullptr, nullptr, nullptr) : 0;
    };
    Json::Value jToken = record();

    EXPECT_EQ(-1, m_db.tokenCreate(jToken));

    const std::string strExec = "sqlite3_exec " + statement("INSERT");
    EXPECT_EQ((Lines{strExec, "usleep 10000", strExec, "usleep 10000", strExec}),
              seam().callsOf({"sqlite3_exec", "usleep"}));
    EXPECT_EQ((Lines{fail(FILE_NAME, "sql error, sql=" + statement("INSERT"))}), takeLines());
    EXPECT_EQ("database is locked", m_db.m_strErr);
    EXPECT_EQ(statement("INSERT"), m_db.m_strSql);
    EXPECT_EQ(record(), stored());
    sqlite3_close(pOther);
}

TEST_F(Save, FailsWhenLockNeverEnds)
{
    sqlite3* pOther = nullptr;
    ASSERT_EQ(SQLITE_OK, sqlite3_open(path().c_str(), &pOther));
    ASSERT_EQ(SQLITE_OK, sqlite3_exec(pOther, "BEGIN EXCLUSIVE", nullptr, nullptr, nullptr));
    Json::Value jToken = record();
    EXPECT_EQ(-1, m_db.tokenUpdate(jToken));
    EXPECT_EQ(failureLines(statement("REPLACE"), "database is locked", 500), takeLines());
    sqlite3_close(pOther);
    EXPECT_EQ(Lines{}, query("SELECT * FROM token"));
}

TEST_F(Save, FailsWithoutTable)
{
    query("DROP TABLE token");
    Json::Value jToken = record();
    EXPECT_EQ(-1, m_db.tokenCreate(jToken));
    EXPECT_EQ(failureLines(statement("INSERT"), "no such table: token"), takeLines());
}

TEST_F(Save, FailsWhenDatabaseDoesNotOpen)
{
    AccessTokenDbApi db;
    Json::Value jToken = record();
    seam().fail("seteuid", EPERM);
    EXPECT_EQ(-1, db.tokenCreate(jToken));
    EXPECT_EQ((Lines{failed(FILE_NAME, "0 > seteuid(0)", EPERM), failed(FILE_NAME, "0 > initDb()", EPERM),
                     failed(FILE_NAME, "0 > runSql()", EPERM)}),
              takeLines());
    EXPECT_EQ(statement("INSERT"), db.m_strSql);
}

TEST_F(Save, TracesInDebugMode)
{
    VEMO_ACCESS_TOKEN::debugInfo(true);
    for (const bool blCreate : {true, false}) {
        const std::string strSql = statement(blCreate ? "INSERT" : "REPLACE");
        const std::string strFlag = blCreate ? "1" : "0";
        Json::Value jToken = record();
        EXPECT_EQ(0, m_db.tokenSave(jToken, blCreate));
        EXPECT_EQ((Lines{ordinary(FILE_NAME, "tokenSave, blCreate=" + strFlag + ", jParam=" + RECORD_TEXT),
                         ordinary(FILE_NAME, "run sql=" + strSql), ordinary(FILE_NAME, "run sql=" + strSql),
                         ordinary(FILE_NAME, "change rv=1, run sql=" + strSql)}),
                  takeLines());
    }
    Json::Value jNull;
    errno = EACCES;
    EXPECT_EQ(-1, m_db.tokenCreate(jNull));
    EXPECT_EQ((Lines{ordinary(FILE_NAME, "tokenSave, blCreate=1, jParam=null"),
                     failed(std::string(FIELD_LIST) + ":2", "!jParam.isMember(\"tid\")", EACCES)}),
              takeLines());
}

// The system log shows errno in front of each line. Neither the lines nor what stands in them may
// change it.
TEST(SaveSystemLog, TellsErrnoAsTheFailureLeftIt)
{
    seam() = Seam();
    VEMO_ACCESS_TOKEN::debugInfo(true);
    AccessTokenDbApi db;
    ASSERT_EQ(SQLITE_OK, sqlite3_open(":memory:", &db.m_pDb));
    seam().sqliteExec = [](sqlite3*, const char*, auto, void*, char**) {
        errno = EIO;
        return SQLITE_OK;
    };
    const auto inFront = [](std::string strLine, int nErrno) {
        return strLine.insert(strLine.find(' ') + 1, std::string("(") + strerror(nErrno) + ")");
    };
    const std::string strTrace = std::string("tokenSave, blCreate=1, jParam=") + RECORD_TEXT;
    const std::string strRun = "run sql=" + statement("INSERT");
    Json::Value jToken = record();

    errno = EACCES;
    EXPECT_EQ(0, db.tokenCreate(jToken));
    EXPECT_EQ(
        (Lines{ordinary(FILE_NAME, strTrace, EACCES), ordinary(FILE_NAME, strRun, EACCES),
               ordinary(FILE_NAME, strRun, EACCES), ordinary(FILE_NAME, "change rv=0, " + strRun, EIO)}),
        takeLines(Destination::Syslog));

    errno = 0;
    seam().fail("sqlite3_mprintf", ENOMEM, 1, 100);
    EXPECT_EQ(-1, db.tokenCreate(jToken));
    EXPECT_EQ((Lines{ordinary(FILE_NAME, strTrace),
                     inFront(failed(FILE_NAME, "!szSql || !szSql[0]", ENOMEM), ENOMEM)}),
              takeLines(Destination::Syslog));

    errno = EACCES;
    jToken.removeMember("extra");
    EXPECT_EQ(-1, db.tokenCreate(jToken));
    seam().lines.erase(seam().lines.begin());
    EXPECT_EQ((Lines{inFront(failed(std::string(FIELD_LIST) + ":22", "!jParam.isMember(\"extra\")", EACCES),
                             EACCES)}),
              takeLines(Destination::Syslog));
}

std::string bytesFrom(int nFirst)
{
    std::string strBytes;
    for (int nByte = nFirst; nByte < 256; ++nByte) {
        strBytes += static_cast<char>(nByte);
    }
    return strBytes;
}

// What is saved comes back equal, and once more when that is saved again.
class SaveRoundTrip : public Save {
protected:
    void expectSame(const Json::Value& jExtra)
    {
        Json::Value jToken = record();
        jToken["extra"] = jExtra;
        jToken["webapi_allow"] = jExtra;
        EXPECT_EQ(0, m_db.tokenUpdate(jToken));
        Json::Value jStored = stored();
        EXPECT_EQ(jToken, jStored);
        EXPECT_EQ(0, m_db.tokenUpdate(jStored));
        EXPECT_EQ(jToken, stored());
        EXPECT_EQ(Lines{}, takeLines());
    }
};

TEST_F(SaveRoundTrip, KeepsJsonValues)
{
    for (const char* szExtra :
         {"{}", R"({"":""})", R"({"a":{},"b":[],"c":null,"d":[[],{},[{}]],"e":[null,true,false]})",
          R"({"it's":"it''s","\"":"\\\"/"})", R"({"größe":"日本語 😀","\u0001":"\u2028\ud83d\ude00"})",
          R"({"min":-9223372036854775808,"max":9223372036854775807,"unsigned":18446744073709551615})",
          R"({"limits":[-2147483649,-2147483648,2147483647,2147483648,4294967295,9223372036854775808]})",
          R"({"Example.Api":{"method":["get","list"]},"Other.Api":{"method":[]}})",
          R"({"text":["null","1","{}","// no comment","/* none */","%Q%lld"]})"}) {
        SCOPED_TRACE(szExtra);
        expectSame(json(szExtra));
    }
}

// Byte for byte, as text and as name: valid UTF-8 or not, NUL and other control characters too.
TEST_F(SaveRoundTrip, KeepsBytes)
{
    Json::Value jExtra;
    for (const std::string& strBytes :
         {bytesFrom(0), std::string("a\0b", 3), std::string("a\0c", 3), std::string("\0", 1),
          std::string("a"), std::string("\xff\xfe"), std::string("\xc3"), std::string("\xc0\x80"),
          std::string("\xed\xa0\x80"), std::string("\xf4\x90\x80\x80"), std::string("\xe2\x82"),
          std::string("\x7f\x80\xbf")}) {
        jExtra[strBytes] = strBytes;
    }
    for (int nByte = 0; nByte < 256; ++nByte) {
        const std::string strByte(1, static_cast<char>(nByte));
        jExtra["bytes"].append(strByte);
        jExtra[strByte] = nByte;
    }
    expectSame(jExtra);
}

TEST_F(SaveRoundTrip, KeepsSizeAndDepth)
{
    Json::Value jDeep(Json::objectValue);
    for (int nLevel = 1; nLevel < 1000; ++nLevel) { // as deep as the reader goes
        Json::Value jOuter;
        jOuter["a"].swap(jDeep);
        jDeep.swap(jOuter);
    }
    expectSame(jDeep);

    Json::Value jLarge;
    jLarge["a"] = std::string(1 << 20, '\'');
    expectSame(jLarge);
}

TEST_F(SaveRoundTrip, KeepsDoublesToTheBit)
{
    typedef std::numeric_limits<double> Limits;
    Json::Value jToken = record();
    for (const double value : {0.0,
                               -0.0,
                               0.1,
                               0.1 + 0.2,
                               1.0 / 3,
                               1.0,
                               -1.0,
                               100.0,
                               1e15,
                               1e16,
                               1e17,
                               1e22,
                               1e23,
                               9007199254740993.0,
                               9223372036854775808.0,
                               -9223372036854775808.0,
                               18446744073709551616.0,
                               1e300,
                               -1e-300,
                               Limits::max(),
                               Limits::lowest(),
                               Limits::min(),
                               Limits::denorm_min(),
                               -Limits::denorm_min(),
                               Limits::min() / 3,
                               Limits::infinity(),
                               -Limits::infinity()}) {
        SCOPED_TRACE(value);
        jToken["extra"]["d"] = value;
        jToken["webapi_allow"]["d"][0] = value;
        EXPECT_EQ(0, m_db.tokenUpdate(jToken));
        const Json::Value jStored = stored();
        for (const Json::Value& jDouble : {jStored["extra"]["d"], jStored["webapi_allow"]["d"][0]}) {
            ASSERT_EQ(Json::realValue, jDouble.type());
            EXPECT_EQ(value, jDouble.asDouble());
            EXPECT_EQ(std::signbit(value), std::signbit(jDouble.asDouble()));
        }
    }
    jToken["extra"]["d"] = Limits::quiet_NaN();
    EXPECT_EQ(0, m_db.tokenUpdate(jToken));
    EXPECT_TRUE(std::isnan(stored()["extra"]["d"].asDouble()));
}

TEST_F(SaveRoundTrip, KeepsNumberFields)
{
    for (const char* szField : {"uid", "deadline", "count", "create_time"}) {
        for (const Json::Int64 nValue : {Json::Value::minInt64, Json::Int64(-1), Json::Int64(0),
                                         Json::Int64(4294967295LL), Json::Value::maxInt64}) {
            SCOPED_TRACE(std::string(szField) + " " + std::to_string(nValue));
            Json::Value jToken = record();
            jToken[szField] = nValue;
            EXPECT_EQ(0, m_db.tokenUpdate(jToken));
            EXPECT_EQ(jToken, stored());
        }
    }
}

TEST_F(SaveRoundTrip, KeepsTextFields)
{
    for (const std::string& strText :
         Lines{bytesFrom(1), "it's", "''", "\"", "\\", "%q", " ", "x'); DROP TABLE token; --", "größe"}) {
        SCOPED_TRACE(strText);
        Json::Value jToken = record();
        jToken["tid"] = strText;
        jToken["bind_sid"] = strText;
        jToken["function"] = strText;
        EXPECT_EQ(0, m_db.tokenCreate(jToken));
        EXPECT_EQ(jToken, stored(strText));
    }
    EXPECT_EQ(Lines{}, takeLines());
}

TEST_F(SaveRoundTrip, CutsTextFieldsAtNul)
{
    Json::Value jToken = record();
    jToken["tid"] = std::string("a\0b", 3);
    EXPECT_EQ(0, m_db.tokenCreate(jToken));
    EXPECT_EQ(record(), stored());
    EXPECT_EQ((Lines{"1"}), query("SELECT length(CAST(tid AS BLOB)) FROM token"));
}

TEST_F(SaveRoundTrip, DropsMembersThatAreNoFields)
{
    Json::Value jToken = record();
    jToken["more"] = "text";
    jToken["TID"] = 1;
    jToken["sort_by"] = "tid";
    const Json::Value jBefore = jToken;
    EXPECT_EQ(0, m_db.tokenCreate(jToken));
    EXPECT_EQ(jBefore, jToken);
    EXPECT_EQ(record(), stored());
}

} // namespace
