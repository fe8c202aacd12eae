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
const char* const RECORD = R"({"webapi_allow":{"A":{"method":["get","list"]},"Empty":{"method":[]}}})";

struct Case {
    const char* szRecord;
    const char* szApi;
    const char* szMethod;
    int nResult;
    const char* szCondition = nullptr; // of the failure line, when there is one
};

const Case CASES[] = {
    {RECORD, "A", "get", 1},
    {RECORD, "A", "list", 1},
    {RECORD, "A", "set", 0},
    {RECORD, "A", "Get", 0},
    {RECORD, "A", "ge", 0},
    {RECORD, "A", "gets", 0},
    {RECORD, "A", "get ", 0},
    {RECORD, "A", "*", 0},
    {RECORD, "A", "%s%n%m", 0},
    {RECORD, "Empty", "get", 0},
    // Without a method, an API that is listed is enough.
    {RECORD, "A", nullptr, 1},
    {RECORD, "A", "", 1},
    {RECORD, "Empty", nullptr, 1},
    {R"({"webapi_allow":{"A":["get"]}})", "A", nullptr, 1},
    {R"({"webapi_allow":{"A":null}})", "A", "", 1},
    {R"({"webapi_allow":{"A":{}}})", "A", nullptr, 1},
    {R"({"webapi_allow":{"A":{"method":"get"}}})", "A", "", 1},
    {R"({"webapi_allow":{"A":{"method":["*"]}}})", "A", "get", 0},
    {R"({"webapi_allow":{"A":{"method":[""]}}})", "A", "get", 0},
    {R"({"webapi_allow":{"A":{"method":["get\u0000"]}}})", "A", "get", 0},
    {R"({"webapi_allow":{"A":{"method":["get","get"]}}})", "A", "get", 1},
    {R"({"webapi_allow":{"A":{"method":["get"],"methods":["set"]}}})", "A", "set", 0},
    // Elements are read as text, up to the one that matches.
    {R"({"webapi_allow":{"A":{"method":[5,"get",{}]}}})", "A", "5", 1},
    {R"({"webapi_allow":{"A":{"method":[5,"get",{}]}}})", "A", "get", 1},
    // Nothing but webapi_allow is looked at.
    {R"({"count":0,"deadline":-1,"tid":5,"webapi_allow":{"A":{"method":["get"]}}})", "A", "get", 1},

    {RECORD, "B", "get", -1},
    {RECORD, "B", nullptr, -1},
    {RECORD, "a", "get", -1},
    {RECORD, "Emp", "get", -1},
    {RECORD, "Empty2", "get", -1},
    {RECORD, "%s%n", "%m", -1},
    {R"({"webapi_allow":{"A\u0000":{"method":["get"]}}})", "A", "get", -1},
    {R"({"webapi_allow":{}})", "A", "get", -1},
    {R"({"A":{"method":["get"]},"webapi_allow":{}})", "A", "get", -1},

    {"null", "A", "get", -1, NO_OBJECT},
    {"[]", "A", "get", -1, NO_OBJECT},
    {R"("webapi_allow")", "A", "get", -1, NO_OBJECT},
    {"null", nullptr, nullptr, -1, NO_OBJECT},
    {RECORD, nullptr, "get", -1, NO_NAME},
    {RECORD, "", "get", -1, NO_NAME},
    {RECORD, nullptr, nullptr, -1, NO_NAME},
    {R"({"webapi_allow":{"":{"method":["get"]}}})", "", "get", -1, NO_NAME},
    {"{}", nullptr, "get", -1, NO_NAME},
    {"{}", "A", "get", -1, NO_ALLOW},
    {R"({"extra":{}})", "A", "", -1, NO_ALLOW},
    {R"({"webapi_allow":null})", "A", "get", -1, BAD_ALLOW},
    {R"({"webapi_allow":["A"]})", "A", "get", -1, BAD_ALLOW},
    {R"({"webapi_allow":"{}"})", "A", nullptr, -1, BAD_ALLOW},
    {R"({"webapi_allow":{"A":null}})", "A", "get", -1, BAD_ENTRY},
    {R"({"webapi_allow":{"A":["get"]}})", "A", "get", -1, BAD_ENTRY},
    {R"({"webapi_allow":{"A":{}}})", "A", "get", -1, NO_METHOD},
    {R"({"webapi_allow":{"A":{"Method":["get"]}}})", "A", "get", -1, NO_METHOD},
    {R"({"webapi_allow":{"A":{"method":null}}})", "A", "get", -1, BAD_METHOD},
    {R"({"webapi_allow":{"A":{"method":"get"}}})", "A", "get", -1, BAD_METHOD},
    {R"({"webapi_allow":{"A":{"method":{"get":1}}}})", "A", "get", -1, BAD_METHOD},
};

// What is logged of a case.
Texts linesOf(const Case& row, bool blDebug, int nErrno)
{
    Texts lines = row.szCondition ? Texts{failed(UTIL, row.szCondition, nErrno)} : Texts{};
    if (!blDebug || 1 == row.nResult) {
        return lines;
    }
    if (!row.szCondition) {
        const std::string strMethod = 0 == row.nResult ? std::string(" , method=") + row.szMethod + "," : "";
        lines.push_back(ordinary(UTIL, std::string("webapi=") + row.szApi + strMethod +
                                           " not in allow list, jToken=" + row.szRecord));
    }
    if (-1 == row.nResult) {
        lines.push_back(ordinary(UTIL, std::string("jToken=") + row.szRecord));
    }
    return lines;
}

class Permission : public SeamTest {};

TEST_F(Permission, IsDecidedAndExplainedInDebugMode)
{
    for (const bool blDebug : {false, true}) {
        debugInfo(blDebug);
        for (const Case& row : CASES) {
            const int nErrno = blDebug ? EACCES : 0;
            SCOPED_TRACE(::testing::Message()
                         << row.szRecord << " " << (row.szApi ? row.szApi : "(null)") << " "
                         << (row.szMethod ? row.szMethod : "(null)") << " " << blDebug);
            Json::Value jToken = json(row.szRecord);
            errno = nErrno;
            EXPECT_EQ(row.nResult, checkPermission(jToken, row.szApi, row.szMethod));
            EXPECT_EQ(nErrno, errno);
            EXPECT_LINES(linesOf(row, blDebug, nErrno));
            EXPECT_EQ(json(row.szRecord), jToken);
        }
    }
}

TEST_F(Permission, ThrowsAtAMethodThatIsNoText)
{
    Json::Value jToken = token();
    EXPECT_THROW(checkPermission(jToken, "Odd", "get"), Json::LogicError);
}

} // namespace
