// Databases that somebody has tampered with, or other files in their place: what each call does.

#include <gtest/gtest.h>

#include <functional>

#include "FaultyVfs.h"
#include "SmallStore.h"

namespace {

typedef std::function<void(const TokenStore&)> Damage;

// What is done to a sound store, and what each call then answers. Each call gets a fresh store.
struct Case {
    const char* szName;
    Damage damage;
    std::string strListing;
    std::string strGrant;
    std::string strCreation;
    std::string strDeletion;
};

Damage sql(const std::string& strSql)
{
    return [=](const TokenStore& store) { store.run(strSql); };
}

Damage settings(const std::string& strSql)
{
    return [=](const TokenStore& store) { makeSmallStore(store, strSql); };
}

Damage contents(const std::string& strContents)
{
    return [=](const TokenStore& store) { store.setFiles({{DATABASE, strContents}}); };
}

Damage journal(const std::string& strContents)
{
    return [=](const TokenStore& store) {
        Files files = store.files();
        files[DATABASE + "-journal"] = strContents;
        store.setFiles(files);
    };
}

std::string failed(const std::string& strError)
{
    return "-1: i=0,run sql failed, error=" + strError;
}

// Makes the table again, without the constraints of its columns.
const std::string LAX = "ALTER TABLE token RENAME TO old; CREATE TABLE token AS SELECT * FROM old;";

std::string setThree(const std::string& strAssignment)
{
    return "UPDATE token SET " + strAssignment + " WHERE tid LIKE 'known-three%'";
}

// The value of an expression in the row of that token, or "gone".
std::string valueOfThree(const TokenStore& store, const std::string& strExpression)
{
    const std::string strRow =
        store.rows("SELECT " + strExpression + " FROM token WHERE tid LIKE 'known-three%'");
    return strRow.empty() ? "gone" : strRow.substr(0, strRow.size() - 1);
}

Case everywhere(const char* szName, const Damage& damage, const std::string& strAnswer)
{
    return {szName, damage, strAnswer, strAnswer, strAnswer, strAnswer};
}

Case sound(const char* szName, const Damage& damage)
{
    return {szName, damage, "3", "0", "0", "1"};
}

// The field of one token holds NULL.
Case null(const char* szName, const std::string& strPreparation, const std::string& strField)
{
    const std::string strRefused = "-1: Failed [NULL == column_name[i] || NULL == column_value[i]]";
    return {szName, sql(strPreparation + setThree(strField + " = NULL")), strRefused, strRefused, "0", "1"};
}

Case trigger(const char* szName, const std::string& strWhen, const std::string& strRaise,
             const std::string& strGrant, const std::string& strCreation, const std::string& strDeletion)
{
    return {
        szName,
        sql("CREATE TRIGGER no BEFORE " + strWhen + " ON token BEGIN SELECT RAISE(" + strRaise + "); END"),
        "3",
        strGrant,
        strCreation,
        strDeletion};
}

const std::string NO_DATABASE = failed("file is not a database");
const std::string IS_VIEW = failed("cannot modify token because it is a view");
const std::string LOCKED = "-1: i=500,run sql failed, error=database is locked";

const std::vector<Case> CASES = {
    sound("Nothing", sql("")),
    sound("AnotherColumn", sql("ALTER TABLE token ADD COLUMN more TEXT DEFAULT 'm'")),
    sound("Utf16", settings("PRAGMA encoding = 'UTF-16';")),
    sound("WriteAheadLog", sql("PRAGMA journal_mode = WAL")),
    sound("GarbageAsJournal", journal(std::string(1000, 'g'))),

    {"NoExtra", sql("ALTER TABLE token DROP COLUMN extra"), failed("no such column: extra"),
     failed("no such column: extra"), failed("table token has no column named extra"), "1"},
    {"NoDeadline", sql("ALTER TABLE token DROP COLUMN deadline"), failed("no such column: deadline"),
     failed("no such column: deadline"), failed("no such column: deadline"), "1"},

    null("NullSession", "", "bind_sid"),
    null("NullUid", "", "uid"),
    null("NullDeadline", "", "deadline"),
    null("NullCount", "", "count"),
    null("NullCreateTime", "", "create_time"),
    null("NullPurpose", LAX, "function"),
    null("NullAllow", "", "webapi_allow"),
    null("NullExtra", "", "extra"),
    // A token without an id is not found; that is not a failure and is not logged.
    {"NullId", sql(LAX + setThree("tid = NULL")),
     "-1: Failed [NULL == column_name[i] || NULL == column_value[i]]", "-1: ", "0", "1"},

    {"View", sql("ALTER TABLE token RENAME TO real; CREATE VIEW token AS SELECT * FROM real"), "3", IS_VIEW,
     IS_VIEW, IS_VIEW},
    trigger("RefusedInsertion", "INSERT", "ABORT, 'no'", failed("no"), failed("no"), "1"),
    // The calls report success although the trigger prevented the change: nothing is created, no use is
    // spent.
    trigger("IgnoredInsertion", "INSERT", "IGNORE", "0", "0", "1"),
    trigger("IgnoredDeletion", "DELETE", "IGNORE", "0", "0", "0"),
    // The text of an error decides whether the library takes it for a lock.
    trigger("FeignedLock", "INSERT", "ABORT, 'database is locked'", LOCKED, LOCKED, "1"),
    // The index of the ids points to another table: no token is found by its id, and the purge notices.
    {"LyingIndex",
     sql("CREATE TABLE other (t TEXT PRIMARY KEY); PRAGMA writable_schema = ON;"
         "CREATE TEMP TABLE page AS SELECT * FROM sqlite_schema WHERE name LIKE 'sqlite_autoindex%';"
         "UPDATE sqlite_schema AS s SET rootpage = (SELECT p.rootpage FROM page p WHERE p.name <> s.name) "
         "WHERE name LIKE 'sqlite_autoindex%'"),
     "3", failed("database disk image is malformed"), "0", "0"},

    everywhere("TextFile", contents("these are no tokens\n"), NO_DATABASE),
    everywhere("Picture", contents("\x89PNG\r\n\x1a\n" + std::string(5000, '\0')), NO_DATABASE),
    everywhere("Zeros", contents(std::string(4096, '\0')), NO_DATABASE),
};

// A field with a type that the library never writes: what a grant answers, and the token's count, deadline
// and uid afterwards, or "gone".
struct Value {
    const char* szAssignment;
    std::string strAnswer;
    std::string strAfter;
};

const std::string UNTOUCHED = "3 4102444800 0";
const std::string SPENT = "2 4102444800 0";
const std::string NO_OBJECT = R"(-1: Failed [jToken["webapi_allow"].type() != Json::objectValue])";
const std::string NO_METHODS =
    R"(-1: Failed [jToken["webapi_allow"][szWebapiName]["method"].type() != Json::arrayValue])";
const std::string NO_ENTRY =
    R"(-1: Failed [jToken["webapi_allow"][szWebapiName].type() != Json::objectValue])";
const std::string NOT_LISTED =
    "-1: Failed [0 > (err = checkPermission(jToken, szWebapiName, szWebapiMethod))]";
const std::string WRONG_EXTRA = "-1: type failed, jmList[i]=extra";

const std::vector<Value> VALUES = {
    // A number is read as far as it has digits, and written back like that; a text reads as 0.
    {"count = 'abc'", "0", "gone"},
    {"count = ''", "0", "gone"},
    {"count = '7up'", "0", "6 4102444800 0"},
    {"count = X'39'", "0", "8 4102444800 0"},
    {"count = 2.9", "0", "1 4102444800 0"},
    {"count = 1e300", "0", "gone"},
    {"count = 99999999999999999999", "0", "gone"},
    {"count = 9223372036854775807", "0", "9223372036854775806 4102444800 0"},
    {"count = -9223372036854775808", "0", "-9223372036854775808 4102444800 0"},
    {"uid = 'nobody'", "0", SPENT},
    {"uid = 1e300", "0", "2 4102444800 1"},
    // SQLite sorts texts after all numbers, so this deadline has not passed. The grant writes a number back.
    {"deadline = 'never'", "0", "2 0 0"},
    {"deadline = ''", "0", "2 0 0"},
    {"deadline = X'39'", "0", "2 9 0"},
    {"deadline = 1e300", "0", "2 1 0"},

    {"webapi_allow = '[]'", NO_OBJECT, UNTOUCHED},
    {"webapi_allow = '\"x\"'", NO_OBJECT, UNTOUCHED},
    {"webapi_allow = 7", NO_OBJECT, UNTOUCHED},
    {"webapi_allow = 'null'", NO_OBJECT, UNTOUCHED},
    {"webapi_allow = ''", NO_OBJECT, UNTOUCHED},
    {"webapi_allow = X'00'", NO_OBJECT, UNTOUCHED},
    {"webapi_allow = replace(hex(zeroblob(2000)), '00', '[')", NO_OBJECT, UNTOUCHED},
    {"webapi_allow = '{'", NOT_LISTED, UNTOUCHED},
    {R"(webapi_allow = '{"Example.Api":7}')", NO_ENTRY, UNTOUCHED},
    {R"(webapi_allow = '{"Example.Api":{"method":"get"}}')", NO_METHODS, UNTOUCHED},
    {R"(webapi_allow = '{"Example.Api":{"method":[{}]}}')", "throws: Type is not convertible to string",
     UNTOUCHED},
    // What was read before the damage counts.
    {R"(webapi_allow = '{"Example.Api":{"method":["get"]')", "0", SPENT},
    {R"(webapi_allow = '{"Example.Api":{"method":["get"]}} more')", "0", SPENT},
    {R"(webapi_allow = '{"Example.Api":7,"Example.Api":{"method":[7,null,"get"]}}')", "0", SPENT},

    // The type of this field is checked only when the token is written back.
    {"extra = '[]'", WRONG_EXTRA, UNTOUCHED},
    {"extra = 'x'", WRONG_EXTRA, UNTOUCHED},
    {"extra = 'x', count = 1", "0", "gone"},
    {"extra = 'x', count = -1", "0", "-1 4102444800 0"},
};

} // namespace

