// The exported functions: one call for each thing that programs do with access tokens.
//
// Each call but VemoAccessTokenGenerate opens the token database, deletes expired tokens (except where a
// function says otherwise), does its work and closes the database again; nothing is kept between calls.
// The process must be able to set its effective uid to 0 and should have it (vemo-access-token(7) says why).
//
// Results: 0 or more is success; -1 is a failure or a refusal. A failure has written its log lines (see
// AccessTokenUtil.h), unless it is VemoAccessTokenGenerate's. An unknown token and a method that is not
// listed are logged in debug mode only, but VemoAccessTokenGrant always logs that a grant was refused.
// Arguments that are not described as results are only read. Strings and JSON values are C++ objects, so
// the caller must be built with the same libstdc++ and jsoncpp.
//
// AccessTokenApi.h describes exceptions, -1 after waiting for a lock, threads and processes. Calls may
// overlap, but what overlaps is not exact: see vemo-access-token(7), THREADS AND PROCESSES.

#ifndef VEMO_ACCESS_TOKEN_H
#define VEMO_ACCESS_TOKEN_H

#include <json/value.h>

#include <cstddef>
#include <string>

#include "AccessTokenDefine.h"

extern "C" {

// Creates a token with a new random id, which strTid receives. The arguments are those of
// AccessTokenApi::tokenCreateByTid. Returns 0; or -1, and leaves strTid unchanged.
VEMO_ATOKEN_EXPORT int VemoAccessTokenCreate(unsigned int& uid, std::string& strFunction,
                                             Json::Value& jTokenOption, std::string& strTid);

// Creates a token with an id that the caller chooses, of at least 127 bytes. The arguments are
// those of AccessTokenApi::tokenCreateByTid. Returns 0 or -1.
VEMO_ATOKEN_EXPORT int VemoAccessTokenCreateByTid(unsigned int& uid, std::string& strFunction,
                                                  Json::Value& jTokenOption, std::string& strTid);

// Makes a token id, of 127 to 255 digits and ASCII letters, without using the database.
// Returns 0 or more; or a negative value, with strTid unchanged and no log line.
VEMO_ATOKEN_EXPORT int VemoAccessTokenGenerate(std::string& strTid);

// Decides whether the bearer of strTid may call szWebapiMethod of szWebapiName; a null or empty method
// asks for the API alone. A grant spends one use of the token, a refusal none.
// Returns 0 and sets jToken to the token's record (see AccessTokenApi::tokenGrant); or -1, and leaves
// jToken unchanged.
VEMO_ATOKEN_EXPORT int VemoAccessTokenGrantEx(std::string& strTid, const char* szWebapiName,
                                              const char* szWebapiMethod, Json::Value& jToken);

// Grants as VemoAccessTokenGrantEx does, and writes the name of the token's user to szUser, a buffer
// of cbUser bytes. No name is looked up when szUser is null or cbUser is 0.
// Returns 0; or -1 when the grant is refused (szUser is unchanged), the user is unknown, or the name
// and its terminator do not fit (szUser then holds the start of the name, terminated). In the last two
// cases the use is spent.
VEMO_ATOKEN_EXPORT int VemoAccessTokenGrant(std::string& strTid, const char* szWebapiName,
                                            const char* szWebapiMethod, char* szUser, size_t cbUser);

// Delete tokens by id, by login session and by purpose. Return the number of tokens deleted, which may
// be 0, or -1, also for an empty argument and a null szSid. Deleting by session does not delete
// expired tokens of other sessions.
VEMO_ATOKEN_EXPORT int VemoAccessTokenDeleteByTid(std::string& strTid);
VEMO_ATOKEN_EXPORT int VemoAccessTokenDeleteByBindSid(const char* szSid);
VEMO_ATOKEN_EXPORT int VemoAccessTokenDeleteByFunction(std::string& strFunction);

} // extern "C"

#endif
