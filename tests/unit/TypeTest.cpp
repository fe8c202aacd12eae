// The type table and the validation of records.

#include <algorithm>
#include <limits>
#include <ostream>

#include "AccessTokenUtil.h"
#include "StoreTest.h"

namespace {

using VEMO_ACCESS_TOKEN::checkJsonType;
using VEMO_ACCESS_TOKEN::fillDefaultValue;
using VEMO_ACCESS_TOKEN::tokenType;

const std::string NO_OBJECT = "!jTokenParam.isObject()";

std::string typeFailed(const std::string& strName, const std::string& strRecord)
{
    return "type failed, jmList[i]=" + strName + ", jTokenParam=" + strRecord;
}

class TypeTable : public SeamTest {};

TEST_F(TypeTable, HoldsTypeNameAndDefaultOfEachField)
{
    seam().clock = 1767355200;
    Json::Value jExpected = json(R"({
        "tid": ["string", "INVALID_TOKEN_ID"],
        "bind_sid": ["string", ""],
        "deadline": ["long long", -1],
        "count": ["long long", 1],
        "create_time": ["long long", 1767355200],
        "function": ["string", "VEMO_ACCESS_TOKEN"],
        "webapi_allow": ["Json::objectValue", {}],
        "extra": ["Json::objectValue", {}]})");
    jExpected["uid"].append("long long");
    jExpected["uid"].append(4294967295U);

    EXPECT_EQ(jExpected, tokenType());
    EXPECT_EQ(Json::uintValue, tokenType()["uid"][1].type());
    EXPECT_EQ(Json::intValue, tokenType()["create_time"][1].type());
    EXPECT_EQ(Texts{}, takeLines());
}

TEST_F(TypeTable, IsBuiltByTheFirstCallAlone)
{
    seam().clock = 1767355200;
    const Json::Value* pFirst = &tokenType();
    seam().clock = 1767355205;
    const Json::Value* pSecond = &tokenType();

    EXPECT_EQ(pFirst, pSecond);
    EXPECT_EQ(Json::Value(1767355200), tokenType()["create_time"][1]);
    EXPECT_EQ((Texts{"time"}), seam().calls);
}

TEST_F(TypeTable, FrozenTimeDoesNotReachRecords)
{
    seam().clock = 1767355200;
    tokenType();
    seam().clock = 1767355205;
    Json::Value jToken;

    EXPECT_EQ(0, fillDefaultValue(jToken, false));

    EXPECT_EQ(Json::Value(1767355205), jToken["create_time"]);
}

// A value of each kind, by the name that the table of types uses for it.
const std::vector<std::pair<std::string, Json::Value>>& kinds()
{
    static const std::vector<std::pair<std::string, Json::Value>> rgKind = {
        {"null", Json::Value()},
        {"bool", false},
        {"int", 5},
        {"negative", -5},
        {"unsigned", 5U},
        {"least", std::numeric_limits<Json::Int64>::min()},
        {"greatest", std::numeric_limits<Json::UInt64>::max()},
        {"real", 5.5},
        {"text", "5"},
        {"no text", ""},
        {"array", json("[5]")},
        {"object", json(R"({"a":5})")},
        {"empty object", Json::Value(Json::objectValue)},
    };
    return rgKind;
}

struct Type {
    const char* szTestName;
    const char* szType;
    Texts accepted;
};

std::ostream& operator<<(std::ostream& stream, const Type& type)
{
    return stream << type.szType;
}

const Texts INTEGRAL = {"int", "negative", "unsigned", "least", "greatest"};

class EachType : public SeamTest, public ::testing::WithParamInterface<Type> {};

INSTANTIATE_TEST_SUITE_P(TypeNames, EachType,
                         ::testing::Values(Type{"Int", "int", INTEGRAL},
                                           Type{"LongLong", "long long", INTEGRAL},
                                           Type{"UidT", "uid_t", INTEGRAL}, Type{"TimeT", "time_t", INTEGRAL},
                                           Type{"Bool", "bool", {"bool"}},
                                           Type{"String", "string", {"text", "no text"}},
                                           Type{"Array", "Json::arrayValue", {"array"}},
                                           Type{"Object", "Json::objectValue", {"object", "empty object"}}),
                         [](const auto& testInfo) { return testInfo.param.szTestName; });

// The table is what decides: a field that is added to it is checked like the others.
TEST_P(EachType, AcceptsItsKindsOfValuesOnly)
{
    tokenType()["added"].append(GetParam().szType);

    for (const auto& kind : kinds()) {
        SCOPED_TRACE(kind.first);
        const auto& accepted = GetParam().accepted;
        const bool blAccepted = accepted.end() != std::find(accepted.begin(), accepted.end(), kind.first);
        Json::Value jToken(Json::objectValue);
        jToken["added"] = kind.second;

        EXPECT_EQ(blAccepted ? 0 : -1, checkJsonType(jToken));

        EXPECT_EQ(blAccepted ? 0u : 1u, takeLines().size());
        EXPECT_EQ(kind.second, jToken["added"]);
    }
}

class Validation : public SeamTest {
protected:
    struct Row {
        const char* szRecord;
        const char* szMessage; // of the failure line; nullptr when the record passes
    };

    void check(const std::vector<Row>& rows, int nErrno = 0)
    {
        for (const Row& row : rows) {
            SCOPED_TRACE(row.szRecord);
            Json::Value jToken = json(row.szRecord);
            const Json::Value jBefore = jToken;
            Texts expected;
            if (row.szMessage) {
                expected.push_back(fail(UTIL, row.szMessage, nErrno));
            }
            errno = nErrno;

            EXPECT_EQ(row.szMessage ? -1 : 0, checkJsonType(jToken));

            EXPECT_EQ(expected, takeLines());
            EXPECT_EQ(jBefore, jToken);
        }
    }
};

