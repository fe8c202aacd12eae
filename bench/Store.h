// A database of the benchmark's own, filled with tokens such as programs make them.
//
// The database path is redirected (examples/redirect.cpp), for the library and the bare engine alike.
// A failure throws.

#ifndef VEMO_ACCESS_TOKEN_BENCH_STORE_H
#define VEMO_ACCESS_TOKEN_BENCH_STORE_H

#include <string>

#include "BareEngine.h"

enum class Place { Memory, Disk };

const char* nameOf(Place place);

// Stands for as long as the object.
class Store {
public:
    // Makes it, and uses it.
    explicit Store(Place place);
    ~Store();
    Store(const Store&) = delete;
    Store& operator=(const Store&) = delete;

    // Lets the library and the bare engine open this store from now on.
    void use() const;

    // Adds tokens until there are nTokens.
    void grow(int nTokens);

    // What an administrator may do from outside.
    void makeIndexes();
    void useWriteAheadLog();

    const std::string& directory() const { return m_strDirectory; }

private:
    std::string m_strDirectory;
    int m_nTokens;
};

// The token of that number: its id and texts depend on nothing else. A store of n tokens holds those
// of 0 to n - 1. Each has many uses left and two methods of one API (webapi() and
// method()), and expires in a day, ten tokens a second.
BareToken tokenOf(int nNumber);

const int FRESH = 100000000; // the number of a token that no store holds by itself

// What the tokens allow, among others.
const char* webapi();
const char* method();

#endif
