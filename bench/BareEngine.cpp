#include "BareEngine.h"

#include <sqlite3.h>
#include <unistd.h>

#include <cstdlib>
#include <memory>
#include <stdexcept>

#include "AccessTokenDefine.h"

namespace {

struct SqliteDeleter {
    void operator()(char* szText) const { sqlite3_free(szText); }
};

typedef std::unique_ptr<char, SqliteDeleter> SqliteText;

int copyColumns(void* pToken, int /* nine */, char** rgszValue, char** /* names */)
{
    BareToken& token = *static_cast<BareToken*>(pToken);
    token.strTid = rgszValue[0];
    token.strBindSid = rgszValue[1];
    token.nUid = atoll(rgszValue[2]);
    token.nDeadline = atoll(rgszValue[3]);
    token.nCount = atoll(rgszValue[4]);
    token.nCreateTime = atoll(rgszValue[5]);
    token.strFunction = rgszValue[6];
    token.strWebapiAllow = rgszValue[7];
    token.strExtra = rgszValue[8];
    return 0;
}

} // namespace

BareEngine::BareEngine() : m_pDb(nullptr)
{
    const uid_t uid = geteuid();
    if (0 != seteuid(0) || 0 != access(VEMO_ATOKEN_DB_PATH, F_OK) ||
        SQLITE_OK != sqlite3_open(VEMO_ATOKEN_DB_PATH, &m_pDb) || 0 != seteuid(uid)) {
        throw std::runtime_error("bare engine: cannot open the database");
    }
}

BareEngine::~BareEngine()
{
    sqlite3_close(m_pDb);
}

void BareEngine::run(const char* szSql, int (*callback)(void*, int, char**, char**), void* arg)
{
    char* szErr = nullptr;
    if (SQLITE_OK != sqlite3_exec(m_pDb, szSql, callback, arg, &szErr)) {
        throw std::runtime_error(std::string("bare engine: ") + szErr + ", sql=" + szSql);
    }
}

void BareEngine::purge()
{
    run("DELETE FROM token where deadline < strftime('%s', 'now');");
}

void BareEngine::write(const char* szPrefix, const BareToken& token)
{
    const SqliteText szSql(sqlite3_mprintf(
        "%s INTO token (tid,bind_sid,uid,deadline,count,create_time,function,webapi_allow,extra) VALUES "
        "(%Q,%Q,%lld,%lld,%lld,%lld,%Q,%Q,%Q)",
        szPrefix, token.strTid.c_str(), token.strBindSid.c_str(), token.nUid, token.nDeadline, token.nCount,
        token.nCreateTime, token.strFunction.c_str(), token.strWebapiAllow.c_str(), token.strExtra.c_str()));
    run(szSql.get());
}

void BareEngine::create(const BareToken& token)
{
    write("INSERT", token);
}

void BareEngine::save(const BareToken& token)
{
    write("REPLACE", token);
}

BareToken BareEngine::read(const std::string& strTid)
{
    const SqliteText szSql(sqlite3_mprintf(
        "SELECT tid,bind_sid,uid,deadline,count,create_time,function,webapi_allow,extra FROM token  WHERE  "
        "(tid='%q' );",
        strTid.c_str()));
    BareToken token = {};
    run(szSql.get(), copyColumns, &token);
    return token;
}

void BareEngine::deleteWhere(const char* szField, const std::string& strValue)
{
    const SqliteText szSql(
        sqlite3_mprintf("DELETE FROM token WHERE  (%s in ('%q' ) );", szField, strValue.c_str()));
    run(szSql.get());
}

void BareEngine::grant(const std::string& strTid)
{
    BareToken token = read(strTid);
    if (1 < token.nCount) {
        --token.nCount;
        save(token);
    } else if (0 <= token.nCount) {
        deleteWhere("tid", token.strTid);
    }
}
