// A store that records are saved to.

#ifndef TESTS_SAVE_TEST_H
#define TESTS_SAVE_TEST_H

#include <cerrno>

#include "StoreTest.h"
#include "internal/AccessTokenDbApi.h"

// The record of most tests.
inline Json::Value record()
{
    return json(R"({"tid":"a","bind_sid":"sid","uid":1026,"deadline":-1,"count":1,"create_time":1700000000,
                    "function":"f","webapi_allow":{"Example.Api":{"method":["get","list"]}},
                    "extra":{"b":[1,null]}})");
}

// An open store on an empty table.
class SaveTest : public StoreTest {
protected:
    using StoreTest::StoreTest;

    void SetUp() override
    {
        StoreTest::SetUp();
        makeDatabase();
        ASSERT_EQ(0, m_db.initDb());
        seam() = Seam();
        errno = 0;
    }

    // The record as it comes back.
    Json::Value stored(const std::string& strTid = "a")
    {
        Json::Value jToken;
        std::string strValue = strTid;
        EXPECT_EQ(1, m_db.tokenGetOne("tid", strValue, jToken));
        return jToken;
    }

    AccessTokenDbApi m_db;
};

#endif
