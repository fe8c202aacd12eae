// The token database through the library's store, in a transaction of the tool's own.
//
// The library's operations report failure when they had to wait for a lock, although they took effect.
// Here all waiting happens where a transaction begins and where it is committed, and there the result
// is exact. So what a command says is what happened.

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

// All members throw Failure. What is not committed is undone when the object ends.
class Transaction {
public:
    enum class Access {
        Glance, // nothing changes meanwhile
        Read,   // the same, and what is seen outlasts a power cut
        Locked, // no transaction, but the lock that programs take for a call
        Write,  // nobody else writes meanwhile; with that lock
    };

    // What to do where there is no database.
    enum class Missing { Fail, Make };

    explicit Transaction(Access access, Missing missing = Missing::Fail);

    // Whether the file was missing, and was made.
    bool hasMadeFile() const { return m_blMadeFile; }

    // Waits, for 5 s at most, until the change can be written. It outlasts a power cut. Others that take the
    // lock can change tokens when this object is gone.
    void commit();

    // Any statement.
    Rows query(const std::string& strSql);

    // The same for one that gives many rows: takes them one by one.
    void eachRow(const std::string& strSql, const std::function<void(Row)>& take);

    // The same for a statement that can give rows before it fails; returns why it did, or "".
    std::string queryAsFarAsItGoes(const std::string& strSql, Rows& rows);

    // The same for one that is interrupted when it takes longer; returns nothing then.
    std::optional<std::string> queryWithin(std::chrono::milliseconds longest, const std::string& strSql,
                                           Rows& rows);

    // The first column of a query's first row, as text and as a number of 0 or more.
    std::string text(const std::string& strSql);
    uint64_t number(const std::string& strSql);

    // What there is under the name of the table of tokens: "table", "view" or "virtual table"; "" for
    // nothing.
    std::string tableKind();

    // Whether there is a table of tokens, and fails where something else is in its place.
    bool hasTable();

    // Makes the table where it is missing, and returns whether it was. Without a transaction.
    bool makeTable();

protected:
    // The database, for the library's operations; and what one returned, which must not be an error.
    AccessTokenDbApi& db() { return m_db; }
    void require(int nResult);

    [[noreturn]] void fail(const std::string& strErr);

private:
    void beginWriting(Missing missing);
    void lock();
    std::string run(const std::string& strSql, const std::function<void(Row)>& take);
    bool holdsNull();

    // The last that go, when the database is closed and nobody waits for the lock: a change that is made is
    // told, and then a signal that has come meanwhile ends the process.
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
