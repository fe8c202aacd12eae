// The token store: one SQLite connection and the statements that run on it. Most callers use the
// service (AccessTokenApi.h); this class is for what the service does not offer.
//
// Results: 0 or more is success; -1 is a failure, which has written its log lines. Members with other
// results say so. vemo-access-token(7) describes filters. Arguments named ...Out are results; all
// others are only read.
//
// A statement that succeeds after waiting for a lock leaves "database is locked" in m_strErr. The
// operations on tokens then report -1 although the statement took effect. Callers depend on it.
//
// AccessTokenApi.h describes exceptions, threads and processes.

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

    AccessTokenDbApi(const AccessTokenDbApi&) = delete;
    AccessTokenDbApi& operator=(const AccessTokenDbApi&) = delete;

    // Connection and statements

    // Opens the database file with effective uid 0, and then restores the effective uid. Creates the
    // file, with mode 0700, and the table when there is no file. Does nothing when open.
    // Returns -1 when the uid cannot be set, or the file cannot be created or opened. A table that
    // cannot be created is logged, and the result is 0. After a failed opening by SQLite the effective
    // uid stays 0, and the object counts as open: its statements then fail.
    int initDb();

    // Sets strSql to the statement that creates the table. Returns 0.
    int SqlExpandCreateTable(std::string& strSql);

    // Creates the table in a database that lacks it. Returns 0 or -1.
    int createTable();

    // Runs a statement on the open connection. While others lock the database it tries again
    // (vemo-access-token(7), LOCKS). callback is that of sqlite3_exec, called with arg for each row; it
    // must not throw.
    // Returns 0 with a callback, the number of changed rows without; or -1, with the reason in
    // m_strErr.
    int runSqlEx(std::string strSql, int (*callback)(void*, int, char**, char**), void* arg);

    // Opens the database if it is closed, empties m_strErr and runs m_strSql as runSqlEx does.
    int runSql(int (*callback)(void*, int, char**, char**), void* arg);
    int runSql();

    // Closes the connection. If SQLite refuses, the connection stays open. Returns 0 always.
    int freeDb();

    // Does what AccessTokenApi::cleanExpireToken does.
    int cleanExpireToken(bool blLog);

    // Saving

    // Writes a record that has all nine fields: blCreate true inserts it and fails when the tid
    // exists, false replaces the row of that tid or inserts it. The caller has checked the types.
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
    // Values of text and JSON fields are quoted and escaped. Values of number fields are not quoted,
    // whatever their type, so a string becomes part of the statement.

    // Appends the condition made of the filter's token fields, joined by "and" or "or". Returns 0; 1
    // when the filter names no token field (nothing is appended); or -1.
    int SqlWhereFromJson(Json::Value& jTokenParam, std::string& strSqlWhereOut, bool bAnd);

    // Append one field's condition: equal to jParam, or one of the array jList (nothing for an empty
    // one). Return 0, or -1, also when no token field has that name.
    int SqlMakeByMatchField(std::string& strField, Json::Value& jParam, std::string& strSqlWhereOut);
    int SqlMakeByListField(const char* szField, Json::Value& jList, std::string& strSqlWhereOut);

    // Appends the filter's sort_by, sort_direction, limit and offset. Returns 0 or -1.
    int SqlFilterConditionFromJson(Json::Value& jFilter, std::string& strSqlWhereOut);

    // Reading and deleting

    // Appends the records that the filter selects to jTokenArrayOut, an array or null. Returns 0; or -1,
    // and then jTokenArrayOut may hold some of the records and must not be used.
    int tokenGet(Json::Value& jTokenParam, Json::Value& jTokenArrayOut);

    // Looks for a record whose field szName equals strValue. Returns 1 and sets jTokenOut to the first
    // one; 0 and sets jTokenOut to an empty object when there is none; or -1. An empty name or value is a
    // failure that leaves jTokenOut unchanged. A szName that is not a token field selects every token.
    int tokenGetOne(const char* szName, std::string& strValue, Json::Value& jTokenOut);

    // Deletes the tokens that the filter's fields select; sort_by, limit and so on have no effect. A
    // filter without fields deletes all tokens when bAll is true, and fails when it is false.
    // Returns the number of tokens deleted, or -1.
    int tokenDelete(Json::Value& jTokenParam, bool bAll);

    // State
    //
    // Callers only read it, except that they set m_strSql before runSql.

    sqlite3* m_pDb;       // the connection; null when closed
    std::string m_strSql; // the statement that runSql runs, or ran last
    std::string m_strErr; // why a statement failed or had to wait; only runSql empties it, before it runs one
};

#endif
