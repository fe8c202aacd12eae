// Functions and variables that the parser sees instead of the macros of the same names, so that it knows the
// place of each argument. They are neither compiled nor run.

#include <json/value.h>
#include <sqlite3.h>
#include <unistd.h>

#include "AccessTokenDefine.h"
#include "AccessTokenUtil.h"
#include "internal/ErrnoKeeper.h"

#define VEMO_ACCESS_TOKEN_LOG_H // keeps the macros themselves out

namespace VEMO_ACCESS_TOKEN {
const char* textOrNull(const char* szText);
}

struct Logging {
    template <typename... Arguments>
    void operator()(Arguments&&...) const;
};
extern const Logging VEMO_ATOKEN_LOG, VEMO_ATOKEN_DEBUG, VEMO_ATOKEN_FAIL, VEMO_ATOKEN_FAILED,
    VEMO_ATOKEN_WRITE_LINE;
void VEMO_ATOKEN_CHECK_RETURN(bool blCondition, int nResult);
void VEMO_ATOKEN_CHECK_RETURN_AS(bool blCondition, const char* szCondition, int nResult);
void VEMO_ATOKEN_CHECK_GOTO(bool blCondition, int nLabel);
void VEMO_ATOKEN_CHECK_GOTO_AS(bool blCondition, const char* szCondition, int nLabel);

extern int VEMO_ATOKEN_HERE, VEMO_ATOKEN_HERE_IN_LIST;
extern int Error, Failed, Refused; // the labels, as arguments

#undef UID_ERR
#undef VEMO_ATOKEN_LENGTH_MIN
#undef SQLITE_OK
#undef F_OK
const unsigned int UID_ERR = 4294967295U;
const int VEMO_ATOKEN_LENGTH_MIN = 127, SQLITE_OK = 0, F_OK = 0;

// The parameters of the field list's macro, and its field.
extern const char* type;
extern int value;
enum { FIELD___name };
