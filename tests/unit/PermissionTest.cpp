// Whether a record's webapi_allow lists an API and a method.

#include "AccessTokenUtil.h"
#include "StoreTest.h"

using VEMO_ACCESS_TOKEN::checkPermission;
using VEMO_ACCESS_TOKEN::debugInfo;

namespace {

const char* const NO_OBJECT = "jToken.type() != Json::objectValue";
const char* const NO_NAME = "!szWebapiName || !szWebapiName[0]";
const char* const NO_ALLOW = "!jToken.isMember(\"webapi_allow\")";
const char* const BAD_ALLOW = "jToken[\"webapi_allow\"].type() != Json::objectValue";
const char* const BAD_ENTRY = "jToken[\"webapi_allow\"][szWebapiName].type() != Json::objectValue";
const char* const NO_METHOD = "!jToken[\"webapi_allow\"][szWebapiName].isMember(\"method\")";
const char* const BAD_METHOD =
    "jToken[\"webapi_allow\"][szWebapiName][\"method\"].type() != Json::arrayValue";

// Two APIs and two methods of one of them; compact, since log lines show it.
const std::string RECORD = R"({"webapi_allow":{"A":{"method":["get","list"]},"Empty":{"method":[]}}})";

// A record whose API A has this entry.
std::string entry(const std::string& strEntry)
{
    return R"({"webapi_allow":{"A":)" + strEntry + "}}";
}

class Permission : public SeamTest {};

TEST_F(Permission, IsDecidedAndExplainedInDebugMode)
{
    for (const bool blDebug : {false, true}) {
        debugInfo(blDebug);
        const int nErrno = blDebug ? EACCES : 0;
        // szCondition is the condition in the failure line, if there is one.
        const auto decides = [&](const std::string& strRecord, const char* szApi, const char* szMethod,
                                 int nResult, const char* szCondition = nullptr) {
            SCOPED_TRACE(::testing::Message() << strRecord << " " << (szApi ? szApi : "(null)") << " "
                                              << (szMethod ? szMethod : "(null)") << " " << blDebug);
            Texts lines = szCondition ? Texts{failed(UTIL, szCondition, nErrno)} : Texts{};
            if (blDebug && 1 != nResult && !szCondition) {
                const std::string strMethod = 0 == nResult ? std::string(" , method=") + szMethod + "," : "";
                lines.push_back(ordinary(UTIL, std::string("webapi=") + szApi + strMethod +
                                                   " not in allow list, jToken=" + strRecord));
            }
            if (blDebug && -1 == nResult) {
                lines.push_back(ordinary(UTIL, "jToken=" + strRecord));
            }
            Json::Value jToken = json(strRecord);
            errno = nErrno;
            EXPECT_EQ(nResult, checkPermission(jToken, szApi, szMethod));
            EXPECT_EQ(nErrno, errno);
            EXPECT_LINES(lines);
            EXPECT_EQ(json(strRecord), jToken);
        };
        decides(RECORD, "A", "get", 1);
        for (const char* szMethod : {"set", "Get", "ge", "gets", "get ", "*", "%s%n%m"}) {
            decides(RECORD, "A", szMethod, 0);
        }
        decides(RECORD, "Empty", "get", 0);
        decides(entry(R"({"method":[""]})"), "A", "get", 0);
        decides(entry(R"({"method":["get\u0000"]})"), "A", "get", 0);
        decides(entry(R"({"method":["get"],"methods":["set"]})"), "A", "set", 0);
        // Elements are read as text, up to the one that matches.
        decides(entry(R"({"method":[5,"get",{}]})"), "A", "5", 1);
        decides(entry(R"({"method":[5,"get",{}]})"), "A", "get", 1);
        // Only webapi_allow is read.
        decides(R"({"count":0,"deadline":-1,"tid":5,"webapi_allow":{"A":{"method":["get"]}}})", "A", "get",
                1);

        for (const char* szApi : {"B", "a", "Emp", "Empty2", "%s%n"}) {
            decides(RECORD, szApi, "get", -1);
            decides(RECORD, szApi, nullptr, -1);
        }
        decides(R"({"webapi_allow":{"A\u0000":{"method":["get"]}}})", "A", "get", -1);
        decides(R"({"A":{"method":["get"]},"webapi_allow":{}})", "A", "get", -1);

        for (const char* szRecord : {"null", "[]", R"("webapi_allow")"}) {
            decides(szRecord, "A", "get", -1, NO_OBJECT);
            decides(szRecord, nullptr, nullptr, -1, NO_OBJECT);
        }
        decides(RECORD, nullptr, "get", -1, NO_NAME);
        decides(RECORD, "", "get", -1, NO_NAME);
        decides(R"({"webapi_allow":{"":{"method":["get"]}}})", "", "get", -1, NO_NAME);
        decides("{}", "A", "get", -1, NO_ALLOW);
        decides(R"({"webapi_allow":null})", "A", "get", -1, BAD_ALLOW);
        decides(R"({"webapi_allow":"{}"})", "A", nullptr, -1, BAD_ALLOW);
        // Without a method, an API that is listed is enough, whatever its entry is.
        const std::pair<const char*, const char*> entries[] = {
            {"null", BAD_ENTRY},
            {R"(["get"])", BAD_ENTRY},
            {"{}", NO_METHOD},
            {R"({"Method":["get"]})", NO_METHOD},
            {R"({"method":null})", BAD_METHOD},
            {R"({"method":"get"})", BAD_METHOD},
            {R"({"method":{"get":1}})", BAD_METHOD},
        };
        for (const auto& [szEntry, szCondition] : entries) {
            decides(entry(szEntry), "A", "get", -1, szCondition);
            decides(entry(szEntry), "A", nullptr, 1);
            decides(entry(szEntry), "A", "", 1);
        }
        decides(RECORD, "Empty", nullptr, 1);
    }
}

} // namespace
