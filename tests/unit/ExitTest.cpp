// The library while a thread or the process ends, and in a thread that can keep nothing for it.

#include <pthread.h>

#include <cstdlib>
#include <thread>

#include "StoreTest.h"
#include "vemo-access-token.h"

namespace {

std::string g_strTid;

class Exit : public StoreTest {};

class Thread : public StoreTest {};

void grantAndLeave()
{
    Json::Value jToken;
    const bool blGranted = 0 == VemoAccessTokenGrantEx(g_strTid, "Api", nullptr, jToken) &&
                           json(R"({"Api": {}})") == jToken["webapi_allow"];
    _exit(blGranted ? 0 : 1);
}

TEST_F(Exit, HandlersCanStillGrant)
{
    unsigned int uid = 0;
    std::string strFunction = "VPN";
    Json::Value jOption = json(R"({"count": 3, "webapi_allow": {"Api": {}}})");
    ASSERT_EQ(0, VemoAccessTokenCreate(uid, strFunction, jOption, g_strTid));

    EXPECT_EXIT(
        {
            Json::Value jToken;
            VemoAccessTokenGrantEx(g_strTid, "Api", nullptr, jToken);
            atexit(grantAndLeave);
            exit(2);
        },
        ::testing::ExitedWithCode(0), "");
}

// Grants when it is destroyed.
struct LastGrant {
    bool* pGranted = nullptr;
    ~LastGrant()
    {
        Json::Value jToken;
        *pGranted = 0 == VemoAccessTokenGrantEx(g_strTid, "Api", nullptr, jToken) &&
                    json(R"({"Api": {}})") == jToken["webapi_allow"];
    }
};

TEST_F(Exit, ThreadsCanStillGrantAtTheirEnd)
{
    unsigned int uid = 0;
    std::string strFunction = "VPN";
    Json::Value jOption = json(R"({"count": 3, "webapi_allow": {"Api": {}}})");
    ASSERT_EQ(0, VemoAccessTokenCreate(uid, strFunction, jOption, g_strTid));

    bool blGranted = false;
    std::thread([&] {
        // Made ahead of what the library keeps for the thread, so destroyed after it.
        static thread_local LastGrant lastGrant;
        lastGrant.pGranted = &blGranted;
        Json::Value jToken;
        VemoAccessTokenGrantEx(g_strTid, "Api", nullptr, jToken);
    }).join();
    EXPECT_TRUE(blGranted);
}

// The library keeps something for each thread under a key, of which a process has so many.
TEST_F(Thread, GrantsThoughTheProcessHasNoKeyLeft)
{
    pthread_key_t key;
    while (0 == pthread_key_create(&key, nullptr)) {
    }
    unsigned int uid = 0;
    std::string strFunction = "VPN";
    Json::Value jOption = json(R"({"count": 3, "webapi_allow": {"Api": {}}})");
    ASSERT_EQ(0, VemoAccessTokenCreate(uid, strFunction, jOption, g_strTid));

    Json::Value jToken;
    EXPECT_EQ(0, VemoAccessTokenGrantEx(g_strTid, "Api", nullptr, jToken));
    EXPECT_EQ(json(R"({"Api": {}})"), jToken["webapi_allow"]);
}

} // namespace
