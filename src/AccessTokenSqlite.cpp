#include <sqlite3.h>
#include <sys/stat.h>
#include <sys/types.h>
#include <unistd.h>

#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <exception>
#include <memory>
#include <string_view>

#include "AccessTokenUtil.h"
#include "internal/AccessTokenDbApi.h"
#include "internal/AccessTokenLog.h"
#include "internal/FieldType.h"
#include "internal/JsonAccess.h"
#include "internal/JsonText.h"
#include "plibc.h"

using VEMO_ACCESS_TOKEN::debugInfoGet;
using VEMO_ACCESS_TOKEN::ErrnoKeeper;
using VEMO_ACCESS_TOKEN::fieldType;
using VEMO_ACCESS_TOKEN::findMember;
using VEMO_ACCESS_TOKEN::fromString;
using VEMO_ACCESS_TOKEN::textOf;
using VEMO_ACCESS_TOKEN::textOrNull;
using VEMO_ACCESS_TOKEN::tokenType;
using VEMO_ACCESS_TOKEN::toString;

namespace {

const int LOCK_TRIES = 500;
const useconds_t LOCK_WAIT_USEC = 10000;

struct SqliteDeleter {
    void operator()(char* szText) const { sqlite3_free(szText); }
};

// Text that SQLite allocated.
typedef std::unique_ptr<char[], SqliteDeleter> SqliteText;

// Puts the effective uid back at the end of a scope.
class EffectiveUidKeeper {
public:
    EffectiveUidKeeper() : m_uid(geteuid()) {}
    ~EffectiveUidKeeper()
    {
        if (UID_NONE != m_uid) {
            const ErrnoKeeper errnoKeeper;
            // Nothing can be done about a failure.
            [[maybe_unused]] const int nIgnored = seteuid(m_uid);
        }
    }
    EffectiveUidKeeper(const EffectiveUidKeeper&) = delete;
    EffectiveUidKeeper& operator=(const EffectiveUidKeeper&) = delete;
    void forget() { m_uid = UID_NONE; }

private:
    static constexpr uid_t UID_NONE = static_cast<uid_t>(-1);
    uid_t m_uid;
};

void waitForLock()
{
    const ErrnoKeeper keeper;
    usleep(LOCK_WAIT_USEC);
}

// How a field's value is written in SQL; its type name decides.
enum class Rendering { Text, Json, Number };

constexpr Rendering renderingOf(std::string_view strType)
{
    if (strType == "string") {
        return Rendering::Text;
    }
    if (strType == "Json::Value" || strType == "Json::objectValue" || strType == "Json::arrayValue") {
        return Rendering::Json;
    }
    return Rendering::Number;
}

// A member as an argument of sqlite3_mprintf, and the directive that formats it. get() is valid as
// long as the object.
template <Rendering rendering>
class SqlArgument;

template <>
class SqlArgument<Rendering::Text> {
public:
    static constexpr const char* DIRECTIVE = "%Q";
    explicit SqlArgument(const Json::Value& jMember) : m_szText(jMember.asCString()) {}
    const char* get() const { return m_szText; }

private:
    const char* m_szText;
};

template <>
class SqlArgument<Rendering::Json> {
public:
    static constexpr const char* DIRECTIVE = "%Q";
    explicit SqlArgument(const Json::Value& jMember) : m_strText(toString(jMember)) {}
    const char* get() const { return m_strText.c_str(); }

private:
    std::string m_strText;
};

template <>
class SqlArgument<Rendering::Number> {
public:
    static constexpr const char* DIRECTIVE = "%lld";
    explicit SqlArgument(const Json::Value& jMember) : m_nNumber(jMember.asInt64()) {}
    sqlite3_int64 get() const { return m_nNumber; }

private:
    sqlite3_int64 m_nNumber;
};

// Appends a filter's value, escaped and quoted as its field demands. Number fields take the value
// without quotes whatever its type, so a string in their place becomes part of the statement. The two
// conditions are the caller's, for the log line of a failed allocation.
int appendValue(Rendering rendering, const Json::Value& jValue, const char* szAsStringFailed,
                const char* szToStringFailed, std::string& strSqlOut)
{
    const bool blJson = Rendering::Json == rendering;
    const std::string strText = blJson ? toString(jValue) : jValue.asString();
    const SqliteText szSql(sqlite3_mprintf("%q", strText.c_str()));
    if (!szSql) {
        VEMO_ATOKEN_FAILED(blJson ? szToStringFailed : szAsStringFailed, VEMO_ATOKEN_HERE);
        return -1;
    }
    const char* szQuote = Rendering::Number == rendering ? "" : "'";
    strSqlOut.append(szQuote).append(szSql.get()).append(szQuote);
    return 0;
}

// The rule of "limit" and "offset": the number is a position in the keyword's text, of which the
// tail is appended; the number itself is never written. So 0 gives " LIMIT ", without a number, and
// a position past the end gives nothing. Callers have always seen this, and it stays.
void appendTail(std::string_view strKeyword, Json::Int64 nValue, std::string& strSqlOut)
{
    const uint32_t nPosition = static_cast<uint32_t>(nValue);
    if (nPosition < strKeyword.size()) {
        strSqlOut.append(strKeyword.substr(nPosition));
    }
}

// The record's member, made if it is missing. A field's name is not copied into each record: records
// point at the names in the library, which for that reason is never unloaded.
Json::Value& recordMember(Json::Value& jToken, const char* szName)
{
    static const Json::StaticString rgFieldName[] = {
#define VEMO_ATOKEN_DATA_MEMBER(name, type, column, value) Json::StaticString(#name),
#include "internal/vemo-access-token-data-member"
#undef VEMO_ATOKEN_DATA_MEMBER
    };
    for (const Json::StaticString& fieldName : rgFieldName) {
        if (0 == strcmp(fieldName.c_str(), szName)) {
            return jToken[fieldName];
        }
    }
    return jToken[szName]; // a field that has been added to tokenType() meanwhile
}

int FillField(Json::Value& jToken, char** column_name, char** column_value, int idx)
{
    VEMO_ATOKEN_CHECK_RETURN(jToken.type() != Json::objectValue && jToken.type() != Json::nullValue, -1);
    VEMO_ATOKEN_CHECK_RETURN(0 > idx, -1);
    const char* szName = column_name[idx];
    const Json::Value* pType = fieldType(szName);
    VEMO_ATOKEN_CHECK_RETURN_AS(!pType, "!jTokenType.isMember(strName)", -1);

    const char* szValue = column_value[idx];
    const std::string_view strType = textOf(*pType);
    if (strType == "string") {
        recordMember(jToken, szName) = szValue;
    } else if (strType == "int") {
        recordMember(jToken, szName) = static_cast<Json::Int>(strtol(szValue, nullptr, 10));
    } else if (strType == "long long") {
        recordMember(jToken, szName) = static_cast<Json::Int64>(strtoll(szValue, nullptr, 10));
    } else if (Rendering::Json == renderingOf(strType)) {
        fromString(szValue, recordMember(jToken, szName));
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
    for (int i = 0; i < n_column; ++i) {
        VEMO_ATOKEN_CHECK_RETURN(NULL == column_name[i] || NULL == column_value[i], -1);
        VEMO_ATOKEN_CHECK_RETURN(0 > (iTmp = FillField(*pjToken, column_name, column_value, i)), -1);
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

// The callback of sqlite3_exec, a C function that no exception may cross.
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
        // The one way out that leaves the process at effective uid 0; callers know it so.
        uidKeeper.forget();
        return -1;
    }

    // From here on the result is success: a missing handle or table is logged, and shows in the
    // statements that follow.
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
        // The text decides, not the code: nothing else is worth waiting for.
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

    // m_strErr is not cleared: after a lock that was waited out it still tells of the lock, and the
    // operations on tokens report failure although the statement took effect. That is kept.
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
    int nResult = 0;

    if (m_strSql.empty()) {
        VEMO_ATOKEN_FAIL("no correct sql", VEMO_ATOKEN_HERE);
        return -1;
    }
    VEMO_ATOKEN_CHECK_RETURN(0 > initDb(), -1);
    m_strErr.clear();
    nResult = runSqlEx(m_strSql, callback, arg);
    if (0 > nResult) {
        VEMO_ATOKEN_FAIL("run sql failed, sql=%s", VEMO_ATOKEN_HERE, m_strSql.c_str());
        return -1;
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

    // Nothing protects a deadline of -1: it lies before now, and such a token is purged.
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
#define VEMO_ATOKEN_DATA_MEMBER(name, type, column, value)                                                   \
    const Json::Value* p_##name = findMember(jParam, #name);                                                 \
    if (!p_##name) {                                                                                         \
        VEMO_ATOKEN_FAILED("!jParam.isMember(\"" #name "\")", VEMO_ATOKEN_HERE_IN_LIST);                     \
        return -1;                                                                                           \
    }
#include "internal/vemo-access-token-data-member"
#undef VEMO_ATOKEN_DATA_MEMBER

    VEMO_ATOKEN_CHECK_RETURN(0 > SqlExpandMemberName(strSqlPrefix), -1);
    strSqlPrefix.append(") VALUES (");
    VEMO_ATOKEN_CHECK_RETURN(0 > SqlExpandMemberSymbol(strSqlPrefix), -1);

#define VEMO_ATOKEN_DATA_MEMBER(name, type, column, value) , SqlArgument<renderingOf(type)>(*p_##name).get()
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
        // Whatever is no field passes: paging keys, and misspelt ones too.
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
            // The message shows the whole filter read as a string, which an object never is.
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
    if (0 > appendValue(renderingOf(textOf(*pType)), jParam,
                        "NULL == (szSql = sqlite3_mprintf(\"%q\", jParam.asString().c_str()))",
                        "NULL == (szSql = sqlite3_mprintf(\"%q\", jParam.toString().c_str()))",
                        strCondition)) {
        return -1;
    }
    strSqlWhereOut.append(strCondition);
    return 0;
}

int AccessTokenDbApi::SqlMakeByListField(const char* szField, Json::Value& jList, std::string& strSqlWhereOut)
{
    const Json::Value& jElements = jList; // reading through it adds no element where there is a gap
    std::string strList;

    VEMO_ATOKEN_CHECK_RETURN(!szField || !szField[0], -1);
    const Json::Value* pType = fieldType(szField);
    VEMO_ATOKEN_CHECK_RETURN_AS(!pType, "!jTokenType.isMember(szField)", -1);
    const Rendering rendering = renderingOf(textOf(*pType));
    VEMO_ATOKEN_CHECK_RETURN(jList.type() != Json::arrayValue, -1);

    // No separator stands between the elements: 'a''b' is the one text a'b, and 12 the one number.
    // So a list matches as intended only with one element. Callers have always seen this.
    for (Json::ArrayIndex i = 0; i < jElements.size(); ++i) {
        if (0 > appendValue(rendering, jElements[i],
                            "NULL == (szSql = sqlite3_mprintf(\"%q\", jList[i].asString().c_str()))",
                            "NULL == (szSql = sqlite3_mprintf(\"%q\", jList[i].toString().c_str()))",
                            strList)) {
            return -1;
        }
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
        // A string literal, no column: SQLite sorts by a constant, and the rows keep their order.
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

    VEMO_ATOKEN_CHECK_RETURN(jTokenParam.type() != Json::objectValue, -1);
    VEMO_ATOKEN_CHECK_RETURN(
        jTokenArrayOut.type() != Json::nullValue && jTokenArrayOut.type() != Json::arrayValue, -1);
    VEMO_ATOKEN_CHECK_RETURN(0 > SqlWhereFromJson(jTokenParam, strSql, true), -1);
    VEMO_ATOKEN_CHECK_RETURN(0 > SqlFilterConditionFromJson(jTokenParam, strSql), -1);
    VEMO_ATOKEN_CHECK_RETURN_AS(0 > SqlExpandMemberName(strStatement),
                                "0 > SqlExpandMemberName(VEMO_ATOKEN_SELECT_SQL)", -1);
    strStatement.append(" FROM token ");
    // Ordering without a field condition gives "WHERE  order by", which SQLite refuses; that stays.
    if (!strSql.empty()) {
        strStatement.append(" WHERE ").append(strSql);
    }
    m_strSql = strStatement.append(";");

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
    m_strSql = strStatement.append(";");

    VEMO_ATOKEN_CHECK_RETURN(0 > (err = runSql()), -1);
    if (!m_strErr.empty()) {
        VEMO_ATOKEN_FAIL("sql error, sql=%s", VEMO_ATOKEN_HERE, m_strSql.c_str());
        return -1;
    }
    VEMO_ATOKEN_DEBUG("delete token number=%d", VEMO_ATOKEN_HERE, err);
    return err;
}
