// The exported functions: one call each for what programs do with access tokens.
//
// Each call opens the token database, deletes expired tokens (but for the two functions that say
// otherwise), does its work and closes the database again; nothing is kept between calls. The
// process must be able to set its effective uid to 0 and should have it (README says why).
//
// Results: 0 or more is success, -1 a failure or refusal. Failures have written their log lines (see
// AccessTokenUtil.h); that a token is unknown or a method not listed is logged in debug mode only,
// though VemoAccessTokenGrant logs every refusal as such.
// Arguments not named as results are only read. The strings and JSON values are those of C++, so a
// caller is built with the same libstdc++ and jsoncpp.
//
// Exceptions, -1 after waiting for a lock, threads and processes: as AccessTokenApi.h says. Calls may
// overlap in any threads and processes; overlapping grants of one token can spend one use for two.

#ifndef VEMO_ACCESS_TOKEN_H
#define VEMO_ACCESS_TOKEN_H

#include <json/value.h>

#include <cstddef>
#include <string>

#include "AccessTokenDefine.h"

extern "C" {

// Creates a token under a new random id, which strTid receives on success.
// Arguments and jTokenOption as for AccessTokenApi::tokenCreateByTid. Returns 0, or -1 with strTid
// unchanged.
VEMO_ATOKEN_EXPORT int VemoAccessTokenCreate(unsigned int& uid, std::string& strFunction,
                                             Json::Value& jTokenOption, std::string& strTid);

// Creates a token under the caller's id strTid, of 127 characters at least. Arguments and
// jTokenOption as for AccessTokenApi::tokenCreateByTid. Returns 0 or -1.
VEMO_ATOKEN_EXPORT int VemoAccessTokenCreateByTid(unsigned int& uid, std::string& strFunction,
                                                  Json::Value& jTokenOption, std::string& strTid);

// Makes a token id without touching the database: 127 to 255 digits and ASCII letters.
// Returns 0 or more, or a negative value with strTid unchanged.
VEMO_ATOKEN_EXPORT int VemoAccessTokenGenerate(std::string& strTid);

// Whether the bearer of strTid may call szWebapiMethod of szWebapiName; a null or empty method asks
// for the API alone. A grant spends one use of the token, a refusal none.
// Returns 0 and sets jToken to the token's record (see AccessTokenApi::tokenGrant), or -1 with jToken
// unchanged.
VEMO_ATOKEN_EXPORT int VemoAccessTokenGrantEx(std::string& strTid, const char* szWebapiName,
                                              const char* szWebapiMethod, Json::Value& jToken);

// Grants as VemoAccessTokenGrantEx does, and writes the name of the token's user to szUser, a buffer
// of cbUser bytes. No name is looked up when szUser is null or cbUser is 0.
// Returns 0, or -1 when the grant is refused (szUser unchanged), the user is unknown, or the name
// with its terminator does not fit (szUser then holds what fits, terminated). A grant that fails for
// the name has spent its use.
VEMO_ATOKEN_EXPORT int VemoAccessTokenGrant(std::string& strTid, const char* szWebapiName,
                                            const char* szWebapiMethod, char* szUser, size_t cbUser);

// Delete tokens by id, by login session and by purpose. Return the number of tokens deleted, 0 when
// there were none, or -1, also for an empty argument and a null szSid. Deleting by session does not
// delete expired tokens of other sessions.
VEMO_ATOKEN_EXPORT int VemoAccessTokenDeleteByTid(std::string& strTid);
VEMO_ATOKEN_EXPORT int VemoAccessTokenDeleteByBindSid(const char* szSid);
VEMO_ATOKEN_EXPORT int VemoAccessTokenDeleteByFunction(std::string& strFunction);

} // extern "C"

#endif
