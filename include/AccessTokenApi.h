// The token service: an object that holds one open connection to the token database and offers the
// operations on tokens. For a single operation, use the functions of vemo-access-token.h. For many
// calls, use an object: it opens the database once.
//
// Results: 0 is success; -1 is a failure, which has written its log lines. Operations with other
// results say so. A missing token is not a failure. All arguments are references, because compiled
// callers pass them so; those that are not described as results are only read.
//
// Exceptions: Json::LogicError when a member has a type that cannot be converted (for example a
// "deadline" option that is a string, or that needs more than 32 bits), and std::bad_alloc.
//
// Expiry: only cleanExpireToken looks at deadlines. Call it before the other operations, as the
// exported functions do.
//
// An operation whose statement had to wait for a lock on the database reports -1 although the statement
// took effect. Look the token up (tokenGetByTid) to learn what happened.
//
// Threads and processes: one thread at a time may use an object; several objects, in any threads and
// processes, may use the database at once. The constructor, or the first operation after a failed
// opening, changes the effective uid of the whole process for a moment. The process should have
// effective uid 0 as long as the object lives. No transaction spans reading and writing a token:
// overlapping updates, grants and deletions of one token can overwrite each other. vemo-access-token(7)
// says more about both.

#ifndef VEMO_ACCESS_TOKEN_API_H
#define VEMO_ACCESS_TOKEN_API_H

#include <json/value.h>

#include <memory>
#include <string>
#include <vector>

#include "AccessTokenDefine.h"

class AccessTokenDbApi;

class VEMO_ATOKEN_EXPORT AccessTokenApi {
public:
    // Opens the database, and creates file and table if the file is missing. A failure is only logged: after
    // one, each operation tries to open again. But when SQLite itself could not open the file, or memory for
    // the store was missing, all operations fail until the object is destroyed.
    AccessTokenApi();

    // Closes the database.
    ~AccessTokenApi();

    AccessTokenApi(const AccessTokenApi&) = delete;
    AccessTokenApi& operator=(const AccessTokenApi&) = delete;

    // Creates a token with the id strTidIn, of at least VEMO_ATOKEN_LENGTH_MIN bytes, for the
    // user uid (not UID_ERR) and the purpose strFunction (not empty).
    // jTokenOption is null or an object with any of these members; others are ignored:
    //   deadline      lifetime in seconds from now, 32 bits, default 86400. There is no value for
    //                 "never": -1 makes a token that has already expired.
    //   count         number of uses, default 1; negative means unlimited
    //   bind_sid      login session, default ""
    //   webapi_allow  {"API": {"method": ["get", ...]}, ...}, default {}, which allows nothing
    //   extra         an object of the creator's own, default {}
    // An id that exists already is a failure; the existing token stays as it was.
    int tokenCreateByTid(unsigned int& uid, std::string& strFunction, Json::Value& jTokenOption,
                         std::string& strTidIn);

    // Creates a token as tokenCreateByTid does, with a new random id. strTidOut receives the id on
    // success and is unchanged on failure.
    int tokenCreate(unsigned int& uid, std::string& strFunction, Json::Value& jTokenOption,
                    std::string& strTidOut);

    // Appends the tokens that jFilter selects to jTokenArrayOut, which must be an array. A null
    // filter selects all. vemo-access-token(7) describes filters and their oddities.
    // After a failure jTokenArrayOut may hold some of the tokens and must not be used.
    int tokenList(Json::Value& jFilter, Json::Value& jTokenArrayOut);

    // Looks up one token. Returns 1 and sets jTokenOut to its record; 0 and sets jTokenOut to an
    // empty object when there is no such token; or a negative value.
    int tokenGetByTid(std::string& strTid, Json::Value& jTokenOut);

    // Sets the member szField of jParamOut (an object or null) to the array of the vector's strings:
    // the list form of a filter.
    int VectorParamToJson(std::vector<std::string>& strVector, const char* szField, Json::Value& jParamOut);

    // Appends the token with the given id to jTokenArrayOut, which must be an array. An empty list is
    // a failure; a list of more than one id finds none of them.
    int tokenGetByTidArray(std::vector<std::string>& strTidVector, Json::Value& jTokenArrayOut);

    // Replaces those fields of a token that are members of the object jParam, each as a whole. Here
    // deadline is an absolute time, in seconds since the epoch. Returns 0 also when there is no such
    // token. A different tid in jParam leaves the token as it is and writes a copy with that tid.
    int tokenUpdateByTid(std::string& strTid, Json::Value& jParam);

    // Writes a complete record over the token of the same tid, or creates that token. A missing field
    // or one of a wrong type is a failure. jToken is only read.
    int tokenSaveByOverwrite(Json::Value& jToken);

    // Delete tokens by the value of a string field (szName is "tid", "bind_sid" or "function"), by id,
    // by login session or by purpose. A list of more than one value matches none of them.
    // Return the number of tokens deleted, which may be 0, or -1, also for an empty argument.
    int tokenDeleteByArray(std::vector<std::string>& strVector, const char* szName);
    int tokenDeleteByName(std::string& strValue, const char* szName);
    int tokenDeleteByTid(std::string& strTid);
    int tokenDeleteByBindSid(std::string& strSid);
    int tokenDeleteByFunction(std::string& strFunction);
    int tokenDeleteByTidArray(std::vector<std::string>& strTidVector);
    // Deletes all tokens. Returns the number of tokens deleted, or -1.
    int tokenDeleteAll();

    // Deletes the tokens whose deadline lies before now, as a deadline of -1 does. With blLogErr false
    // the operation writes its own failure lines in debug mode only. Returns 0 whatever the number of
    // tokens deleted, or -1.
    int cleanExpireToken(bool blLogErr);

    // Decides whether the bearer of strTid may call a method of a web API; a null or empty
    // szWebapiMethod asks for the API alone. A grant spends one use, and the last use deletes the
    // token; a refusal spends none.
    // Returns 0 and sets jTokenOut to the token's record with the uses that are left (after the last
    // use it still shows the count before it); or -1 and leaves jTokenOut unchanged, for an unknown
    // token, a call that is not allowed and a failure alike. An unknown token and a method that is
    // not listed are logged in debug mode only.
    int tokenGrant(std::string& strTid, const char* szWebapiName, const char* szWebapiMethod,
                   Json::Value& jTokenOut);

    // Spends one use of the token whose record jToken is: lowers count by one, in jToken too, and saves
    // the record; or deletes the token when count is 1 or 0. A negative count stays as it is.
    int tokenCountDegrade(Json::Value& jToken);

private:
    std::unique_ptr<AccessTokenDbApi> m_pDb; // null when its allocation failed: operations return -1
};

#endif
