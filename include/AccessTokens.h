// Access tokens, one call at a time: what most programs need, in C++17. The operations are the library's
// (AccessTokenApi.h); each opens the database for itself, purges expired tokens first, and holds the lock of
// all programs (CallLock.h) meanwhile.
//
//     const AccessTokens tokens;
//     const std::string strTid = tokens.create(uid, "file-share", jOption);
//
//     Json::Value jToken;
//     switch (tokens.grant(strTid, "Example.File", "get", &jToken)) {
//     case AccessTokens::Answer::Granted: return serve(jToken["uid"].asInt64());
//     case AccessTokens::Answer::Refused: return forbid();
//     case AccessTokens::Answer::Failed: return askToTryAgain();
//     }
//
// What an operation reports is what happened, also where it had to wait for the database. That holds as long
// as all programs that share tokens take the lock, as those that use this class do. Beside one that does not,
// a use can be granted twice, and a token can come back that was revoked (doc/concurrency.md).
//
// Arguments are only read. Texts count up to their first NUL.
//
// Errors: all operations but grant throw std::runtime_error when they did not do their work. It is a
// std::system_error when the lock cannot be had; in any other case the library has written log lines that say
// why. Besides, as AccessTokenApi.h says: Json::LogicError for a member of an argument that cannot be
// converted, std::bad_alloc.
//
// Time: an operation waits for the lock as long as the object says, and then up to 5 seconds with each
// statement for a database that a program without the lock keeps locked.
//
// Threads and processes: any number of threads may use an object at once, and take turns. The process needs
// effective uid 0 during each operation, calls VEMO_ACCESS_TOKEN::tokenType() once before it starts threads,
// and holds no CallLock of its own meanwhile: it would wait for itself. Nothing is kept between operations,
// so a child of fork() may use the object too, unless its parent has several threads.
//
// All of this is compiled into the program; the library exports nothing for it.

#ifndef VEMO_ACCESS_TOKENS_H
#define VEMO_ACCESS_TOKENS_H

#include <json/value.h>
#include <syslog.h>

#include <chrono>
#include <cstdio>
#include <ctime>
#include <optional>
#include <stdexcept>
#include <string>
#include <system_error>

#include "AccessTokenApi.h"
#include "AccessTokenUtil.h"
#include "CallLock.h"

class AccessTokens {
public:
    // What comes of a grant.
    enum class Answer {
        Granted, // the token opens the call, and one use of it is spent
        Refused, // it does not, has expired, or there is none; nothing is spent
        Failed,  // nobody knows, because the lock or the store failed; see grant
    };

    // wait: for the lock, at most.
    explicit AccessTokens(std::chrono::milliseconds wait = std::chrono::seconds(5)) : m_wait(wait) {}

    // Creates a token for the user uid (not UID_ERR) and the purpose strFunction (not empty), and returns its
    // id: a credential. jOption is null or an object, as for AccessTokenApi::tokenCreateByTid; its deadline
    // is in seconds from now.
    std::string create(unsigned int uid, const std::string& strFunction,
                       const Json::Value& jOption = Json::Value()) const;

    // Whether the bearer of strTid may call strMethod of the web API strApi; an empty method asks for the API
    // alone. A grant spends one use, and the last use deletes the token.
    //
    // When granted, pToken, if not null, receives the record with the uses that are left (after the last use
    // it still shows the count before it); otherwise it keeps what it holds.
    //
    // Failed never means that the token opens the call. It is logged. No use is spent, unless the store fails
    // to be written and then also to be read.
    Answer grant(const std::string& strTid, const std::string& strApi, const std::string& strMethod = "",
                 Json::Value* pToken = nullptr) const;

    // The record of a token, or nothing where there is none. Spends nothing.
    std::optional<Json::Value> lookup(const std::string& strTid) const;

    // Replaces those fields of a token that are members of the object jChange, each as a whole; the deadline
    // is in seconds since the epoch here. Returns whether there is such a token. The id cannot be changed:
    // std::invalid_argument.
    bool update(const std::string& strTid, const Json::Value& jChange) const;

    // Deletes a token. Returns whether there was one.
    bool revoke(const std::string& strTid) const;

    // Delete the tokens of a login session or of a purpose, neither of which is empty. There is none left
    // when they return.
    void revokeSession(const std::string& strSid) const;
    void revokeFunction(const std::string& strFunction) const;

private:
    // Calls use(AccessTokenApi&) under the lock, when expired tokens have been purged.
    template <typename Use>
    auto run(Use use) const
    {
        const CallLock lock(CallLock::FILE_OF_ALL, m_wait);
        AccessTokenApi api;
        api.cleanExpireToken(false);
        return use(api);
    }

    // The result of a call that may be made twice. The library reports a failure where a call had to wait for
    // the database, although it took effect; the second one has nothing to wait for any more.
    template <typename Call>
    static int settled(Call call)
    {
        const int nResult = call();
        return 0 > nResult ? call() : nResult;
    }

    static void require(bool blDone, const char* szElse)
    {
        if (!blDone) {
            throw std::runtime_error(std::string(szElse) + "; the log says why");
        }
    }

    // The record of a token, or nothing where there is none. One that has expired is none, also where it
    // could not be purged.
    static std::optional<Json::Value> find(AccessTokenApi& api, std::string& strTid)
    {
        Json::Value jToken;
        const int nFound = strTid.empty() ? 0 : settled([&] { return api.tokenGetByTid(strTid, jToken); });
        require(0 <= nFound, "the access token could not be looked up");
        if (0 == nFound || jToken["deadline"].asInt64() < time(nullptr)) {
            return std::nullopt;
        }
        return jToken;
    }

