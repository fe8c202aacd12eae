// A token, its record, and its grant.

#ifndef TESTS_ONE_GRANT_H
#define TESTS_ONE_GRANT_H

#include <optional>

#include "AccessTokenApi.h"
#include "StoreTest.h"

const Json::Value UNTOUCHED = "what the caller had";
const std::string ALLOW = R"({"Api":{"method":["get","post"]},"Odd":7})";
const std::string SELECT_T = selectSql("t");
const std::string DELETE_T = deleteSql("tid", "t");

inline std::string replaceSql(Json::Int64 nCount)
{
    return std::string("REPLACE INTO token (") + COLUMNS + ") VALUES ('t','S1',1000,1700000100," +
           std::to_string(nCount) + R"(,1700000000,'VPN',')" + ALLOW + R"(','{"note":"mine"}'))";
}

inline std::string recordText(Json::Int64 nCount)
{
    return R"({"bind_sid":"S1","count":)" + std::to_string(nCount) +
           R"(,"create_time":1700000000,"deadline":1700000100,"extra":{"note":"mine"},"function":"VPN",)" +
           R"("tid":"t","uid":1000,"webapi_allow":)" + ALLOW + "}";
}

// A service, a token "t" to be granted, and the record that the caller hands in.
class OneGrant : public StoreTest {
protected:
    void SetUp() override
    {
        StoreTest::SetUp();
        makeDatabase();
        m_api.emplace();
        seam().calls.clear();
    }

    void insertToken(const std::string& strCount, const std::string& strAllow = ALLOW) const
    {
        insert("t", "'S1',1000,1700000100," + strCount + ",1700000000,'VPN','" + strAllow +
                        R"(','{"note":"mine"}')");
    }

    int grant(std::string strTid, const char* szApi, const char* szMethod)
    {
        return m_api->tokenGrant(strTid, szApi, szMethod, m_jToken);
    }

    AccessTokenApi& api() { return *m_api; }

    Json::Value m_jToken = UNTOUCHED;

private:
    std::optional<AccessTokenApi> m_api; // opened when its database stands
};

#endif
