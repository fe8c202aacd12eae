// Clients of a server in a closed loop: each sends a request, waits for the whole reply, and sends the next.
// All run in one thread, which needs much less time than a server does.

#ifndef VEMO_ACCESS_TOKEN_BENCH_LOAD_H
#define VEMO_ACCESS_TOKEN_BENCH_LOAD_H

#include <cstddef>
#include <cstdint>
#include <functional>
#include <string>
#include <string_view>
#include <vector>

// Connects to a Unix socket. Throws std::runtime_error when that fails.
int connectTo(const std::string& strPath);

// What the client has of a reply so far.
struct Reply {
    size_t cbReply = 0; // the size of the whole reply; 0: more must come
    bool blGranted = false;
};

// Reads the reply at the beginning of the received bytes.
typedef std::function<Reply(std::string_view)> ReplyReader;

Reply readHttpReply(std::string_view strBytes);
Reply readRedisReply(std::string_view strBytes); // an array: granted; nil: refused

struct Load {
    std::string strPath; // of a Unix socket
    std::vector<std::string> strRequests;
    ReplyReader readReply;
    size_t nClients = 1;
    double dSeconds = 1;
};

struct Loaded {
    uint64_t nReplies = 0;
    uint64_t nGranted = 0;
    double dSeconds = 0;
    double dMedian = 0; // s
    double d99th = 0;
};

// Runs the load, and waits for the last replies. Throws std::runtime_error when a connection fails.
Loaded run(const Load& load);

#endif
