// The operations on tokens, in a transaction.

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

    // The tokens whose fields equal the filter's.
    Json::Value tokens(const Json::Value& jFilter);

    // The tokens that a condition in SQL selects, one by one, with the columns behind them that are asked
    // for (", COLUMN, ...").
    typedef std::function<void(Json::Value jToken, const Row& columns)> TakeToken;
    void eachToken(const std::string& strWhere, const std::string& strColumns, const TakeToken& take);

    // How many tokens a condition in SQL selects; and the id of each, which is nothing for NULL.
    uint64_t count(const std::string& strWhere);
    void eachTid(const std::string& strWhere,
                 const std::function<void(const std::optional<std::string>& strTid)>& take);

    // Whether rows have numbers: those of a table that a stranger made need not.
    bool hasRowIds();

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

private:
    std::string equation(std::string strName, Json::Value jValue);
    template <typename Use>
    auto withTokens(Use use);
};

} // namespace tool

#endif
