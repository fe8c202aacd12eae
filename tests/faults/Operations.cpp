#include "Operations.h"

#include <algorithm>

#include "AccessTokenApi.h"
#include "ProcessState.h"
#include "internal/AccessTokenDbApi.h"
#include "vemo-access-token.h"

namespace {

Json::Value options()
{
    Json::Value jOption(Json::objectValue);
    jOption["webapi_allow"]["Example.Api"]["method"].append("get");
    jOption["count"] = 2;
    return jOption;
}

std::string g_strFunction = "VPN";
unsigned int g_uid = 0;

// Some tokens on a few pages. One is longer than a page, two have expired.
Files makeStore(const TokenStore& store)
{
    makeTable(store);
    insertToken(store, "one", "'',0,4102444800,1,1,'VPN'");
    insertToken(store, "three", "'',0,4102444800,3,1,'VPN'");
    insertToken(store, "bound", "'session',0,4102444800,-1,1,'VPN'");
    insertToken(store, "mail", "'',0,4102444800,5,1,'Mail'");
    insertToken(store, "large", "'" + std::string(10000, 'l') + "',0,4102444800,5,1,'Large'");
    insertExpired(store);
    return store.files();
}

} // namespace

void makeTable(const TokenStore& store, const std::string& strSettings)
{
    store.setFiles({{DATABASE, ""}});
    std::string strSql;
    AccessTokenDbApi().SqlExpandCreateTable(strSql);
    store.run(strSettings + strSql);
}

void insertToken(const TokenStore& store, const std::string& strName, const std::string& strColumns)
{
    store.run("INSERT INTO token VALUES ('" + idOf(strName) + "'," + strColumns +
              R"(,'{"Example.Api":{"method":["get"]}}','{"ratio":1.25}');)");
}

void insertExpired(const TokenStore& store)
{
    insertToken(store, "expired", "'session',0,1,5,1,'VPN'");
    insertToken(store, "expired-large", "'" + std::string(5000, 'e') + "',0,1,5,1,'VPN'");
}

const std::vector<Operation>& operations()
{
    static int (*const create)() = [] {
        Json::Value jOption = options();
        std::string strTid;
        return VemoAccessTokenCreate(g_uid, g_strFunction, jOption, strTid);
    };
    static const std::vector<Operation> all = {
        {"FirstCreation", true, true, create},
        {"Creation", false, true, create},
        {"CreationUnderAGivenId", false, true,
         [] {
             Json::Value jOption = options();
             std::string strTid = idOf("given");
             return VemoAccessTokenCreateByTid(g_uid, g_strFunction, jOption, strTid);
         }},
        {"GrantOfOneUseOfThree", false, true,
         [] {
             std::string strTid = idOf("three");
             Json::Value jToken;
             return VemoAccessTokenGrantEx(strTid, "Example.Api", "get", jToken);
         }},
        {"GrantOfTheLastUse", false, true,
         [] {
             std::string strTid = idOf("one");
             char szUser[64];
             return VemoAccessTokenGrant(strTid, "Example.Api", "get", szUser, sizeof(szUser));
         }},
        {"DeletionById", false, true,
         [] {
             std::string strTid = idOf("one");
             return VemoAccessTokenDeleteByTid(strTid);
         }},
        {"DeletionBySession", false, false, [] { return VemoAccessTokenDeleteByBindSid("session"); }},
        {"DeletionByPurpose", false, true,
         [] {
             std::string strFunction = "Mail";
             return VemoAccessTokenDeleteByFunction(strFunction);
         }},
        {"Update", false, false,
         [] {
             std::string strTid = idOf("three");
             Json::Value jParam(Json::objectValue);
             jParam["extra"]["note"] = std::string(6000, 'n'); // more than a page
             return AccessTokenApi().tokenUpdateByTid(strTid, jParam);
         }},
        {"Listing", false, false,
         [] {
             Json::Value jFilter(Json::objectValue);
             Json::Value jTokenArray(Json::arrayValue);
             const int nResult = AccessTokenApi().tokenList(jFilter, jTokenArray);
             return 0 > nResult ? nResult : static_cast<int>(jTokenArray.size());
         }},
        {"DeletionByAListOfIds", false, false,
         [] {
             std::vector<std::string> strTidVector = {idOf("large")};
             return AccessTokenApi().tokenDeleteByTidArray(strTidVector);
         }},
        {"DeletionOfAll", false, false, [] { return AccessTokenApi().tokenDeleteAll(); }},
    };
    return all;
}

void prepareStore(const TokenStore& store, const Operation& operation)
{
    static const Files files = makeStore(store);
    store.setFiles(operation.blCreatesStore ? Files() : files);
}

std::string makeSmallStore(const TokenStore& store, const std::string& strSettings)
{
    makeTable(store, "PRAGMA page_size = 512;" + strSettings);
    insertToken(store, "one", "'',0,4102444800,1,1,'VPN'");
    insertToken(store, "three", "'session',0,4102444800,3,1,'VPN'");
    insertToken(store, "expired", "'" + std::string(300, 'e') + "',0,1,5,1,'VPN'"); // over two pages
    return store.files().at(DATABASE);
}

std::string answerOf(const Operation& operation)
{
    Log::clear();
    try {
        const int nResult = operation.run();
        const std::string strLine = Log::firstLine();
        const size_t nDetails = std::min(strLine.find(", err="), strLine.find(", jTokenParam="));
        return std::to_string(nResult) + (0 > nResult ? ": " + strLine.substr(0, nDetails) : "");
    } catch (const Json::Exception& exception) {
        return std::string("throws: ") + exception.what();
    }
}
