#include "Transaction.h"

#include <sqlite3.h>
#include <unistd.h>

#include <cerrno>
#include <condition_variable>
#include <cstdlib>
#include <cstring>
#include <exception>
#include <mutex>
#include <new>
#include <system_error>
#include <thread>

#include "AccessTokenUtil.h"
#include "Change.h"
#include "Failure.h"
#include "Masking.h"
#include "Place.h"
#include "Processes.h"
#include "Signals.h"
#include "internal/JsonText.h"

namespace {

// Takes the rows of a query, and keeps the exception that stopped that.
struct Taker {
    const std::function<void(tool::Row)>& take;
    std::exception_ptr pStopped;
};

int giveRow(void* pTaker, int nColumns, char** rgValue, char**)
{
    Taker& taker = *static_cast<Taker*>(pTaker);
    try {
        tool::Row row;
        for (int i = 0; i < nColumns; ++i) {
            row.push_back(rgValue[i] ? std::optional<std::string>(rgValue[i]) : std::nullopt);
        }
        taker.take(std::move(row));
        return 0;
    } catch (...) {
        taker.pStopped = std::current_exception(); // must not leave through SQLite, which is C
        return -1;
    }
}

bool contains(const std::string& strErr, const char* szText)
{
    return std::string::npos != strErr.find(szText);
}

// An error of SQLite, as a fact about the database and a hint at what helps.
std::pair<std::string, std::string> explained(const std::string& strErr)
{
    if (contains(strErr, "no such table: token")) {
        return {"has no table of tokens", "\"vemo-access-token doctor --repair\" makes it"};
    }
    if (contains(strErr, "file is not a database")) {
        return {"is not a token database, or is damaged (" + strErr + ")", ""};
    }
    // With a write-ahead journal, the database cannot even be read if no file can be made beside it.
    const bool blReadOnly = contains(strErr, "readonly database");
    if ((blReadOnly || contains(strErr, "unable to open database file")) &&
        0 != access(tool::databaseDirectory().c_str(), W_OK) && EROFS == errno) {
        return {"is on a file system that is read-only", "\"mount -o remount,rw\" makes that writable"};
    }
    if (blReadOnly) {
        return {"cannot be written to (" + strErr + ")", "\"vemo-access-token doctor\" says why"};
    }
    if (contains(strErr, "malformed")) {
        return {"is damaged (" + strErr + ")", "\"vemo-access-token doctor\" says how badly"};
    }
    if (contains(strErr, "query aborted")) {
        return {"holds a token that cannot be read", "\"vemo-access-token doctor\" finds it"};
    }
    return {"failed: " + strErr, ""};
}

// In SQL, opens(webapi_allow, API, METHOD): whether a token opens a call; METHOD "" asks for the API alone.
void opens(sqlite3_context* pContext, int, sqlite3_value** rgValue)
{
    try {
        std::string strTexts[3];
        for (size_t i = 0; i < std::size(strTexts); ++i) {
            const auto szText = reinterpret_cast<const char*>(sqlite3_value_text(rgValue[i]));
            strTexts[i] = szText ? szText : "";
        }
        Json::Value jToken;
        VEMO_ACCESS_TOKEN::fromString(strTexts[0], jToken["webapi_allow"]);
        const int nOpens =
            VEMO_ACCESS_TOKEN::checkPermission(jToken, strTexts[1].c_str(), strTexts[2].c_str());
        sqlite3_result_int(pContext, 0 < nOpens);
    } catch (const Json::LogicError&) {
        sqlite3_result_int(pContext, 0); // the list of methods holds an array or an object
    } catch (const std::bad_alloc&) {
        sqlite3_result_error_nomem(pContext);
    }
}

// As long as the library waits for the database.
const std::chrono::seconds LOCK_WAIT(5);

// The hint if a command that changes tokens did not get a lock.
const char* meaningOfLocked()
{
    return tool::hasChanged() ? "" : "nothing was changed";
}

[[noreturn]] void failOnLock(int nError)
{
    const std::string strFile = CallLock::FILE_OF_ALL;
    switch (nError) {
    case ETIMEDOUT:
        throw tool::LockedFailure(tool::EXIT_STATUS_STORE,
                                  strFile + " stayed locked by " + tool::lockHolders(strFile) +
                                      " for 5 seconds",
                                  meaningOfLocked());
    case EPERM:
    case ELOOP:
        throw tool::Failure(tool::EXIT_STATUS_STORE,
                            strFile + " is not root's alone, and others could hold the lock for ever",
                            "remove it while no program that uses tokens runs");
    default: throw tool::Failure(tool::EXIT_STATUS_STORE, strFile + ": " + strerror(nError));
    }
}

} // namespace

