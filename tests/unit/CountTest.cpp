// Counting the uses of tokens, one by one and where grants overlap.

#include <cstring>
#include <functional>

#include "AccessTokenUtil.h"
#include "OneGrant.h"

namespace {

struct CountCase {
    const char* szName;
    const char* szCount;
    const char* szStored; // after the grant
    Json::Int64 nHandedBack;
    std::string strStatement; // besides the SELECT
};

void PrintTo(const CountCase& count, std::ostream* pStream)
{
    *pStream << count.szName;
}

const CountCase COUNTS[] = {
    {"Three", "3", "2", 2, replaceSql(2)},
    {"Two", "2", "1", 1, replaceSql(1)},
    {"One", "1", "", 1, DELETE_T},
    {"Zero", "0", "", 0, DELETE_T},
    {"MinusOne", "-1", "-1", -1, ""},
    {"Least", "-9223372036854775808", "-9223372036854775808", INT64_MIN, ""},
    {"Most", "9223372036854775807", "9223372036854775806", INT64_MAX - 1, replaceSql(INT64_MAX - 1)}};

class GrantOfCount : public OneGrant, public ::testing::WithParamInterface<CountCase> {};

TEST_P(GrantOfCount, SpendsOneUse)
{
    insertToken(GetParam().szCount);

    EXPECT_EQ(0, grant("t", "Api", "get"));

    EXPECT_EQ(GetParam().szStored, countOf("t"));
    Json::Value jExpected = json(recordText(0));
    jExpected["count"] = GetParam().nHandedBack;
    EXPECT_EQ(jExpected, m_jToken);
    Texts statements = {"sqlite3_exec " + SELECT_T};
    if (!GetParam().strStatement.empty()) {
        statements.push_back("sqlite3_exec " + GetParam().strStatement);
    }
    EXPECT_EQ(statements, seam().callsOf({"sqlite3_exec"}));
    EXPECT_EQ(Texts{}, takeLines());
}

INSTANTIATE_TEST_SUITE_P(Counts, GrantOfCount, ::testing::ValuesIn(COUNTS),
                         [](const auto& test) { return std::string(test.param.szName); });

// Nothing is locked between the lookup and the change: another process may come in between.
class GrantOverlaps : public OneGrant {
protected:
    // Runs something once, just ahead of the first statement that is no SELECT.
    void meanwhile(std::function<void()> run)
    {
        seam().sqliteExec = [run](sqlite3* pDb, const char* szSql, SqlCallback callback, void* pArgument,
                                  char** pszError) mutable {
            if (run && 0 != strncmp(szSql, "SELECT", 6)) {
                const std::function<void()> runOnce = std::move(run);
                run = nullptr;
                runOnce();
            }
            return Seam::exec(pDb, szSql, callback, pArgument, pszError);
        };
    }

