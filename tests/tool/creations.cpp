// A program that runs beside the tool: creates a token each 20 ms until its standard input ends, and prints
// how many it was to create, and how many milliseconds the longest call took. Their purpose is "beside-PID".

#include <json/value.h>
#include <poll.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <string>

#include "vemo-access-token.h"

int main()
{
    typedef std::chrono::steady_clock Clock;
    struct pollfd end = {0, POLLIN, 0};
    int nCalls = 0;
    Clock::duration longest{};
    const std::string strFunction = "beside-" + std::to_string(getpid());
    while (0 == poll(&end, 1, 20)) {
        std::string strTid = strFunction + "-" + std::to_string(++nCalls) + "-";
        strTid.resize(VEMO_ATOKEN_LENGTH_MIN, 'x');
        unsigned int uid = 0;
        std::string strPurpose = strFunction;
        Json::Value jOption(Json::objectValue);
        const auto start = Clock::now();
        // A call that had to wait reports failure.
        VemoAccessTokenCreateByTid(uid, strPurpose, jOption, strTid);
        longest = std::max(longest, Clock::now() - start);
    }
    printf("%d %lld\n", nCalls,
           static_cast<long long>(std::chrono::duration_cast<std::chrono::milliseconds>(longest).count()));
}
