#include "Redis.h"

#include <map>
#include <stdexcept>
#include <utility>

#include "Store.h"

namespace {

// KEYS: the id. ARGV: web API and method. A token is a hash under its id, and Redis itself removes it at its
// deadline. "record" and "first" are set before this.
const char* const GRANT = R"lua(
if not record[1] then
    return false
end
local api = cjson.decode(record[2])[ARGV[1]]
for _, listed in ipairs(api and api.method or {}) do
    if listed == ARGV[2] then
        local count = tonumber(record[1])
        if count > 1 then
            record[1] = tostring(redis.call('HINCRBY', KEYS[1], 'count', -1))
        elseif count >= 0 then
            redis.call('DEL', KEYS[1])
        end
        return {unpack(record, first)}
    end
end
return false
)lua";

} // namespace

Redis::Redis(const char* szSocket, int nTokens, const Words& rgszField, int nFirst)
    : m_szSocket(szSocket), m_rgszField(rgszField), m_pHeld(connect())
{
    std::string strScript =
        "local first = " + std::to_string(nFirst) + "\nlocal record = redis.call('HMGET', KEYS[1]";
    for (const char* szField : m_rgszField) {
        strScript += std::string(", '") + szField + "'";
    }
    run({"FLUSHALL"});
    m_strGrant = run({"SCRIPT", "LOAD", (strScript + ")" + GRANT).c_str()})->str;
    run({"MULTI"});
    for (int i = 0; i < nTokens; ++i) {
        create(tokenOf(i));
    }
    run({"EXEC"});
}

void Redis::create(const BareToken& token) const
{
    const std::map<std::string, std::string> fields = fieldsOf(token);
    Words rgszWord = {"HSET", token.strTid.c_str()};
    for (const char* szField : m_rgszField) {
        rgszWord.push_back(szField);
        rgszWord.push_back(fields.at(szField).c_str());
    }
    run(rgszWord);
    run({"EXPIREAT", token.strTid.c_str(), fields.at("deadline").c_str()});
}

Redis::Words Redis::grant(const std::string& strTid, const char* szWebapi, const char* szMethod) const
{
    return {"EVALSHA", m_strGrant.c_str(), "1", strTid.c_str(), szWebapi, szMethod};
}

Redis::Session Redis::connect() const
{
    Session pSession(redisConnectUnix(m_szSocket));
    if (!pSession || pSession->err) {
        throw std::runtime_error(std::string("no connection to Redis at ") + m_szSocket);
    }
    return pSession;
}

Redis::Reply Redis::run(const Session& pSession, Words rgszWord)
{
    const int nWords = static_cast<int>(rgszWord.size());
    Reply pReply(
        static_cast<redisReply*>(redisCommandArgv(pSession.get(), nWords, rgszWord.data(), nullptr)));
    if (!pReply || REDIS_REPLY_ERROR == pReply->type) {
        throw std::runtime_error(std::string("Redis: ") + (pReply ? pReply->str : pSession->errstr));
    }
    return pReply;
}
