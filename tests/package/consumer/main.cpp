// A program outside of the library's tree: takes tokens through their life, through the functions, the
// service, the store and the class that it compiles itself. Prints one line, and ends with status 1 where a
// step does not do what it should.

#include <AccessTokenApi.h>
#include <AccessTokenUtil.h>
#include <AccessTokens.h>
#include <internal/AccessTokenDbApi.h>
#include <vemo-access-token.h>

#include <cstdio>
#include <cstdlib>
#include <string>

namespace {

void require(bool blHolds, const char* szStep)
{
    if (!blHolds) {
        fprintf(stderr, "not as it should be: %s\n", szStep);
        exit(EXIT_FAILURE);
    }
}

} // namespace

#define REQUIRE(condition) require(condition, #condition)

int main()
{
    unsigned int uid = 0;
    std::string strFunction = "consumer";
    std::string strTid;
    Json::Value jOption;
    jOption["count"] = 3;
    jOption["webapi_allow"]["Consumer.Api"]["method"].append("get");
    REQUIRE(0 == VemoAccessTokenCreate(uid, strFunction, jOption, strTid));

    char szUser[64] = "";
    REQUIRE(0 == VemoAccessTokenGrant(strTid, "Consumer.Api", "get", szUser, sizeof(szUser)));
    REQUIRE(std::string(szUser) == "root");
    Json::Value jToken;
    REQUIRE(-1 == VemoAccessTokenGrantEx(strTid, "Consumer.Api", "put", jToken));
    {
        AccessTokenApi service;
        Json::Value jChange;
        jChange["count"] = 2;
        REQUIRE(0 == service.tokenUpdateByTid(strTid, jChange));
        REQUIRE(1 == service.tokenGetByTid(strTid, jToken));
        REQUIRE(0 == VEMO_ACCESS_TOKEN::checkJsonType(jToken));
    }
    REQUIRE(0 == VemoAccessTokenGrantEx(strTid, "Consumer.Api", "get", jToken));
    {
        AccessTokenDbApi store;
        REQUIRE(1 == store.tokenGetOne("tid", strTid, jToken));
        REQUIRE(1 == jToken["count"].asInt());
    }
    REQUIRE(1 == VemoAccessTokenDeleteByTid(strTid));
    REQUIRE(0 == VemoAccessTokenDeleteByTid(strTid));

    const AccessTokens tokens;
    const std::string strOther = tokens.create(uid, strFunction, jOption);
    REQUIRE(AccessTokens::Answer::Refused == tokens.grant(strOther, "Consumer.Api", "put"));
    REQUIRE(AccessTokens::Answer::Granted == tokens.grant(strOther, "Consumer.Api", "get"));
    REQUIRE(tokens.revoke(strOther));
    puts("the life of a token: ok");
}
