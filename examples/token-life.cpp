// Shows the life of access tokens. Each step shows a call of the library, its log lines, its result, and
// the table after it. Ends with status 1 when a result is not the expected one. Tokens of other programs
// are neither shown nor used.

#include <AccessTokenApi.h>
#include <AccessTokenUtil.h>
#include <AccessTokens.h>
#include <json/json.h>
#include <vemo-access-token.h>

#include <cstdio>
#include <cstdlib>
#include <ctime>
#include <memory>
#include <string>

namespace {

int g_nStep = 0;
bool g_blAsExpected = true;

Json::Value json(const std::string& strText)
{
    const std::unique_ptr<Json::CharReader> pReader(Json::CharReaderBuilder().newCharReader());
    Json::Value jValue;
    pReader->parse(strText.data(), strText.data() + strText.size(), &jValue, nullptr);
    return jValue;
}

std::string text(const Json::Value& jValue)
{
    Json::StreamWriterBuilder builder;
    builder["indentation"] = "";
    return Json::writeString(builder, jValue);
}

// An id is a credential, so only its start is shown.
std::string shortened(const std::string& strTid)
{
    return strTid.substr(0, 8) + "...";
}

std::string lifetime(const Json::Value& jToken)
{
    const long nLeft = static_cast<long>(jToken["deadline"].asInt64()) - time(nullptr);
    return 0 > nLeft ? "expired" : "in " + std::to_string(nLeft) + " s";
}

// Shows the tokens of this program. An object of the service reads them, because it purges nothing.
void showTable()
{
    AccessTokenApi api;
    Json::Value jFilter;
    Json::Value jTokens(Json::arrayValue);
    bool blEmpty = true;

    if (0 > api.tokenList(jFilter, jTokens)) {
        printf("   The table cannot be read.\n");
        g_blAsExpected = false;
        return;
    }
    printf("   The table:");
    for (const Json::Value& jToken : jTokens) {
        if (0 != jToken["function"].asString().rfind("demo-", 0)) {
            continue;
        }
        if (blEmpty) {
            printf("\n     %-12s%-14s%-13s%-5s%-7s%-12s%s", "tid", "function", "bind_sid", "uid", "count",
                   "deadline", "webapi_allow");
            blEmpty = false;
        }
        printf("\n     %-12s%-14s%-13s%-5s%-7s%-12s%s", shortened(jToken["tid"].asString()).c_str(),
               jToken["function"].asString().c_str(), jToken["bind_sid"].asString().c_str(),
               jToken["uid"].asString().c_str(), jToken["count"].asString().c_str(), lifetime(jToken).c_str(),
               text(jToken["webapi_allow"]).c_str());
    }
    printf("%s\n\n", blEmpty ? " no tokens" : "");
}

void step(const char* szTitle)
{
    printf("%d. %s\n\n", ++g_nStep, szTitle);
}

void announce(const char* szCall)
{
    printf("   %s\n", szCall);
}

void conclude(int nExpected, int nResult)
{
    printf("   -> %d%s\n", nResult, nExpected == nResult ? "" : "   NOT WHAT THIS STEP SHOWS");
    g_blAsExpected = g_blAsExpected && nExpected == nResult;
}

// Prints a call as it is written here, runs it and prints its result.
#define CALL(expected, call)                                                                                 \
    do {                                                                                                     \
        announce(#call);                                                                                     \
        conclude(expected, call);                                                                            \
    } while (0)

void createWithGeneratedId(std::string& strTid)
{
    unsigned int uid = 0;
    std::string strFunction = "demo-share";
    Json::Value jOption = json(R"({"count": 2, "webapi_allow": {"Demo.File": {"method": ["get", "list"]}}})");

    step("A token for user 0: two uses of the methods get and list of the web API Demo.File.\n"
         "   The library makes the id; without a deadline the token lives for a day.");
    printf("   jOption = %s\n", text(jOption).c_str());
    CALL(0, VemoAccessTokenCreate(uid, strFunction, jOption, strTid));
    printf("   strTid = %s (%zu characters)\n", shortened(strTid).c_str(), strTid.size());
    showTable();
}

void refuse(std::string& strTid)
{
    Json::Value jToken;

    step("A method and an API that the token does not list are refused, and spend no use. (The log lines\n"
         "   of the library are between call and result.)");
    CALL(-1, VemoAccessTokenGrantEx(strTid, "Demo.File", "delete", jToken));
    CALL(-1, VemoAccessTokenGrantEx(strTid, "Demo.User", "get", jToken));
    printf("   A log line shows where in the library a check failed, the last error of the system,\n"
           "   which may have another cause, and the check itself. The line of\n"
           "   \"0 > (err = checkPermission(...))\" is the refusal: the token does not list this call.\n");
    showTable();
}

void grantToTheLastUse(std::string& strTid)
{
    Json::Value jToken;
    char szUser[256] = "";

    step("The first grant spends one use and names the token's user.");
    CALL(0, VemoAccessTokenGrant(strTid, "Demo.File", "get", szUser, sizeof(szUser)));
    printf("   szUser = %s\n", szUser);
    showTable();

    step("The second grant spends the last use, and the token is deleted. A third one is refused.");
    CALL(0, VemoAccessTokenGrantEx(strTid, "Demo.File", "list", jToken));
    printf("   jToken[\"function\"] = %s\n", jToken["function"].asString().c_str());
    CALL(-1, VemoAccessTokenGrantEx(strTid, "Demo.File", "list", jToken));
    showTable();
}

void createUnlimited(std::string& strTid)
{
    unsigned int uid = 0;
    std::string strFunction = "demo-sync";
    Json::Value jToken;
    Json::Value jOption = json(R"({"count": -1, "deadline": 3600, "bind_sid": "demo-login-1",)"
                               R"( "webapi_allow": {"Demo.Sync": {"method": ["pull"]}}})");

    step("An id of our own, and a token of unlimited uses for one hour, bound to a login session.");
    printf("   jOption = %s\n", text(jOption).c_str());
    CALL(0, VemoAccessTokenGenerate(strTid));
    CALL(0, VemoAccessTokenCreateByTid(uid, strFunction, jOption, strTid));
    CALL(0, VemoAccessTokenGrantEx(strTid, "Demo.Sync", "pull", jToken));
    CALL(0, VemoAccessTokenGrantEx(strTid, "Demo.Sync", "pull", jToken));
    CALL(0, VemoAccessTokenGrantEx(strTid, "Demo.Sync", "pull", jToken));
    showTable();
}

void purge()
{
    unsigned int uid = 0;
    std::string strFunction = "demo-expired";
    std::string strTid;
    std::string strUnknown = "unknown";
    Json::Value jOption = json(R"({"deadline": -1})");

    step("A token with a lifetime of -1 seconds has already expired. It stays in the table until the next\n"
         "   call purges it. Here that is a call that deletes a token that does not exist.");
    printf("   jOption = %s\n", text(jOption).c_str());
    CALL(0, VemoAccessTokenCreate(uid, strFunction, jOption, strTid));
    showTable();
    CALL(0, VemoAccessTokenDeleteByTid(strUnknown));
    showTable();
}

void deleteTokens()
{
    unsigned int uid = 0;
    std::string strFunction = "demo-share";
    std::string strTid;
    Json::Value jOption = json(R"({"bind_sid": "demo-login-2"})");

    step("Two more tokens; then the tokens of the first session are deleted; then all of one purpose.");
    CALL(0, VemoAccessTokenCreate(uid, strFunction, jOption, strTid));
    CALL(0, VemoAccessTokenCreate(uid, strFunction, jOption, strTid));
    showTable();
    CALL(1, VemoAccessTokenDeleteByBindSid("demo-login-1"));
    showTable();
    CALL(2, VemoAccessTokenDeleteByFunction(strFunction));
    showTable();
}

void withTheClass()
{
    typedef AccessTokens::Answer Answer;
    const AccessTokens tokens;
    Json::Value jToken;
    Json::Value jOption = json(R"({"webapi_allow": {"Demo.File": {"method": ["get"]}}})");

    step("The same in C++17, with the class AccessTokens: it distinguishes refusals from failures, and\n"
         "   takes the lock of all programs for each call.");
    const std::string strTid = tokens.create(0, "demo-class", jOption);
    CALL(true, Answer::Refused == tokens.grant(strTid, "Demo.File", "delete"));
    CALL(true, Answer::Granted == tokens.grant(strTid, "Demo.File", "get", &jToken));
    CALL(true, Answer::Refused == tokens.grant(strTid, "Demo.File", "get"));
    CALL(false, tokens.revoke(strTid));
    showTable();
}

} // namespace

int main()
{
    std::string strTid;

    VEMO_ACCESS_TOKEN::logToStdout(true);
    createWithGeneratedId(strTid);
    refuse(strTid);
    grantToTheLastUse(strTid);
    createUnlimited(strTid);
    purge();
    deleteTokens();
    withTheClass();
    return g_blAsExpected ? EXIT_SUCCESS : EXIT_FAILURE;
}
