// The fields of records: their types, their defaults, and the check of their types.

#include <climits>
#include <set>

#include "AccessTokenUtil.h"
#include "StoreTest.h"

using VEMO_ACCESS_TOKEN::checkJsonType;
using VEMO_ACCESS_TOKEN::fillDefaultValue;
using VEMO_ACCESS_TOKEN::tokenType;

namespace {

Json::Value defaults()
{
    Json::Value jToken;
    for (const Field& field : fields()) {
        jToken[field.szName] = field.jDefault;
    }
    return jToken;
}

// Two values are equal only if their JSON types are, signed and unsigned told apart.
class TypeTable : public SeamTest {};

TEST_F(TypeTable, HoldsTypeNameAndDefaultOfEachField)
{
    Json::Value jExpected;
    for (const Field& field : fields()) {
        jExpected[field.szName].append(field.szType);
        jExpected[field.szName].append(field.jDefault);
    }
    EXPECT_EQ(jExpected, tokenType());
}

TEST_F(TypeTable, IsBuiltOnceAndItsTimeDoesNotReachRecords)
{
    const Json::Value* pFirst = &tokenType();
    seam().clock = NOW + 5;
    EXPECT_EQ(pFirst, &tokenType());
    EXPECT_EQ(Json::Value(Json::Int64(NOW)), tokenType()["create_time"][1]);
    EXPECT_EQ((Texts{"time"}), seam().calls);
    Json::Value jToken;
    EXPECT_EQ(0, fillDefaultValue(jToken, false));
    EXPECT_EQ(Json::Value(Json::Int64(NOW + 5)), jToken["create_time"]);
}

class Defaults : public SeamTest {};

TEST_F(Defaults, CompleteARecord)
{
    for (const Json::ValueType type : {Json::objectValue, Json::nullValue}) {
        Json::Value jToken(type);
        EXPECT_EQ(0, fillDefaultValue(jToken, false));
        EXPECT_EQ(defaults(), jToken);
    }
    for (const Field& field : fields()) {
        SCOPED_TRACE(field.szName);
        Json::Value jToken = without(field.szName);
        Json::Value jExpected = token();
        jExpected[field.szName] = field.jDefault;
        EXPECT_EQ(0, fillDefaultValue(jToken, false));
        EXPECT_EQ(jExpected, jToken);
    }
}

TEST_F(Defaults, LeaveMembersAsTheyAre)
{
    const Json::Value jGiven = json(
        R"({"count":"5","tid":null,"uid":-1,"extra":[1],"create_time":{},"function":false,"note":7,"":{}})");
    Json::Value jToken = jGiven;
    Json::Value jExpected = defaults();
    for (const std::string& strName : jGiven.getMemberNames()) {
        jExpected[strName] = jGiven[strName];
    }
    for (const bool blCheck : {false, true}) {
        EXPECT_EQ(0, fillDefaultValue(jToken, blCheck));
        EXPECT_EQ(jExpected, jToken);
    }
    EXPECT_EQ(Texts{}, seam().calls);
}

TEST_F(Defaults, CheckTellsTheFirstMissingFieldAndAddsNothing)
{
    Json::Value jRest = token();
    for (auto field = fields().rbegin(); fields().rend() != field; ++field) {
        jRest.removeMember(field->szName); // and all that follow are gone already
        for (const Json::Value& jBefore : {without(field->szName), jRest}) {
            SCOPED_TRACE(text(jBefore));
            Json::Value jToken = jBefore;
            EXPECT_EQ(-1, fillDefaultValue(jToken, true));
            EXPECT_EQ(jBefore, jToken);
            EXPECT_LINES(ordinary(fieldList(field->nLine), std::string("lost data member=") + field->szName));
        }
    }
    Json::Value jNull;
    EXPECT_FAILURE(fillDefaultValue(jNull, true), ordinary(fieldList(2), "lost data member=tid"));
    EXPECT_TRUE(jNull.isNull());
}

TEST_F(Defaults, ThrowForWhatIsNoRecord)
{
    for (const char* szRecord : {"[]", "5", R"("")"}) {
        SCOPED_TRACE(szRecord);
        Json::Value jToken = json(szRecord);
        EXPECT_THROW(fillDefaultValue(jToken, false), Json::LogicError);
        EXPECT_THROW(fillDefaultValue(jToken, true), Json::LogicError);
        EXPECT_EQ(json(szRecord), jToken);
    }
}

class TypeCheck : public SeamTest {
protected:
    // Checks a record: szMessage is that of the failure line, null when the record passes.
    static void check(const Json::Value& jRecord, const char* szMessage, int nErrno = 0)
    {
        SCOPED_TRACE(text(jRecord).substr(0, 200));
        Json::Value jToken = jRecord;
        errno = nErrno;
        EXPECT_EQ(szMessage ? -1 : 0, checkJsonType(jToken));
        EXPECT_LINES(szMessage ? Texts{fail(UTIL, szMessage, nErrno)} : Texts{});
        EXPECT_EQ(jRecord, jToken);
    }

