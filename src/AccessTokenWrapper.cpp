#include <cstdio>
#include <memory>

#include "AccessTokenApi.h"
#include "AccessTokenUtil.h"
#include "internal/AccessTokenLog.h"
#include "vemo-access-token.h"
#include "vemouser.h"

namespace {

struct UserDeleter {
    void operator()(VEMOUser* pUser) const { VEMOUserFree(pUser); }
};

} // namespace

int VemoAccessTokenCreate(unsigned int& uid, std::string& strFunction, Json::Value& jTokenOption,
                          std::string& strTid)
{
    AccessTokenApi api;
    api.cleanExpireToken(false);
    return api.tokenCreate(uid, strFunction, jTokenOption, strTid);
}

int VemoAccessTokenCreateByTid(unsigned int& uid, std::string& strFunction, Json::Value& jTokenOption,
                               std::string& strTid)
{
    AccessTokenApi api;
    api.cleanExpireToken(false);
    return api.tokenCreateByTid(uid, strFunction, jTokenOption, strTid);
}

int VemoAccessTokenGenerate(std::string& strTid)
{
    return VEMO_ACCESS_TOKEN::tokenGenerate(strTid);
}

int VemoAccessTokenGrantEx(std::string& strTid, const char* szWebapiName, const char* szWebapiMethod,
                           Json::Value& jToken)
{
    AccessTokenApi api;
    api.cleanExpireToken(false);
    return api.tokenGrant(strTid, szWebapiName, szWebapiMethod, jToken);
}

// The grant comes first: when the name is unknown or does not fit, the use stays spent.
int VemoAccessTokenGrant(std::string& strTid, const char* szWebapiName, const char* szWebapiMethod,
                         char* szUser, size_t cbUser)
{
    Json::Value jToken(Json::objectValue);
    VEMOUser* pUser = nullptr;

    VEMO_ATOKEN_CHECK_RETURN(0 > VemoAccessTokenGrantEx(strTid, szWebapiName, szWebapiMethod, jToken), -1);
    VEMO_ATOKEN_CHECK_RETURN(!jToken.isMember("uid"), -1);
    if (!szUser || 0 == cbUser) {
        return 0;
    }

    const int nLookup = VEMOUserGetByUID(static_cast<uid_t>(jToken["uid"].asInt64()), &pUser);
    const std::unique_ptr<VEMOUser, UserDeleter> pOwner(pUser);
    VEMO_ATOKEN_CHECK_RETURN_AS(0 > nLookup, "0 > VEMOUserGetByUID(jToken[\"uid\"].asInt64(), &pUser)", -1);
    VEMO_ATOKEN_CHECK_RETURN(!pUser, -1); // a platform's way to say that the user is unknown
    // clang-format off
    VEMO_ATOKEN_CHECK_RETURN((int)cbUser <= snprintf(szUser,cbUser, "%s", pUser->szName), -1);
    // clang-format on
    return 0;
}

int VemoAccessTokenDeleteByTid(std::string& strTid)
{
    AccessTokenApi api;
    api.cleanExpireToken(false);
    return api.tokenDeleteByTid(strTid);
}

// The only operation that does not purge expired tokens first.
int VemoAccessTokenDeleteByBindSid(const char* szSid)
{
    AccessTokenApi api;
    VEMO_ATOKEN_CHECK_RETURN(!szSid || !szSid[0], -1);
    std::string strSid = szSid;
    return api.tokenDeleteByBindSid(strSid);
}

int VemoAccessTokenDeleteByFunction(std::string& strFunction)
{
    AccessTokenApi api;
    api.cleanExpireToken(false);
    return api.tokenDeleteByFunction(strFunction);
}
