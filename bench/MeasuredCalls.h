// The measured operations: each exported function, and some calls of an object that stays open.

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
    std::unique_ptr<AccessTokenApi> pApi; // the object that stays open
};

struct Operation {
    const char* szName;
    void (*prepare)(Call&); // makes what the operation needs; not measured
    int (*run)(Call&);      // null for the control, which runs the bare engine twice
    int nExpected;          // what run returns
    void (*runBare)(Call&); // the calls of SQLite that run must make; null if none, or if pApi is used
};

const std::vector<Operation>& operations();

// Deletes the tokens that operations and their preparation leave behind.
void removeFreshTokens();

#endif
