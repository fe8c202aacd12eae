// The operations on tokens, within a transaction.

#ifndef TOOLS_STORE_H
#define TOOLS_STORE_H

#include <json/value.h>

#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <vector>

#include "Transaction.h"
#include "grant/Tokens.h"

namespace tool {

// Members throw Failure.
class Store : public Transaction {
public:
    using Transaction::Transaction;

    // Calls take() with the values of SQL expressions, for each token that a condition in SQL selects.
    void select(const std::string& strExpressions, const std::string& strWhere,
                const std::function<void(Row)>& take);

    // Calls take() with each token that a condition in SQL selects, and with the columns that strColumns adds
    // to the query (", COLUMN, ...").
    typedef std::function<void(Json::Value jToken, const Row& columns)> TakeToken;
    void eachToken(const std::string& strWhere, const std::string& strColumns, const TakeToken& take);

    // Counts the tokens that a condition in SQL selects; or calls take() with the id of each, nothing for
    // NULL.
    uint64_t count(const std::string& strWhere);
    void eachTid(const std::string& strWhere,
                 const std::function<void(const std::optional<std::string>& strTid)>& take);

    // Whether the rows have numbers. Not those of a table that another program made WITHOUT ROWID or with a
    // column of that name, or of a view in its place.
    bool hasRowIds();

    // Whether there is a token with this id.
    bool has(const std::string& strTid);

    // The token with this id.
    std::optional<Json::Value> find(const std::string& strTid);

    // The token with this id, or the one whose id begins with this prefix of at least PREFIX_MIN characters.
    // Fails with a usage failure if the prefix is too short or fits several tokens.
    std::optional<Json::Value> findByPrefix(const std::string& strTid);

    // The token as a grant reads it; and spends one use of it, as a grant does.
    std::optional<grant::Token> token(const std::string& strTid);
    void spend(const grant::Token& token);

    // Writes a new token.
    void create(const Json::Value& jToken);

    // Writes expressions in SQL, "FIELD = EXPRESSION, ...", to the tokens that a condition in SQL selects.
    void change(const std::string& strAssignments, const std::string& strWhere);

    // Writes the members of jChange to the fields of a token. All other fields stay as they are, even if they
    // cannot be read.
    void update(const std::string& strTid, const Json::Value& jChange);

    // Copies a token, exact to the byte, with another id and time of creation.
    void copy(const std::string& strTid, const std::string& strNewTid, int64_t nCreateTime);

    // Deletes the tokens that a condition in SQL selects, or those with these ids. Returns how many were
    // deleted.
    uint64_t remove(const std::string& strWhere);
    uint64_t removeTid(const std::string& strTid);
    uint64_t removeTids(const std::vector<std::string>& strTids);

    // These two return what is damaged among the tokens that a condition in SQL selects, or "": whether each
    // can be read; and whether the index of the ids, which belongs to the primary key, leads to each.
    std::string damageOfRows(const std::string& strWhere);
    std::string damageOfIndex(const std::string& strWhere);

    // Deletes the expired tokens, as the library does. Returns how many were deleted.
    uint64_t purge();

private:
    std::string equation(std::string strName, Json::Value jValue);
    template <typename Use>
    auto withTokens(Use use);
};

} // namespace tool

#endif
