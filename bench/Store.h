// A database for a benchmark, with tokens like those that programs make.
//
// The database path is redirected (examples/redirect.cpp), for the library and the bare engine alike.
// A failure throws.

#ifndef VEMO_ACCESS_TOKEN_BENCH_STORE_H
#define VEMO_ACCESS_TOKEN_BENCH_STORE_H

#include <map>
#include <string>

#include "BareEngine.h"

enum class Place { Memory, Disk };

const char* nameOf(Place place);

// Removed with the object.
class Store {
public:
    // Makes a store with the tokens 0 to nTokens - 1, runs the statements of a tuning, and uses the store.
    Store(Place place, int nTokens, const std::string& strTuning = "");
    ~Store();
    Store(const Store&) = delete;
    Store& operator=(const Store&) = delete;

    // Lets the library and the bare engine open this store from now on.
    void use() const;

    const std::string& directory() const { return m_strDirectory; }

private:
    std::string m_strDirectory;
};

// An administrator's tuning from outside: the same as "tune --deadline-only", "tune" and "tune --wal".
const std::string DEADLINE_INDEX = "CREATE INDEX token_deadline ON token (deadline);";
const std::string INDEXES = DEADLINE_INDEX + "CREATE INDEX token_bind_sid ON token (bind_sid);"
                                             "CREATE INDEX token_function ON token (function);";
const std::string WRITE_AHEAD = "PRAGMA journal_mode = WAL;";

// The token of that number; its id and texts depend on the number alone. Each has many uses left and allows
// two methods of one API. The first tokens expire after a day, then ten in each second.
BareToken tokenOf(int nNumber);

// Its fields as texts, by their names.
std::map<std::string, std::string> fieldsOf(const BareToken& token);

const int FRESH = 100000000; // the number of a token that is in no store at first

// An API and a method that the tokens allow.
const char* const WEBAPI = "Example.File";
const char* const METHOD = "list";

#endif
