#include "grant/Tokens.h"

#include <gtest/gtest.h>
#include <sqlite3.h>

#include <memory>
#include <new>

using grant::Error;
using grant::Statement;
using grant::Tokens;

namespace {

const int64_t NO_LIMIT = 0;

// A table of tokens as a stranger can have made it: of one id there can be several, and any field can be
// NULL.
class TokensOfAnyTable : public testing::Test {
protected:
    void SetUp() override
    {
        ASSERT_EQ(SQLITE_OK, sqlite3_open(":memory:", &m_pDb));
        // What it holds in reserve does not count for the limit of memory.
        sqlite3_db_config(m_pDb, SQLITE_DBCONFIG_LOOKASIDE, nullptr, 0, 0);
        run("CREATE TABLE token (tid, bind_sid, uid, deadline INTEGER, count, create_time, function, "
            "webapi_allow, extra)");
    }

    // Fails while there is a statement.
    void TearDown() override { EXPECT_EQ(SQLITE_OK, sqlite3_close(m_pDb)); }

    void run(const std::string& strSql)
    {
        ASSERT_EQ(SQLITE_OK, sqlite3_exec(m_pDb, strSql.c_str(), nullptr, nullptr, nullptr)) << strSql;
    }

    void add(const std::string& strTid, const std::string& strChange = "count = 2")
    {
        run("INSERT INTO token VALUES ('" + strTid +
            "', 's', 1000, 9999999999, 2, 5, 'VPN', '{}', '{}'); UPDATE token SET " + strChange +
            " WHERE rowid = last_insert_rowid()");
    }

    // The error that SQLite tells of.
    template <typename Use>
    static std::string errorOf(Use use)
    {
        try {
            use();
            return "none";
        } catch (const Error& error) {
            return std::to_string(error.code()) + " " + error.what();
        }
    }

    // What it gives, or nothing, when there are so many bytes of memory left.
    template <typename Use>
    static auto within(int64_t cbLeft, Use use) -> std::optional<decltype(use())>
    {
        sqlite3_hard_heap_limit64(sqlite3_memory_used() + cbLeft);
        try {
            auto result = use();
            sqlite3_hard_heap_limit64(NO_LIMIT);
            return result;
        } catch (const std::bad_alloc&) {
            sqlite3_hard_heap_limit64(NO_LIMIT);
            return std::nullopt;
        }
    }

    sqlite3* m_pDb = nullptr;
};

} // namespace

TEST_F(TokensOfAnyTable, FailByWhatSqliteSays)
{
    Statement insert(m_pDb, "INSERT INTO token (tid) VALUES (?1)");
    const std::string strText = "text";
    EXPECT_EQ("1 no such table: other", errorOf([&] { Statement(m_pDb, "SELECT * FROM other"); }));
    EXPECT_EQ("25 column index out of range", errorOf([&] { insert.bind(2, strText); }));
    EXPECT_EQ("25 column index out of range", errorOf([&] { insert.bind(2, 2); }));

    run("CREATE UNIQUE INDEX one ON token (tid)");
    EXPECT_EQ("none", errorOf([&] { insert.bind(1, strText).step(); }));
    EXPECT_EQ("2067 UNIQUE constraint failed: token.tid", errorOf([&] { insert.step(); }));
    EXPECT_EQ("none", errorOf([&] { insert.bind(1, 2).step(); })) << "it has ended, and can be run again";
}

TEST_F(TokensOfAnyTable, FailForWantOfMemoryAndWorkAgainWhenThereIsSome)
{
    EXPECT_FALSE(within(1, [&] { return Statement(m_pDb, "SELECT 1").step(); }));

    add("token", "deadline = 1");
    {
        Statement number(m_pDb, "SELECT deadline < 2 FROM token");
        EXPECT_TRUE(number.step());
        EXPECT_FALSE(within(1, [&] { return number.text(0); })) << "which would be NULL";
    }
    Tokens tokens(m_pDb);
    std::optional<bool> blExpired;
    int nFailures = -1;
    for (int64_t cbLeft = 1; !blExpired; cbLeft += 8) {
        blExpired = within(cbLeft, [&] { return tokens.find("token").value().blExpired; });
        EXPECT_EQ(1000, tokens.find("token").value().nUid) << "after a failure with " << cbLeft;
        ++nFailures;
    }
    EXPECT_TRUE(*blExpired);
    EXPECT_LT(1, nFailures);
}

TEST_F(TokensOfAnyTable, GiveTheFirstOfAnIdIfAllOfItCanBeRead)
{
    add("first", "count = 7");
    add("first", "count = 8");
    add("first", "count = 9");
    Tokens tokens(m_pDb);
    const auto token = tokens.find("first");
    EXPECT_TRUE(token->blReadable);
    EXPECT_EQ(7, token->nCount);
    EXPECT_FALSE(token->blExpired);
    EXPECT_EQ(SQLITE_TXN_NONE, sqlite3_txn_state(m_pDb, nullptr)) << "the look-up has ended";

    for (const std::string strField :
         {"bind_sid", "uid", "deadline", "count", "create_time", "function", "webapi_allow", "extra"}) {
        for (const bool blFirst : {true, false}) {
            run("DELETE FROM token");
            add("one", blFirst ? strField + " = NULL" : "webapi_allow = '{\"Api\":{}}'");
            add("one", blFirst ? "webapi_allow = '{\"Api\":{}}'" : strField + " = NULL");
            auto unreadable = tokens.find("one");
            EXPECT_FALSE(unreadable->blReadable) << strField;
            EXPECT_EQ(grant::Verdict::Malformed, judge(*unreadable, "Api", "")) << strField;
        }
    }
}
