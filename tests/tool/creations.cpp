// A program that runs beside the tool: creates a token each so many milliseconds until its standard input
// ends, and prints how many it was to create, how many of them exist, and how many milliseconds the longest
// call took.
//
// usage: creations MILLISECONDS

#include <json/value.h>
#include <poll.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <string>

#include "internal/AccessTokenDbApi.h"
#include "vemo-access-token.h"

int main(int argc, char** argv)
{
    typedef std::chrono::steady_clock Clock;
    const int nEach = argc > 1 ? atoi(argv[1]) : 100;
    struct pollfd end = {0, POLLIN, 0};
    int nCalls = 0;
    Clock::duration longest{};
    const std::string strFunction = "beside-" + std::to_string(getpid());
    while (0 == poll(&end, 1, nEach)) {
        std::string strTid = strFunction + "-" + std::to_string(++nCalls) + "-";
        strTid.resize(VEMO_ATOKEN_LENGTH_MIN, 'x');
        unsigned int uid = 0;
        std::string strPurpose = strFunction;
        Json::Value jOption(Json::objectValue);
        const auto start = Clock::now();
        VemoAccessTokenCreateByTid(uid, strPurpose, jOption,
                                   strTid); // a call that had to wait reports failure
        longest = std::max(longest, Clock::now() - start);
    }
    AccessTokenDbApi db;
    Json::Value jFilter;
    jFilter["function"] = strFunction;
    Json::Value jTokens(Json::arrayValue);
    db.tokenGet(jFilter, jTokens);
    printf("%d %u %lld\n", nCalls, jTokens.size(),
           static_cast<long long>(std::chrono::duration_cast<std::chrono::milliseconds>(longest).count()));
    return EXIT_SUCCESS;
}
