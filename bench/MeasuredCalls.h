// The operations that are measured: each exported function, and some calls of an object that is kept.

#ifndef VEMO_ACCESS_TOKEN_BENCH_MEASURED_CALLS_H
#define VEMO_ACCESS_TOKEN_BENCH_MEASURED_CALLS_H

#include <json/value.h>

#include <memory>
#include <string>
#include <vector>

#include "AccessTokenApi.h"
#include "BareEngine.h"

// What an operation works on.
struct Call {
    BareToken token;
    Json::Value jArgument;
    Json::Value jResult;
    std::string strTid;
    char szUser[64];
    std::unique_ptr<AccessTokenApi> pApi; // the held object
};

struct Operation {
    const char* szName;
    void (*prepare)(Call&); // makes what the operation is to find; not measured
    int (*run)(Call&);
    int nExpected;          // what run returns
    void (*runBare)(Call&); // what run must execute; null for a held object, and where that is nothing
};

const std::vector<Operation>& operations();

// Runs the bare engine instead of the library.
const Operation& control();

// Deletes the tokens that operations and their preparation leave behind.
void removeFreshTokens();

#endif
