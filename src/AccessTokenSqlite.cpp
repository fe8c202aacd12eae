#include <sqlite3.h>
#include <sys/stat.h>
#include <sys/types.h>
#include <unistd.h>

#include <cstdlib>
#include <cstring>
#include <exception>
#include <string_view>

#include "AccessTokenUtil.h"
#include "internal/AccessTokenDbApi.h"
#include "internal/AccessTokenLog.h"
#include "internal/EffectiveUidKeeper.h"
#include "internal/Fields.h"
#include "internal/JsonAccess.h"
#include "internal/JsonText.h"
#include "internal/SqlText.h"
#include "plibc.h"

using namespace VEMO_ACCESS_TOKEN;

namespace {

const int LOCK_TRIES = 500;
const useconds_t LOCK_WAIT_USEC = 10000;

void waitForLock()
{
    const ErrnoKeeper keeper;
    usleep(LOCK_WAIT_USEC);
}

int FillField(Json::Value& jToken, char** column_name, char** column_value, int idx, const Column& column)
{
    VEMO_ATOKEN_CHECK_RETURN(jToken.type() != Json::objectValue && jToken.type() != Json::nullValue, -1);
    VEMO_ATOKEN_CHECK_RETURN(0 > idx, -1);
    const char* szName = column_name[idx];
    const Json::Value* pType = column.pEntry ? &(*column.pEntry)[0U] : fieldType(szName);
    VEMO_ATOKEN_CHECK_RETURN_AS(!pType, "!jTokenType.isMember(strName)", -1);

    const char* szValue = column_value[idx];
    const std::string_view strType = textOf(*pType);
    Json::Value& jMember = column.pMember ? *column.pMember : jToken[szName];
    if (strType == "string") {
        jMember = szValue;
    } else if (strType == "int") {
        jMember = static_cast<Json::Int>(strtol(szValue, nullptr, 10));
    } else if (strType == "long long") {
        jMember = static_cast<Json::Int64>(strtoll(szValue, nullptr, 10));
    } else if (Rendering::Json == renderingOf(strType)) {
        fromString(szValue, jMember);
    } else {
        VEMO_ATOKEN_FAIL("type error, strType=%s", VEMO_ATOKEN_HERE, pType->asString().c_str());
        return -1;
    }
    return 0;
}

int FillToken(Json::Value* pjToken, int n_column, char** column_value, char** column_name)
{
    int iTmp = 0;

    VEMO_ATOKEN_CHECK_RETURN(NULL == column_name || NULL == column_value, -1);
    const auto rgColumn = addFields(*pjToken, n_column, column_name);
    for (int i = 0; i < n_column; ++i) {
        VEMO_ATOKEN_CHECK_RETURN(NULL == column_name[i] || NULL == column_value[i], -1);
        const Column column = i < FIELDS ? rgColumn[static_cast<size_t>(i)] : Column();
        VEMO_ATOKEN_CHECK_RETURN_AS(0 > (iTmp = FillField(*pjToken, column_name, column_value, i, column)),
                                    "0 > (iTmp = FillField(*pjToken, column_name, column_value, i))", -1);
    }
    return 0;
}

int appendRow(Json::Value* pjTokenArray, int n_column, char** column_value, char** column_name)
{
    Json::Value jTmp(Json::objectValue);

    VEMO_ATOKEN_CHECK_RETURN(!pjTokenArray, -1);
    VEMO_ATOKEN_CHECK_RETURN(
        pjTokenArray->type() != Json::arrayValue && pjTokenArray->type() != Json::nullValue, -1);
    VEMO_ATOKEN_CHECK_RETURN(0 > FillToken(&jTmp, n_column, column_value, column_name), -1);
    pjTokenArray->append(std::move(jTmp));
    return 0;
}

// The callback of sqlite3_exec. Exceptions must not pass through that C function.
int FillList(void* pjTokenArray, int n_column, char** column_value, char** column_name)
{
    try {
        return appendRow(static_cast<Json::Value*>(pjTokenArray), n_column, column_value, column_name);
    } catch (const std::exception& exception) {
        VEMO_ATOKEN_FAIL("decode row failed, error=%s", VEMO_ATOKEN_HERE, exception.what());
        return -1;
    }
}

} // namespace