TEST(HostileDatabase, GetsItsAnswerFromEachCall)
{
    const TokenStore store;
    for (const Case& theCase : CASES) {
        SCOPED_TRACE(theCase.szName);
        const std::pair<const char*, std::string> expected[] = {{LISTING, theCase.strListing},
                                                                {GRANT, theCase.strGrant},
                                                                {CREATION, theCase.strCreation},
                                                                {DELETION, theCase.strDeletion}};
        for (const auto& [szCall, strAnswer] : expected) {
            makeSmallStore(store);
            theCase.damage(store);
            EXPECT_EQ(strAnswer, call(szCall)) << szCall;
            EXPECT_EQ(1U, store.files().size()) << szCall;
        }
    }
}

TEST(HostileValue, GetsItsAnswerFromAGrant)
{
    const TokenStore store;
    for (const Value& value : VALUES) {
        SCOPED_TRACE(value.szAssignment);
        makeSmallStore(store);
        store.run(setThree(value.szAssignment));
        EXPECT_EQ("3", call(LISTING));
        EXPECT_EQ(value.strAnswer, call(GRANT));
        EXPECT_EQ(value.strAfter, valueOfThree(store, "count || ' ' || deadline || ' ' || uid"));
    }
}

// SQLite cannot see that a journal belongs to another database: the next call copies its pages into this one.
TEST(HostileJournal, OfAnotherDatabaseIsRolledBackIntoThisOne)
{
    const TokenStore store;
    const std::string strJournal = DATABASE + "-journal";
    makeSmallStore(store);
    store.run(setThree("count = 9"));
    std::string strForeign;
    {
        const FaultyVfs vfs([&](const FileCall& fileCall, const std::function<int()>& real) {
            if (strForeign.empty() && std::string("xWrite") == fileCall.szName &&
                store.path() == fileCall.strPath) {
                strForeign = store.files().at(strJournal);
            }
            return real();
        });
        call(GRANT);
    }
    makeSmallStore(store);
    EXPECT_EQ("3", valueOfThree(store, "count"));
    journal(strForeign)(store);
    EXPECT_EQ("3", call(LISTING));
    EXPECT_EQ("9", valueOfThree(store, "count"));
    EXPECT_EQ(1U, store.files().size());
}
