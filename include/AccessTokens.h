// Access tokens, one call at a time: what most programs need, in C++17. Each operation takes the lock that
// all programs share (CallLock.h), opens the database, purges expired tokens, and calls AccessTokenApi.
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
// The result of an operation is exact, also after a wait for the database, as long as all programs that share
// tokens take the lock. A program that uses this class does. Beside one that does not, a use can be granted
// twice, and a revoked token can come back (doc/concurrency.md).
//
// Arguments are only read. Texts end at their first NUL.
//
// Errors: except for grant, an operation that did not do its work throws std::runtime_error. It is a
// std::system_error when the lock was not available; otherwise the library's log lines say why, unless
// create found no random number. There are also Json::LogicError, for a member of an argument that cannot be
// converted, and std::bad_alloc.
//
// Time: an operation waits for the lock, at most as long as the constructor's argument says. Then each
// statement waits up to 5 seconds for a database that a program without the lock keeps locked.
//
// Threads and processes: any number of threads may use an object at once, and take turns. The process needs
// effective uid 0 during each operation. It calls VEMO_ACCESS_TOKEN::tokenType() once before it starts
// threads. A thread that holds a CallLock must not call an operation: it would wait for itself. Nothing is
// kept between operations, so a child of fork() may use the object too, unless its parent has several
// threads.
//
// This class is compiled into the program; the library exports nothing for it.

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
    // The result of a grant.
    enum class Answer {
        Granted, // the token allows the call, and one use of it is spent
        Refused, // the token does not allow it, has expired, or does not exist; nothing is spent
        Failed,  // undecided: the lock or the database failed, or the token cannot be saved; see grant
    };

    // An operation waits for the lock as long as wait says, and then fails.
    explicit AccessTokens(std::chrono::milliseconds wait = std::chrono::seconds(5)) : m_wait(wait) {}

    // Creates a token for the user uid (not UID_ERR) and the purpose strFunction (not empty). Returns its id,
    // which is a credential. jOption is null or an object, as for AccessTokenApi::tokenCreateByTid; its
    // deadline is in seconds from now.
    std::string create(unsigned int uid, const std::string& strFunction,
                       const Json::Value& jOption = Json::Value()) const;

    // Decides whether the bearer of strTid may call strMethod of the web API strApi; an empty method asks for
    // the API alone. A grant spends one use, and the last use deletes the token.
    //
    // After a grant *pToken is the record with the uses that are left (after the last use it still shows the
    // count before it). After any other answer it is unchanged. pToken may be null.
    //
    // Failed is logged, and the call must not be allowed. No use is spent, unless the database failed while
    // the use was written, and then could not be read either.
    Answer grant(const std::string& strTid, const std::string& strApi, const std::string& strMethod = "",
                 Json::Value* pToken = nullptr) const;

    // Returns the record of a token, or nothing when there is no such token. Spends no use.
    std::optional<Json::Value> lookup(const std::string& strTid) const;

    // Replaces those fields of a token that are members of the object jChange, each as a whole. Here the
    // deadline is in seconds since the epoch. Returns whether there is such a token. Throws
    // std::invalid_argument when jChange has a tid: the id cannot be changed.
    bool update(const std::string& strTid, const Json::Value& jChange) const;

    // Deletes a token. Returns whether it existed.
    bool revoke(const std::string& strTid) const;

    // Delete all tokens of a login session, or of a purpose. The argument must not be empty.
    void revokeSession(const std::string& strSid) const;
    void revokeFunction(const std::string& strFunction) const;

private:
    // Takes the lock, purges expired tokens, and calls use(AccessTokenApi&).
    template <typename Use>
    auto run(Use use) const
    {
        const CallLock lock(CallLock::FILE_OF_ALL, m_wait);
        AccessTokenApi api;
        api.cleanExpireToken(false);
        return use(api);
    }

    // Makes a call, and makes it again if it fails. After a wait for the database the library reports a
    // failure although the call took effect; the second call no longer has to wait.
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

    // Returns the record of a token, or nothing when there is no such token, or when it has expired but
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

    // Whether the token allows the call. A malformed token allows nothing.
    static bool allows(Json::Value& jToken, const char* szApi, const char* szMethod)
    {
        try {
            return 0 < VEMO_ACCESS_TOKEN::checkPermission(jToken, szApi, szMethod);
        } catch (const Json::LogicError&) {
            return false;
        }
    }

    // Whether a grant that the library reported as failed has spent a use after all. The count in the
    // database shows it: nobody else has written since jToken was read. Lowers the count in jToken too.
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
        if (!jToken || !allows(*jToken, szApi, szMethod)) {
            return Answer::Refused;
        }
        require(0 == api.tokenGrant(strTid, szApi, szMethod, *jToken) || isSpent(api, strTid, *jToken),
                "the access token could not be granted");
        if (pToken) {
            pToken->swap(*jToken);
        }
        return Answer::Granted;
    }

    // Writes a line in the library's form, to where the library writes its own.
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
    if (0 > VEMO_ACCESS_TOKEN::tokenGenerate(strTid)) {
        throw std::runtime_error("there is no random number for an id");
    }
    std::string strFunctionCopy = strFunction;
    Json::Value jOptionCopy = jOption;
    run([&](AccessTokenApi& api) {
        // Nobody else knows the id, so a token that has it is this one.
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
