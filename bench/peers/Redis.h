// A Redis server that grants tokens. A failure throws std::runtime_error.

#ifndef VEMO_ACCESS_TOKEN_BENCH_REDIS_H
#define VEMO_ACCESS_TOKEN_BENCH_REDIS_H

#include <hiredis/hiredis.h>

#include <memory>
#include <string>
#include <vector>

#include "BareEngine.h"

class Redis {
public:
    struct Deleter {
        void operator()(redisContext* pContext) const { redisFree(pContext); }
        void operator()(redisReply* pReply) const { freeReplyObject(pReply); }
    };
    typedef std::unique_ptr<redisContext, Deleter> Session;
    typedef std::unique_ptr<redisReply, Deleter> Reply;
    typedef std::vector<const char*> Words;

    // Replaces all data of the server by the tokens 0 to nTokens - 1. It stores these fields of each; "count"
    // and "webapi_allow" are the first two. A grant returns the fields from number nFirst on.
    Redis(const char* szSocket, int nTokens, const Words& rgszField, int nFirst);

    void create(const BareToken& token) const;

    // The command that grants a use. The answer to a refusal is nil.
    Words grant(const std::string& strTid, const char* szWebapi, const char* szMethod) const;

    Session connect() const;
    static Reply run(const Session& pSession, Words rgszWord);
    Reply run(Words rgszWord) const { return run(m_pHeld, std::move(rgszWord)); }

private:
    const char* const m_szSocket;
    const Words m_rgszField;
    const Session m_pHeld;
    std::string m_strGrant; // the digest of the script
};

#endif
