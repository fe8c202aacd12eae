// Opens the token database through the library's store, in a transaction of the tool.
//
// The library's operations report a failure when they had to wait for a lock, even if they took effect. Here,
// all waiting happens when a transaction begins and when it is committed, and the results of both are exact.
// So what a command says is what happened.

#ifndef TOOLS_TRANSACTION_H
#define TOOLS_TRANSACTION_H

#include <chrono>
#include <cstdint>
#include <functional>
#include <optional>
#include <string>

#include "Audit.h"
#include "CallLock.h"
#include "Signals.h"
#include "Sql.h"
#include "internal/AccessTokenDbApi.h"

namespace tool {

// The destructor undoes what was not committed. All members throw Failure.
class Transaction {
public:
    enum class Access {
        Glance, // nothing changes while it is open
        Read,   // like Glance, and what is read outlasts a power cut
        Locked, // no transaction, but the lock of CallLock.h
        Write,  // nobody else writes while it is open; holds the lock too
    };

    // What to do if there is no database.
    enum class Missing { Fail, Make };

    explicit Transaction(Access access, Missing missing = Missing::Fail);

    // Whether this object made the database file, because it was missing.
    bool hasMadeFile() const { return m_blMadeFile; }

    // Commits; waits at most 5 s for other programs. The change then outlasts a power cut. Programs that take
    // the lock must wait until this object is destroyed.
    void commit();

    // The same for a change of the structure, of which SQLite counts no rows.
    void commitChange();

    // From now on, a signal that would end the process waits until this object is destroyed and the system
    // log has the line about the change.
    void holdSignals();

    // What has the name of the table of tokens: "table", "view" or "virtual table"; "" for nothing.
    std::string tableKind();

    // Whether there is a table of tokens. Fails if something else has its name.
    bool hasTable();

    // Makes the table if it is missing, and returns whether it was made. Call it outside a transaction.
    bool makeTable();

protected:
    // Runs any statement and returns its rows.
    Rows query(const std::string& strSql);

    // Runs a statement and passes its rows to take(), one by one.
    void eachRow(const std::string& strSql, const std::function<void(Row)>& take);

    // Runs a statement that may fail after some rows. Adds the rows; returns the error, or "".
    std::string queryPartially(const std::string& strSql, Rows& rows);

    // Like queryPartially(), but interrupts the statement after this time, and then returns nothing. Returns
    // nothing, too, if it gets no thread that can do so.
    std::optional<std::string> queryWithin(std::chrono::milliseconds longest, const std::string& strSql,
                                           Rows& rows);

    // The first column of the first row, as text ("" if there is no row) or as a number of 0 or more.
    std::string text(const std::string& strSql);
    uint64_t number(const std::string& strSql);

    // The library's store; and a check of the result of one of its operations, which fails if the result is
    // an error.
    AccessTokenDbApi& db() { return m_db; }
    void require(int nResult);

    [[noreturn]] void fail(const std::string& strErr);

private:
    void beginWriting(Missing missing);
    void lock();
    std::string run(const std::string& strSql, const std::function<void(Row)>& take);
    bool holdsNull();

    // These two are destroyed last, after the database is closed and the lock is free: first the system log
    // gets the line about a committed change, then a signal that has come meanwhile ends the process.
    std::optional<EndingPause> m_pause;
    audit::Teller m_teller;
    const Access m_access;
    std::optional<CallLock> m_lock;
    bool m_blMadeFile = false;
    bool m_blCommitting = false;
    AccessTokenDbApi m_db;
};

} // namespace tool

#endif