TEST_F(Validation, RefusesWhatIsNoObject)
{
    for (const char* szRecord : {"null", "[]", "\"count\"", "5", "true", "1.5"}) {
        SCOPED_TRACE(szRecord);
        Json::Value jToken = json(szRecord);

        EXPECT_EQ(-1, checkJsonType(jToken));

        EXPECT_EQ((Texts{failed(UTIL, NO_OBJECT)}), takeLines());
        EXPECT_EQ(json(szRecord), jToken);
    }
}

TEST_F(Validation, PassesRecordsOfRightTypes)
{
    check({{"{}", nullptr},
           {R"({"count":5})", nullptr},
           {R"({"extra":{}})", nullptr},
           {R"({"tid":"","bind_sid":"","uid":0,"deadline":-1,"count":-9223372036854775808,
                "create_time":18446744073709551615,"function":"","webapi_allow":{},"extra":{"a":[]}})",
            nullptr},
           // neither value nor shape is looked at
           {R"({"tid":"too short","webapi_allow":{"Api":5}})", nullptr}});
}

TEST_F(Validation, StopsAtTheFirstBadMemberByName)
{
    check({{R"({"count":"5"})", R"(type failed, jmList[i]=count, jTokenParam={"count":"5"})"},
           {R"({"extra":[]})", R"(type failed, jmList[i]=extra, jTokenParam={"extra":[]})"},
           {R"({"tid":null})", R"(type failed, jmList[i]=tid, jTokenParam={"tid":null})"},
           {R"({"webapi_allow":"{}"})",
            R"(type failed, jmList[i]=webapi_allow, jTokenParam={"webapi_allow":"{}"})"},
           {R"({"uid":"0","tid":1,"count":1,"bind_sid":""})",
            R"(type failed, jmList[i]=tid, jTokenParam={"bind_sid":"","count":1,"tid":1,"uid":"0"})"},
           {R"({"uid":"0","bind_sid":5})",
            R"(type failed, jmList[i]=bind_sid, jTokenParam={"bind_sid":5,"uid":"0"})"}});
}

TEST_F(Validation, UnsignedCountPasses)
{
    Json::Value jToken(Json::objectValue);
    jToken["count"] = 5U;
    EXPECT_EQ(0, checkJsonType(jToken));
}

TEST_F(Validation, BooleanIsAsIntegralAsJsoncppSays)
{
    Json::Value jToken = json(R"({"count":true})");
    EXPECT_EQ(jToken["count"].isIntegral() ? 0 : -1, checkJsonType(jToken));
}

TEST_F(Validation, IgnoresOtherNames)
{
    check({{R"({"Count":"5","tid ":1,"":[],"limit":"x","sort_by":{}})", nullptr},
           {R"({"count\u0000":"5"})", nullptr},
           {R"({"a":1,"count":"5","z":1})",
            R"(type failed, jmList[i]=count, jTokenParam={"a":1,"count":"5","z":1})"}});
}

TEST_F(Validation, FailureTellsErrno)
{
    check({{"[]", "Failed [!jTokenParam.isObject()], err=Permission denied"},
           {R"({"count":"5"})", R"(type failed, jmList[i]=count, jTokenParam={"count":"5"})"}},
          EACCES);
}

TEST_F(Validation, TextOfTheRecordIsNoFormat)
{
    check({{R"({"count":"%s%n%m%%"})", R"(type failed, jmList[i]=count, jTokenParam={"count":"%s%n%m%%"})"}});
}

// Names that the checker does not know, though the row decoder may.
TEST_F(Validation, UnknownTypeNameIsAnError)
{
    for (const char* szType : {"Json::Value", "double", "String", "int ", ""}) {
        SCOPED_TRACE(szType);
        tokenType()["count"][0] = szType;
        Json::Value jToken = json(R"({"bind_sid":"","count":5,"tid":1})");

        errno = EACCES;
        EXPECT_EQ(-1, checkJsonType(jToken));

        EXPECT_EQ((Texts{fail(UTIL, "type not found!!, key=count", EACCES)}), takeLines());
    }
}

TEST_F(Validation, WholeRecordIsLoggedHoweverLong)
{
    Json::Value jToken = json(R"({"count":"5"})");
    const std::string strLong(200000, 'x');
    jToken["tid"] = strLong;

    EXPECT_EQ(-1, checkJsonType(jToken));

    EXPECT_EQ((Texts{fail(UTIL, typeFailed("count", R"({"count":"5","tid":")" + strLong + "\"}"))}),
              takeLines());
}

class ValidationInSystemLog : public SeamTest {
protected:
    ValidationInSystemLog() : SeamTest(Destination::Syslog) {}
};

TEST_F(ValidationInSystemLog, TellsErrnoInFrontOfEachLineWhenThereIsOne)
{
    tokenType()["count"][0] = "double";
    Json::Value jUnknown = json(R"({"count":5})");
    Json::Value jWrong = json(R"({"tid":1})");
    for (const int nErrno : {0, EACCES}) {
        errno = nErrno;
        EXPECT_EQ(-1, checkJsonType(jUnknown));
        EXPECT_EQ(-1, checkJsonType(jWrong));
        EXPECT_EQ(inSystemLog({fail(UTIL, "type not found!!, key=count", nErrno),
                               fail(UTIL, typeFailed("tid", R"({"tid":1})"), nErrno)},
                              nErrno),
                  takeLines(Destination::Syslog));
    }
}

} // namespace
