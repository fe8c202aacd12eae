// A store of a test's own: a fresh directory, which the library takes for the real private one.

#ifndef TESTS_TOKEN_STORE_H
#define TESTS_TOKEN_STORE_H

#include <map>
#include <string>

// Contents by name: of the database and, while there is one, of its journal.
typedef std::map<std::string, std::string> Files;

const std::string DATABASE = "vemo-access-token.db";

// The id of a token that tests know by a name, which TokenStore::state() shows.
std::string idOf(const std::string& strName);

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

    // What the file holds, read as its next user would, who rolls back what a crash left: STATE_MISSING,
    // STATE_NO_TABLE, or a line for each token, in the order of their text. Ids that no operation
    // knows beforehand read "new"; instead of a time the line says "past", "new" or "far". A database
    // that is not sound reads "corrupt: " and why.
    std::string state() const;

    // Run SQL behind the library's back. The rows come as lines, in the order of their text.
    std::string rows(const std::string& strSelect) const;
    void run(const std::string& strSql) const;

private:
    std::string m_strDirectory;
};

const std::string STATE_MISSING = "no file";
const std::string STATE_NO_TABLE = "no table";

#endif