AccessTokenDbApi::AccessTokenDbApi() : m_pDb(nullptr) {}

AccessTokenDbApi::~AccessTokenDbApi()
{
    freeDb();
}

int AccessTokenDbApi::initDb()
{
    bool blNew = false;
    std::string strSql;

    if (m_pDb) {
        return 0;
    }

    EffectiveUidKeeper uidKeeper;
    VEMO_ATOKEN_CHECK_RETURN(0 > seteuid(0), -1);
    if (0 != access(VEMO_ATOKEN_DB_PATH, F_OK)) {
        VEMO_ATOKEN_CHECK_RETURN(0 > PLIBCFileTouch(VEMO_ATOKEN_DB_PATH), -1);
        VEMO_ATOKEN_CHECK_RETURN(-1 == chmod(VEMO_ATOKEN_DB_PATH, 0700), -1);
        blNew = true;
    }

    const int nOpen = sqlite3_open(VEMO_ATOKEN_DB_PATH, &m_pDb);
    if (SQLITE_OK != nOpen) {
        VEMO_ATOKEN_FAIL("open sqlite failed, path=%s, errno=%d", VEMO_ATOKEN_HERE, VEMO_ATOKEN_DB_PATH,
                         nOpen);
        // Of these failures, only this one leaves the process at effective uid 0. Callers depend on it.
        uidKeeper.forget();
        return -1;
    }

    // From here on the result is success: a missing handle or table is logged, and later statements fail.
    VEMO_ATOKEN_CHECK_RETURN(!m_pDb, 0);
    if (blNew) {
        VEMO_ATOKEN_CHECK_RETURN(0 > SqlExpandCreateTable(strSql), 0);
        if (0 > runSqlEx(strSql, nullptr, nullptr)) {
            VEMO_ATOKEN_FAIL("create table failed, sql=%s", VEMO_ATOKEN_HERE, strSql.c_str());
        }
    }
    return 0;
}

int AccessTokenDbApi::SqlExpandCreateTable(std::string& strSql)
{
    const char* szColumns =
#define VEMO_ATOKEN_DATA_MEMBER(name, type, column, value) "," column
#include "internal/vemo-access-token-data-member"
#undef VEMO_ATOKEN_DATA_MEMBER
        ;
    strSql = "PRAGMA auto_vacuum = FULL; CREATE TABLE if not exists token (";
    strSql.append(&szColumns[1]).append(");"); // without the first comma
    return 0;
}

int AccessTokenDbApi::createTable()
{
    std::string strSql;

    VEMO_ATOKEN_CHECK_RETURN(0 > AccessTokenDbApi::SqlExpandCreateTable(strSql), -1);
    m_strSql = strSql;
    VEMO_ATOKEN_CHECK_RETURN(0 > runSql(), -1);
    return 0;
}

