// The calls that many processes make at once, on tokens with names, and what the store holds afterwards.

#ifndef TESTS_STORM_CALLS_H
#define TESTS_STORM_CALLS_H

#include <gtest/gtest.h>

#include <cstdint>
#include <map>
#include <optional>
#include <sstream>
#include <string>

#include "CallLock.h"
#include "Operations.h"
#include "TokenStore.h"
#include "vemo-access-token.h"

enum class Calls { Plain, Serialised };

// The uses left, by the name of the token.
typedef std::map<std::string, int64_t> Tokens;

class StormCalls {
public:
    explicit StormCalls(Calls calls) : m_calls(calls) {}

    // The results of the exported functions.
    int create(const std::string& strName) const
    {
        unsigned int uid = 0;
        std::string strFunction = "VPN";
        std::string strTid = idOf(strName);
        Json::Value jOption(Json::objectValue);
        return run([&] { return VemoAccessTokenCreateByTid(uid, strFunction, jOption, strTid); });
    }

    int grant(const std::string& strName) const
    {
        std::string strTid = idOf(strName);
        Json::Value jToken;
        return run([&] { return VemoAccessTokenGrantEx(strTid, "Example.Api", "get", jToken); });
    }

    int revoke(const std::string& strName) const
    {
        std::string strTid = idOf(strName);
        return run([&] { return VemoAccessTokenDeleteByTid(strTid); });
    }

    // Makes a new store with these tokens.
    void prepare(const Tokens& tokens) const
    {
        makeTable(m_store);
        for (const auto& [strName, nUses] : tokens) {
            insertToken(m_store, strName, "'',0,4102444800," + std::to_string(nUses) + ",1,'VPN'");
        }
    }

    // The tokens in the store, which must be sound. None if there is no table.
    Tokens tokens() const
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

    const TokenStore& store() const { return m_store; }

    // The lock file of serialised calls, next to the database.
    std::string lockFile() const { return m_store.directory() + "/calls.lock"; }

private:
    template <typename Call>
    int run(Call call) const
    {
        std::optional<CallLock> lock;
        if (Calls::Serialised == m_calls) {
            lock.emplace(lockFile().c_str());
        }
        return call();
    }

    const Calls m_calls;
    const TokenStore m_store;
};

#endif
