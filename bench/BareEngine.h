// The SQLite calls that the library must make, and nothing else: the baseline for the library's own cost.
// Same calls, same statement texts, and copies of the columns of a row; no checks, no log, no JSON.
//
// A failure throws std::runtime_error.

#ifndef VEMO_ACCESS_TOKEN_BARE_ENGINE_H
#define VEMO_ACCESS_TOKEN_BARE_ENGINE_H

#include <string>

struct sqlite3;

struct BareToken {
    std::string strTid;
    std::string strBindSid;
    long long nUid;
    long long nDeadline;
    long long nCount;
    long long nCreateTime;
    std::string strFunction;
    std::string strWebapiAllow;
    std::string strExtra;
};

// One connection, from construction to destruction.
class BareEngine {
public:
    BareEngine();
    ~BareEngine();
    BareEngine(const BareEngine&) = delete;
    BareEngine& operator=(const BareEngine&) = delete;

    // Runs one statement text; the callback is sqlite3_exec's.
    void run(const char* szSql, int (*callback)(void*, int, char**, char**) = nullptr, void* arg = nullptr);

    void purge();
    void create(const BareToken& token);
    void save(const BareToken& token); // over the token of that tid
    BareToken read(const std::string& strTid);
    void deleteWhere(const char* szField, const std::string& strValue);

    // Spends one use, as a grant does.
    void grant(const std::string& strTid);

private:
    void write(const char* szPrefix, const BareToken& token);

    sqlite3* m_pDb;
};

#endif
