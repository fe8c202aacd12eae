// Clients of a server in a closed loop: each sends a request, waits for the whole reply, and sends the next.
// All run in one thread, which needs much less time than a server.

#ifndef VEMO_ACCESS_TOKEN_BENCH_LOAD_H
#define VEMO_ACCESS_TOKEN_BENCH_LOAD_H

#include <cstddef>
#include <string>
#include <vector>

#include "Samples.h"

struct Load {
    std::string strPath;          // of a Unix socket
    std::string strBegin, strEnd; // of the replies, which must all grant
    std::vector<std::string> strRequests;
};

struct Loaded {
    long long nReplies = 0;
    double dSeconds = 0;
    Samples took; // µs
};

// Runs the clients, and waits for the last replies. The server may need some seconds before it listens.
// Throws std::runtime_error when a connection fails, or where a reply is not as expected.
Loaded run(const Load& load, size_t nClients, double dSeconds);

#endif