// NOLINTNEXTLINE(performance-unnecessary-value-param): callers are compiled against it
int AccessTokenDbApi::runSqlEx(std::string strSql, int (*callback)(void*, int, char**, char**), void* arg)
{
    SqliteText szErr;
    int i = 0;

    VEMO_ATOKEN_CHECK_GOTO(0 >= strSql.length(), Failed);
    for (;;) {
        VEMO_ATOKEN_DEBUG("run sql=%s", VEMO_ATOKEN_HERE, strSql.c_str());
        char* szMessage = nullptr;
        const int nResult = sqlite3_exec(m_pDb, strSql.c_str(), callback, arg, &szMessage);
        szErr.reset(szMessage);
        if (SQLITE_OK == nResult) {
            break;
        }
        // Only this text means a lock that is worth waiting for, whatever the result code.
        if (!szErr || !strstr(szErr.get(), "database is locked")) {
            VEMO_ATOKEN_LOG("i=%d,run sql failed, error=%s, sql=%s", VEMO_ATOKEN_HERE, i,
                            textOrNull(szErr.get()), strSql.c_str());
            goto Failed;
        }
        VEMO_ATOKEN_DEBUG("i=%d,run sql failed, error=%s, sql=%s", VEMO_ATOKEN_HERE, i, szErr.get(),
                          strSql.c_str());
        waitForLock();
        if (LOCK_TRIES == ++i) {
            VEMO_ATOKEN_LOG("i=%d,run sql failed, error=%s, sql=%s", VEMO_ATOKEN_HERE, i, szErr.get(),
                            strSql.c_str());
            goto Failed;
        }
        m_strErr = szErr.get();
    }

    // m_strErr is not cleared: after a wait for a lock it still names the lock, and the operations on
    // tokens report failure although the statement took effect. Callers depend on it.
    if (!callback) {
        const int nChanges = sqlite3_changes(m_pDb);
        VEMO_ATOKEN_DEBUG("change rv=%d, run sql=%s", VEMO_ATOKEN_HERE, nChanges, strSql.c_str());
        return nChanges;
    }
    return 0;

Failed:
    m_strErr = szErr ? szErr.get() : "Unknow Error!!";
    return -1;
}

int AccessTokenDbApi::runSql(int (*callback)(void*, int, char**, char**), void* arg)
{
    if (m_strSql.empty()) {
        VEMO_ATOKEN_FAIL("no correct sql", VEMO_ATOKEN_HERE);
        return -1;
    }
    VEMO_ATOKEN_CHECK_RETURN(0 > initDb(), -1);
    m_strErr.clear();
    const int nResult = runSqlEx(m_strSql, callback, arg);
    if (0 > nResult) {
        VEMO_ATOKEN_FAIL("run sql failed, sql=%s", VEMO_ATOKEN_HERE, m_strSql.c_str());
    }
    return nResult;
}

int AccessTokenDbApi::runSql()
{
    return runSql(nullptr, nullptr);
}

int AccessTokenDbApi::freeDb()
{
    if (!m_pDb) {
        return 0;
    }
    VEMO_ATOKEN_CHECK_RETURN(SQLITE_OK != sqlite3_close(m_pDb), 0);
    m_pDb = nullptr;
    return 0;
}

int AccessTokenDbApi::cleanExpireToken(bool blLog)
{
    const bool blLogFailure = blLog || debugInfoGet();

    // A deadline of -1 is not special: it lies before now, so the token is purged.
    m_strSql = "DELETE FROM token where deadline < strftime('%s', 'now');";
    if (0 > runSql()) {
        if (blLogFailure) {
            VEMO_ATOKEN_FAIL("run sql failed", VEMO_ATOKEN_HERE);
        }
        return -1;
    }
    if (!m_strErr.empty()) {
        if (blLogFailure) {
            VEMO_ATOKEN_FAIL("sql error, sql=%s", VEMO_ATOKEN_HERE, m_strSql.c_str());
        }
        return -1;
    }
    return 0;
}

