// The operations into which faults are injected, and the store that they start from.

#ifndef TESTS_FAULT_OPERATIONS_H
#define TESTS_FAULT_OPERATIONS_H

#include <functional>
#include <string>
#include <vector>

#include "TokenStore.h"

struct Operation {
    const char* szName;
    bool blCreatesStore;      // starts without a database file
    bool blPurges;            // deletes expired tokens first, and goes on when that fails
    std::function<int()> run; // the library's result; for a listing, the number of tokens
};

// Twelve: creating the store, and each way in which the library changes it or reads it.
const std::vector<Operation>& operations();

// Some of these.
inline const Operation& FIRST_CREATION = operations()[0];
inline const Operation& CREATION = operations()[1];
inline const Operation& GIVEN_CREATION = operations()[2];
inline const Operation& GRANT = operations()[3];
inline const Operation& DELETION = operations()[5];
inline const Operation& LISTING = operations()[9];
inline const Operation& DELETION_OF_ALL = operations()[11];

// Makes the store that the operation starts from. insertExpired() adds the expired tokens that it has.
void prepareStore(const TokenStore& store, const Operation& operation);
void insertExpired(const TokenStore& store);

// For stores of other tokens. makeTable() runs strSettings and makes an empty table. insertToken() adds a
// token with these values in the columns from bind_sid to function; it allows the method "get" of
// Example.Api.
void makeTable(const TokenStore& store, const std::string& strSettings = "");
void insertToken(const TokenStore& store, const std::string& strName, const std::string& strColumns);

// Makes a store of three tokens on pages of 512 bytes, so small that each byte can be damaged in turn. The
// listing shows all three; GIVEN_CREATION, GRANT and DELETION use "known-given", "known-three" and
// "known-one". Returns the bytes of its database.
std::string makeSmallStore(const TokenStore& store, const std::string& strSettings = "");

// Runs an operation on a damaged store. Returns its result ("0"); after a failure also the start of its first
// log line ("-1: LINE"); or the JSON library's exception ("throws: WHAT"). Other exceptions pass through.
std::string answerOf(const Operation& operation);

#endif
