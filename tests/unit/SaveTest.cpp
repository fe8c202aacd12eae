// Saving records: the statements, and what is refused.

#include <cstring>
#include <functional>

#include "AccessTokenUtil.h"
#include "SaveTest.h"
#include "StandIns.h"
#include "Statements.h"

namespace {

const char* const DIRECTIVES = "%Q,%Q,%lld,%lld,%lld,%lld,%Q,%Q,%Q";
const char* const FIELDS[] = {"tid",         "bind_sid", "uid",          "deadline", "count",
                              "create_time", "function", "webapi_allow", "extra"};

// The values of record() in SQL.
const Texts VALUES = {"'a'",
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

std::string statement(const std::string& strVerb, const Texts& values = VALUES)
{
    std::string strValues;
    for (const std::string& strValue : values) {
        strValues.append(strValues.empty() ? "" : ",").append(strValue);
    }
    return strVerb + " INTO token (" + COLUMNS + ") VALUES (" + strValues + ")";
}

// What is logged of a save whose statement failed.
Texts failureLines(const std::string& strSql, const std::string& strError)
{
    return failureOf(strSql, strError) + Texts{failed(STORE, "0 > runSql()")};
}

class Save : public SaveTest {};

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

        EXPECT_EQ((Texts{statement(std::string("sqlite3_mprintf ") + szVerb, {DIRECTIVES}),
                         "sqlite3_exec " + statement(szVerb), "sqlite3_changes"}),
                  seam().calls);
        EXPECT_EQ(statement(szVerb), m_db.m_strSql);
        EXPECT_EQ("", m_db.m_strErr);
        EXPECT_EQ(record(), jToken);
        EXPECT_EQ(Texts{}, takeLines());
        EXPECT_EQ((Texts{R"(a|sid|1026|-1|1|1700000000|f|{"Example.Api":{"method":["get","list"]}}|)"
                         R"({"b":[1,null]})"}),
                  query("SELECT * FROM token"));
    }
    EXPECT_EQ((Texts{"text|text|integer|integer|integer|integer|text|text|text"}),
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
        Texts values = VALUES;
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
    EXPECT_EQ(Texts{}, seam().calls);
    EXPECT_EQ("before", m_db.m_strSql);
}

TEST_F(Save, RefusesMissingMember)
{
    const struct {
        const char* szField;
        int nLine;
    } cases[] = {{"tid", 2},          {"bind_sid", 4},  {"uid", 6},           {"deadline", 8}, {"count", 10},
                 {"create_time", 14}, {"function", 16}, {"webapi_allow", 18}, {"extra", 22}};
    m_db.m_strSql = "before";
    for (const auto& [szField, nLine] : cases) {
        for (const int nErrno : {0, EACCES}) {
            SCOPED_TRACE(std::string(szField) + " " + strerror(nErrno));
            Json::Value jToken = record();
            jToken.removeMember(szField);
            errno = nErrno;
            EXPECT_EQ(-1, m_db.tokenSave(jToken, 0 == nErrno));
            EXPECT_EQ((Texts{failed(fieldList(nLine), std::string("!jParam.isMember(\"") + szField + "\")",
                                    nErrno)}),
                      takeLines());
        }
    }
    EXPECT_EQ(Texts{}, seam().callsOf({"sqlite3_mprintf", "sqlite3_exec"}));
    EXPECT_EQ("before", m_db.m_strSql);
}

TEST_F(Save, StopsAtFirstMissingMember)
{
    for (const char* szToken : {"null", "{}", R"({"bind_sid":"","TID":"a"})"}) {
        SCOPED_TRACE(szToken);
        Json::Value jToken = json(szToken);
        EXPECT_EQ(-1, m_db.tokenCreate(jToken));
        EXPECT_EQ((Texts{failed(fieldList(2), "!jParam.isMember(\"tid\")")}), takeLines());
        EXPECT_EQ(json(szToken), jToken);
    }
}

TEST_F(Save, RefusesStatementThatCannotBeComposed)
{
    typedef std::function<int(std::string&)> Expand;
    const Expand fails = [](std::string&) { return -1; };
    const Expand clears = [](std::string& strSql) {
        strSql.clear();
        return 0;
    };
    const struct {
        Expand name;
        Expand symbol;
        int nErrno; // of an allocation that fails
        const char* szCondition;
    } cases[] = {{fails, fails, 0, "0 > SqlExpandMemberName(strSqlPrefix)"},
                 {nullptr, fails, 0, "0 > SqlExpandMemberSymbol(strSqlPrefix)"},
                 {nullptr, clears, 0, "!szSql || !szSql[0]"},
                 {nullptr, nullptr, ENOMEM, "!szSql || !szSql[0]"}};
    m_db.m_strSql = "before";
    for (const auto& [name, symbol, nErrno, szCondition] : cases) {
        SCOPED_TRACE(szCondition);
        standIns().sqlExpandMemberName = name;
        standIns().sqlExpandMemberSymbol = symbol;
        if (nErrno) {
            seam().fail("sqlite3_mprintf", nErrno, 1, 100);
        }
        Json::Value jToken = record();
        EXPECT_EQ(-1, m_db.tokenUpdate(jToken));
        EXPECT_EQ((Texts{failed(STORE, szCondition, nErrno)}), takeLines());
    }
    EXPECT_EQ(Texts{}, seam().callsOf({"sqlite3_exec"}));
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
    EXPECT_EQ((Texts{"1"}), query("SELECT count(*) FROM token"));
    EXPECT_EQ(Texts{}, takeLines());
}

// Callers see a failure although the row is there; that stays.
TEST_F(Save, FailsAfterLockThatWasWaitedOut)
{
    const Lock lock(path(), 2);
    Json::Value jToken = record();

    EXPECT_EQ(-1, m_db.tokenCreate(jToken));

    const std::string strExec = "sqlite3_exec " + statement("INSERT");
    EXPECT_EQ((Texts{strExec, "usleep 10000", strExec, "usleep 10000", strExec}),
              seam().callsOf({"sqlite3_exec", "usleep"}));
    EXPECT_EQ((Texts{fail(STORE, "sql error, sql=" + statement("INSERT"))}), takeLines());
    EXPECT_EQ("database is locked", m_db.m_strErr);
    EXPECT_EQ(statement("INSERT"), m_db.m_strSql);
    EXPECT_EQ(record(), stored());
}

TEST_F(Save, FailsWhenLockNeverEnds)
{
    Json::Value jToken = record();
    {
        const Lock lock(path());
        EXPECT_EQ(-1, m_db.tokenUpdate(jToken));
    }
    EXPECT_EQ(
        (Texts{ordinary(STORE, "i=500,run sql failed, error=database is locked, sql=" + statement("REPLACE")),
               fail(STORE, "run sql failed, sql=" + statement("REPLACE")), failed(STORE, "0 > runSql()")}),
        takeLines());
    EXPECT_EQ(Texts{}, query("SELECT * FROM token"));
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
    EXPECT_EQ(NOT_OPENED + Texts{failed(STORE, "0 > runSql()", EPERM)}, takeLines());
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
        EXPECT_EQ((Texts{ordinary(STORE, "tokenSave, blCreate=" + strFlag + ", jParam=" + RECORD_TEXT),
                         ordinary(STORE, "run sql=" + strSql), ordinary(STORE, "run sql=" + strSql),
                         ordinary(STORE, "change rv=1, run sql=" + strSql)}),
                  takeLines());
    }
    Json::Value jNull;
    errno = EACCES;
    EXPECT_EQ(-1, m_db.tokenCreate(jNull));
    EXPECT_EQ((Texts{ordinary(STORE, "tokenSave, blCreate=1, jParam=null"),
                     failed(fieldList(2), "!jParam.isMember(\"tid\")", EACCES)}),
              takeLines());
}

