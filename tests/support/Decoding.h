// The function that turns rows of the database into records, and what it logs.

#ifndef TESTS_DECODING_H
#define TESTS_DECODING_H

#include <cerrno>

#include "AccessTokenUtil.h"
#include "StoreTest.h"
#include "internal/AccessTokenDbApi.h"

const char* const FIELD_FAILED = "0 > (iTmp = FillField(*pjToken, column_name, column_value, i))";
const char* const TOKEN_FAILED = "0 > FillToken(&jTmp, n_column, column_value, column_name)";
const char* const NULL_COLUMN = "NULL == column_name[i] || NULL == column_value[i]";
const char* const NO_FIELD = "!jTokenType.isMember(strName)";
const char* const WRONG_ARRAY = "pjTokenArray->type() != Json::arrayValue && "
                                "pjTokenArray->type() != Json::nullValue";

// What is logged when a row, and when a column of it, is refused.
inline Texts rowLines(const std::string& strLine, int nErrno = 0)
{
    return {strLine, failed(STORE, TOKEN_FAILED, nErrno)};
}

inline Texts columnLines(const std::string& strLine, int nErrno = 0)
{
    return {strLine, failed(STORE, FIELD_FAILED, nErrno), failed(STORE, TOKEN_FAILED, nErrno)};
}

// The decoder, as the library hands it to SQLite.
inline SqlCallback captureDecoder()
{
    SqlCallback pDecoder = nullptr;
    seam().sqliteExec = [&](sqlite3*, const char*, SqlCallback pCallback, void*, char**) {
        pDecoder = pCallback;
        return SQLITE_OK;
    };
    AccessTokenDbApi db;
    EXPECT_EQ(SQLITE_OK, sqlite3_open(":memory:", &db.m_pDb));
    Json::Value jFilter(Json::objectValue);
    Json::Value jArray;
    EXPECT_EQ(0, db.tokenGet(jFilter, jArray));
    seam() = Seam();
    errno = 0;
    return pDecoder;
}

// A field of a type that no field has today, added while the process runs.
inline void addField(const char* szName, const Json::Value& jEntry)
{
    VEMO_ACCESS_TOKEN::tokenType()[szName] = jEntry;
}

// What the JSON library says when the type name of such an entry is read.
inline std::string errorOf(const Json::Value& jEntry)
{
    try {
        return "no error: " + jEntry[0U].asString();
    } catch (const Json::LogicError& error) {
        return error.what();
    }
}

#endif
