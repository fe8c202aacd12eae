// A store of three tokens on pages of 512 bytes, so small that each byte can be damaged in turn.

#ifndef TESTS_SMALL_STORE_H
#define TESTS_SMALL_STORE_H

#include <json/json.h>

#include <algorithm>
#include <string>

#include "Operations.h"
#include "ProcessState.h"

// Makes the store, and returns the bytes of its database. strSettings run before the table is made.
inline std::string makeSmallStore(const TokenStore& store, const std::string& strSettings = "")
{
    makeTable(store, "PRAGMA page_size = 512;" + strSettings);
    insertToken(store, "one", "'',0,4102444800,1,1,'VPN'");
    insertToken(store, "three", "'session',0,4102444800,3,1,'VPN'");
    insertToken(store, "expired", "'" + std::string(300, 'e') + "',0,1,5,1,'VPN'"); // over two pages
    return store.files().at(DATABASE);
}

// The operations that are run on the damaged store. The listing shows all three tokens; the others use
// "known-three", "known-given" and "known-one".
const char* const LISTING = "listing";
const char* const GRANT = "grant of one use of three";
const char* const CREATION = "creation under a given id";
const char* const DELETION = "deletion by id";

// Runs an operation. Returns its result ("0"); after a failure also the start of its first log line
// ("-1: LINE"); or the JSON library's exception ("throws: WHAT"). Other exceptions pass through.
inline std::string call(const char* szOperation)
{
    Log::clear();
    try {
        const int nResult = operationNamed(szOperation).run();
        const std::string strLine = Log::firstLine();
        const size_t nDetails = std::min(strLine.find(", err="), strLine.find(", jTokenParam="));
        return std::to_string(nResult) + (0 > nResult ? ": " + strLine.substr(0, nDetails) : "");
    } catch (const Json::Exception& exception) {
        return std::string("throws: ") + exception.what();
    }
}

#endif
