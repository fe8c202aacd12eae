// The rule of a grant, for programs with their own connections: whether a token opens a call, and what is
// left of the token afterwards. Except for the library itself, the rule is only here. It is exactly the
// library's rule, with statements that are prepared once.
//
// The caller is responsible for transactions, locks and the purge. Reading needs no special transaction.
// Spending needs one that nobody else can write in (BEGIN IMMEDIATE), and that the token was read in.

#ifndef GRANT_TOKENS_H
#define GRANT_TOKENS_H

#include <json/value.h>

#include <cstdint>
#include <optional>
#include <stdexcept>
#include <string>

struct sqlite3;
struct sqlite3_stmt;

namespace grant {

// The condition for expired tokens, as in the purge. Use no other: it decides as the library does even if a
// deadline is not a number.
extern const char* const SQL_EXPIRED;

// The statement that deletes the expired tokens.
extern const char* const SQL_PURGE;

// SQLite's error for a statement that failed.
class Error : public std::runtime_error {
public:
    Error(int nCode, const char* szReason) : std::runtime_error(szReason), m_nCode(nCode) {}
    int code() const { return m_nCode; } // an extended result code

private:
    const int m_nCode;
};

// A prepared statement. The connection must outlive it. Members throw Error or std::bad_alloc.
class Statement {
public:
    Statement(sqlite3* pDb, const char* szSql);
    ~Statement();
    Statement(const Statement&) = delete;
    Statement& operator=(const Statement&) = delete;

    // Sets a parameter; the first is 1. A text ends at its first NUL, as in the library's statements, and
    // must live until the statement is reset.
    Statement& bind(int nParameter, const std::string& strText);
    Statement& bind(int nParameter, int64_t nNumber);

    // Runs the statement to its next row. Returns false after the last row, or if it has no rows. After that,
    // or after an error, the statement has ended and can be run again.
    bool step();

    // Ends the statement earlier.
    void reset();

    // A column of the row, as the library reads it; the first is 0. The text ends at its first NUL, and is
    // null for NULL. It is valid until the next step.
    const char* text(int nColumn) const;
    int64_t number(int nColumn) const; // at the beginning of the text, not NULL; 0 if there is none

private:
    [[noreturn]] void fail();

    sqlite3* const m_pDb;
    sqlite3_stmt* m_pStatement = nullptr;
};

// A token as its row holds it.
struct Token {
    std::string strTid;
    std::string strSession;
    int64_t nUid = 0;
    int64_t nDeadline = 0;
    int64_t nCount = 0;
    int64_t nCreateTime = 0;
    std::string strFunction;
    Json::Value jAllow; // an object with the one member webapi_allow
    Json::Value jExtra;
    bool blExpired = false;
    bool blReadable = true; // false if a column is NULL: such a token is never granted

    // The record as JSON on one line, without its tid.
    std::string recordWithoutTid() const;
};

// Whether a token opens a call, and why not.
enum class Verdict : uint8_t { Granted, Unknown, Expired, ApiNotListed, MethodNotListed, Malformed };

// Spends nothing. strApi must not be empty; an empty strMethod asks for the API alone. token is only read.
// The library logs malformed tokens: whoever must not wait for a log must discard its lines.
Verdict judge(Token& token, const std::string& strApi, const std::string& strMethod);

// What a grant leaves of a token: nothing after the last use (a count of 0 is one last use, like 1), one use
// less, or all of an unlimited token.
enum class Left : uint8_t { Nothing, Less, All };
Left left(int64_t nCount);

// The tokens in a database. The connection must outlive this object. Members throw Error or std::bad_alloc.
class Tokens {
public:
    explicit Tokens(sqlite3* pDb);

    std::optional<Token> find(const std::string& strTid);

    // Writes the number of uses that are left.
    void setCount(const std::string& strTid, int64_t nCount);

    // Spends one use of a token that find() has returned.
    void spend(const Token& token);

    // Deletes a token.
    void remove(const std::string& strTid);

private:
    Statement m_find;
    Statement m_setCount;
    Statement m_remove;
};

} // namespace grant

#endif
