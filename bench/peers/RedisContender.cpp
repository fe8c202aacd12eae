#include "Contender.h"
#include "Redis.h"
#include "Store.h"

namespace {

// KEYS: the id. ARGV: web API and method. A token is a hash under its id, and Redis itself removes it
// at its deadline.
const char* const GRANT = R"lua(
local function allows(webapi_allow, webapi, method)
    local api = cjson.decode(webapi_allow)[webapi]
    for _, listed in ipairs(api and api.method or {}) do
        if listed == method then
            return true
        end
    end
    return false
end

local record = redis.call('HMGET', KEYS[1], 'tid', 'bind_sid', 'uid', 'deadline', 'count', 'create_time',
                          'function', 'webapi_allow', 'extra')
if not record[1] or not allows(record[8], ARGV[1], ARGV[2]) then
    return false
end
local count = tonumber(record[5])
if count > 1 then
    record[5] = tostring(redis.call('HINCRBY', KEYS[1], 'count', -1))
elseif count >= 0 then
    redis.call('DEL', KEYS[1])
end
return record
)lua";

using redis::connect;
using redis::run;

class RedisContender final : public Contender {
public:
    RedisContender(int nTokens, const char* szSocket, Connection connection)
        : m_strSocket(szSocket), m_connection(connection), m_pHeld(connect(szSocket))
    {
        run(*m_pHeld, {"FLUSHALL"});
        m_strGrant = run(*m_pHeld, {"SCRIPT", "LOAD", GRANT})->str;
        run(*m_pHeld, {"MULTI"});
        for (int i = 0; i < nTokens; ++i) {
            create(tokenOf(i));
        }
        run(*m_pHeld, {"EXEC"});
    }

    int size() override { return static_cast<int>(run(*m_pHeld, {"DBSIZE"})->integer); }

    void create(const BareToken& token) override
    {
        const Texts rgstrText = textsOf(token);
        std::vector<const char*> rgszWord = {"HSET", token.strTid.c_str()};
        for (size_t i = 0; i < rgstrText.size(); ++i) {
            rgszWord.push_back(fieldNames()[i].c_str());
            rgszWord.push_back(rgstrText[i].c_str());
        }
        run(*m_pHeld, rgszWord);
        run(*m_pHeld, {"EXPIREAT", token.strTid.c_str(), std::to_string(token.nDeadline).c_str()});
    }

    bool grant(std::string& strTid, const char* szWebapi, const char* szMethod) override
    {
        const std::vector<const char*> rgszWord = {"EVALSHA",      m_strGrant.c_str(), "1",
                                                   strTid.c_str(), szWebapi,           szMethod};
        if (Connection::Held == m_connection) {
            m_pAnswer = run(*m_pHeld, rgszWord);
        } else {
            m_pAnswer = run(*connect(m_strSocket), rgszWord);
        }
        return REDIS_REPLY_ARRAY == m_pAnswer->type;
    }

    Json::Value answer() const override
    {
        Texts rgstrText;
        for (size_t i = 0; i < rgstrText.size(); ++i) {
            rgstrText[i] = m_pAnswer->element[i]->str;
        }
        return recordOf(rgstrText);
    }

private:
    std::string m_strSocket;
    Connection m_connection;
    redis::Context m_pHeld;
    std::string m_strGrant; // the script's digest
    redis::Reply m_pAnswer;
};

} // namespace

std::unique_ptr<Contender> makeRedis(int nTokens, const char* szSocket, Connection connection)
{
    return std::make_unique<RedisContender>(nTokens, szSocket, connection);
}
