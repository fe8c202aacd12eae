// Whether a record's webapi_allow lists an API and a method.

#include <ostream>

#include "AccessTokenUtil.h"
#include "StoreTest.h"

namespace {

using VEMO_ACCESS_TOKEN::checkPermission;
using VEMO_ACCESS_TOKEN::debugInfo;

const char* const NO_OBJECT = "jToken.type() != Json::objectValue";
const char* const NO_NAME = "!szWebapiName || !szWebapiName[0]";
const char* const NO_ALLOW = "!jToken.isMember(\"webapi_allow\")";
const char* const BAD_ALLOW = "jToken[\"webapi_allow\"].type() != Json::objectValue";
const char* const BAD_ENTRY = "jToken[\"webapi_allow\"][szWebapiName].type() != Json::objectValue";
const char* const NO_METHOD = "!jToken[\"webapi_allow\"][szWebapiName].isMember(\"method\")";
const char* const BAD_METHOD =
    "jToken[\"webapi_allow\"][szWebapiName][\"method\"].type() != Json::arrayValue";

// Two APIs and two methods of one of them; compact, since log lines show it.
const char* const RECORD =
    R"({"webapi_allow":{"Example.Api":{"method":["get","list"]},"Example.Empty":{"method":[]}}})";

struct Case {
    const char* szTestName;
    const char* szRecord;
    const char* szApi;
    const char* szMethod;
    int nResult;
    const char* szCondition = nullptr; // of the failure line, when there is one
};

std::ostream& operator<<(std::ostream& stream, const Case& testCase)
{
    return stream << testCase.szTestName;
}

const std::vector<Case> CASES = {
    {"ListedMethod", RECORD, "Example.Api", "get", 1},
    {"LastListedMethod", RECORD, "Example.Api", "list", 1},
    {"MethodNotListed", RECORD, "Example.Api", "set", 0},
    {"MethodInOtherCase", RECORD, "Example.Api", "Get", 0},
    {"MethodIsPrefix", RECORD, "Example.Api", "ge", 0},
    {"MethodIsLonger", RECORD, "Example.Api", "gets", 0},
    {"MethodWithBlank", RECORD, "Example.Api", "get ", 0},
    {"MethodWildcard", RECORD, "Example.Api", "*", 0},
    {"NoMethodsListed", RECORD, "Example.Empty", "get", 0},
    {"NoMethodAsked", RECORD, "Example.Api", nullptr, 1},
    {"EmptyMethodAsked", RECORD, "Example.Api", "", 1},
    {"NoMethodAskedOfNone", RECORD, "Example.Empty", nullptr, 1},
    {"ListedWildcardIsAName", R"({"webapi_allow":{"Api":{"method":["*"]}}})", "Api", "get", 0},
    {"ListedEmptyMethod", R"({"webapi_allow":{"Api":{"method":[""]}}})", "Api", "get", 0},
    {"ListedMethodWithNul", R"({"webapi_allow":{"Api":{"method":["get\u0000"]}}})", "Api", "get", 0},
    {"MethodListedTwice", R"({"webapi_allow":{"Api":{"method":["get","get"]}}})", "Api", "get", 1},
    {"OtherMembersOfEntry", R"({"webapi_allow":{"Api":{"method":["get"],"methods":["set"]}}})", "Api", "set",
     0},
    {"EmptyNameIsNoNameEvenIfListed", R"({"webapi_allow":{"":{"method":["get"]}}})", "", "get", -1, NO_NAME},

    {"ApiNotListed", RECORD, "Other.Api", "get", -1},
    {"ApiNotListedNoMethodAsked", RECORD, "Other.Api", nullptr, -1},
    {"ApiInOtherCase", RECORD, "example.api", "get", -1},
    {"ApiIsPrefix", RECORD, "Example", "get", -1},
    {"ApiIsLonger", RECORD, "Example.Api2", "get", -1},
    {"ApiWithNulListed", R"({"webapi_allow":{"Api\u0000":{"method":["get"]}}})", "Api", "get", -1},
    {"NothingAllowed", R"({"webapi_allow":{}})", "Example.Api", "get", -1},
    {"ApiListedOutsideWebapiAllow", R"({"Api":{"method":["get"]},"webapi_allow":{}})", "Api", "get", -1},

    {"NullRecord", "null", "Api", "get", -1, NO_OBJECT},
    {"ArrayRecord", "[]", "Api", "get", -1, NO_OBJECT},
    {"StringRecord", R"("webapi_allow")", "Api", "get", -1, NO_OBJECT},
    {"NullRecordBeforeNullApi", "null", nullptr, nullptr, -1, NO_OBJECT},
    {"NullApi", RECORD, nullptr, "get", -1, NO_NAME},
    {"EmptyApi", RECORD, "", "get", -1, NO_NAME},
    {"NullApiNoMethodAsked", RECORD, nullptr, nullptr, -1, NO_NAME},
    {"NullApiBeforeMissingAllow", "{}", nullptr, "get", -1, NO_NAME},
    {"NoWebapiAllow", "{}", "Api", "get", -1, NO_ALLOW},
    {"NoWebapiAllowNoMethodAsked", R"({"extra":{}})", "Api", "", -1, NO_ALLOW},
    {"WebapiAllowIsNull", R"({"webapi_allow":null})", "Api", "get", -1, BAD_ALLOW},
    {"WebapiAllowIsArray", R"({"webapi_allow":["Api"]})", "Api", "get", -1, BAD_ALLOW},
    {"WebapiAllowIsString", R"({"webapi_allow":"{}"})", "Api", nullptr, -1, BAD_ALLOW},
    {"EntryIsNull", R"({"webapi_allow":{"Api":null}})", "Api", "get", -1, BAD_ENTRY},
    {"EntryIsArray", R"({"webapi_allow":{"Api":["get"]}})", "Api", "get", -1, BAD_ENTRY},
    {"EntryIsArrayNoMethodAsked", R"({"webapi_allow":{"Api":["get"]}})", "Api", nullptr, 1},
    {"EntryIsNullEmptyMethodAsked", R"({"webapi_allow":{"Api":null}})", "Api", "", 1},
    {"EntryWithoutMethod", R"({"webapi_allow":{"Api":{}}})", "Api", "get", -1, NO_METHOD},
    {"EntryWithMethodInOtherCase", R"({"webapi_allow":{"Api":{"Method":["get"]}}})", "Api", "get", -1,
     NO_METHOD},
    {"EntryWithoutMethodNoneAsked", R"({"webapi_allow":{"Api":{}}})", "Api", nullptr, 1},
    {"MethodIsNull", R"({"webapi_allow":{"Api":{"method":null}}})", "Api", "get", -1, BAD_METHOD},
    {"MethodIsString", R"({"webapi_allow":{"Api":{"method":"get"}}})", "Api", "get", -1, BAD_METHOD},
    {"MethodIsObject", R"({"webapi_allow":{"Api":{"method":{"get":1}}}})", "Api", "get", -1, BAD_METHOD},
    {"MethodIsStringNoneAsked", R"({"webapi_allow":{"Api":{"method":"get"}}})", "Api", "", 1},
};

class Permission : public SeamTest, public ::testing::WithParamInterface<Case> {
protected:
    void check(const Texts& expectedLines)
    {
        const Case& testCase = GetParam();
        Json::Value jToken = json(testCase.szRecord);

        EXPECT_EQ(testCase.nResult, checkPermission(jToken, testCase.szApi, testCase.szMethod));

        EXPECT_EQ(expectedLines, takeLines());
        EXPECT_EQ(json(testCase.szRecord), jToken);
    }