int AccessTokenDbApi::tokenSave(Json::Value& jParam, bool blCreate)
{
    std::string strSqlPrefix = blCreate ? "INSERT INTO token (" : "REPLACE INTO token (";

    VEMO_ATOKEN_DEBUG("tokenSave, blCreate=%d, jParam=%s", VEMO_ATOKEN_HERE, blCreate,
                      toString(jParam).c_str());
    strSqlPrefix.reserve(256); // all of it, at once
    const auto rgMember = fieldMembers(jParam);
#define VEMO_ATOKEN_DATA_MEMBER(name, type, column, value)                                                   \
    if (!rgMember[FIELD_##name]) {                                                                           \
        VEMO_ATOKEN_FAILED("!jParam.isMember(\"" #name "\")", VEMO_ATOKEN_HERE_IN_LIST);                     \
        return -1;                                                                                           \
    }
#include "internal/vemo-access-token-data-member"
#undef VEMO_ATOKEN_DATA_MEMBER

    VEMO_ATOKEN_CHECK_RETURN(0 > SqlExpandMemberName(strSqlPrefix), -1);
    strSqlPrefix.append(") VALUES (");
    VEMO_ATOKEN_CHECK_RETURN(0 > SqlExpandMemberSymbol(strSqlPrefix), -1);

#define VEMO_ATOKEN_DATA_MEMBER(name, type, column, value)                                                   \
    , SqlArgument<renderingOf(type)>(*rgMember[FIELD_##name]).get()
    const SqliteText szSql(sqlite3_mprintf(strSqlPrefix.c_str()
#include "internal/vemo-access-token-data-member"
                                               ));
#undef VEMO_ATOKEN_DATA_MEMBER
    VEMO_ATOKEN_CHECK_RETURN(!szSql || !szSql[0], -1);

    m_strSql = szSql.get();
    VEMO_ATOKEN_DEBUG("run sql=%s", VEMO_ATOKEN_HERE, m_strSql.c_str());
    VEMO_ATOKEN_CHECK_RETURN(0 > runSql(), -1);
    if (!m_strErr.empty()) {
        VEMO_ATOKEN_FAIL("sql error, sql=%s", VEMO_ATOKEN_HERE, m_strSql.c_str());
        return -1;
    }
    return 0;
}

int AccessTokenDbApi::tokenCreate(Json::Value& jParam)
{
    return tokenSave(jParam, true);
}

int AccessTokenDbApi::tokenUpdate(Json::Value& jParam)
{
    return tokenSave(jParam, false);
}

int AccessTokenDbApi::SqlExpandMemberName(std::string& strSql)
{
    const char* szNames =
#define VEMO_ATOKEN_DATA_MEMBER(name, type, column, value) "," #name
#include "internal/vemo-access-token-data-member"
#undef VEMO_ATOKEN_DATA_MEMBER
        ;
    strSql.append(&szNames[1]); // without the first comma
    return 0;
}

int AccessTokenDbApi::SqlExpandMemberSymbol(std::string& strSql)
{
    const char* rgszDirective[] = {
#define VEMO_ATOKEN_DATA_MEMBER(name, type, column, value) SqlArgument<renderingOf(type)>::DIRECTIVE,
#include "internal/vemo-access-token-data-member"
#undef VEMO_ATOKEN_DATA_MEMBER
    };
    const char* szSeparator = "";
    for (const char* szDirective : rgszDirective) {
        strSql.append(szSeparator).append(szDirective);
        szSeparator = ",";
    }
    strSql.append(")");
    return 0;
}

int AccessTokenDbApi::SqlWhereFromJson(Json::Value& jTokenParam, std::string& strSqlWhereOut, bool bAnd)
{
    const Json::Value& jTokenType = tokenType();
    const char* szJoin = " (";
    bool blEmpty = true;

    VEMO_ATOKEN_CHECK_RETURN(jTokenParam.type() != Json::objectValue, -1);
    Json::Value::Members jmFieldName = jTokenParam.getMemberNames();
    for (size_t i = 0; i < jmFieldName.size(); ++i) {
        // Names that are not fields are skipped: paging keys, and misspelt fields too.
        if (!jTokenType.isMember(jmFieldName[i])) {
            continue;
        }
        strSqlWhereOut.append(szJoin);
        szJoin = bAnd ? " and " : " or ";
        blEmpty = false;

        Json::Value& jTmp = jTokenParam[jmFieldName[i]];
        if (jTmp.isArray()) {
            VEMO_ATOKEN_CHECK_RETURN(0 > SqlMakeByListField(jmFieldName[i].c_str(), jTmp, strSqlWhereOut),
                                     -1);
        } else if (jTmp.isObject()) {
            // The message has a place for the filter as a string. An object is none, so it says "(null)".
            VEMO_ATOKEN_FAIL("err input type, jTokenParam=%s", VEMO_ATOKEN_HERE, textOrNull(nullptr));
            return -1;
        } else {
            VEMO_ATOKEN_CHECK_RETURN(0 > SqlMakeByMatchField(jmFieldName[i], jTmp, strSqlWhereOut), -1);
        }
    }
    if (blEmpty) {
        return 1;
    }
    strSqlWhereOut.append(" )");
    return 0;
}

int AccessTokenDbApi::SqlMakeByMatchField(std::string& strField, Json::Value& jParam,
                                          std::string& strSqlWhereOut)
{
    std::string strCondition = strField + "=";

    const Json::Value* pType = fieldType(strField);
    VEMO_ATOKEN_CHECK_RETURN_AS(!pType, "!jTokenType.isMember(strField)", -1);
    const Rendering rendering = renderingOf(textOf(*pType));
    VEMO_ATOKEN_CHECK_RETURN_AS(!appendValue(rendering, jParam, strCondition),
                                Rendering::Json == rendering
                                    ? "NULL == (szSql = sqlite3_mprintf(\"%q\", jParam.toString().c_str()))"
                                    : "NULL == (szSql = sqlite3_mprintf(\"%q\", jParam.asString().c_str()))",
                                -1);
    strSqlWhereOut.append(strCondition);
    return 0;
}

int AccessTokenDbApi::SqlMakeByListField(const char* szField, Json::Value& jList, std::string& strSqlWhereOut)
{
    const Json::Value& jElements = jList; // its operator[] does not add missing elements
    std::string strList;

    VEMO_ATOKEN_CHECK_RETURN(!szField || !szField[0], -1);
    const Json::Value* pType = fieldType(szField);
    VEMO_ATOKEN_CHECK_RETURN_AS(!pType, "!jTokenType.isMember(szField)", -1);
    const Rendering rendering = renderingOf(textOf(*pType));
    VEMO_ATOKEN_CHECK_RETURN(jList.type() != Json::arrayValue, -1);

    // There is no separator between the elements: 'a''b' is one text, a'b, and 12 one number. So only a
    // list of one element matches as intended. Callers depend on it.
    for (Json::ArrayIndex i = 0; i < jElements.size(); ++i) {
        VEMO_ATOKEN_CHECK_RETURN_AS(
            !appendValue(rendering, jElements[i], strList),
            Rendering::Json == rendering
                ? "NULL == (szSql = sqlite3_mprintf(\"%q\", jList[i].toString().c_str()))"
                : "NULL == (szSql = sqlite3_mprintf(\"%q\", jList[i].asString().c_str()))",
            -1);
    }
    if (!jList.empty()) {
        strSqlWhereOut.append(szField).append(" in (").append(strList).append(" )");
    }
    return 0;
}

int AccessTokenDbApi::SqlFilterConditionFromJson(Json::Value& jFilter, std::string& strSqlWhereOut)
{
    VEMO_ATOKEN_CHECK_RETURN(jFilter.type() != Json::objectValue, -1);
    if (jFilter.isMember("sort_by")) {
        // This is a string literal, not a column: SQLite sorts by a constant, and the order does not change.
        const SqliteText szSql(sqlite3_mprintf(" order by '%q'", jFilter["sort_by"].asCString()));
        VEMO_ATOKEN_CHECK_RETURN(!szSql, -1);
        strSqlWhereOut.append(szSql.get());
        if (jFilter.isMember("sort_direction")) {
            strSqlWhereOut.append(jFilter["sort_direction"].asString() == "desc" ? " DESC" : " ASC");
        }
    }
    if (jFilter.isMember("limit")) {
        appendTail(" LIMIT ", jFilter["limit"].asInt64(), strSqlWhereOut);
        if (jFilter.isMember("offset")) {
            appendTail(" OFFSET ", jFilter["offset"].asInt64(), strSqlWhereOut);
        }
    }
    return 0;
}

int AccessTokenDbApi::tokenGet(Json::Value& jTokenParam, Json::Value& jTokenArrayOut)
{
    std::string strSql;
    std::string strStatement = "SELECT ";

    strStatement.reserve(512); // as a rule all of it, at once
    VEMO_ATOKEN_CHECK_RETURN(jTokenParam.type() != Json::objectValue, -1);
    VEMO_ATOKEN_CHECK_RETURN(
        jTokenArrayOut.type() != Json::nullValue && jTokenArrayOut.type() != Json::arrayValue, -1);
    VEMO_ATOKEN_CHECK_RETURN(0 > SqlWhereFromJson(jTokenParam, strSql, true), -1);
    VEMO_ATOKEN_CHECK_RETURN(0 > SqlFilterConditionFromJson(jTokenParam, strSql), -1);
    VEMO_ATOKEN_CHECK_RETURN_AS(0 > SqlExpandMemberName(strStatement),
                                "0 > SqlExpandMemberName(VEMO_ATOKEN_SELECT_SQL)", -1);
    strStatement.append(" FROM token ");
    // Ordering without a field condition gives "WHERE  order by", which SQLite refuses. Callers depend on it.
    if (!strSql.empty()) {
        strStatement.append(" WHERE ").append(strSql);
    }
    m_strSql.swap(strStatement.append(";"));

    VEMO_ATOKEN_CHECK_RETURN(0 > runSql(FillList, &jTokenArrayOut), -1);
    if (!m_strErr.empty()) {
        VEMO_ATOKEN_FAIL("sql error, sql=%s", VEMO_ATOKEN_HERE, m_strSql.c_str());
        return -1;
    }
    return 0;
}

int AccessTokenDbApi::tokenGetOne(const char* szName, std::string& strValue, Json::Value& jTokenOut)
{
    Json::Value jParam(Json::objectValue);
    Json::Value jTokenArray(Json::arrayValue);

    VEMO_ATOKEN_CHECK_RETURN(!szName || !szName[0], -1);
    VEMO_ATOKEN_CHECK_RETURN(strValue.empty(), -1);
    jTokenOut = Json::Value(Json::objectValue);
    jParam[szName] = strValue;
    VEMO_ATOKEN_CHECK_RETURN(0 > tokenGet(jParam, jTokenArray), -1);
    if (jTokenArray.empty()) {
        return 0;
    }
    jTokenOut.swap(jTokenArray[0U]);
    return 1;
}

int AccessTokenDbApi::tokenDelete(Json::Value& jTokenParam, bool bAll)
{
    int err = -1;
    std::string strSql;
    std::string strStatement = "DELETE FROM token";

    VEMO_ATOKEN_CHECK_RETURN(jTokenParam.type() != Json::objectValue, -1);
    VEMO_ATOKEN_CHECK_RETURN(0 > SqlWhereFromJson(jTokenParam, strSql, true), -1);
    if (!bAll) {
        VEMO_ATOKEN_CHECK_RETURN(strSql.empty(), -1);
    }
    if (!strSql.empty()) {
        strStatement.append(" WHERE ").append(strSql);
    }
    m_strSql.swap(strStatement.append(";"));

    VEMO_ATOKEN_CHECK_RETURN(0 > (err = runSql()), -1);
    if (!m_strErr.empty()) {
        VEMO_ATOKEN_FAIL("sql error, sql=%s", VEMO_ATOKEN_HERE, m_strSql.c_str());
        return -1;
    }
    VEMO_ATOKEN_DEBUG("delete token number=%d", VEMO_ATOKEN_HERE, err);
    return err;
}
