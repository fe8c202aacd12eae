// A service whose database holds one token.

#ifndef TESTS_ONE_TOKEN_H
#define TESTS_ONE_TOKEN_H

#include <memory>

#include "AccessTokenApi.h"
#include "Statements.h"
#include "StoreTest.h"

const std::string SELECT_ONE = selectSql("one");
const char* const GET_ONE_FAILED = "0 > (rv = m_pDb->tokenGetOne(\"tid\", strTid, jTokenOut))";

// The token is "one". Its deadline is long over: no operation that looks
// tokens up or changes them cares.
class OneToken : public StoreTest {
protected:
    void SetUp() override
    {
        StoreTest::SetUp();
        makeDatabase();
        insertOne();
        m_pApi = std::make_unique<AccessTokenApi>();
        seam().calls.clear();
        m_rows = rows();
    }

    void insertOne() const
    {
        insert("one", R"('S1',1026,1000,3,900,'VPN','{"A":{"method":["get"]}}','{"a":1,"b":[2]}')");
    }

    Texts rows() const { return query("SELECT * FROM token ORDER BY tid"); }
    Texts statements() const { return seam().callsOf({"sqlite3_exec"}); }

    // What is logged of a statement that failed at its first try, and where its failure was noticed.
    static Texts broken(const std::string& strSql, const Texts& inStore, const Texts& inService)
    {
        return failureOf(strSql, DISK_ERROR.szError, EIO) + allFailed(STORE, inStore, EIO) +
               allFailed(SERVICE, inService, EIO);
    }

    static Json::Value one()
    {
        return json(R"({"tid":"one","bind_sid":"S1","uid":1026,"deadline":1000,"count":3,"create_time":900,
                        "function":"VPN","webapi_allow":{"A":{"method":["get"]}},"extra":{"a":1,"b":[2]}})");
    }

    std::unique_ptr<AccessTokenApi> m_pApi;
    Texts m_rows; // at the start
};

#endif