    Texts failureLines() const
    {
        Texts lines;
        if (GetParam().szCondition) {
            lines.push_back(failed(UTIL, GetParam().szCondition));
        }
        return lines;
    }
};

INSTANTIATE_TEST_SUITE_P(Cases, Permission, ::testing::ValuesIn(CASES),
                         [](const auto& testInfo) { return testInfo.param.szTestName; });

TEST_P(Permission, IsDecided)
{
    check(failureLines());
}

TEST_P(Permission, IsDecidedAndExplainedInDebugMode)
{
    const Case& testCase = GetParam();
    Texts expected = failureLines();
    if (0 == testCase.nResult) {
        expected.push_back(ordinary(UTIL, std::string("webapi=") + testCase.szApi +
                                              " , method=" + testCase.szMethod +
                                              ", not in allow list, jToken=" + testCase.szRecord));
    } else if (-1 == testCase.nResult) {
        if (!testCase.szCondition) {
            expected.push_back(ordinary(UTIL, std::string("webapi=") + testCase.szApi +
                                                  " not in allow list, jToken=" + testCase.szRecord));
        }
        expected.push_back(ordinary(UTIL, std::string("jToken=") + testCase.szRecord));
    }
    debugInfo(true);

    check(expected);
}

class PermissionRecord : public SeamTest {};

// Elements are read as jsoncpp reads them as text, one after the other, up to the first match.
TEST_F(PermissionRecord, ElementsAreReadAsTextUpToTheMatch)
{
    Json::Value jToken = json(R"({"webapi_allow":{"Api":{"method":[5,"get",{}]}}})");

    EXPECT_EQ(1, checkPermission(jToken, "Api", "5"));
    EXPECT_EQ(1, checkPermission(jToken, "Api", "get"));
    EXPECT_THROW(checkPermission(jToken, "Api", "set"), Json::LogicError);
    EXPECT_EQ(Texts{}, takeLines());
}

TEST_F(PermissionRecord, NothingButWebapiAllowIsLookedAt)
{
    Json::Value jToken = json(RECORD);
    jToken["tid"] = 5;
    jToken["count"] = 0;
    jToken["deadline"] = -1;

    EXPECT_EQ(1, checkPermission(jToken, "Example.Api", "get"));
}

TEST_F(PermissionRecord, FailureTellsErrno)
{
    Json::Value jToken = json("{}");
    errno = EACCES;

    EXPECT_EQ(-1, checkPermission(jToken, "Api", "get"));

    EXPECT_EQ(EACCES, errno);
    EXPECT_EQ((Texts{failed(UTIL, NO_ALLOW, EACCES)}), takeLines());
}

TEST_F(PermissionRecord, NamesAreNoFormats)
{
    const std::string strRecord = R"({"webapi_allow":{"%n":{"method":["%s"]}}})";
    Json::Value jToken = json(strRecord);
    debugInfo(true);

    EXPECT_EQ(-1, checkPermission(jToken, "%s%n", "%m"));
    EXPECT_EQ(0, checkPermission(jToken, "%n", "%m"));

    EXPECT_EQ((Texts{ordinary(UTIL, "webapi=%s%n not in allow list, jToken=" + strRecord),
                     ordinary(UTIL, "jToken=" + strRecord),
                     ordinary(UTIL, "webapi=%n , method=%m, not in allow list, jToken=" + strRecord)}),
              takeLines());
}

} // namespace