namespace tool {

Transaction::Transaction(Access access, Missing missing) : m_access(access)
{
    requireDatabase(Missing::Make == missing);
    if (Access::Locked == access || Access::Write == access) {
        lock();
    }
    if (Missing::Make == missing && !statusOf(VEMO_ATOKEN_DB_PATH)) {
        holdSignals();
        m_blMadeFile = makeFile();
        settleChange();
    }
    if (0 > m_db.initDb()) {
        throw Failure(EXIT_STATUS_STORE,
                      std::string(VEMO_ATOKEN_DB_PATH) + " cannot be opened: " + strerror(errno));
    }
    if (SQLITE_OK !=
        sqlite3_create_function(m_db.m_pDb, "opens", 3, SQLITE_UTF8, nullptr, opens, nullptr, nullptr)) {
        throw std::bad_alloc();
    }
    query("PRAGMA temp_store = MEMORY"); // temporary files would hold purposes and sessions
    if (Access::Write == access) {
        beginWriting(missing);
    } else if (Access::Locked != access) {
        query("BEGIN");
        query("SELECT count(*) FROM sqlite_schema"); // SQLite takes its lock at the first read
    }
    if (Access::Read == access) {
        syncDirectory("a power cut can undo what others changed last");
    }
}

void Transaction::beginWriting(Missing missing)
{
    // An empty database is one that another program is making, or failed to make: the file comes before the
    // table. Whoever comes first makes the table.
    if (Missing::Make == missing && 0 == number("SELECT count(*) FROM sqlite_schema")) {
        makeTable();
    }
    if (!hasTable()) {
        fail("no such table: token"); // before BEGIN makes an empty file a database without a table
    }
    query("BEGIN IMMEDIATE");
}

void Transaction::lock()
{
    try {
        m_lock.emplace(CallLock::FILE_OF_ALL, LOCK_WAIT);
    } catch (const std::system_error& error) {
        failOnLock(error.code().value());
    }
}

void Transaction::commit()
{
    if (0 != number("SELECT total_changes()")) {
        commitChange();
        return;
    }
    holdSignals();
    query("COMMIT");
    if (audit::hasNotes()) {
        audit::made(); // a grant of an unlimited token, which changes nothing
    }
    syncDirectory("a power cut can undo what others changed last");
}

void Transaction::commitChange()
{
    holdSignals();
    m_blCommitting = true;
    query("COMMIT");
    m_blCommitting = false;
    settleChange();
}

void Transaction::holdSignals()
{
    if (!m_pause) {
        m_pause.emplace();
    }
}

void Transaction::fail(const std::string& strErr)
{
    const std::string strPath = VEMO_ATOKEN_DB_PATH " ";
    if (contains(strErr, "database is locked")) {
        throw LockedFailure(EXIT_STATUS_STORE, strPath + "stayed locked by another process for 5 seconds",
                            Access::Read == m_access || Access::Glance == m_access ? "" : meaningOfLocked());
    }
    // These mean that memory ran out: an error without a text, and "query aborted" when no token has a NULL,
    // which would also cause it.
    if (strErr.empty() || (contains(strErr, "query aborted") && !holdsNull())) {
        throw std::bad_alloc();
    }
    // After a change is committed, SQLite shortens the file, and reports an error if that fails.
    const bool blPerhaps = m_blCommitting && contains(strErr, "disk I/O error");
    if (blPerhaps) {
        audit::made(audit::Certainty::Perhaps);
    }
    const auto [strFact, strHint] = explained(shownReason(strErr));
    throw Failure(EXIT_STATUS_STORE, strPath + strFact,
                  blPerhaps ? "the change may have been made" : strHint);
}

// Whether a token has a NULL, so that it cannot be read.
bool Transaction::holdsNull()
{
    std::string strAny = "0";
    for (const std::string& strName : fieldNames()) {
        strAny += " OR " + strName + " IS NULL";
    }
    return 0 != number("SELECT count(*) FROM token WHERE " + strAny);
}

void Transaction::require(int nResult)
{
    if (0 > nResult) {
        fail(m_db.m_strErr);
    }
}

std::string Transaction::tableKind()
{
    return text("SELECT iif(sql LIKE 'CREATE VIRTUAL %', 'virtual table', type) FROM sqlite_schema "
                "WHERE type IN ('table', 'view') AND name = 'token' COLLATE NOCASE");
}

bool Transaction::hasTable()
{
    const std::string strKind = tableKind();
    if (!strKind.empty() && strKind != "table") {
        throw Failure(EXIT_STATUS_STORE,
                      VEMO_ATOKEN_DB_PATH " has a " + strKind + " in the place of the table of tokens",
                      "\"vemo-access-token doctor\" tells what helps");
    }
    return !strKind.empty();
}

bool Transaction::makeTable()
{
    if (hasTable()) {
        return false;
    }
    // The file that the link leads to may belong to another program.
    const auto status = statusOf(VEMO_ATOKEN_DB_PATH);
    if (status && S_ISLNK(status->st_mode)) {
        throw Failure(EXIT_STATUS_STORE,
                      VEMO_ATOKEN_DB_PATH " is a symbolic link, and what it leads to has no "
                                          "table of tokens",
                      "find out who made it");
    }
    query("PRAGMA auto_vacuum = FULL"); // as in the library; has no effect within a transaction
    query("BEGIN IMMEDIATE");
    require(m_db.createTable()); // does nothing if another program has just made it
    commitChange();
    return true;
}

Rows Transaction::query(const std::string& strSql)
{
    Rows rows;
    eachRow(strSql, [&rows](Row row) { rows.push_back(std::move(row)); });
    return rows;
}

void Transaction::eachRow(const std::string& strSql, const std::function<void(Row)>& take)
{
    const std::string strErr = run(strSql, take);
    if (!strErr.empty()) {
        fail(strErr);
    }
}

std::string Transaction::queryPartially(const std::string& strSql, Rows& rows)
{
    return run(strSql, [&rows](Row row) { rows.push_back(std::move(row)); });
}

std::optional<std::string> Transaction::queryWithin(std::chrono::milliseconds longest,
                                                    const std::string& strSql, Rows& rows)
{
    std::mutex mutex;
    std::condition_variable ended;
    bool blEnded = false;
    bool blInterrupted = false;
    const SignalPause pause; // the thread inherits it, so that signals go to the main thread, which cleans up
    std::thread watch;
    try {
        watch = std::thread([&] {
            std::unique_lock guard(mutex);
            blInterrupted = !ended.wait_for(guard, longest, [&blEnded] { return blEnded; });
            if (blInterrupted) {
                sqlite3_interrupt(m_db.m_pDb);
            }
        });
    } catch (const std::system_error&) { // then nothing could interrupt the statement
        return std::nullopt;
    }
    const std::string strErr = queryPartially(strSql, rows);
    {
        const std::lock_guard<std::mutex> guard(mutex);
        blEnded = true;
    }
    ended.notify_one();
    watch.join();
    return blInterrupted && !strErr.empty() ? std::nullopt : std::optional(strErr);
}

// Runs a statement. Returns why it failed, or "".
std::string Transaction::run(const std::string& strSql, const std::function<void(Row)>& take)
{
    Taker taker = {take, nullptr};
    const int nResult = m_db.runSqlEx(strSql, giveRow, &taker);
    if (taker.pStopped) {
        std::rethrow_exception(taker.pStopped);
    }
    return 0 > nResult ? m_db.m_strErr : "";
}

std::string Transaction::text(const std::string& strSql)
{
    const Rows rows = query(strSql);
    return rows.empty() ? "" : rows[0][0].value_or("");
}

uint64_t Transaction::number(const std::string& strSql)
{
    return strtoull(text(strSql).c_str(), nullptr, 10);
}

} // namespace tool
