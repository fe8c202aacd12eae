#include "Operations.h"

#include <stdexcept>

#include "AccessTokenApi.h"
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

int create()
{
    unsigned int uid = 0;
    std::string strFunction = "VPN";
    Json::Value jOption = options();
    std::string strTid;
    return VemoAccessTokenCreate(uid, strFunction, jOption, strTid);
}

int createByTid()
{
    unsigned int uid = 0;
    std::string strFunction = "VPN";
    Json::Value jOption = options();
    std::string strTid = idOf("given");
    return VemoAccessTokenCreateByTid(uid, strFunction, jOption, strTid);
}

int grantOneOfSome()
{
    std::string strTid = idOf("three");
    Json::Value jToken;
    return VemoAccessTokenGrantEx(strTid, "Example.Api", "get", jToken);
}

int grantTheLast()
{
    std::string strTid = idOf("one");
    char szUser[64];
    return VemoAccessTokenGrant(strTid, "Example.Api", "get", szUser, sizeof(szUser));
}

int deleteByTid()
{
    std::string strTid = idOf("one");
    return VemoAccessTokenDeleteByTid(strTid);
}

int deleteByBindSid()
{
    return VemoAccessTokenDeleteByBindSid("session");
}

int deleteByFunction()
{
    std::string strFunction = "Mail";
    return VemoAccessTokenDeleteByFunction(strFunction);
}

int update()
{
    AccessTokenApi api;
    std::string strTid = idOf("three");
    Json::Value jParam(Json::objectValue);
    jParam["extra"]["note"] = std::string(6000, 'n'); // more than a page
    return api.tokenUpdateByTid(strTid, jParam);
}

int list()
{
    AccessTokenApi api;
    Json::Value jFilter(Json::objectValue);
    Json::Value jTokenArray(Json::arrayValue);
    const int nResult = api.tokenList(jFilter, jTokenArray);
    return 0 > nResult ? nResult : static_cast<int>(jTokenArray.size());
}

int deleteByTidArray()
{
    AccessTokenApi api;
    std::vector<std::string> strTidVector = {idOf("large")};
    return api.tokenDeleteByTidArray(strTidVector);
}

int deleteAll()
{
    AccessTokenApi api;
    return api.tokenDeleteAll();
}

// Some tokens on a few pages: one of them over several, and two that have expired.
Files makeStore(const TokenStore& store)
{
    makeTable(store);
    insertToken(store, "one", "'',0,4102444800,1,1,'VPN'");
    insertToken(store, "three", "'',0,4102444800,3,1,'VPN'");
    insertToken(store, "bound", "'session',0,4102444800,-1,1,'VPN'");
    insertToken(store, "mail", "'',0,4102444800,5,1,'Mail'");
    insertToken(store, "large", "'" + std::string(10000, 'l') + "',0,4102444800,5,1,'Large'");
    insertToken(store, "expired", "'session',0,1,5,1,'VPN'");
    insertToken(store, "expired-large", "'" + std::string(5000, 'e') + "',0,1,5,1,'VPN'");
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

const std::vector<Operation>& operations()
{
    static const std::vector<Operation> all = {
        {"first creation", true, true, &create},
        {"creation", false, true, &create},
        {"creation under a given id", false, true, &createByTid},
        {"grant of one use of three", false, true, &grantOneOfSome},
        {"grant of the last use", false, true, &grantTheLast},
        {"deletion by id", false, true, &deleteByTid},
        {"deletion by session", false, false, &deleteByBindSid},
        {"deletion by purpose", false, true, &deleteByFunction},
        {"update", false, false, &update},
        {"listing", false, false, &list},
        {"deletion by a list of ids", false, false, &deleteByTidArray},
        {"deletion of all", false, false, &deleteAll},
    };
    return all;
}

const Operation& operationNamed(const std::string& strName)
{
    for (const Operation& operation : operations()) {
        if (strName == operation.szName) {
            return operation;
        }
    }
    throw std::logic_error("no operation " + strName);
}

void prepareStore(const TokenStore& store, const Operation& operation)
{
    static const Files files = makeStore(store);
    store.setFiles(operation.blCreatesStore ? Files() : files);
}
