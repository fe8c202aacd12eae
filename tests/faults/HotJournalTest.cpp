// Why a process must stay at effective uid 0 while it holds a connection: other users cannot see the journal
// that undoes the change of a writer that crashed half-way.

#include <gtest/gtest.h>
#include <signal.h>
#include <sqlite3.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include "AccessTokenApi.h"
#include "Figures.h"
#include "Operations.h"
#include "Processes.h"
#include "TokenStore.h"

namespace {

const unsigned int TOKENS = 300;
const uid_t UID_OTHER = 65534;

// By the system call: the redirection has replaced seteuid().
void setRealEffectiveUid(uid_t uid)
{
    ASSERT_EQ(0, syscall(SYS_setresuid, -1, uid, -1));
}

void makeTokens(const TokenStore& store)
{
    makeTable(store);
    store.run("WITH RECURSIVE number(n) AS (SELECT 1 UNION ALL SELECT n + 1 FROM number WHERE n < " +
              std::to_string(TOKENS) +
              ") INSERT INTO token SELECT 'token-' || n, '', 0, 4102444800, 1, 1, 'VPN', '{}', " +
              "json_object('filling', printf('%.1000c', 'f')) FROM number"); // three of them to a page
}

// A process sets all counts to 99 and is killed before it commits. Its cache is so small that it has already
// written most of the pages.
void crashHalfWay(const TokenStore& store)
{
    const int nStatus = statusOf(startProcess([&] {
        sqlite3* pDb = nullptr;
        sqlite3_open(store.path().c_str(), &pDb);
        sqlite3_exec(pDb, "PRAGMA cache_size = 1; BEGIN; UPDATE token SET count = 99;", nullptr, nullptr,
                     nullptr);
        raise(SIGKILL);
    }));
    ASSERT_TRUE(WIFSIGNALED(nStatus));
}

int tokensWith99Uses(AccessTokenApi& api)
{
    Json::Value jFilter(Json::objectValue);
    jFilter["count"] = 99;
    Json::Value jTokenArray(Json::arrayValue);
    EXPECT_EQ(0, api.tokenList(jFilter, jTokenArray));
    return static_cast<int>(jTokenArray.size());
}

} // namespace

TEST(HotJournal, IsNotSeenByAReaderAtAnotherEffectiveUid)
{
    if (0 != getuid()) {
        GTEST_SKIP() << "only root can take another effective uid";
    }
    const TokenStore store;
    makeTokens(store);
    AccessTokenApi api; // its connection is open already
    crashHalfWay(store);

    setRealEffectiveUid(UID_OTHER);
    const int nHalfChange = tokensWith99Uses(api);
    setRealEffectiveUid(0);
    const int nAtRoot = tokensWith99Uses(api);

    EXPECT_LT(100, nHalfChange); // read from a change that was never committed
    EXPECT_GT(TOKENS, static_cast<unsigned int>(nHalfChange));
    EXPECT_EQ(0, nAtRoot); // the journal has been played back
    figure("hot journal", std::to_string(nHalfChange) + " of " + std::to_string(TOKENS) +
                              " tokens read from a change that never was");
}
