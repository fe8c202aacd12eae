// The fields of records: their types, their defaults, and the check of their types.

#include <set>

#include "AccessTokenUtil.h"
#include "StoreTest.h"

using VEMO_ACCESS_TOKEN::checkJsonType;
using VEMO_ACCESS_TOKEN::fillDefaultValue;
using VEMO_ACCESS_TOKEN::tokenType;

namespace {

// Two values are equal only if their JSON types are equal; signed and unsigned are different types.
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

// The test of the model shows what records are completed with.
class Defaults : public SeamTest {};

TEST_F(Defaults, CheckLogsTheFirstMissingFieldAndAddsNothing)
{
    Json::Value jToken = token();
    for (auto field = fields().rbegin(); fields().rend() != field; ++field) {
        jToken.removeMember(field->szName); // the fields after it are removed already
        const Json::Value jBefore = jToken;
        EXPECT_FAILURE(fillDefaultValue(jToken, true),
                       ordinary(fieldList(field->nLine), std::string("lost data member=") + field->szName));
        EXPECT_EQ(jBefore, jToken);
    }
}

class TypeCheck : public SeamTest {
protected:
    // Checks a record. szMessage is the message of the failure line, or null if the record passes.
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
TEST_F(TypeCheck, AcceptsOnlyValuesOfTheFieldsType)
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
        jToken[field.szName] = json(field.szWrong);
        checkFails(jToken, field.szName, EACCES);
    }
    // In the order of the names, whatever the other members are.
    checkFails(json(R"({"uid":"0","tid":1,"count":"%s%n%m%%","bind_sid":"","a":1,"z":1,"Count":[]})"),
               "count");
}

TEST_F(TypeCheck, RefusesOtherValuesThanObjectsAndUnknownTypeNames)
{
    check(Json::Value(), "Failed [!jTokenParam.isObject()], err=Permission denied", EACCES);
    // The row decoder knows the first of these names, but the check does not.
    for (const char* szType : {"Json::Value", "double", "String", "int ", ""}) {
        SCOPED_TRACE(szType);
        tokenType()["count"][0] = szType;
        check(json(R"({"bind_sid":"","count":5,"tid":1})"), "type not found!!, key=count", EACCES);
    }
}

} // namespace
