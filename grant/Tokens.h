// The rule of a grant for programs that hold a connection of their own: whether a token opens a call, and
// what is left of it afterwards. Outside of the library, it stands only here. It is the library's rule to the
// letter, with statements that are prepared once.
//
// Transactions, locks and the purge are the caller's. What reads may stand in any transaction; what spends
// needs one that has written nothing yet and that nobody else can write in (BEGIN IMMEDIATE).

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

// Those tokens whose deadline has passed by now, as the purge sees it. Use only this condition: it decides as
// the library does where a deadline is no number.
extern const char* const SQL_EXPIRED;

// The statement that deletes them.
extern const char* const SQL_PURGE;

// What SQLite says of a statement that failed.
class Error : public std::runtime_error {
public:
    Error(int nCode, const char* szReason) : std::runtime_error(szReason), m_nCode(nCode) {}
    int code() const { return m_nCode; } // an extended result code

private:
    const int m_nCode;
};

// A statement of a connection, which must outlive it. Members throw Error, or std::bad_alloc.
class Statement {
public:
    Statement(sqlite3* pDb, const char* szSql);
    ~Statement();
    Statement(const Statement&) = delete;
    Statement& operator=(const Statement&) = delete;

    // Sets a parameter, counted from 1. A text counts up to its first NUL, as in the library's statements,
    // and must live until the statement is reset.
    Statement& bind(int nParameter, const std::string& strText);
    Statement& bind(int nParameter, int64_t nNumber);

    // Runs it to its next row; returns false behind the last, and at once for a statement without rows. Then,
    // and where it fails, it has ended and can be run again.
    bool step();

    // Ends it ahead of that.
    void reset();

    // A column of the row, counted from 0, as the library reads it: text up to the first NUL; null where it
    // is NULL. Valid until the next step.
    const char* text(int nColumn) const;
    int64_t number(int nColumn) const; // of the text's beginning, 0 where it does not begin with a number

private:
    [[noreturn]] void fail();

    sqlite3* const m_pDb;
    sqlite3_stmt* m_pStatement = nullptr;
};

// A token as its row has it.
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
    bool blReadable = true; // false where a column is NULL: nobody is granted such a token

    // The record without its tid, on one line.
    std::string recordWithoutTid() const;
};

// Whether a token opens a call, and why not.
enum class Verdict : uint8_t { Granted, Unknown, Expired, ApiNotListed, MethodNotListed, Malformed };

// strApi is not empty; an empty strMethod asks for the API alone. Spends nothing. The library logs what it
// finds malformed, which is why a gate that must not wait for a log keeps the lines away from it. token is
// only read.
Verdict judge(Token& token, const std::string& strApi, const std::string& strMethod);

// What a grant leaves: nothing of the last use (a count of 0 is one last use, like 1), one use less, or all
// of an unlimited token.
enum class Left : uint8_t { Nothing, Less, All };
Left left(int64_t nCount);

// The tokens of a connection, which must outlive this object. Members throw Error, or std::bad_alloc.
class Tokens {
public:
    explicit Tokens(sqlite3* pDb);

    std::optional<Token> find(const std::string& strTid);

    // Writes how many uses are left.
    void setCount(const std::string& strTid, int64_t nCount);

    // Spends one use, of which token tells how many there are.
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
