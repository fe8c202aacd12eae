#include "Store.h"

#include <sqlite3.h>
#include <sys/stat.h>

#include <algorithm>

#include "AccessTokenDefine.h"
#include "Clock.h"

namespace {

// A purge takes long without an index. Purges take at most a fiftieth of the time, so long ones come less
// often. No grant depends on them, because each grant checks the deadline of its token.
const int64_t PURGE_EACH = gate::SECOND;
const int64_t PURGE_SHARE = 50;

sqlite3* opened(AccessTokenDbApi& db)
{
    if (0 > db.initDb() || !db.m_pDb) {
        throw grant::Error(SQLITE_CANTOPEN, "the database cannot be opened");
    }
    // A commit is on the disk when it returns. EXTRA also syncs the directory, for a rollback journal.
    for (const char* szSql : {"PRAGMA synchronous = EXTRA", "PRAGMA temp_store = MEMORY"}) {
        if (SQLITE_OK != sqlite3_exec(db.m_pDb, szSql, nullptr, nullptr, nullptr)) {
            throw grant::Error(sqlite3_extended_errcode(db.m_pDb), sqlite3_errmsg(db.m_pDb));
        }
    }
    return db.m_pDb;
}

// Runs a statement. Returns false if other programs hold the database.
bool isDone(grant::Statement& statement)
{
    try {
        statement.step();
    } catch (const grant::Error& error) {
        const int nCode = error.code() & 0xff;
        if (SQLITE_BUSY != nCode && SQLITE_PROTOCOL != nCode) {
            throw;
        }
        return false;
    }
    statement.reset();
    return true;
}

} // namespace

namespace gate {

Store::Connection::Connection()
    : pDb(opened(db)),
      begin(pDb, "BEGIN IMMEDIATE"),
      commit(pDb, "COMMIT"),
      rollBack(pDb, "ROLLBACK"),
      purge(pDb, grant::SQL_PURGE),
      look(pDb, "SELECT 1 FROM token LIMIT 1"),
      tokens(pDb)
{
}

bool Store::Connection::isOfTheFile() const
{
    int nMoved = 0;
    return SQLITE_OK == sqlite3_file_control(pDb, nullptr, SQLITE_FCNTL_HAS_MOVED, &nMoved) && !nMoved;
}

void Store::open()
{
    if (m_connection && !m_connection->isOfTheFile()) {
        m_connection.reset();
    }
    if (!m_connection) {
        m_connection.emplace();
    }
}

bool Store::begin()
{
    open();
    return isDone(m_connection->begin);
}

uint64_t Store::purge()
{
    const int64_t nNow = now();
    if (nNow < m_connection->nPurgeAt) {
        return 0;
    }
    m_connection->purge.step();
    const int64_t nEnd = now();
    m_connection->nPurgeAt = nEnd + std::max(PURGE_EACH, PURGE_SHARE * (nEnd - nNow));
    return static_cast<uint64_t>(sqlite3_changes64(m_connection->pDb));
}

bool Store::commit()
{
    return isDone(m_connection->commit);
}

void Store::rollBack() noexcept
{
    if (!m_connection || sqlite3_get_autocommit(m_connection->pDb)) {
        return;
    }
    try {
        m_connection->rollBack.step();
    } catch (...) {
        m_connection.reset(); // closing the connection also undoes it
    }
}

bool Store::canRead()
{
    open();
    return isDone(m_connection->look);
}

uint64_t Store::size()
{
    uint64_t cbAll = 0;
    for (const char* szPath : {VEMO_ATOKEN_DB_PATH, VEMO_ATOKEN_DB_PATH "-wal"}) {
        struct stat status = {};
        if (0 == stat(szPath, &status)) {
            cbAll += static_cast<uint64_t>(status.st_size);
        }
    }
    return cbAll;
}

} // namespace gate
