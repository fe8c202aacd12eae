// Clocks that jump, are wrong, or have passed the end of 32-bit time: what expires, and what comes back to
// life.

#include <gtest/gtest.h>
#include <json/json.h>
#include <sqlite3.h>
#include <sys/time.h>
#include <unistd.h>

#include <ctime>
#include <limits>
#include <optional>
#include <vector>

#include "AccessTokenApi.h"
#include "Interpose.h"
#include "ProcessState.h"
#include "TokenStore.h"
#include "vemo-access-token.h"

namespace {

const time_t DAY = 86400;
const time_t NOW = 1700000000;
const time_t LAST_OF_32_BITS = std::numeric_limits<int32_t>::max();
const time_t YEAR_10000 = 253402300800;

std::optional<time_t> g_now; // of this test's clock; the others have the real one

// A store of its own and the token that was created last.
class Clock : public ::testing::Test {
protected:
    Clock() { g_now = NOW; }
    ~Clock() override { g_now.reset(); }

    // Creates a token with a lifetime, or with the default of a day.
    int create(const Json::Value& jLifetime = Json::Value())
    {
        unsigned int uid = 0;
        std::string strFunction = "VPN";
        Json::Value jOption(Json::objectValue);
        jOption["webapi_allow"]["Api"] = Json::Value(Json::objectValue);
        jOption["count"] = -1;
        if (!jLifetime.isNull()) {
            jOption["deadline"] = jLifetime;
        }
        return VemoAccessTokenCreate(uid, strFunction, jOption, m_strTid);
    }

    int grant()
    {
        Json::Value jToken;
        return VemoAccessTokenGrantEx(m_strTid, "Api", nullptr, jToken);
    }

    // The deadlines of all tokens, which are not purged.
    static std::vector<time_t> deadlines()
    {
        AccessTokenApi api;
        Json::Value jAll;
        Json::Value jTokens(Json::arrayValue);
        EXPECT_EQ(0, api.tokenList(jAll, jTokens));
        std::vector<time_t> all;
        for (const Json::Value& jToken : jTokens) {
            all.push_back(jToken["deadline"].asInt64());
        }
        return all;
    }

    typedef std::vector<time_t> Times;

    const TokenStore m_store;
    std::string m_strTid;
};

} // namespace

// The clocks of the library and of SQLite.
extern "C" time_t time(time_t* pTime) noexcept
{
    const time_t now = g_now ? *g_now : NEXT(time)(nullptr);
    if (pTime) {
        *pTime = now;
    }
    return now;
}

extern "C" int gettimeofday(struct timeval* pTime, void* pZone) noexcept
{
    if (!g_now) {
        return NEXT(gettimeofday)(pTime, pZone);
    }
    *pTime = {*g_now, 0};
    return 0;
}

TEST_F(Clock, JumpAheadExpiresForGood)
{
    ASSERT_EQ(0, create());
    g_now = NOW + DAY; // the last second
    EXPECT_EQ(0, grant());
    g_now = NOW + DAY + 1;
    EXPECT_EQ(-1, grant());
    EXPECT_EQ(Times{}, deadlines());
    g_now = NOW;
    EXPECT_EQ(-1, grant());
}

TEST_F(Clock, JumpBackRevivesWhatNobodyPurged)
{
    ASSERT_EQ(0, create());
    g_now = NOW + DAY + 1;
    EXPECT_EQ(Times{NOW + DAY}, deadlines());
    g_now = NOW;
    EXPECT_EQ(0, grant());
}

TEST_F(Clock, ServiceThatDoesNotPurgeGrantsWhatHasExpired)
{
    ASSERT_EQ(0, create());
    g_now = NOW + DAY + 1;
    AccessTokenApi api;
    Json::Value jToken;
    EXPECT_EQ(0, api.tokenGrant(m_strTid, "Api", nullptr, jToken));
}

TEST_F(Clock, JumpBackLengthensLives)
{
    ASSERT_EQ(0, create());
    g_now = NOW - 1000 * DAY;
    EXPECT_EQ(0, grant());
    EXPECT_EQ(Times{NOW + DAY}, deadlines());
}

TEST_F(Clock, TokenOfAClockThatWasNotSetExpiresWhenItIs)
{
    for (const time_t unset : {-DAY - 1, time_t(0)}) {
        g_now = unset;
        ASSERT_EQ(0, create());
        EXPECT_EQ(Times{unset + DAY}, deadlines());
        EXPECT_EQ(0, grant());
        g_now = NOW;
        EXPECT_EQ(-1, grant());
        EXPECT_EQ(Times{}, deadlines());
    }
}

TEST_F(Clock, TokensOutliveTheEndOf32Bits)
{
    for (const time_t now :
         {LAST_OF_32_BITS, LAST_OF_32_BITS + 1, 2 * LAST_OF_32_BITS + 2, YEAR_10000 - DAY - 2}) {
        g_now = now;
        ASSERT_EQ(0, create()) << now;
        EXPECT_EQ(Times{now + DAY}, deadlines());
        g_now = now + DAY;
        EXPECT_EQ(0, grant()) << now;
        g_now = now + DAY + 1;
        EXPECT_EQ(-1, grant()) << now;
        EXPECT_EQ(Times{}, deadlines());
    }
}

// SQLite has no dates behind the year 9999, and the purge nothing to compare with.
TEST_F(Clock, NothingExpiresAfterTheYear9999)
{
    ASSERT_EQ(0, create());
    g_now = YEAR_10000;
    EXPECT_EQ(0, grant());
    EXPECT_EQ(Times{NOW + DAY}, deadlines());
}

TEST_F(Clock, LifetimeReachesBeyond32Bits)
{
    ASSERT_EQ(0, create(static_cast<Json::Int64>(LAST_OF_32_BITS)));
    g_now = LAST_OF_32_BITS;
    ASSERT_EQ(0, create(100));
    EXPECT_EQ((Times{NOW + LAST_OF_32_BITS, LAST_OF_32_BITS + 100}), deadlines());
}

// A lifetime is added to the time as a number of 32 bits, and the JSON library throws when one of the two is
// none. Nothing is created then, and nothing left open.
TEST_F(Clock, LifetimeThrowsWhenItOrTheTimeHasMoreThan32Bits)
{
    ASSERT_EQ(0, create());
    const ProcessState before = ProcessState::now();
    EXPECT_THROW(create(static_cast<Json::Int64>(LAST_OF_32_BITS + 1)), Json::LogicError);
    EXPECT_EQ(Times{NOW + DAY}, deadlines());

    g_now = LAST_OF_32_BITS + 1;
    EXPECT_THROW(create(100), Json::LogicError);
    EXPECT_EQ(Times{}, deadlines()); // the purge came first
    EXPECT_EQ("", before.differenceTo(ProcessState::now()));
    EXPECT_EQ(0, sqlite3_memory_used());
    EXPECT_EQ(0, create());
}