    // The whole grant by another service.
    void grantElsewhere()
    {
        AccessTokenApi another;
        std::string strTid = "t";
        Json::Value jToken;
        EXPECT_EQ(0, another.tokenGrant(strTid, "Api", "get", jToken));
    }
};

TEST_F(GrantOverlaps, AndSpendsOneUseForTwoGrants)
{
    insertToken("3");
    meanwhile([this] { grantElsewhere(); });

    EXPECT_EQ(0, grant("t", "Api", "get"));

    EXPECT_EQ("2", countOf("t"));
    EXPECT_EQ(json(recordText(2)), m_jToken);
}

TEST_F(GrantOverlaps, AndBothSpendTheLastUse)
{
    insertToken("1");
    meanwhile([this] { grantElsewhere(); });

    EXPECT_EQ(0, grant("t", "Api", "get"));

    EXPECT_EQ("", countOf("t"));
    EXPECT_EQ(json(recordText(1)), m_jToken);
    EXPECT_EQ(Texts{}, takeLines());
}

TEST_F(GrantOverlaps, AndSavesATokenThatWasDeletedMeanwhile)
{
    insertToken("3");
    meanwhile([this] { query("DELETE FROM token"); });

    EXPECT_EQ(0, grant("t", "Api", "get"));

    EXPECT_EQ("2", countOf("t"));
}

class Degrade : public OneGrant {};

// What a record may be that no table yielded.
TEST_F(Degrade, RefusesMalformedRecords)
{
    const std::string strCount = failed(SERVICE, "!jToken.isMember(\"count\")");
    const std::string strObject = failed(SERVICE, "jToken.type() != Json::objectValue");
    const std::string strTid = failed(SERVICE, "!jToken.isMember(\"tid\")");
    const std::string strString = failed(SERVICE, "jToken[\"tid\"].type() != Json::stringValue");
    const std::pair<const char*, Texts> records[] = {
        {"null", {strObject}},
        {"[1]", {strObject}},
        {"\"count\"", {strObject}},
        {"{}", {strCount}},
        {R"({"tid":"t"})", {strCount}},
        {R"({"count":1})", {strTid}},
        {R"({"count":0})", {strTid}},
        {R"({"count":1,"tid":7})", {strString}},
        {R"({"count":null,"tid":null})", {strString}},
        {R"({"count":1,"tid":""})",
         {failed(SERVICE, "strValue.empty()"),
          ordinary(SERVICE, "tokenDeleteByName failed, name=tid, strValue="),
          failed(SERVICE, "0 > tokenDeleteByTid(strTid)")}}};
    for (const bool blDebug : {false, true}) {
        VEMO_ACCESS_TOKEN::debugInfo(blDebug);
        for (const auto& [szRecord, lines] : records) {
            SCOPED_TRACE(szRecord);
            Json::Value jToken = json(szRecord);

            EXPECT_EQ(-1, api().tokenCountDegrade(jToken));

            Texts expected = lines;
            if (blDebug) {
                expected.push_back(
                    ordinary(SERVICE, std::string("tokenCountDegrade failed, jToken=") + szRecord));
            }
            EXPECT_EQ(expected, takeLines());
            EXPECT_EQ(json(szRecord), jToken);
        }
    }
    EXPECT_EQ(Texts{}, seam().callsOf({"sqlite3_exec"}));
}

// The count is lowered before the record is saved, and stays so when the save refuses the record.
TEST_F(Degrade, LowersTheCountOfARecordThatCannotBeSaved)
{
    Json::Value jToken = json(R"({"count":2,"tid":"t"})");
    VEMO_ACCESS_TOKEN::debugInfo(true);

    EXPECT_EQ(-1, api().tokenCountDegrade(jToken));

    EXPECT_EQ(json(R"({"count":1,"tid":"t"})"), jToken);
    EXPECT_EQ((Texts{ordinary(fieldList(4), "lost data member=bind_sid"),
                     failed(SERVICE, "0 > fillDefaultValue(jToken, true)"),
                     ordinary(SERVICE, R"(tokenSaveByOverwrite failed, jToken={"count":1,"tid":"t"})"),
                     failed(SERVICE, "0 > tokenSaveByOverwrite(jToken)"),
                     ordinary(SERVICE, R"(tokenCountDegrade failed, jToken={"count":1,"tid":"t"})")}),
              takeLines());
}

TEST_F(Degrade, SavesTheLoweredCount)
{
    insertToken("2");
    Json::Value jToken = json(recordText(2));

    EXPECT_EQ(0, api().tokenCountDegrade(jToken));

    EXPECT_EQ("1", countOf("t"));
    EXPECT_EQ(json(recordText(1)), jToken);
    EXPECT_EQ(Texts{}, takeLines());
}

TEST_F(Degrade, LeavesUnlimitedRecordsAlone)
{
    for (const char* szRecord : {R"({"count":-1})", R"({"count":-9223372036854775808,"tid":7})"}) {
        Json::Value jToken = json(szRecord);

        EXPECT_EQ(0, api().tokenCountDegrade(jToken));

        EXPECT_EQ(json(szRecord), jToken);
    }
    EXPECT_EQ(Texts{}, seam().callsOf({"sqlite3_exec"}));
    EXPECT_EQ(Texts{}, takeLines());
}

TEST_F(Degrade, DeletesByTidWhateverElseTheRecordHolds)
{
    insertToken("5");
    Json::Value jToken = json(R"({"count":1,"tid":"t"})");

    EXPECT_EQ(0, api().tokenCountDegrade(jToken));
    EXPECT_EQ("", countOf("t"));
    // A token that has gone already is no failure.
    EXPECT_EQ(0, api().tokenCountDegrade(jToken));

    EXPECT_EQ(json(R"({"count":1,"tid":"t"})"), jToken);
    EXPECT_EQ(Texts{}, takeLines());
}

TEST_F(Degrade, LetsTheExceptionOfACountThatIsNoNumberPass)
{
    for (const char* szRecord :
         {R"({"count":"2","tid":"t"})", R"({"count":18446744073709551615,"tid":"t"})"}) {
        Json::Value jToken = json(szRecord);

        EXPECT_THROW(api().tokenCountDegrade(jToken), Json::LogicError);

        EXPECT_EQ(json(szRecord), jToken);
    }
    EXPECT_EQ(Texts{}, seam().callsOf({"sqlite3_exec"}));
}

} // namespace
