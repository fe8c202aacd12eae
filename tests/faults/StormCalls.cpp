#include "StormCalls.h"

#include <gtest/gtest.h>

#include <optional>
#include <sstream>

#include "CallLock.h"
#include "Operations.h"
#include "vemo-access-token.h"

template <typename Call>
int StormCalls::run(Call call) const
{
    std::optional<CallLock> lock;
    if (Calls::Serialised == m_calls) {
        lock.emplace(lockFile().c_str());
    }
    return call();
}

int StormCalls::create(const std::string& strName) const
{
    unsigned int uid = 0;
    std::string strFunction = "VPN";
    std::string strTid = idOf(strName);
    Json::Value jOption(Json::objectValue);
    return run([&] { return VemoAccessTokenCreateByTid(uid, strFunction, jOption, strTid); });
}

int StormCalls::grant(const std::string& strName) const
{
    std::string strTid = idOf(strName);
    Json::Value jToken;
    return run([&] { return VemoAccessTokenGrantEx(strTid, "Example.Api", "get", jToken); });
}

int StormCalls::revoke(const std::string& strName) const
{
    std::string strTid = idOf(strName);
    return run([&] { return VemoAccessTokenDeleteByTid(strTid); });
}

void StormCalls::prepare(const Tokens& tokens) const
{
    makeTable(m_store);
    std::string strSql;
    for (const auto& [strName, nUses] : tokens) {
        strSql += (strSql.empty() ? "INSERT INTO token VALUES ('" : ",('") + idOf(strName) +
                  "','',0,4102444800," + std::to_string(nUses) +
                  R"(,1,'VPN','{"Example.Api":{"method":["get"]}}','{}'))";
    }
    m_store.run(strSql);
}

Tokens StormCalls::tokens() const
{
    Tokens tokens;
    const std::string strState = m_store.state();
    if (STATE_NO_TABLE == strState) {
        return tokens;
    }
    EXPECT_EQ(std::string::npos, strState.find("corrupt:")) << strState;
    std::istringstream lines(m_store.rows("SELECT rtrim(substr(tid, 7), 'x'), count FROM token"));
    std::string strName;
    std::string strUses;
    while (std::getline(lines, strName, '|') && std::getline(lines, strUses)) {
        tokens[strName] = std::stoll(strUses);
    }
    return tokens;
}
