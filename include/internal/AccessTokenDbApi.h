// The token store: one SQLite connection and the statements that are run over it. The service
// (AccessTokenApi.h) is the ordinary way in; this class is for what the service lacks.
//
// Results: 0 or more is success and -1 a failure that has written its log lines, unless a member
// says otherwise. Filters are described in README. The arguments named ...Out are results; all
// others are only read.
//
// A statement that succeeds after waiting for a lock leaves "database is locked" in m_strErr. The
// operations on tokens then report -1 although the statement took effect; that is how this store
// has always answered, and callers rely on it.
//
// Exceptions: Json::LogicError for a filter or record member of a type that its use cannot convert,
// std::bad_alloc.
//
// Threads and processes: an object serves one thread at a time. initDb changes the effective uid of
// the whole process for a moment. Processes share the database file through SQLite's file locks.

#ifndef VEMO_ACCESS_TOKEN_DB_API_H
#define VEMO_ACCESS_TOKEN_DB_API_H

#include <json/value.h>

#include <string>

#include "AccessTokenDefine.h"

struct sqlite3;

class VEMO_ATOKEN_EXPORT AccessTokenDbApi {
public:
    // Opens nothing yet.
    AccessTokenDbApi();

    // Closes the connection (freeDb).
    ~AccessTokenDbApi();

    // The connection has one owner.
    AccessTokenDbApi(const AccessTokenDbApi&) = delete;
    AccessTokenDbApi& operator=(const AccessTokenDbApi&) = delete;

    // Connection and statements

    // Opens the database file with effective uid 0 and puts the effective uid back; creates the file
    // with mode 0700 and the table when there is no file. Does nothing when open.
    // Returns -1 when effective uid 0, the file, its mode or the opening fails. A table that could
    // not be created is logged and returns 0. After a failed opening by SQLite the effective uid
    // stays 0, and the object counts as open: its statements then fail.
    int initDb();

    // Sets strSql to the statement that creates the table. Returns 0.
    int SqlExpandCreateTable(std::string& strSql);

    // Creates the table if it is missing, for a file that was made without it. Returns 0 or -1.
    int createTable();

    // Runs a statement on the open connection. While the database is locked by others it tries
    // again, 500 times with 10 ms between. callback is sqlite3_exec's, called for each row with arg;
    // it must not throw.
    // Returns 0 with a callback, the number of changed rows without; or -1 with the reason in
    // m_strErr.
    int runSqlEx(std::string strSql, int (*callback)(void*, int, char**, char**), void* arg);

    // Opens the database if need be, empties m_strErr and runs m_strSql as runSqlEx does.
    int runSql(int (*callback)(void*, int, char**, char**), void* arg);
    int runSql();

    // Closes the connection. Returns 0 always; if SQLite refuses, the connection stays open.
    int freeDb();

    // Deletes the tokens whose deadline lies before now; a deadline of -1 does. blLog false leaves
    // this operation's own failure line to debug mode. Returns 0, not a number, or -1.
    int cleanExpireToken(bool blLog);

    // Saving

    // Writes a record that has all nine fields: blCreate true inserts it and fails when the tid
    // exists, false replaces the row of that tid or inserts it. Types are the caller's business.
    // Returns 0 or -1.
    int tokenSave(Json::Value& jParam, bool blCreate);
    int tokenCreate(Json::Value& jParam); // the same as tokenSave(jParam, true)
    int tokenUpdate(Json::Value& jParam); // the same as tokenSave(jParam, false)

    // Append the column names, or their formatting directives and ")", to strSql. Return 0.
    int SqlExpandMemberName(std::string& strSql);
    int SqlExpandMemberSymbol(std::string& strSql);

    // Filters as SQL
    //
    // All append to strSqlWhereOut; what they appended before a failure stays.
    // Values of text and JSON fields are quoted and escaped. Those of number fields are not quoted,
    // whatever their type: a string there becomes part of the statement.

    // The condition made of the filter's token fields, joined by "and" or "or". Returns 0, 1 when
    // the filter names no token field (nothing is appended), or -1.
    int SqlWhereFromJson(Json::Value& jTokenParam, std::string& strSqlWhereOut, bool bAnd);

    // One field's condition: equality with the value jParam, or membership of the array jList, where an
    // empty one appends nothing. Return 0, or -1, also when the name is that of no token field.
    int SqlMakeByMatchField(std::string& strField, Json::Value& jParam, std::string& strSqlWhereOut);
    int SqlMakeByListField(const char* szField, Json::Value& jList, std::string& strSqlWhereOut);

    // The filter's sort_by, sort_direction, limit and offset. Returns 0 or -1.
    int SqlFilterConditionFromJson(Json::Value& jFilter, std::string& strSqlWhereOut);

    // Reading and deleting

    // Appends the records that the filter selects to jTokenArrayOut, an array or null. Returns 0;
    // or -1, when jTokenArrayOut may hold some of them and must not be used.
    int tokenGet(Json::Value& jTokenParam, Json::Value& jTokenArrayOut);

    // Sets jTokenOut to the first record whose field szName equals strValue and returns 1, or to an
    // empty object and returns 0 when there is none, -1 when the query fails. Without a name or a
    // value it returns -1 and leaves jTokenOut. A szName that is no token field selects every token.
    int tokenGetOne(const char* szName, std::string& strValue, Json::Value& jTokenOut);

    // Deletes what the filter's fields select; sort_by, limit and so on have no effect. A filter
    // without fields deletes all when bAll is true and is refused when it is false.
    // Returns the number of tokens deleted, or -1.
    int tokenDelete(Json::Value& jTokenParam, bool bAll);

    // State
    //
    // For callers to read, but for m_strSql, which is set ahead of runSql.

    sqlite3* m_pDb;       // the connection; null when closed
    std::string m_strSql; // the statement that runSql runs, or ran last
    std::string m_strErr; // why the last statement failed or had to wait; "" when neither
};

#endif
