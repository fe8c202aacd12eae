// A store for one test: a fresh directory, which the library uses instead of the real private one.

#ifndef TESTS_TOKEN_STORE_H
#define TESTS_TOKEN_STORE_H

#include <sqlite3.h>

#include <map>
#include <memory>
#include <string>

// The contents of the files by name: of the database and, if there is one, of its journal.
typedef std::map<std::string, std::string> Files;

const std::string DATABASE = "vemo-access-token.db";

// The id of the token with this name, padded to the length of an id. TokenStore::state() shows the name.
std::string idOf(const std::string& strName);

typedef std::unique_ptr<sqlite3, decltype(&sqlite3_close)> Database;

void run(const Database& pDb, const std::string& strSql);

class TokenStore {
public:
    TokenStore();
    ~TokenStore();
    TokenStore(const TokenStore&) = delete;
    TokenStore& operator=(const TokenStore&) = delete;

    const std::string& directory() const { return m_strDirectory; }
    std::string path() const;

    Files files() const;
    void setFiles(const Files& files) const;

    // What the next program finds, which rolls back a half change: STATE_MISSING, STATE_NO_TABLE, or a sorted
    // line for each token. Ids that the library generated read "new"; times read "past", "new" or "far". A
    // damaged database reads "corrupt: " and why.
    std::string state() const;

    // Run SQL without the library. The rows come as sorted lines.
    std::string rows(const std::string& strSelect) const;
    void run(const std::string& strSql) const;

    // A connection without the library. It does not use the default VFS, which may be the one with faults.
    Database open() const;

private:
    std::string m_strDirectory;
};

const std::string STATE_MISSING = "no file";
const std::string STATE_NO_TABLE = "no table";

#endif
