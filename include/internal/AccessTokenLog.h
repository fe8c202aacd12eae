// The log lines and the failure checks: a small language of eight macros.
//
//   VEMO_ATOKEN_LOG(message, location, ...)        an ordinary line, always
//   VEMO_ATOKEN_DEBUG(message, location, ...)      an ordinary line in debug mode only
//   VEMO_ATOKEN_FAIL(message, location, ...)       a failure line with a message of its own
//   VEMO_ATOKEN_FAILED(szCondition, location)      the failure line of a condition that held
//   VEMO_ATOKEN_CHECK_RETURN(condition, result)    if it holds: failure line, return result
//   VEMO_ATOKEN_CHECK_GOTO(condition, label)       if it holds: failure line, jump to label
//   VEMO_ATOKEN_CHECK_RETURN_AS, ..._GOTO_AS       the same; the second argument is the text of the
//                                                  condition in the log, where it differs from the code
//
// message is a literal without the newline at its end; location is VEMO_ATOKEN_HERE or, in code
// expanded from the field list, VEMO_ATOKEN_HERE_IN_LIST. Conditions are evaluated once, in every
// build, and are logged exactly as they are written, blanks included. Arguments are evaluated only
// when the line is written.
//
// A failure line shows errno as the failed call left it. So writing a line preserves errno, and so must
// the arguments of a line, and all code between a failure and its line.

#ifndef VEMO_ACCESS_TOKEN_LOG_H
#define VEMO_ACCESS_TOKEN_LOG_H

#include <syslog.h>

#include <cerrno>

#include "AccessTokenUtil.h"
#include "internal/ErrnoKeeper.h"

namespace VEMO_ACCESS_TOKEN {

// printf and syslog by their plain names. The system headers of a hardened build would call __printf_chk
// and __syslog_chk instead, and a caller who interposes the plain names would miss the lines.
extern "C" int logPrintf(const char* szFormat, ...) __asm__("printf") __attribute__((cold));
extern "C" void logSyslog(int nPriority, const char* szFormat, ...) __asm__("syslog") __attribute__((cold));

// Never defined: it only lets the compiler check a message against its arguments. (logPrintf cannot have
// the attribute, because ISO C++ has no "%m".)
int checkFormat(const char* szFormat, ...) __attribute__((format(printf, 1, 2)));

// The format of a line in the system log. When errno is set, it comes before the message.
inline const char* syslogFormat(const char* szWithErrno, const char* szWithoutErrno)
{
    return 0 != errno ? szWithErrno : szWithoutErrno;
}

// Writes the line of VEMO_ATOKEN_FAILED.
void logFailed(const char* szCondition, const char* szFile, int nLine) __attribute__((cold));

// A text for a log line, or "(null)" when there is none.
inline const char* textOrNull(const char* szText)
{
    return szText ? szText : "(null)";
}

} // namespace VEMO_ACCESS_TOKEN

#define VEMO_ATOKEN_HERE __FILE_NAME__, __LINE__
#define VEMO_ATOKEN_HERE_IN_LIST __FILE__, __LINE__

// Standard output never shows errno before the message.
#define VEMO_ATOKEN_WRITE_LINE(message, ...)                                                                 \
    do {                                                                                                     \
        const VEMO_ACCESS_TOKEN::ErrnoKeeper keeperOfLine;                                                   \
        if (VEMO_ACCESS_TOKEN::logToStdoutGet()) {                                                           \
            VEMO_ACCESS_TOKEN::logPrintf("%s:%d " message "\n", __VA_ARGS__);                                \
        } else {                                                                                             \
            VEMO_ACCESS_TOKEN::logSyslog(                                                                    \
                LOG_ERR, VEMO_ACCESS_TOKEN::syslogFormat("%s:%d (%m)" message "\n", "%s:%d " message "\n"),  \
                __VA_ARGS__);                                                                                \
        }                                                                                                    \
    } while (0)

#define VEMO_ATOKEN_CHECK_FORMAT(message, ...)                                                               \
    static_cast<void>(sizeof VEMO_ACCESS_TOKEN::checkFormat("%s:%d " message, __VA_ARGS__))

#define VEMO_ATOKEN_LOG(message, ...)                                                                        \
    do {                                                                                                     \
        VEMO_ATOKEN_CHECK_FORMAT(message, __VA_ARGS__);                                                      \
        VEMO_ATOKEN_WRITE_LINE(message, __VA_ARGS__);                                                        \
    } while (0)

#define VEMO_ATOKEN_DEBUG(message, ...)                                                                      \
    do {                                                                                                     \
        if (VEMO_ACCESS_TOKEN::debugInfoGet()) {                                                             \
            VEMO_ATOKEN_LOG(message, __VA_ARGS__);                                                           \
        }                                                                                                    \
    } while (0)

// A failure line shows the location twice and ends in two newlines.
#define VEMO_ATOKEN_FAIL(message, ...)                                                                       \
    do {                                                                                                     \
        VEMO_ATOKEN_CHECK_FORMAT(message, __VA_ARGS__);                                                      \
        VEMO_ATOKEN_WRITE_LINE("(%s:%d)(%m)" message "\n", VEMO_ATOKEN_HERE, __VA_ARGS__);                   \
    } while (0)

#define VEMO_ATOKEN_FAILED(szCondition, ...) VEMO_ACCESS_TOKEN::logFailed(szCondition, __VA_ARGS__)

// These turn the condition into text themselves: passed to another macro first, it would have its own
// macros (UID_ERR, SQLITE_OK) expanded.
#define VEMO_ATOKEN_CHECK_RETURN(condition, result) VEMO_ATOKEN_CHECK_RETURN_AS(condition, #condition, result)
#define VEMO_ATOKEN_CHECK_GOTO(condition, label) VEMO_ATOKEN_CHECK_GOTO_AS(condition, #condition, label)

#define VEMO_ATOKEN_CHECK_RETURN_AS(condition, szCondition, result)                                          \
    do {                                                                                                     \
        if (condition) {                                                                                     \
            VEMO_ATOKEN_FAILED(szCondition, VEMO_ATOKEN_HERE);                                               \
            return result;                                                                                   \
        }                                                                                                    \
    } while (0)

#define VEMO_ATOKEN_CHECK_GOTO_AS(condition, szCondition, label)                                             \
    do {                                                                                                     \
        if (condition) {                                                                                     \
            VEMO_ATOKEN_FAILED(szCondition, VEMO_ATOKEN_HERE);                                               \
            goto label;                                                                                      \
        }                                                                                                    \
    } while (0)

#endif
