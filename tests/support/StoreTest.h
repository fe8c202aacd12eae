// The fixtures that most tests share.

#ifndef TESTS_STORE_TEST_H
#define TESTS_STORE_TEST_H

#include <gtest/gtest.h>

#include <optional>

#include "AccessTokenApi.h"
#include "Tokens.h"
#include "internal/AccessTokenDbApi.h"

// The calls that open the database; their order is fixed. The caller's uid is 1000.
const uid_t UID_CALLER = 1000;
const char* const UID = "geteuid";
const char* const RAISE = "seteuid 0";
const char* const ACCESS = "access " VEMO_ATOKEN_DB_PATH;
const char* const TOUCH = "open " VEMO_ATOKEN_DB_PATH;
const char* const CHMOD = "chmod " VEMO_ATOKEN_DB_PATH " 0700";
const char* const OPEN = "sqlite3_open " VEMO_ATOKEN_DB_PATH;
const std::string CREATE = "sqlite3_exec " + SCHEMA;
const char* const BACK = "seteuid 1000";
const char* const CLOSE = "sqlite3_close";
const Texts OPENING_CALLS = {"geteuid", "seteuid",      "access",       "open",
                             "chmod",   "sqlite3_open", "sqlite3_exec", "sqlite3_close"};

// Tests that need no database. A log line that a test does not expect is an error.
class SeamTest : public ::testing::Test {
protected:
    void SetUp() override;
    void TearDown() override;

    // Forgets all failures and records. errno is 0 and the clock shows NOW.
    static void reset();

    bool m_blStdout = true; // a constructor may set it to false: the log is the system log in both runs
};

// Tests with a fresh directory, which the library uses for its database. There is no file yet.
class StoreTest : public SeamTest {
protected:
    void SetUp() override;
    void TearDown() override;

    const std::string& directory() const { return m_strDirectory; }
    std::string path() const { return m_strDirectory + "/vemo-access-token.db"; }

    // Runs SQL on the test's own connection and returns the rows, their columns joined by
    // '|'; NULL reads "NULL".
    Texts query(const std::string& strSql) const;

    // The rows of the table, in the order of their ids; these ids, separated by blanks; and the count of a
    // token, "" if there is no such token.
    Texts rows() const { return query("SELECT * FROM token ORDER BY tid"); }
    std::string tids() const { return joined(query("SELECT tid FROM token ORDER BY tid"), " "); }
    std::string countOf(const std::string& strTid = "t") const
    {
        return joined(query("SELECT count FROM token WHERE tid = '" + strTid + "'"), " ");
    }

    // Makes the database with its table, as the library does; and a token in it, with the members of
    // token(strChanges).
    void makeTable() const { query(SCHEMA); }
    void insert(const std::string& strChanges = "{}") const { query(saveSql("INSERT", token(strChanges))); }

private:
    std::string m_strDirectory;
};

// Tests with a table, without tokens at first, and with a store and a service for it.
class TableTest : public StoreTest {
protected:
    void SetUp() override;

    AccessTokenApi& api() { return *m_api; }

    AccessTokenDbApi m_db; // not yet open

private:
    std::optional<AccessTokenApi> m_api; // open
};

#endif
