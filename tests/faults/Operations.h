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

const Operation& operationNamed(const char* szName);

// Makes the store that the operation starts from.
void prepareStore(const TokenStore& store, const Operation& operation);

// For stores of other tokens. makeTable() makes a store with an empty table, after running strSettings.
// insertToken() adds a token with these values in the columns from bind_sid to function; it allows the method
// "get" of Example.Api.
void makeTable(const TokenStore& store, const std::string& strSettings = "");
void insertToken(const TokenStore& store, const std::string& strName, const std::string& strColumns);

#endif