    static void checkFails(const Json::Value& jRecord, const std::string& strName, int nErrno = 0)
    {
        check(jRecord, ("type failed, jmList[i]=" + strName + ", jTokenParam=" + text(jRecord)).c_str(),
              nErrno);
    }
};

// The table decides: a field that is added to it is checked like the others.
TEST_F(TypeCheck, AcceptsTheValuesOfEachTypeOnly)
{
    const std::set<std::string> integral = {"5", "-5", "-9223372036854775808", "18446744073709551615"};
    const std::set<std::string> others = {"null",  "false", "5.5",        R"("5")",
                                          R"("")", "[5]",   R"({"a":5})", "{}"};
    const std::pair<const char*, std::set<std::string>> types[] = {
        {"int", integral},
        {"long long", integral},
        {"uid_t", integral},
        {"time_t", integral},
        {"bool", {"false"}},
        {"string", {R"("5")", R"("")"}},
        {"Json::arrayValue", {"[5]"}},
        {"Json::objectValue", {R"({"a":5})", "{}"}}};
    for (const auto& [szType, accepted] : types) {
        tokenType()["added"][0] = szType;
        for (const auto& values : {integral, others}) {
            for (const std::string& strValue : values) {
                const Json::Value jToken = json("{\"added\":" + strValue + "}");
                accepted.count(strValue) ? check(jToken, nullptr) : checkFails(jToken, "added");
            }
        }
    }
}

TEST_F(TypeCheck, StopsAtTheFirstMemberOfAWrongType)
{
    for (const Field& field : fields()) {
        Json::Value jToken = token();
        jToken[field.szName] = json(field.szOther);
        check(jToken, nullptr);
        checkFails(withWrong(field), field.szName, EACCES);
    }
    checkFails(json(R"({"uid":"0","tid":1,"count":1,"bind_sid":""})"), "tid"); // in the order of the names
    checkFails(json(R"({"count":"%s%n%m%%"})"), "count");
    Json::Value jLong = json(R"({"count":"5"})");
    jLong["tid"] = std::string(200000, 'x');
    checkFails(jLong, "count");
}

TEST_F(TypeCheck, LooksAtNeitherValuesNorOtherNames)
{
    for (const char* szRecord :
         {"{}", R"({"tid":"too short","webapi_allow":{"Api":5}})",
          R"({"Count":"5","tid ":1,"":[],"limit":"x","sort_by":{},"count\u0000":"5"})"}) {
        check(json(szRecord), nullptr);
    }
    checkFails(json(R"({"a":1,"count":"5","z":1})"), "count");
}

TEST_F(TypeCheck, RefusesWhatIsNoObject)
{
    for (const char* szRecord : {"null", "[]", "\"count\"", "5", "true", "1.5"}) {
        check(json(szRecord), "Failed [!jTokenParam.isObject()], err=Permission denied", EACCES);
    }
}

// Names that the check does not know, though the row decoder may.
TEST_F(TypeCheck, RefusesUnknownTypeNames)
{
    for (const char* szType : {"Json::Value", "double", "String", "int ", ""}) {
        SCOPED_TRACE(szType);
        tokenType()["count"][0] = szType;
        check(json(R"({"bind_sid":"","count":5,"tid":1})"), "type not found!!, key=count", EACCES);
    }
}

} // namespace