    // What is malformed opens nothing.
    static bool opens(Json::Value& jToken, const char* szApi, const char* szMethod)
    {
        try {
            return 0 < VEMO_ACCESS_TOKEN::checkPermission(jToken, szApi, szMethod);
        } catch (const Json::LogicError&) {
            return false;
        }
    }

    // Whether a grant that the library reports as failed has spent a use all the same: nobody else has
    // written since jToken was read. Lowers the count in it, too.
    static bool isSpent(AccessTokenApi& api, std::string& strTid, Json::Value& jToken)
    {
        const Json::Int64 nBefore = jToken["count"].asInt64();
        if (0 > nBefore) {
            return true; // unlimited: there was nothing to write
        }
        const std::optional<Json::Value> jNow = find(api, strTid);
        if (1 >= nBefore) {
            return !jNow;
        }
        jToken["count"] = nBefore - 1;
        return jNow && (*jNow)["count"].asInt64() == nBefore - 1;
    }

    static Answer grantWith(AccessTokenApi& api, std::string& strTid, const char* szApi, const char* szMethod,
                            Json::Value* pToken)
    {
        std::optional<Json::Value> jToken = find(api, strTid);
        if (!jToken || !opens(*jToken, szApi, szMethod)) {
            return Answer::Refused;
        }
        require(0 == api.tokenGrant(strTid, szApi, szMethod, *jToken) || isSpent(api, strTid, *jToken),
                "the access token could not be granted");
        if (pToken) {
            pToken->swap(*jToken);
        }
        return Answer::Granted;
    }

    // Writes a line of the library's kind to where the library writes them.
    static void log(const char* szText)
    {
        if (VEMO_ACCESS_TOKEN::logToStdoutGet()) {
            printf("AccessTokens.h:%d %s\n", __LINE__, szText);
        } else {
            syslog(LOG_ERR, "AccessTokens.h:%d %s\n", __LINE__, szText);
        }
    }

    const std::chrono::milliseconds m_wait;
};

inline std::string AccessTokens::create(unsigned int uid, const std::string& strFunction,
                                        const Json::Value& jOption) const
{
    std::string strTid;
    require(0 <= VEMO_ACCESS_TOKEN::tokenGenerate(strTid), "there is no random number for an id");
    std::string strFunctionCopy = strFunction;
    Json::Value jOptionCopy = jOption;
    run([&](AccessTokenApi& api) {
        // Nobody else knows the id, so a token under it is this one.
        Json::Value jToken;
        require(0 <= api.tokenCreateByTid(uid, strFunctionCopy, jOptionCopy, strTid) ||
                    0 < settled([&] { return api.tokenGetByTid(strTid, jToken); }),
                "the access token could not be created");
    });
    return strTid;
}

inline AccessTokens::Answer AccessTokens::grant(const std::string& strTid, const std::string& strApi,
                                                const std::string& strMethod, Json::Value* pToken) const
{
    std::string strTidCopy = strTid.c_str();
    try {
        return run([&](AccessTokenApi& api) {
            return grantWith(api, strTidCopy, strApi.c_str(), strMethod.c_str(), pToken);
        });
    } catch (const std::system_error& error) {
        log(error.what());
    } catch (const std::runtime_error&) { // the library has logged it
    }
    return Answer::Failed;
}

inline std::optional<Json::Value> AccessTokens::lookup(const std::string& strTid) const
{
    std::string strTidCopy = strTid.c_str();
    return run([&](AccessTokenApi& api) { return find(api, strTidCopy); });
}

inline bool AccessTokens::update(const std::string& strTid, const Json::Value& jChange) const
{
    std::string strTidCopy = strTid.c_str();
    Json::Value jChangeCopy = jChange;
    if (jChange.isMember("tid")) {
        throw std::invalid_argument("the id of an access token cannot be changed");
    }
    return run([&](AccessTokenApi& api) {
        if (!find(api, strTidCopy)) {
            return false;
        }
        require(0 <= settled([&] { return api.tokenUpdateByTid(strTidCopy, jChangeCopy); }),
                "the access token could not be updated");
        return true;
    });
}

inline bool AccessTokens::revoke(const std::string& strTid) const
{
    std::string strTidCopy = strTid.c_str();
    return run([&](AccessTokenApi& api) {
        if (!find(api, strTidCopy)) {
            return false;
        }
        require(0 <= settled([&] { return api.tokenDeleteByTid(strTidCopy); }),
                "the access token could not be revoked");
        return true;
    });
}

inline void AccessTokens::revokeSession(const std::string& strSid) const
{
    std::string strSidCopy = strSid.c_str();
    run([&](AccessTokenApi& api) {
        require(0 <= settled([&] { return api.tokenDeleteByBindSid(strSidCopy); }),
                "the access tokens of a session could not be revoked");
    });
}

inline void AccessTokens::revokeFunction(const std::string& strFunction) const
{
    std::string strFunctionCopy = strFunction.c_str();
    run([&](AccessTokenApi& api) {
        require(0 <= settled([&] { return api.tokenDeleteByFunction(strFunctionCopy); }),
                "the access tokens of a purpose could not be revoked");
    });
}

#endif
