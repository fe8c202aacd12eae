#include <stdexcept>

#include "AccessTokenApi.h"
#include "Bystander.h"
#include "Contender.h"
#include "Store.h"
#include "vemo-access-token.h"

namespace {

class OursContender final : public Contender {
public:
    OursContender(int nTokens, Tuning tuning, Connection connection) : m_store(Place::Disk)
    {
        m_store.grow(nTokens);
        if (Tuning::Tuned == tuning) {
            m_store.makeIndexes();
            m_store.useWriteAheadLog();
        }
        if (Connection::PerCallBesideAnother == connection) {
            m_pBystander = std::make_unique<Bystander>();
        } else if (Connection::Held == connection) {
            m_pHeld = std::make_unique<AccessTokenApi>();
        }
        fillLog();
    }

    int size() override
    {
        Json::Value jAll;
        Json::Value jTokens(Json::arrayValue);
        if (0 > AccessTokenApi().tokenList(jAll, jTokens)) {
            throw std::runtime_error("the library cannot list the tokens");
        }
        return static_cast<int>(jTokens.size());
    }

    void create(const BareToken& token) override { BareEngine().create(token); }

    bool grant(std::string& strTid, const char* szWebapi, const char* szMethod) override
    {
        if (m_pHeld) {
            m_pHeld->cleanExpireToken(false);
            return 0 == m_pHeld->tokenGrant(strTid, szWebapi, szMethod, m_jAnswer);
        }
        return 0 == VemoAccessTokenGrantEx(strTid, szWebapi, szMethod, m_jAnswer);
    }

    Json::Value answer() const override { return m_jAnswer; }

private:
    // A write-ahead journal that stays grows to some size, and is overwritten from then on. Only that later
    // phase is measured.
    void fillLog()
    {
        std::string strTid = tokenOf(0).strTid;
        for (int i = 0; i < 400; ++i) {
            grant(strTid, webapi(), method());
        }
    }

    Store m_store;
    std::unique_ptr<Bystander> m_pBystander;
    std::unique_ptr<AccessTokenApi> m_pHeld;
    Json::Value m_jAnswer;
};

} // namespace

std::unique_ptr<Contender> makeOurs(int nTokens, Tuning tuning, Connection connection)
{
    return std::make_unique<OursContender>(nTokens, tuning, connection);
}
