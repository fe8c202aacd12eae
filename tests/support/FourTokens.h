// A service whose database holds four tokens.

#ifndef TESTS_FOUR_TOKENS_H
#define TESTS_FOUR_TOKENS_H

#include <optional>

#include "AccessTokenApi.h"
#include "StoreTest.h"

const time_t NOW = 1700000000;

class FourTokens : public StoreTest {
protected:
    using StoreTest::StoreTest;

    void SetUp() override
    {
        StoreTest::SetUp();
        makeDatabase();
        insertToken("a", "S1", "VPN");
        insertToken("b", "S1", "MAIL");
        insertToken("a''b", "", "VPN");
        insertToken("c", "S2", "O''Brien");
        m_api.emplace();
        seam().calls.clear();
        seam().clock = NOW;
    }

    void insertToken(const std::string& strTid, const std::string& strSid, const std::string& strFunction,
                     const std::string& strDeadline = "1700000100") const
    {
        insert(strTid,
               "'" + strSid + "',1000," + strDeadline + ",1,1700000000,'" + strFunction + "','{}','{}'");
    }

    AccessTokenApi& api() { return *m_api; }

    // The tids that there are, with blanks between.
    std::string tids() const
    {
        return query("SELECT group_concat(tid, ' ') FROM (SELECT tid FROM token ORDER BY tid)")[0];
    }

private:
    std::optional<AccessTokenApi> m_api; // opened when its database stands
};

#endif
