// A store of three tokens on pages of 512 bytes, so small that each byte can be damaged in turn.

#ifndef TESTS_SMALL_STORE_H
#define TESTS_SMALL_STORE_H

#include <string>

#include "TokenStore.h"

// Makes the store, and returns the bytes of its database. strSettings run before the table is made.
std::string makeSmallStore(const TokenStore& store, const std::string& strSettings = "");

// The operations that are run on the damaged store. The listing shows all three tokens; the others use
// "known-three", "known-given" and "known-one".
const char* const LISTING = "listing";
const char* const GRANT = "grant of one use of three";
const char* const CREATION = "creation under a given id";
const char* const DELETION = "deletion by id";

// Runs an operation. Returns its result ("0"); after a failure also the start of its first log line
// ("-1: LINE"); or the JSON library's exception ("throws: WHAT"). Other exceptions pass through.
std::string call(const std::string& strOperation);

#endif
