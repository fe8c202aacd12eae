// A table of tokens in memory, as another program can make it: several tokens can have one id, and any field
// can be NULL.

#ifndef TESTS_TOKEN_TABLE_H
#define TESTS_TOKEN_TABLE_H

#include <gtest/gtest.h>
#include <sqlite3.h>

#include <string>

class TokenTable : public testing::Test {
protected:
    TokenTable()
    {
        EXPECT_EQ(SQLITE_OK, sqlite3_open(":memory:", &m_pDb));
        // SQLite's reserved memory does not count towards the limit of memory.
        sqlite3_db_config(m_pDb, SQLITE_DBCONFIG_LOOKASIDE, nullptr, 0, 0);
        run("CREATE TABLE token (tid, bind_sid, uid INTEGER, deadline INTEGER, count INTEGER, "
            "create_time INTEGER, function, webapi_allow, extra)");
    }

    // Closing fails while a statement exists.
    void TearDown() override { EXPECT_EQ(SQLITE_OK, sqlite3_close(m_pDb)); }

    void run(const std::string& strSql)
    {
        ASSERT_EQ(SQLITE_OK, sqlite3_exec(m_pDb, strSql.c_str(), nullptr, nullptr, nullptr)) << strSql;
    }

    void add(const std::string& strTid, const std::string& strChange)
    {
        run("INSERT INTO token VALUES ('" + strTid + R"(', 's', 1000, 9999999999, 2, 5, 'VPN', )" +
            R"('{"Api":{"method":["get"]}}', '{}'); UPDATE token SET )" + strChange +
            " WHERE rowid = last_insert_rowid()");
    }

    sqlite3* m_pDb = nullptr;
};

#endif
