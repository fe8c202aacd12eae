// The calls that many processes make at once, on tokens with names, and what the store holds afterwards.

#ifndef TESTS_STORM_CALLS_H
#define TESTS_STORM_CALLS_H

#include <cstdint>
#include <map>
#include <string>

#include "TokenStore.h"

enum class Calls { Plain, Serialised };

// The uses left, by the name of the token.
typedef std::map<std::string, int64_t> Tokens;

class StormCalls {
public:
    explicit StormCalls(Calls calls) : m_calls(calls) {}

    // The results of the exported functions.
    int create(const std::string& strName) const;
    int grant(const std::string& strName) const;
    int revoke(const std::string& strName) const;

    // Makes a new store with these tokens.
    void prepare(const Tokens& tokens) const;

    // The tokens in the store, which must be sound. None if there is no table.
    Tokens tokens() const;

    const TokenStore& store() const { return m_store; }

    // The lock file of serialised calls, beside the database.
    std::string lockFile() const { return m_store.directory() + "/calls.lock"; }

private:
    template <typename Call>
    int run(Call call) const;

    const Calls m_calls;
    const TokenStore m_store;
};

#endif
