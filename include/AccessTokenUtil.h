// Utilities of the token model: the type table, validation, defaults, ids, times, the permission
// test, and the two switches that say where log lines go.
//
// A token record is a Json::Value object with the nine fields tid, bind_sid, uid, deadline, count,
// create_time, function, webapi_allow and extra (README has their table).
//
// Results: unless a function says otherwise, 0 is success and -1 is a failure that has written its
// log line. Nothing throws but failed allocations (std::bad_alloc), unless said otherwise.
//
// Threads: no function here takes a lock. All of them may run in several threads at once on
// different records, provided that one call of tokenType() was made before the threads started.

#ifndef VEMO_ACCESS_TOKEN_UTIL_H
#define VEMO_ACCESS_TOKEN_UTIL_H

#include <json/value.h>

#include <string>

#include "AccessTokenDefine.h"

namespace VEMO_ACCESS_TOKEN {

// The process-wide type table: an object that maps each field to the array [type name, default].
// Type names are "string", "long long" and "Json::objectValue". The table is built by the first
// call, so its default of create_time is the time of that call for the rest of the process.
// Never fails. The library owns the table, and callers only read it; it lives until the process
// destroys its static objects: exit handlers registered ahead of the first call must not use it. The
// very first call is not safe against another first call in a second thread.
VEMO_ATOKEN_EXPORT Json::Value& tokenType();

// Checks the types of those members of jTokenParam that are token fields; members of other names
// are accepted unseen, and missing ones are not missed. Stops at the first bad member.
// Returns 0, or -1 when a member has a wrong type or jTokenParam is no object.
VEMO_ATOKEN_EXPORT int checkJsonType(Json::Value& jTokenParam);

// Completes a record, or checks that it is complete. Members that are present are never changed,
// whatever their type.
//   blCheck false: each missing field gets its default, create_time the current time. Returns 0.
//   blCheck true: adds nothing; returns -1 at the first missing field, 0 when all nine are there.
// jToken must be an object or null; anything else throws Json::LogicError.
VEMO_ATOKEN_EXPORT int fillDefaultValue(Json::Value& jToken, bool blCheck);

// Makes a new token id of 127 to 255 characters, digits and ASCII letters, from the kernel's random
// source. Uniqueness is not checked here; the table refuses a duplicate.
// Returns 0 or more and replaces strTid, or a negative value with strTid unchanged (and no log
// line) when the random source fails.
VEMO_ATOKEN_EXPORT int tokenGenerate(std::string& strTid);

// Sets now to the current time plus offsetSecond (which may be negative), in seconds since the
// epoch. Always returns 0.
VEMO_ATOKEN_EXPORT int getTimeAfterNow(int offsetSecond, long& now);

// Sets strTime to the current time plus offsetSecond as text in UTC, such as
// "Fri, 02 Jan 2026 13:00:00 GMT". The names of days and months follow the process's LC_TIME locale.
// Returns 0, or -1 with strTime unchanged.
VEMO_ATOKEN_EXPORT int getTimeAfterNow(int offsetSecond, std::string& strTime);

// Whether the record's webapi_allow lists a web API and its method. Names are compared byte by
// byte. A null or empty szWebapiMethod asks for the API alone.
//   1   allowed
//   0   the API is listed, the method is not
//   -1  the API is not listed, szWebapiName is null or empty, or the record is malformed (only the
//       last two write a log line outside debug mode)
// An element of a method array that cannot be read as a string throws Json::LogicError.
VEMO_ATOKEN_EXPORT int checkPermission(Json::Value& jToken, const char* szWebapiName,
                                       const char* szWebapiMethod);

// The log switches, both off when the library is loaded. true switches on, for the rest of the
// process; false only reads, as the functions named ...Get do. All return the state after the call.
//   logToStdout: lines go to standard output instead of the system log (priority LOG_ERR).
//   debugInfo: the lines that trace what is done are written as well. They carry whole records,
//     token ids included.
// Any thread may call them at any time; a thread that has not yet seen a switch logs the old way.
VEMO_ATOKEN_EXPORT bool logToStdout(bool blOn);
VEMO_ATOKEN_EXPORT bool logToStdoutGet();
VEMO_ATOKEN_EXPORT bool debugInfo(bool blOn);
VEMO_ATOKEN_EXPORT bool debugInfoGet();

} // namespace VEMO_ACCESS_TOKEN

#endif
