// Utilities for token records: the type table, validation, defaults, ids, times, the permission test,
// and the two log switches.
//
// A token record is a Json::Value object with the nine fields tid, bind_sid, uid, deadline, count,
// create_time, function, webapi_allow and extra (vemo-access-token(7) describes them).
//
// Results: 0 is success; -1 is a failure, which has written its log line. Functions with other results
// or with exceptions other than std::bad_alloc say so.
//
// Threads: all functions may run in several threads at once, on different records. Call tokenType()
// once before the threads start.

#ifndef VEMO_ACCESS_TOKEN_UTIL_H
#define VEMO_ACCESS_TOKEN_UTIL_H

#include <json/value.h>

#include <string>

#include "AccessTokenDefine.h"

namespace VEMO_ACCESS_TOKEN {

// The process-wide type table: an object that maps each field to the array [type name, default].
// Type names are "string", "long long" and "Json::objectValue". The first call builds the table, so
// the default of create_time stays the time of that call.
// Never fails. The library owns the table, and callers only read it. It is destroyed with the static
// objects of the process, so exit handlers that were registered before the first call must not use it.
// Two threads must not make the first call at the same time.
VEMO_ATOKEN_EXPORT Json::Value& tokenType();

// Checks the types of those members of jTokenParam that are token fields. Other members, and missing
// fields, are fine. Stops at the first bad member.
// Returns 0, or -1 when a member has a wrong type or jTokenParam is not an object.
VEMO_ATOKEN_EXPORT int checkJsonType(Json::Value& jTokenParam);

// Completes a record, or checks that it is complete. Members that are present are never changed,
// whatever their type.
//   blCheck false: each missing field gets its default, create_time the current time. Returns 0.
//   blCheck true: adds nothing; returns -1 at the first missing field, 0 when all nine are there.
// jToken must be an object or null; anything else throws Json::LogicError.
VEMO_ATOKEN_EXPORT int fillDefaultValue(Json::Value& jToken, bool blCheck);

// Makes a new token id of 127 to 255 characters, digits and ASCII letters, from the kernel's random
// source. Uniqueness is not checked here; the database refuses a duplicate.
// Returns 0 or more and sets strTid. When the random source fails, returns a negative value, leaves
// strTid unchanged and writes no log line.
VEMO_ATOKEN_EXPORT int tokenGenerate(std::string& strTid);

// Sets now to the current time plus offsetSecond (which may be negative), in seconds since the
// epoch. Always returns 0.
VEMO_ATOKEN_EXPORT int getTimeAfterNow(int offsetSecond, long& now);

// Sets strTime to the current time plus offsetSecond as text in UTC, such as
// "Fri, 02 Jan 2026 13:00:00 GMT". The names of days and months follow the process's LC_TIME locale.
// Always returns 0.
VEMO_ATOKEN_EXPORT int getTimeAfterNow(int offsetSecond, std::string& strTime);

// Decides whether the record's webapi_allow lists a web API and its method. Names are compared byte
// by byte. A null or empty szWebapiMethod asks for the API alone.
//   1   allowed
//   0   the API is listed, the method is not
//   -1  the API is not listed, szWebapiName is null or empty, or the record is malformed (outside
//       debug mode only the last two write a log line)
// An element of a method array that cannot be read as a string throws Json::LogicError.
VEMO_ATOKEN_EXPORT int checkPermission(Json::Value& jToken, const char* szWebapiName,
                                       const char* szWebapiMethod);

// The log switches, both off when the library is loaded. true switches on, for the rest of the
// process; false changes nothing. The functions named ...Get only read. All return the current state.
//   logToStdout: lines go to standard output instead of the system log (priority LOG_ERR).
//   debugInfo: lines that trace each step are written as well. They show whole records, token ids
//     included.
// Any thread may call them at any time; other threads may see the change a little later.
VEMO_ATOKEN_EXPORT bool logToStdout(bool blOn);
VEMO_ATOKEN_EXPORT bool logToStdoutGet();
VEMO_ATOKEN_EXPORT bool debugInfo(bool blOn);
VEMO_ATOKEN_EXPORT bool debugInfoGet();

} // namespace VEMO_ACCESS_TOKEN

#endif
