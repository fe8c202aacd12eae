// A store of three tokens on pages of 512 bytes, small enough to damage each of its bytes, and the calls that
// meet it then.

#ifndef TESTS_SMALL_STORE_H
#define TESTS_SMALL_STORE_H

#include <string>
#include <vector>

#include "TokenStore.h"

const std::string DATABASE = "vemo-access-token.db";

// Makes the store, and returns the bytes of its database. Before the table is made, strSettings are run.
std::string makeSmallStore(const TokenStore& store, const std::string& strSettings = "");

// What a call gives: its result, with the first line of the log up to errno or a record when it failed, or
// the exception of the JSON library that it lets out. Others pass.
struct Answer {
    int nResult; // -1 as well for an exception
    bool blThrown;
    std::string strText;   // "0", "-1: LINE" or "throws: WHAT"
    std::string strListed; // by a listing
};

// A listing of the three, a grant to "known-three", a creation, a deletion of "known-one".
const std::vector<std::string> CALLS = {"listing", "grant", "creation", "deletion"};
Answer call(const std::string& strName);

// An expression over the row of "known-three" as SQL text, "gone" when there is none.
std::string valueOfThree(const TokenStore& store, const std::string& strExpression);

#endif
