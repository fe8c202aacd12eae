#include "StormCalls.h"

#include <gtest/gtest.h>

#include <cstdlib>
#include <optional>
#include <sstream>

#include "CallLock.h"
#include "internal/AccessTokenDbApi.h"
#include "vemo-access-token.h"

namespace {

const std::string KNOWN = "known-"; // so TokenStore::state() shows the name

std::string tid(const std::string& strName)
{
    std::string strTid = KNOWN + strName;
    strTid.resize(VEMO_ATOKEN_LENGTH_MIN, 'x');
    return strTid;
}

} // namespace

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
    std::string strTid = tid(strName);
    Json::Value jOption(Json::objectValue);
    return run([&] { return VemoAccessTokenCreateByTid(uid, strFunction, jOption, strTid); });
}

int StormCalls::grant(const std::string& strName) const
{
    std::string strTid = tid(strName);
    Json::Value jToken;
    return run([&] { return VemoAccessTokenGrantEx(strTid, "Example.Api", "get", jToken); });
}

int StormCalls::revoke(const std::string& strName) const
{
    std::string strTid = tid(strName);
    return run([&] { return VemoAccessTokenDeleteByTid(strTid); });
}

void StormCalls::prepare(const Tokens& tokens) const
{
    std::string strSql;
    AccessTokenDbApi().SqlExpandCreateTable(strSql);
    std::string strSeparator = " INSERT INTO token VALUES ";
    for (const auto& [strName, nUses] : tokens) {
        strSql += strSeparator + "('" + tid(strName) + "','',0,4102444800," + std::to_string(nUses) +
                  R"(,1,'VPN','{"Example.Api":{"method":["get"]}}','{}'))";
        strSeparator = ",";
    }
    m_store.setFiles({{"vemo-access-token.db", ""}});
    m_store.run(strSql);
}

void StormCalls::removeStore() const
{
    m_store.setFiles(Files());
}

Tokens StormCalls::tokens() const
{
    Tokens tokens;
    const std::string strState = m_store.state();
    if (STATE_NO_TABLE == strState) {
        return tokens;
    }
    EXPECT_EQ(std::string::npos, strState.find("corrupt:")) << strState;
    std::istringstream lines(strState);
    std::string strTid;
    std::string strSkipped;
    std::string strUses;
    while (std::getline(lines, strTid, '|')) {
        for (int i = 0; i < 3; ++i) {
            std::getline(lines, strSkipped, '|');
        }
        std::getline(lines, strUses, '|');
        std::getline(lines, strSkipped);
        const bool blKnown = 0 == strTid.rfind(KNOWN, 0);
        tokens[blKnown ? strTid.substr(KNOWN.size()) : strTid] = std::stoll(strUses);
    }
    return tokens;
}

std::string nameOf(const char* szKind, int nProcess, int nRound)
{
    return std::string(szKind) + "-" + std::to_string(nProcess) + "-" + std::to_string(nRound);
}

std::vector<int> stormSizes()
{
    std::vector<int> nProcesses = {1, 2, 4, 8, 16, 32, 64};
    const char* szMore = getenv("VEMO_TEST_PROCESSES");
    if (szMore) {
        nProcesses.push_back(std::stoi(szMore));
    }
    return nProcesses;
}

std::string stormName(int nProcesses, Calls calls, int64_t nCalls)
{
    return std::to_string(nProcesses) + (1 == nProcesses ? " process, " : " processes, ") +
           (Calls::Plain == calls ? "plain, " : "serialised, ") + std::to_string(nCalls) + " calls";
}
