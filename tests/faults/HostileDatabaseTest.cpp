// What each call does on a manipulated database, or on another file in its place.

#include <gtest/gtest.h>

#include "Operations.h"

namespace {

// A change of a sound store, and the answer of each call after it. Each call gets a fresh store.
struct Case {
    const char* szName;
    std::string strSql;
    std::string strListing;
    std::string strGrant;
    std::string strCreation;
    std::string strDeletion;
    std::string strSettings = ""; // of the store
    Files files = {};             // that are written into it
};

const std::string JOURNAL = DATABASE + "-journal";
const Files ZEROS = {{DATABASE, std::string(4096, '\0')}};

// Adds these files to the store, or replaces them.
void putFiles(const TokenStore& store, Files files)
{
    files.merge(store.files());
    store.setFiles(files);
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

std::string trigger(const std::string& strWhen, const std::string& strRaise)
{
    return "CREATE TRIGGER no BEFORE " + strWhen + " ON token BEGIN SELECT RAISE(" + strRaise + "); END";
}

const std::string NO_DATABASE = failed("file is not a database");
const std::string IS_VIEW = failed("cannot modify token because it is a view");
const std::string LOCKED = "-1: i=500,run sql failed, error=database is locked";
const std::string NO_EXTRA = failed("no such column: extra");
const std::string NO_DEADLINE = failed("no such column: deadline");
const std::string NULL_VALUE = "-1: Failed [NULL == column_name[i] || NULL == column_value[i]]";

const std::vector<Case> CASES = {
    {"AnotherColumn", "ALTER TABLE token ADD COLUMN more TEXT DEFAULT 'm'", "3", "0", "0", "1"},
    {"Utf16", "", "3", "0", "0", "1", "PRAGMA encoding = 'UTF-16';"},
    {"WriteAheadLog", "PRAGMA journal_mode = WAL", "3", "0", "0", "1"},
    {"GarbageAsJournal", "", "3", "0", "0", "1", "", {{JOURNAL, std::string(1000, 'g')}}},
    {"Zeros", "", NO_DATABASE, NO_DATABASE, NO_DATABASE, NO_DATABASE, "", ZEROS},

    {"NoExtra", "ALTER TABLE token DROP COLUMN extra", NO_EXTRA, NO_EXTRA,
     failed("table token has no column named extra"), "1"},
    {"NoDeadline", "ALTER TABLE token DROP COLUMN deadline", NO_DEADLINE, NO_DEADLINE, NO_DEADLINE, "1"},

    // The purge leaves the first. A token without an id is not found; this is neither a failure nor logged.
    {"NullDeadline", setThree("deadline = NULL"), NULL_VALUE, NULL_VALUE, "0", "1"},
    {"NullPurpose", LAX + setThree("function = NULL"), NULL_VALUE, NULL_VALUE, "0", "1"},
    {"NullId", LAX + setThree("tid = NULL"), NULL_VALUE, "-1: ", "0", "1"},

    {"View", "ALTER TABLE token RENAME TO real; CREATE VIEW token AS SELECT * FROM real", "3", IS_VIEW,
     IS_VIEW, IS_VIEW},
    {"RefusedInsertion", trigger("INSERT", "ABORT, 'no'"), "3", failed("no"), failed("no"), "1"},
    // The calls report success although the trigger has prevented the change: no token is created, and no
    // use is spent.
    {"IgnoredInsertion", trigger("INSERT", "IGNORE"), "3", "0", "0", "1"},
    {"IgnoredDeletion", trigger("DELETE", "IGNORE"), "3", "0", "0", "0"},
    // The library takes an error for a lock by its text.
    {"FeignedLock", trigger("INSERT", "ABORT, 'database is locked'"), "3", LOCKED, LOCKED, "1"},
    // The index of the ids points to another table: no token is found by its id, and the purge fails.
    {"LyingIndex",
     "CREATE TABLE other (t TEXT PRIMARY KEY); PRAGMA writable_schema = ON;"
     "CREATE TEMP TABLE page AS SELECT * FROM sqlite_schema WHERE name LIKE 'sqlite_autoindex%';"
     "UPDATE sqlite_schema AS s SET rootpage = (SELECT p.rootpage FROM page p WHERE p.name <> s.name) "
     "WHERE name LIKE 'sqlite_autoindex%'",
     "3", failed("database disk image is malformed"), "0", "0"},
};

// A field of an SQLite type that the library never writes: the answer of a grant, and afterwards the token's
// count, deadline and uid, or "gone".
struct Value {
    const char* szAssignment;
    std::string strAnswer;
    std::string strAfter;
};

const std::string UNTOUCHED = "3 4102444800 0";
const std::string WRONG_EXTRA = "-1: type failed, jmList[i]=extra";

const std::vector<Value> VALUES = {
    // The library reads a number up to the first other character of its text, and writes that back.
    {"count = ''", "0", "gone"},
    {"count = '7up'", "0", "6 4102444800 0"},
    {"count = X'39'", "0", "8 4102444800 0"},
    {"count = 2.9", "0", "1 4102444800 0"},
    {"count = 99999999999999999999", "0", "gone"},
    {"uid = 'nobody'", "0", "2 4102444800 0"},
    {"uid = 1e300", "0", "2 4102444800 1"},
    // In SQLite, texts are greater than numbers, so this deadline has not passed. The grant writes a number.
    {"deadline = 'never'", "0", "2 0 0"},
    {"deadline = X'39'", "0", "2 9 0"},
    {"deadline = 1e300", "0", "2 1 0"},

    {"webapi_allow = 7", R"(-1: Failed [jToken["webapi_allow"].type() != Json::objectValue])", UNTOUCHED},
    {R"(webapi_allow = '{"Example.Api":{"method":[{}]}}')", "throws: Type is not convertible to string",
     UNTOUCHED},
    // The text before the damage is used.
    {R"(webapi_allow = '{"Example.Api":7,"Example.Api":{"method":[7,null,"get"]')", "0", "2 4102444800 0"},

    // The type of this field is checked only when the token is written back.
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
        const std::pair<const Operation*, std::string> expected[] = {{&LISTING, theCase.strListing},
                                                                     {&GRANT, theCase.strGrant},
                                                                     {&GIVEN_CREATION, theCase.strCreation},
                                                                     {&DELETION, theCase.strDeletion}};
        for (const auto& [pOperation, strAnswer] : expected) {
            makeSmallStore(store, theCase.strSettings);
            store.run(theCase.strSql);
            putFiles(store, theCase.files);
            EXPECT_EQ(strAnswer, answerOf(*pOperation)) << pOperation->szName;
            EXPECT_EQ(1U, store.files().size()) << pOperation->szName;
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
        EXPECT_EQ("3", answerOf(LISTING));
        EXPECT_EQ(value.strAnswer, answerOf(GRANT));
        EXPECT_EQ(value.strAfter, valueOfThree(store, "count || ' ' || deadline || ' ' || uid"));
    }
}

// SQLite cannot see that a journal belongs to another database: the next call copies its pages into this one.
TEST(HostileJournal, OfAnotherDatabaseIsRolledBackIntoThisOne)
{
    const TokenStore store;
    makeSmallStore(store);
    store.run(setThree("count = 9"));
    std::string strForeign;
    {
        const Database pDb = store.open();
        run(pDb, "PRAGMA synchronous = OFF; BEGIN; " + setThree("count = 3")); // the journal is whole at once
        strForeign = store.files().at(JOURNAL);
    }
    makeSmallStore(store);
    EXPECT_EQ("3", valueOfThree(store, "count"));
    putFiles(store, {{JOURNAL, strForeign}});
    EXPECT_EQ("3", answerOf(LISTING));
    EXPECT_EQ("9", valueOfThree(store, "count"));
    EXPECT_EQ(1U, store.files().size());
}
