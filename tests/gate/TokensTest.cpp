#include "grant/Tokens.h"

#include <new>
#include <optional>

#include "Seam.h"
#include "TokenTable.h"

using grant::Error;
using grant::Statement;

namespace {

const int64_t NO_LIMIT = 0;

class Tokens : public TokenTable {
protected:
    // The error that SQLite reports.
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

    // The result of the call while so many bytes of memory are left, or nothing if it fails.
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
};

} // namespace

TEST_F(Tokens, FailWithTheErrorOfSqlite)
{
    Statement insert(m_pDb, "INSERT INTO token (tid) VALUES (?1)");
    const std::string strText = "text";
    EXPECT_EQ("1 no such table: other", errorOf([&] { Statement(m_pDb, "SELECT * FROM other"); }));
    EXPECT_EQ("25 column index out of range", errorOf([&] { insert.bind(2, strText); }));
    EXPECT_EQ("25 column index out of range", errorOf([&] { insert.bind(2, 2); }));

    run("CREATE UNIQUE INDEX one ON token (tid)");
    EXPECT_EQ("none", errorOf([&] { insert.bind(1, strText).step(); }));
    EXPECT_EQ("2067 UNIQUE constraint failed: token.tid", errorOf([&] { insert.step(); }));
    EXPECT_EQ("none", errorOf([&] { insert.bind(1, 2).step(); })) << "the statement can be run again";
}

TEST_F(Tokens, FailWithoutMemoryAndThenWorkAgain)
{
    EXPECT_FALSE(within(1, [&] { return Statement(m_pDb, "SELECT 1").step(); }));

    add("token", "deadline = 1");
    {
        Statement number(m_pDb, "SELECT deadline < 2 FROM token");
        EXPECT_TRUE(number.step());
        EXPECT_FALSE(within(1, [&] { return number.text(0); })) << "it would read as NULL";
    }
    grant::Tokens tokens(m_pDb);
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

// SQLite has no dates then; the library's purge finds nothing either.
TEST_F(Tokens, DoNotExpireAfterTheYear9999)
{
    add("one", "count = 2");
    seam().clock = 253402300800;
    EXPECT_FALSE(grant::Tokens(m_pDb).find("one")->blExpired);
}

TEST_F(Tokens, GiveTheFirstRowOfAnIdAndWhetherAllRowsCanBeRead)
{
    add("first", "count = 7");
    add("first", "count = 8");
    add("first", "count = 9");
    grant::Tokens tokens(m_pDb);
    const auto token = tokens.find("first");
    EXPECT_TRUE(token->blReadable);
    EXPECT_EQ(7, token->nCount);
    EXPECT_FALSE(token->blExpired);
    EXPECT_EQ(SQLITE_TXN_NONE, sqlite3_txn_state(m_pDb, nullptr)) << "the look-up has ended";

    for (const std::string strField :
         {"bind_sid", "uid", "deadline", "count", "create_time", "function", "webapi_allow", "extra"}) {
        for (const bool blFirst : {true, false}) {
            run("DELETE FROM token");
            add("one", blFirst ? strField + " = NULL" : "count = 2");
            add("one", blFirst ? "count = 2" : strField + " = NULL");
            auto unreadable = tokens.find("one");
            EXPECT_FALSE(unreadable->blReadable) << strField;
            EXPECT_EQ(grant::Verdict::Malformed, judge(*unreadable, "Api", "")) << strField;
        }
    }
}
