// The calls of a storm, on tokens that have names, and what the store says afterwards.

#ifndef TESTS_STORM_CALLS_H
#define TESTS_STORM_CALLS_H

#include <cstdint>
#include <map>
#include <string>
#include <vector>

#include "TokenStore.h"

enum class Calls { Plain, Serialised };

// Uses by the name of the token.
typedef std::map<std::string, int64_t> Tokens;

class StormCalls {
public:
    explicit StormCalls(Calls calls) : m_calls(calls) {}

    // The results of the exported functions.
    int create(const std::string& strName) const;
    int grant(const std::string& strName) const;
    int revoke(const std::string& strName) const;

    // Replaces the store by one with these tokens, or by none.
    void prepare(const Tokens& tokens) const;
    void removeStore() const;

    // The tokens that the store holds, which must be sound; "new" stands for those of other programs.
    Tokens tokens() const;
    bool hasTable() const { return STATE_NO_TABLE != m_store.state(); }

    std::string database() const { return m_store.path(); }

    // Of the serialised calls; stands beside the database.
    std::string lockFile() const { return m_store.directory() + "/calls.lock"; }

private:
    template <typename Call>
    int run(Call call) const;

    const Calls m_calls;
    const TokenStore m_store;
};

// "KIND-PROCESS-ROUND"
std::string nameOf(const char* szKind, int nProcess, int nRound = 0);

// The numbers of processes to try: 1 to 64, and VEMO_TEST_PROCESSES when it is set.
std::vector<int> stormSizes();

// "8 processes, plain, 100 calls"
std::string stormName(int nProcesses, Calls calls, int64_t nCalls);

#endif
