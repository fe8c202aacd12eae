// The database and the caller that the exported functions are tested with.

#ifndef TESTS_EXPORTED_TEST_H
#define TESTS_EXPORTED_TEST_H

#include <unistd.h>

#include "Opening.h"

const time_t NOW = 1700000000;
const std::string ALLOW = R"({"Api":{"method":["get"]},"Odd":{"method":[{}]}})";
const std::string GRANT_REFUSED =
    failed(WRAPPER, "0 > VemoAccessTokenGrantEx(strTid, szWebapiName, szWebapiMethod, jToken)");
const std::string NOT_PERMITTED =
    failed(SERVICE, "0 > (err = checkPermission(jToken, szWebapiName, szWebapiMethod))");

// A database with three tokens, one of them expired, and a caller who is not root.
class ExportedTest : public StoreTest {
protected:
    using StoreTest::StoreTest;

    void SetUp() override
    {
        StoreTest::SetUp();
        makeDatabase();
        insert("t", "'S1',1000,1700000100,2,1700000000,'VPN','" + ALLOW + "','{}'");
        insert("u", "'S2',1000,1700000100,2,1700000000,'MAIL','" + ALLOW + "','{}'");
        insert("old", "'S1',1000,1699999999,2,1700000000,'VPN','" + ALLOW + "','{}'");
        seam().clock = NOW;
        ASSERT_EQ(0, seteuid(UID_CALLER));
    }
};

#endif
