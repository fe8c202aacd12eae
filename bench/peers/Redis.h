// Calls of a Redis server. They throw std::runtime_error when they fail.

#ifndef VEMO_ACCESS_TOKEN_BENCH_REDIS_H
#define VEMO_ACCESS_TOKEN_BENCH_REDIS_H

#include <hiredis/hiredis.h>

#include <memory>
#include <stdexcept>
#include <string>
#include <vector>

namespace redis {

struct Deleter {
    void operator()(redisContext* pContext) const { redisFree(pContext); }
    void operator()(redisReply* pReply) const { freeReplyObject(pReply); }
};

typedef std::unique_ptr<redisContext, Deleter> Context;
typedef std::unique_ptr<redisReply, Deleter> Reply;

inline Context connect(const std::string& strSocket)
{
    Context pContext(redisConnectUnix(strSocket.c_str()));
    if (!pContext || pContext->err) {
        throw std::runtime_error("no connection to Redis at " + strSocket);
    }
    return pContext;
}

inline Reply run(redisContext& context, std::vector<const char*> rgszWord)
{
    const int nWords = static_cast<int>(rgszWord.size());
    Reply pReply(static_cast<redisReply*>(redisCommandArgv(&context, nWords, rgszWord.data(), nullptr)));
    if (!pReply || REDIS_REPLY_ERROR == pReply->type) {
        throw std::runtime_error(std::string("Redis: ") + (pReply ? pReply->str : context.errstr));
    }
    return pReply;
}

} // namespace redis

#endif
