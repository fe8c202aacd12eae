#include "Tokens.h"

#include <json/value.h>
#include <sqlite3.h>

#include <cstdlib>
#include <new>

#include "AccessTokenUtil.h"
#include "internal/JsonText.h"

namespace {

#define WHERE_TID " WHERE tid = ?1"
#define EXPIRED "deadline < strftime('%s', 'now')"

// The columns of find(), in the order of the field list.
enum Column {
    TID,
    BIND_SID,
    UID,
    DEADLINE,
    COUNT,
    CREATE_TIME,
    FUNCTION,
    WEBAPI_ALLOW,
    EXTRA,
    COLUMNS,
    HAS_EXPIRED = COLUMNS
};

const char* const FIELDS[COLUMNS] = {
#define VEMO_ATOKEN_DATA_MEMBER(name, type, column, value) #name,
#include "internal/vemo-access-token-data-member"
#undef VEMO_ATOKEN_DATA_MEMBER
};

std::string findSql()
{
    std::string strSql = "SELECT ";
    for (const char* szField : FIELDS) {
        strSql.append(szField).append(", ");
    }
    // After the year 9999 SQLite has no date to compare with, and nothing expires.
    return strSql + "ifnull(" EXPIRED ", 0) FROM token" WHERE_TID;
}

// As the library's checkPermission(), and also -1 if it throws: the list of methods holds an array or object.
int permission(Json::Value& jAllow, const std::string& strApi, const std::string& strMethod)
{
    try {
        return VEMO_ACCESS_TOKEN::checkPermission(jAllow, strApi.c_str(), strMethod.c_str());
    } catch (const Json::LogicError&) {
        return -1;
    }
}

} // namespace

