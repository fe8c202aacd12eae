#include "Operations.h"

#include "Store.h"
#include "vemo-access-token.h"

namespace {

const char* const FRESH_FUNCTION = "fresh";

BareToken freshToken(long long nCount)
{
    BareToken token = tokenOf(FRESH);
    token.strFunction = FRESH_FUNCTION;
    token.nUid = 0; // a user that there is everywhere
    token.nCount = nCount;
    return token;
}

// Preparation

void nothing(Call&) {}

void useStoredToken(Call& call)
{
    call.token = tokenOf(0);
}

void useFreshToken(Call& call)
{
    removeFreshTokens();
    call.token = freshToken(1000);
    Json::Value& jMethods = call.jArgument["webapi_allow"][webapi()]["method"];
    jMethods.clear();
    jMethods.append("get");
    jMethods.append(method());
    call.jArgument["bind_sid"] = call.token.strBindSid;
    call.jArgument["deadline"] = 86400;
    call.jArgument["count"] = static_cast<Json::Int64>(call.token.nCount);
}

template <long long nCount>
void storeFreshToken(Call& call)
{
    call.token = freshToken(nCount);
    BareEngine().save(call.token);
}

void holdConnection(Call& call)
{
    useStoredToken(call);
    call.pApi = std::make_unique<AccessTokenApi>();
    call.pApi->cleanExpireToken(true); // the first statement of a connection reads the schema
}

void holdConnectionToList(Call& call)
{
    holdConnection(call);
    call.jArgument = Json::Value(Json::objectValue);
    call.jResult = Json::Value(Json::arrayValue);
}

void holdConnectionToUpdate(Call& call)
{
    holdConnection(call);
    call.jArgument["count"] = 500;
    call.jArgument["extra"]["colour"] = "blue";
}

// The library

int create(Call& call)
{
    unsigned int uid = 0;
    return VemoAccessTokenCreate(uid, call.token.strFunction, call.jArgument, call.strTid);
}

int createByTid(Call& call)
{
    unsigned int uid = 0;
    return VemoAccessTokenCreateByTid(uid, call.token.strFunction, call.jArgument, call.token.strTid);
}

int generate(Call& call)
{
    return VemoAccessTokenGenerate(call.strTid);
}

int grantEx(Call& call)
{
    return VemoAccessTokenGrantEx(call.token.strTid, webapi(), method(), call.jResult);
}

int grantExUnlistedMethod(Call& call)
{
    return VemoAccessTokenGrantEx(call.token.strTid, webapi(), "delete", call.jResult);
}

int grant(Call& call)
{
    return VemoAccessTokenGrant(call.token.strTid, webapi(), method(), call.szUser, sizeof(call.szUser));
}

int deleteByTid(Call& call)
{
    return VemoAccessTokenDeleteByTid(call.token.strTid);
}

int deleteByBindSid(Call& call)
{
    return VemoAccessTokenDeleteByBindSid(call.token.strBindSid.c_str());
}

int deleteByFunction(Call& call)
{
    return VemoAccessTokenDeleteByFunction(call.token.strFunction);
}

int tokenList(Call& call)
{
    return call.pApi->tokenList(call.jArgument, call.jResult);
}

int tokenUpdateByTid(Call& call)
{
    return call.pApi->tokenUpdateByTid(call.token.strTid, call.jArgument);
}

int tokenGrant(Call& call)
{
    return call.pApi->tokenGrant(call.token.strTid, webapi(), method(), call.jResult);
}

// The bare engine

void bareCreate(Call& call)
{
    BareEngine engine;
    engine.purge();
    engine.create(call.token);
}

void bareGrant(Call& call)
{
    BareEngine engine;
    engine.purge();
    engine.grant(call.token.strTid);
}

int controlGrant(Call& call)
{
    bareGrant(call);
    return 0;
}

void bareRead(Call& call)
{
    BareEngine engine;
    engine.purge();
    engine.read(call.token.strTid);
}

void bareDeleteByTid(Call& call)
{
    BareEngine engine;
    engine.purge();
    engine.deleteWhere("tid", call.token.strTid);
}

void bareDeleteByBindSid(Call& call)
{
    BareEngine().deleteWhere("bind_sid", call.token.strBindSid);
}

void bareDeleteByFunction(Call& call)
{
    BareEngine engine;
    engine.purge();
    engine.deleteWhere("function", call.token.strFunction);
}

} // namespace

const std::vector<Operation>& operations()
{
    static const std::vector<Operation> rgOperation = {
        {"Create", useFreshToken, create, 0, bareCreate},
        {"CreateByTid", useFreshToken, createByTid, 0, bareCreate},
        {"Generate", nothing, generate, 0, nullptr},
        {"GrantEx.saved", useStoredToken, grantEx, 0, bareGrant},
        {"GrantEx.deleted", storeFreshToken<1>, grantEx, 0, bareGrant},
        {"GrantEx.unlimited", storeFreshToken<-1>, grantEx, 0, bareGrant},
        {"GrantEx.refused", useStoredToken, grantExUnlistedMethod, -1, bareRead},
        {"Grant.saved", storeFreshToken<1000>, grant, 0, bareGrant},
        {"DeleteByTid", storeFreshToken<1>, deleteByTid, 1, bareDeleteByTid},
        {"DeleteByBindSid", storeFreshToken<1>, deleteByBindSid, 1, bareDeleteByBindSid},
        {"DeleteByFunction", storeFreshToken<1>, deleteByFunction, 1, bareDeleteByFunction},
        {"tokenList", holdConnectionToList, tokenList, 0, nullptr},
        {"tokenUpdateByTid", holdConnectionToUpdate, tokenUpdateByTid, 0, nullptr},
        {"tokenGrant.saved", holdConnection, tokenGrant, 0, nullptr},
    };
    return rgOperation;
}

const Operation& control()
{
    static const Operation operation = {"Control", useStoredToken, controlGrant, 0, bareGrant};
    return operation;
}

void removeFreshTokens()
{
    BareEngine().deleteWhere("function", FRESH_FUNCTION);
}
