// The connection to the token database that the gate holds.

#ifndef GATE_STORE_H
#define GATE_STORE_H

#include <cstdint>
#include <optional>

#include "grant/Tokens.h"
#include "internal/AccessTokenDbApi.h"

namespace gate {

// The connection is opened when it is needed, and again after a failure, or if another file has replaced the
// database. begin, purge, commit and canRead throw grant::Error or std::bad_alloc.
class Store {
public:
    // Begins a transaction in which nobody else writes. Returns false if others hold the database now.
    bool begin();

    // The tokens, within a transaction.
    grant::Tokens& tokens() { return m_connection->tokens; }

    // Deletes the expired tokens, within a transaction, unless the last purge ended less than a second ago,
    // or less than 50 times its own duration ago. Returns how many were deleted.
    uint64_t purge();

    // Commits the transaction, which then outlasts a power cut. Returns false if other programs hold the
    // database; the caller can try again.
    bool commit();

    // Undoes the transaction.
    void rollBack() noexcept;

    // Closes the connection.
    void close() noexcept { m_connection.reset(); }

    // Whether tokens can be read now. Without a transaction.
    bool canRead();

    // The size of the database, with its write-ahead journal.
    static uint64_t size();

private:
    struct Connection {
        Connection();
        bool isOfTheFile() const;

        AccessTokenDbApi db;
        sqlite3* const pDb;
        grant::Statement begin;
        grant::Statement commit;
        grant::Statement rollBack;
        grant::Statement purge;
        grant::Statement look;
        grant::Tokens tokens;
        int64_t nPurgeAt = 0;
    };

    void open();

    std::optional<Connection> m_connection;
};

} // namespace gate

#endif
