// A store of three tokens on pages of 512 bytes, small enough to damage each of its bytes, and the calls that
// meet it.

#ifndef TESTS_SMALL_STORE_H
#define TESTS_SMALL_STORE_H

#include <string>

#include "TokenStore.h"

// Makes the store, and returns the bytes of its database. Before the table is made, strSettings are run.
std::string makeSmallStore(const TokenStore& store, const std::string& strSettings = "");

// Of all operations, these read or change what is damaged. The listing shows all three tokens, the grant is
// to "known-three", and the deletion of "known-one".
const char* const LISTING = "listing";
const char* const GRANT = "grant of one use of three";
const char* const CREATION = "creation under a given id";
const char* const DELETION = "deletion by id";

// What an operation answers: its result ("0"), if it failed with the first line of its log up to errno or a
// record
// ("-1: LINE"), or the exception of the JSON library that it lets out ("throws: WHAT"). Others pass.
std::string call(const std::string& strOperation);

#endif