class SaveSystemLog : public SaveTest {
protected:
    SaveSystemLog() : SaveTest(Destination::Syslog) {}
};

// Neither the lines nor what stands in them may change errno.
TEST_F(SaveSystemLog, TellsErrnoAsTheFailureLeftIt)
{
    VEMO_ACCESS_TOKEN::debugInfo(true);
    seam().sqliteExec = [](sqlite3*, const char*, SqlCallback, void*, char**) {
        errno = EIO;
        return SQLITE_OK;
    };
    const std::string strTrace = ordinary(STORE, std::string("tokenSave, blCreate=1, jParam=") + RECORD_TEXT);
    const std::string strRun = "run sql=" + statement("INSERT");
    Json::Value jToken = record();

    errno = EACCES;
    EXPECT_EQ(0, m_db.tokenCreate(jToken));
    EXPECT_EQ(inSystemLog({strTrace, ordinary(STORE, strRun), ordinary(STORE, strRun)}, EACCES) +
                  inSystemLog({ordinary(STORE, "change rv=0, " + strRun)}, EIO),
              takeLines(Destination::Syslog));

    errno = 0;
    seam().fail("sqlite3_mprintf", ENOMEM, 1, 100);
    EXPECT_EQ(-1, m_db.tokenCreate(jToken));
    EXPECT_EQ(Texts{strTrace} + inSystemLog({failed(STORE, "!szSql || !szSql[0]", ENOMEM)}, ENOMEM),
              takeLines(Destination::Syslog));

    errno = EACCES;
    jToken.removeMember("extra");
    EXPECT_EQ(-1, m_db.tokenCreate(jToken));
    seam().lines.erase(seam().lines.begin());
    EXPECT_EQ(inSystemLog({failed(fieldList(22), "!jParam.isMember(\"extra\")", EACCES)}, EACCES),
              takeLines(Destination::Syslog));
}

} // namespace
