// The token database through the library's store, in transactions of the tool's own.
//
// The library's operations report failure when they had to wait for a lock, although they took effect.
// Here all waiting happens where a transaction begins and where it is committed, and there the result
// is exact. So what a command says is what happened.
//
// All members throw Failure. A transaction that is not committed is undone when the object ends.

#ifndef TOOLS_STORE_H
#define TOOLS_STORE_H

#include <json/value.h>

#include <chrono>
#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <vector>

#include "Audit.h"
#include "CallLock.h"
#include "Sql.h"
#include "grant/Tokens.h"
#include "internal/AccessTokenDbApi.h"

namespace tool {

class Store {
public:
    enum class Access {
        Glance, // nothing changes meanwhile
        Read,   // the same, and what is seen outlasts a power cut
        Locked, // no transaction, but the lock that programs take for a call
        Write,  // nobody else writes meanwhile; with that lock
    };

    // What to do where there is no database.
    enum class Missing { Fail, Make };

    explicit Store(Access access, Missing missing = Missing::Fail);

    // Whether the file was missing, and was made.
    bool hasMadeFile() const { return m_blMadeFile; }

    // Waits, for 5 s at most, until the change can be written. It outlasts a power cut. Others that take the
    // lock can change tokens when this object is gone.
    void commit();

    // The tokens whose fields equal the filter's.
    Json::Value tokens(const Json::Value& jFilter);

    // The tokens that a condition in SQL selects, one by one, with the columns behind them that are asked
    // for (", COLUMN, ...").
    typedef std::function<void(Json::Value jToken, const Row& columns)> TakeToken;
    void eachToken(const std::string& strWhere, const std::string& strColumns, const TakeToken& take);

    // Whether there is a token of an id.
    bool has(const std::string& strTid);

    // The token of an id.
    std::optional<Json::Value> find(const std::string& strTid);

    // The token of an id, or the one whose id begins with these 8 or more characters. Fails with a
    // usage failure when the prefix is too short or fits several.
    std::optional<Json::Value> findByPrefix(const std::string& strTid);

    // The token of an id as a grant sees it; and the use that a grant spends.
    std::optional<grant::Token> token(const std::string& strTid);
    void spend(const grant::Token& token);

    // Writes a new token.
    void create(const Json::Value& jToken);

    // Writes those fields of a token that are members of jChange. The others stay as they are, even if
    // they could not be read.
    void update(const std::string& strTid, const Json::Value& jChange);

    // Makes a copy of a token under another id and time of creation, exact to the byte.
    void copy(const std::string& strTid, const std::string& strNewTid, int64_t nCreateTime);

    // Deletes the tokens that a condition in SQL selects, those of these ids, or that of one. Returns how
    // many there were.
    uint64_t remove(const std::string& strWhere);
    uint64_t removeTid(const std::string& strTid);
    uint64_t removeTids(const std::vector<std::string>& strTids);

    // Deletes the expired tokens, as the library does. Returns how many there were.
    uint64_t purge();

    // What there is under the name of the table of tokens: "table", "view" or "virtual table"; "" for
    // nothing.
    std::string tableKind();

    // Whether there is a table of tokens, and fails where something else is in its place.
    bool hasTable();

    // Makes the table where it is missing, and returns whether it was. Without a transaction.
    bool makeTable();

    // Any other statement.
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

private:
    void beginWriting(Missing missing);
    void lock();
    [[noreturn]] void fail(const std::string& strErr);
    std::string run(const std::string& strSql, const std::function<void(Row)>& take);
    void require(int nResult);
    bool holdsNull();
    std::string equation(std::string strName, Json::Value jValue);
    template <typename Use>
    auto withTokens(Use use);

    audit::Teller m_teller; // the last that goes: the database is closed, and nobody waits for the lock
    const Access m_access;
    std::optional<CallLock> m_lock;
    bool m_blMadeFile = false;
    bool m_blCommitting = false;
    AccessTokenDbApi m_db;
};

} // namespace tool

#endif
