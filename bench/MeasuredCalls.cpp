#include "MeasuredCalls.h"

#include "Store.h"
#include "vemo-access-token.h"

namespace {

const char* const FRESH_FUNCTION = "fresh";

BareToken freshToken(long long nCount)
{
    BareToken token = tokenOf(FRESH);
    token.strFunction = FRESH_FUNCTION;
    token.nUid = 0; // a user that exists everywhere
    token.nCount = nCount;
    return token;
}

// Preparation

void useStoredToken(Call& call)
{
    call.token = tokenOf(0);
}

void useFreshToken(Call& call)
{
    removeFreshTokens();
    call.token = freshToken(1000);
    Json::Value& jMethods = call.jArgument["webapi_allow"][WEBAPI]["method"];
    jMethods.clear();
    jMethods.append("get");
    jMethods.append(METHOD);
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

int grantEx(Call& call)
{
    return VemoAccessTokenGrantEx(call.token.strTid, WEBAPI, METHOD, call.jResult);
}

// A bare engine that has purged, as all exported functions do except the deletion by session.
BareEngine& purged(BareEngine&& engine)
{
    engine.purge();
    return engine;
}

void bareCreate(Call& call)
{
    purged(BareEngine()).create(call.token);
}

void bareGrant(Call& call)
{
    purged(BareEngine()).grant(call.token.strTid);
}

unsigned int g_uid = 0;

} // namespace

const std::vector<Operation>& operations()
{
    static const std::vector<Operation> rgOperation = {
        {"Create", useFreshToken,
         [](Call& call) {
             return VemoAccessTokenCreate(g_uid, call.token.strFunction, call.jArgument, call.strTid);
         },
         0, bareCreate},
        {"CreateByTid", useFreshToken,
         [](Call& call) {
             return VemoAccessTokenCreateByTid(g_uid, call.token.strFunction, call.jArgument,
                                               call.token.strTid);
         },
         0, bareCreate},
        {"Generate", [](Call&) {}, [](Call& call) { return VemoAccessTokenGenerate(call.strTid); }, 0,
         nullptr},
        {"GrantEx.saved", useStoredToken, grantEx, 0, bareGrant},
        {"GrantEx.deleted", storeFreshToken<1>, grantEx, 0, bareGrant},
        {"GrantEx.unlimited", storeFreshToken<-1>, grantEx, 0, bareGrant},
        {"GrantEx.refused", useStoredToken,
         [](Call& call) { return VemoAccessTokenGrantEx(call.token.strTid, WEBAPI, "delete", call.jResult); },
         -1, [](Call& call) { purged(BareEngine()).read(call.token.strTid); }},
        {"Grant.saved", storeFreshToken<1000>,
         [](Call& call) {
             return VemoAccessTokenGrant(call.token.strTid, WEBAPI, METHOD, call.szUser, sizeof(call.szUser));
         },
         0, bareGrant},
        {"DeleteByTid", storeFreshToken<1>,
         [](Call& call) { return VemoAccessTokenDeleteByTid(call.token.strTid); }, 1,
         [](Call& call) { purged(BareEngine()).deleteWhere("tid", call.token.strTid); }},
        {"DeleteByBindSid", storeFreshToken<1>,
         [](Call& call) { return VemoAccessTokenDeleteByBindSid(call.token.strBindSid.c_str()); }, 1,
         [](Call& call) { BareEngine().deleteWhere("bind_sid", call.token.strBindSid); }},
        {"DeleteByFunction", storeFreshToken<1>,
         [](Call& call) { return VemoAccessTokenDeleteByFunction(call.token.strFunction); }, 1,
         [](Call& call) { purged(BareEngine()).deleteWhere("function", call.token.strFunction); }},
        {"tokenList", holdConnectionToList,
         [](Call& call) { return call.pApi->tokenList(call.jArgument, call.jResult); }, 0, nullptr},
        {"tokenUpdateByTid", holdConnectionToUpdate,
         [](Call& call) { return call.pApi->tokenUpdateByTid(call.token.strTid, call.jArgument); }, 0,
         nullptr},
        {"tokenGrant.saved", holdConnection,
         [](Call& call) { return call.pApi->tokenGrant(call.token.strTid, WEBAPI, METHOD, call.jResult); }, 0,
         nullptr},
        {"Control", useStoredToken, nullptr, 0, bareGrant},
    };
    return rgOperation;
}

void removeFreshTokens()
{
    BareEngine().deleteWhere("function", FRESH_FUNCTION);
}
