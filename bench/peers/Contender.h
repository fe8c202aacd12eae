// One way to store and grant tokens. Several are compared. A failure throws std::runtime_error.

#ifndef VEMO_ACCESS_TOKEN_BENCH_CONTENDER_H
#define VEMO_ACCESS_TOKEN_BENCH_CONTENDER_H

#include <functional>
#include <string>

#include "BareEngine.h"

const long long REFUSED = -1;

// It has the tokens 0 to TOKENS - 1 (tokenOf()). At most one for this library and one for each server may
// exist at a time.
struct Contender {
    std::function<void(const BareToken& token)> create;

    // Whether the bearer of the token may call the method of the web API: looks the token up, refuses if it
    // has expired or does not list the method, spends one use, deletes the token with the last, and gets the
    // whole record. Returns the record's count, which after the last use is that before it; or REFUSED.
    std::function<long long(std::string& strTid, const char* szWebapi, const char* szMethod)> grant;
};

const int TOKENS = 1000;

// With a second process: each call opens and closes the file while that process has it open.
enum class Connection { PerCall, PerCallBesideAnother, Held };

Contender makePostgresql(const char* szServer, Connection connection);

#endif
