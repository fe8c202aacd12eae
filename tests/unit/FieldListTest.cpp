// The nine fields, in their order, through every expansion of the field list.

#include <algorithm>
#include <ostream>

#include "AccessTokenApi.h"
#include "AccessTokenUtil.h"
#include "StoreTest.h"
#include "internal/AccessTokenDbApi.h"

namespace {

using VEMO_ACCESS_TOKEN::checkJsonType;
using VEMO_ACCESS_TOKEN::debugInfo;
using VEMO_ACCESS_TOKEN::fillDefaultValue;
using VEMO_ACCESS_TOKEN::tokenType;

const time_t NOW = 1767355200;

struct Field {
    const char* szName;
    int nLine;
    const char* szType;
    const char* szColumn;
    Json::Value jDefault; // at the time NOW
    const char* szDirective;
    Json::Value jSample;
    std::string strSampleSql;

    std::string location() const { return fieldList(nLine); }
};

std::ostream& operator<<(std::ostream& stream, const Field& field)
{
    return stream << field.szName;
}

// Two values are equal only if their JSON types are, signed and unsigned told apart.
const std::vector<Field>& fields()
{
    static const std::string strTid = tid("sample");
    static const Json::Value jEmpty(Json::objectValue);
    static const std::vector<Field> rgField = {
        {"tid", 2, "string", "tid TEXT primary key NOT NULL", "INVALID_TOKEN_ID", "%Q", strTid,
         "'" + strTid + "'"},
        {"bind_sid", 4, "string", "bind_sid TEXT", "", "%Q", "o'sid", "'o''sid'"},
        {"uid", 6, "long long", "uid INTEGER", 4294967295U, "%lld", 1026, "1026"},
        {"deadline", 8, "long long", "deadline INTEGER default -1", -1, "%lld", 1767355201, "1767355201"},
        {"count", 10, "long long", "count INTEGER default 1", 1, "%lld", -2, "-2"},
        {"create_time", 14, "long long", "create_time INTEGER default CURRENT_TIMESTAMP",
         Json::Value(static_cast<Json::Int64>(NOW)), "%lld", 1767355199, "1767355199"},
        {"function", 16, "string", "function TEXT NOT NULL", "VEMO_ACCESS_TOKEN", "%Q", "purpose",
         "'purpose'"},
        {"webapi_allow", 18, "Json::objectValue", "webapi_allow TEXT", jEmpty, "%Q",
         json(R"({"Api":{"method":["get"]}})"), R"('{"Api":{"method":["get"]}}')"},
        {"extra", 22, "Json::objectValue", "extra TEXT", jEmpty, "%Q", json(R"({"note":"it's"})"),
         R"('{"note":"it''s"}')"},
    };
    return rgField;
}

Json::Value sampleRecord()
{
    Json::Value jToken(Json::objectValue);
    for (const Field& field : fields()) {
        jToken[field.szName] = field.jSample;
    }
    return jToken;
}

// What each field contributes, joined in the list's order.
template <typename Piece>
std::string joined(Piece piece)
{
    std::string strJoined;
    for (const Field& field : fields()) {
        strJoined.append(strJoined.empty() ? "" : ",").append(piece(field));
    }
    return strJoined;
}

Texts linesOfFieldList()
{
    Texts lines = takeLines(Destination::Stdout);
    lines.erase(std::remove_if(lines.begin(), lines.end(),
                               [](const std::string& strLine) { return 0 != strLine.find(FIELD_LIST); }),
                lines.end());
    return lines;
}

class FieldList : public StoreTest {
protected:
    void SetUp() override
    {
        StoreTest::SetUp();
        seam().clock = NOW;
    }

    // The tid of a stored token.
    std::string insertOld() const
    {
        makeDatabase();
        insert(tid("old"), "'',7,8,9,10,'purpose','{}','{}'");
        return tid("old");
    }
};

class FieldListEach : public FieldList, public ::testing::WithParamInterface<Field> {};

INSTANTIATE_TEST_SUITE_P(Fields, FieldListEach, ::testing::ValuesIn(fields()),
                         [](const auto& testInfo) { return testInfo.param.szName; });

TEST_P(FieldListEach, HasTypeNameAndDefaultInTypeTable)
{
    const Json::Value jEntry = tokenType()[GetParam().szName];

    ASSERT_TRUE(jEntry.isArray());
    ASSERT_EQ(2u, jEntry.size());
    EXPECT_EQ(Json::Value(GetParam().szType), jEntry[0]);
    EXPECT_EQ(GetParam().jDefault, jEntry[1]);
}

TEST_P(FieldListEach, IsDefaultedWhenItAloneIsMissing)
{
    Json::Value jToken = sampleRecord();
    jToken.removeMember(GetParam().szName);
    Json::Value jExpected = sampleRecord();
    jExpected[GetParam().szName] = GetParam().jDefault;

    EXPECT_EQ(0, fillDefaultValue(jToken, false));

    EXPECT_EQ(jExpected, jToken);
    EXPECT_EQ(Texts{}, takeLines());
}

TEST_P(FieldListEach, IsReportedLostWithItsLine)
{
    Json::Value jToken = sampleRecord();
    jToken.removeMember(GetParam().szName);
    const Json::Value jBefore = jToken;

    EXPECT_EQ(-1, fillDefaultValue(jToken, true));

    EXPECT_EQ(jBefore, jToken);
    EXPECT_EQ((Texts{ordinary(GetParam().location(), std::string("lost data member=") + GetParam().szName)}),
              takeLines());
}

TEST_P(FieldListEach, IsAskedForBeforeSavingWithItsLine)
{
    const std::string strCondition = std::string("!jParam.isMember(\"") + GetParam().szName + "\")";
    Json::Value jToken = sampleRecord();
    jToken.removeMember(GetParam().szName);

    for (const bool blCreate : {true, false}) {
        SCOPED_TRACE(blCreate);
        AccessTokenDbApi db;

        EXPECT_EQ(-1, db.tokenSave(jToken, blCreate));

        EXPECT_EQ("", db.m_strSql);
        EXPECT_EQ((Texts{failed(GetParam().location(), strCondition)}), takeLines());
        EXPECT_EQ(Texts{}, seam().callsOf(OPENING_CALLS));
    }
}

TEST_P(FieldListEach, IsTypeCheckedByItsTypeName)
{
    Json::Value jGood(Json::objectValue);
    jGood[GetParam().szName] = GetParam().jSample;
    Json::Value jBad(Json::objectValue);
    jBad[GetParam().szName] = Json::Value(Json::arrayValue);

    EXPECT_EQ(0, checkJsonType(jGood));
    EXPECT_EQ(-1, checkJsonType(jBad));

    const std::string strName = GetParam().szName;
    EXPECT_EQ(
        (Texts{fail(UTIL, "type failed, jmList[i]=" + strName + ", jTokenParam={\"" + strName + "\":[]}")}),
        takeLines());
}

TEST_P(FieldListEach, IsUpdatedAloneWithADebugLine)
{
    std::string strTid = insertOld();
    Json::Value jExpected = json(R"({"bind_sid":"","uid":7,"deadline":8,"count":9,"create_time":10,
                                     "function":"purpose","webapi_allow":{},"extra":{}})");
    jExpected["tid"] = strTid;
    jExpected[GetParam().szName] = GetParam().jSample;
    Json::Value jParam(Json::objectValue);
    jParam[GetParam().szName] = GetParam().jSample;
    AccessTokenApi api;
    debugInfo(true);

    EXPECT_EQ(0, api.tokenUpdateByTid(strTid, jParam));

    EXPECT_EQ(
        (Texts{ordinary(GetParam().location(), std::string("overwrite token[") + GetParam().szName + "]")}),
        linesOfFieldList());
    Json::Value jToken;
    std::string strTidWritten = jExpected["tid"].asString();
    EXPECT_EQ(1, api.tokenGetByTid(strTidWritten, jToken));
    EXPECT_EQ(jExpected, jToken);
}

TEST_F(FieldList, FirstMissingFieldStopsTheCheckAndTheSave)
{
    Json::Value jToken = sampleRecord();
    for (auto field = fields().rbegin(); fields().rend() != field; ++field) {
        SCOPED_TRACE(field->szName);
        jToken.removeMember(field->szName); // and all that follow are gone already
        AccessTokenDbApi db;

        EXPECT_EQ(-1, fillDefaultValue(jToken, true));
        EXPECT_EQ(-1, db.tokenSave(jToken, true));

        const std::string strName = field->szName;
        EXPECT_EQ((Texts{ordinary(field->location(), "lost data member=" + strName),
                         failed(field->location(), "!jParam.isMember(\"" + strName + "\")")}),
                  takeLines());
    }
}

TEST_F(FieldList, NamesAllColumnsOfTheStatements)
{
    AccessTokenDbApi db;
    std::string strSql = "SELECT ";

    EXPECT_EQ(0, db.SqlExpandMemberName(strSql));

    EXPECT_EQ("SELECT " + joined([](const Field& field) { return field.szName; }), strSql);
}

TEST_F(FieldList, GivesEachValueItsDirective)
{
    AccessTokenDbApi db;
    std::string strSql = "(";

    EXPECT_EQ(0, db.SqlExpandMemberSymbol(strSql));

    EXPECT_EQ("(" + joined([](const Field& field) { return field.szDirective; }) + ")", strSql);
}

TEST_F(FieldList, DeclaresAllColumnsOfTheTable)
{
    AccessTokenDbApi db;
    std::string strSql = "replaced";

    EXPECT_EQ(0, db.SqlExpandCreateTable(strSql));

    EXPECT_EQ("PRAGMA auto_vacuum = FULL; CREATE TABLE if not exists token (" +
                  joined([](const Field& field) { return field.szColumn; }) + ");",
              strSql);
    EXPECT_EQ(0, db.createTable());
    EXPECT_EQ((Texts{joined([](const Field& field) { return field.szName; })}),
              query("SELECT group_concat(name, ',') FROM pragma_table_info('token')"));
}

TEST_F(FieldList, WritesAndReadsAllValues)
{
    Json::Value jToken = sampleRecord();
    Json::Value jFilter(Json::objectValue);
    Json::Value jRead(Json::arrayValue);
    AccessTokenDbApi db;

    EXPECT_EQ(0, db.tokenSave(jToken, true));

    EXPECT_EQ("INSERT INTO token (" + joined([](const Field& field) { return field.szName; }) + ") VALUES (" +
                  joined([](const Field& field) { return field.strSampleSql; }) + ")",
              db.m_strSql);
    EXPECT_EQ(0, db.tokenGet(jFilter, jRead));
    ASSERT_EQ(1u, jRead.size());
    EXPECT_EQ(sampleRecord(), jRead[0]);
    EXPECT_EQ(Texts{}, takeLines());
}

TEST_F(FieldList, UpdatesAllFieldsInOrder)
{
    std::string strTid = insertOld();
    Json::Value jParam = sampleRecord();
    AccessTokenApi api;
    debugInfo(true);

    EXPECT_EQ(0, api.tokenUpdateByTid(strTid, jParam));

    Texts expected;
    for (const Field& field : fields()) {
        expected.push_back(ordinary(field.location(), std::string("overwrite token[") + field.szName + "]"));
    }
    EXPECT_EQ(expected, linesOfFieldList());
}

TEST_F(FieldList, UpdateIsSilentWithoutDebug)
{
    std::string strTid = insertOld();
    Json::Value jParam = sampleRecord();
    AccessTokenApi api;

    EXPECT_EQ(0, api.tokenUpdateByTid(strTid, jParam));

    EXPECT_EQ(Texts{}, takeLines());
}

TEST_F(FieldList, HoldsNoOtherField)
{
    std::string strNames; // the members of an object come sorted
    for (const std::string& strName : tokenType().getMemberNames()) {
        strNames.append(strName).append(" ");
    }
    EXPECT_EQ("bind_sid count create_time deadline extra function tid uid webapi_allow ", strNames);
}

// A record may carry more than a row holds.
TEST_F(FieldList, MembersOfOtherNamesAreNeitherDefaultedNorCheckedNorStored)
{
    const Json::Value jOther = json(R"({"note":[1],"Tid":5,"tid ":null,"":{}})");
    Json::Value jToken = jOther;
    Json::Value jExpected = jOther;
    for (const Field& field : fields()) {
        jExpected[field.szName] = field.jDefault;
    }
    AccessTokenDbApi db;

    EXPECT_EQ(0, checkJsonType(jToken));
    EXPECT_EQ(0, fillDefaultValue(jToken, false));
    EXPECT_EQ(jExpected, jToken);
    EXPECT_EQ(0, checkJsonType(jToken));
    EXPECT_EQ(0, db.tokenCreate(jToken));

    EXPECT_EQ("INSERT INTO token (tid,bind_sid,uid,deadline,count,create_time,function,webapi_allow,extra) "
              "VALUES ('INVALID_TOKEN_ID','',4294967295,-1,1,1767355200,'VEMO_ACCESS_TOKEN','{}','{}')",
              db.m_strSql);
    EXPECT_EQ(Texts{}, takeLines());
}

} // namespace