namespace grant {

const char* const SQL_EXPIRED = EXPIRED;
const char* const SQL_PURGE = "DELETE FROM token WHERE " EXPIRED;

Statement::Statement(sqlite3* pDb, const char* szSql) : m_pDb(pDb)
{
    if (SQLITE_OK != sqlite3_prepare_v3(pDb, szSql, -1, SQLITE_PREPARE_PERSISTENT, &m_pStatement, nullptr)) {
        fail();
    }
}

Statement::~Statement()
{
    sqlite3_finalize(m_pStatement);
}

void Statement::fail()
{
    const int nCode = sqlite3_extended_errcode(m_pDb);
    if (SQLITE_NOMEM == nCode) {
        throw std::bad_alloc();
    }
    throw Error(nCode, sqlite3_errmsg(m_pDb));
}

Statement& Statement::bind(int nParameter, const std::string& strText)
{
    if (SQLITE_OK != sqlite3_bind_text(m_pStatement, nParameter, strText.c_str(), -1, SQLITE_STATIC)) {
        fail();
    }
    return *this;
}

Statement& Statement::bind(int nParameter, int64_t nNumber)
{
    if (SQLITE_OK != sqlite3_bind_int64(m_pStatement, nParameter, nNumber)) {
        fail();
    }
    return *this;
}

bool Statement::step()
{
    if (SQLITE_ROW == sqlite3_step(m_pStatement)) {
        return true;
    }
    if (SQLITE_OK != sqlite3_reset(m_pStatement)) { // reset returns the error of the step again
        fail();
    }
    return false;
}

void Statement::reset()
{
    sqlite3_reset(m_pStatement);
}

const char* Statement::text(int nColumn) const
{
    if (SQLITE_NULL == sqlite3_column_type(m_pStatement, nColumn)) {
        return nullptr; // must come first: if memory runs out, sqlite3_column_text() makes a column NULL
    }
    const auto szText = reinterpret_cast<const char*>(sqlite3_column_text(m_pStatement, nColumn));
    if (!szText) {
        throw std::bad_alloc();
    }
    return szText;
}

int64_t Statement::number(int nColumn) const
{
    return strtoll(text(nColumn), nullptr, 10);
}

std::string Token::recordWithoutTid() const
{
    Json::Value jRecord;
    jRecord[FIELDS[BIND_SID]] = strSession;
    jRecord[FIELDS[UID]] = Json::Int64(nUid);
    jRecord[FIELDS[DEADLINE]] = Json::Int64(nDeadline);
    jRecord[FIELDS[COUNT]] = Json::Int64(nCount);
    jRecord[FIELDS[CREATE_TIME]] = Json::Int64(nCreateTime);
    jRecord[FIELDS[FUNCTION]] = strFunction;
    jRecord[FIELDS[WEBAPI_ALLOW]] = jAllow[FIELDS[WEBAPI_ALLOW]];
    jRecord[FIELDS[EXTRA]] = jExtra;
    return VEMO_ACCESS_TOKEN::toString(jRecord);
}

Verdict judge(Token& token, const std::string& strApi, const std::string& strMethod)
{
    if (!token.blReadable) {
        return Verdict::Malformed;
    }
    if (token.blExpired) {
        return Verdict::Expired;
    }
    const int nPermission = permission(token.jAllow, strApi, strMethod);
    if (0 > nPermission) {
        const Json::Value& jAllow = token.jAllow[FIELDS[WEBAPI_ALLOW]];
        return jAllow.isObject() && !jAllow.isMember(strApi) ? Verdict::ApiNotListed : Verdict::Malformed;
    }
    if (0 == nPermission) {
        return Verdict::MethodNotListed;
    }
    // A token that is written with fewer uses must be valid in all its fields.
    return Left::Less == left(token.nCount) && !token.jExtra.isObject() ? Verdict::Malformed
                                                                        : Verdict::Granted;
}

Left left(int64_t nCount)
{
    if (0 > nCount) {
        return Left::All;
    }
    return 1 < nCount ? Left::Less : Left::Nothing;
}

Tokens::Tokens(sqlite3* pDb)
    : m_find(pDb, findSql().c_str()),
      m_setCount(pDb, "UPDATE token SET count = ?2" WHERE_TID),
      m_remove(pDb, "DELETE FROM token" WHERE_TID)
{
}

std::optional<Token> Tokens::find(const std::string& strTid)
{
    m_find.reset(); // lack of memory may have ended the last look-up at a row
    std::optional<Token> token;
    // Reads all rows, as the library does: any row that cannot be read makes the look-up fail.
    for (m_find.bind(1, strTid); m_find.step();) {
        if (!token) {
            token.emplace();
        }
        for (int nColumn = 0; nColumn < COLUMNS; ++nColumn) {
            token->blReadable = token->blReadable && m_find.text(nColumn);
        }
        if (!token->blReadable || !token->strTid.empty()) {
            continue;
        }
        token->strTid = m_find.text(TID);
        token->strSession = m_find.text(BIND_SID);
        token->nUid = m_find.number(UID);
        token->nDeadline = m_find.number(DEADLINE);
        token->nCount = m_find.number(COUNT);
        token->nCreateTime = m_find.number(CREATE_TIME);
        token->strFunction = m_find.text(FUNCTION);
        VEMO_ACCESS_TOKEN::fromString(m_find.text(WEBAPI_ALLOW), token->jAllow[FIELDS[WEBAPI_ALLOW]]);
        VEMO_ACCESS_TOKEN::fromString(m_find.text(EXTRA), token->jExtra);
        token->blExpired = 0 != m_find.number(HAS_EXPIRED);
    }
    return token;
}

void Tokens::setCount(const std::string& strTid, int64_t nCount)
{
    m_setCount.bind(1, strTid).bind(2, nCount).step();
}

void Tokens::spend(const Token& token)
{
    const Left nLeft = left(token.nCount);
    if (Left::Nothing == nLeft) {
        remove(token.strTid);
    } else if (Left::Less == nLeft) {
        setCount(token.strTid, token.nCount - 1);
    }
}

void Tokens::remove(const std::string& strTid)
{
    m_remove.bind(1, strTid).step();
}

} // namespace grant
