#include "Turns.h"

#include <sqlite3.h>

#include "Interpose.h"

namespace {

typedef int RowCallback(void*, int, char**, char**);

struct RowReceiver {
    RowCallback* callback;
    void* pArgument;
};

int receiveRow(void* pReceiver, int nColumns, char** rgszValue, char** rgszName)
{
    const Turn turn(LIBRARY);
    const RowReceiver& receiver = *static_cast<RowReceiver*>(pReceiver);
    return receiver.callback(receiver.pArgument, nColumns, rgszValue, rgszName);
}

} // namespace

extern "C" {

INTERPOSED int sqlite3_open(const char* szPath, sqlite3** ppDb)
{
    const Turn turn(turnOf("open"));
    return NEXT(sqlite3_open)(szPath, ppDb);
}

INTERPOSED int sqlite3_close(sqlite3* pDb)
{
    const Turn turn(turnOf("close"));
    return NEXT(sqlite3_close)(pDb);
}

INTERPOSED int sqlite3_exec(sqlite3* pDb, const char* szSql, RowCallback* callback, void* pArgument,
                            char** pszError)
{
    if (LIBRARY != g_nTurn) { // SQLite reads the schema in the middle of a statement
        return NEXT(sqlite3_exec)(pDb, szSql, callback, pArgument, pszError);
    }
    RowReceiver receiver = {callback, pArgument};
    const Turn turn(turnOf(szSql));
    return NEXT(sqlite3_exec)(pDb, szSql, callback ? receiveRow : nullptr, &receiver, pszError);
}

} // extern "C"
