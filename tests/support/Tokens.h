// The token of most tests, and the fields that it has.

#ifndef TESTS_TOKENS_H
#define TESTS_TOKENS_H

#include <ctime>

#include "Texts.h"

const time_t NOW = 1700000000; // what the library's clock shows

// A field, and values for tests of it.
struct Field {
    const char* szName;
    int nLine; // in the field list
    const char* szType;
    const char* szColumn;
    Json::Value jDefault; // at the time NOW
    const char* szOther;  // a value that is not the token's own, in JSON
    const char* szWrong;  // one of a wrong type
};

// In the field list's order.
const std::vector<Field>& fields();

// The record of a token: that of most tests, with the members of strChanges (JSON) in place of its own.
Json::Value token(const std::string& strChanges = "{}");

// The same without one member, and as a row of the table.
Json::Value without(const char* szMember, Json::Value jToken = token());
std::string row(const Json::Value& jToken);

// The statement that saves a record: strVerb is INSERT or REPLACE.
std::string saveSql(const std::string& strVerb, const Json::Value& jToken);

// A token id of 127 characters, the fewest that a caller may choose, which starts with strStart.
std::string tid(const std::string& strStart = "");

#endif
