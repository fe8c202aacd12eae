// The operations of AccessTokens: their effects and results, also when the store is locked or fails.

#include "AccessTokens.h"

#include <algorithm>
#include <filesystem>

#include "Statements.h"
#include "StoreTest.h"

namespace {

const std::string REPLACE = "REPLACE INTO token";
const std::string DELETE_T = deleteSql("tid", "t");
const AccessTokens::Answer GRANTED = AccessTokens::Answer::Granted;
const AccessTokens::Answer REFUSED = AccessTokens::Answer::Refused;
const AccessTokens::Answer FAILED = AccessTokens::Answer::Failed;

// Other tests check the lines that the library logs; they are dropped here.
class TokensTest : public TableTest {
protected:
    void SetUp() override
    {
        TableTest::SetUp();
        seam().clock.reset(); // the class uses the real clock
    }

    void TearDown() override
    {
        std::filesystem::remove(directory() + ".lock");
        seam().lines.clear();
        TableTest::TearDown();
    }

    // The text of the std::runtime_error that a call throws.
    template <typename Call>
    static std::string errorOf(Call call)
    {
        try {
            call();
        } catch (const std::runtime_error& error) {
            return error.what();
        }
        return "none";
    }

    const AccessTokens m_tokens;
    const Json::Value m_jCountOf7 = json(R"({"count":7})");
};

// Each change of the token waits for a lock once, and takes effect.
TEST_F(TokensTest, LiveFromCreationToRevocation)
{
    answerStatements("INSERT", {LOCKED});
    const std::string strTid =
        m_tokens.create(1000, "VPN", json(R"({"count":2,"webapi_allow":{"Api":{"method":["get"]}}})"));
    EXPECT_EQ(2, m_tokens.lookup(strTid)->get("count", 0).asInt());
    answerStatements(REPLACE, {LOCKED});
    EXPECT_TRUE(m_tokens.update(strTid, m_jCountOf7));
    EXPECT_THROW(m_tokens.update(strTid, json(R"({"tid":"u"})")), std::invalid_argument);
    Json::Value jToken;
    EXPECT_EQ(GRANTED, m_tokens.grant(strTid, "Api", "get", &jToken));
    EXPECT_EQ(6, jToken["count"].asInt());
    EXPECT_EQ(1000, jToken["uid"].asInt());
    EXPECT_EQ(GRANTED, m_tokens.grant(strTid, "Api"));
    EXPECT_EQ(strTid, tids());
    EXPECT_EQ("5", countOf(strTid));
    answerStatements("DELETE FROM token WHERE tid", {LOCKED});
    EXPECT_TRUE(m_tokens.revoke(strTid));
    EXPECT_EQ("", tids());
    EXPECT_FALSE(m_tokens.revoke(strTid));
    EXPECT_FALSE(m_tokens.update(strTid, m_jCountOf7));
    EXPECT_EQ(std::nullopt, m_tokens.lookup(strTid));
}

TEST_F(TokensTest, AreRevokedBySessionAndByPurpose)
{
    insert(R"({"tid":"a"})");
    insert(R"({"tid":"b","bind_sid":"S2"})");
    insert(R"({"tid":"c","bind_sid":"S2","function":"MAIL"})");
    insert(R"({"tid":"d","bind_sid":"","function":"MAIL"})");
    m_tokens.revokeSession("S1");
    EXPECT_EQ("b c d", tids());
    m_tokens.revokeFunction("VPN");
    EXPECT_EQ("c d", tids());
    // The library would read this as "no session", and delete the tokens that are bound to none.
    EXPECT_THROW(m_tokens.revokeSession(std::string("\0S2", 3)), std::runtime_error);
    EXPECT_EQ("c d", tids());
}

TEST_F(TokensTest, ReportTheOutcomeOfAGrant)
{
    // The first tries of the statement get the answers. Afterwards the count is szStored.
    const auto says = [&](const char* szCount, const std::string& strStatement,
                          const std::vector<SqlAnswer>& answers, AccessTokens::Answer answer,
                          const char* szStored) {
        SCOPED_TRACE(szCount + (" " + strStatement));
        query("DELETE FROM token");
        insert(std::string("{\"count\":") + szCount + "}");
        answerStatements(strStatement, answers);
        Json::Value jToken = "what the caller had";
        EXPECT_EQ(answer, m_tokens.grant("t", "Api", "get", &jToken));
        EXPECT_EQ(szStored, countOf());
        if (GRANTED != answer) {
            EXPECT_EQ(Json::Value("what the caller had"), jToken);
        } else {
            EXPECT_EQ(szStored[0] ? szStored : szCount, jToken["count"].asString());
        }
    };
    says("2", "", {}, GRANTED, "1");
    says("2", REPLACE, {LOCKED, LOCKED}, GRANTED, "1");
    says("1", DELETE_T, {LOCKED}, GRANTED, "");
    says("0", DELETE_T, {LOCKED}, GRANTED, ""); // 0 is one last use
    says("2", SELECT, {LOCKED}, GRANTED, "1");
    says("2", REPLACE, {DISK_ERROR}, FAILED, "2");
    says("1", DELETE_T, {DISK_ERROR}, FAILED, "1");
    says("2", SELECT, {DISK_ERROR, DISK_ERROR}, FAILED, "2");
    says("2", SELECT, {RUN, DISK_ERROR}, FAILED, "2");
    says("-1", SELECT, {RUN, LOCKED}, GRANTED, "-1"); // an unlimited token needs no change
}

TEST_F(TokensTest, RefuseWhatATokenDoesNotAllow)
{
    insert();
    EXPECT_EQ(REFUSED, m_tokens.grant("u", "Api", "get"));
    EXPECT_EQ(REFUSED, m_tokens.grant("", "Api", "get"));
    EXPECT_EQ(REFUSED, m_tokens.grant(std::string("\0t", 2), "Api", "get"));
    EXPECT_EQ(REFUSED, m_tokens.grant("t", "", "get"));
    EXPECT_EQ(REFUSED, m_tokens.grant("t", "Else", "get"));
    EXPECT_EQ(REFUSED, m_tokens.grant("t", "Api", "put"));
    EXPECT_EQ(REFUSED, m_tokens.grant("t", "Odd", "get")); // the library throws
    EXPECT_EQ("3", countOf());
}

TEST_F(TokensTest, TreatExpiredTokensAsGoneWhenThePurgeFails)
{
    insert(R"({"deadline":1700000000})");
    failStatements(PURGE, DISK_ERROR, 3);
    EXPECT_EQ(REFUSED, m_tokens.grant("t", "Api", "get"));
    EXPECT_EQ(std::nullopt, m_tokens.lookup("t"));
    EXPECT_FALSE(m_tokens.update("t", m_jCountOf7));
    EXPECT_EQ("3", countOf());
}

TEST_F(TokensTest, ThrowWhenTheStoreFails)
{
    insert();
    const auto failsTo = [](const std::string& strStatement, const char* szDone, const auto& call) {
        failStatements(strStatement, DISK_ERROR, 2);
        EXPECT_EQ(std::string("the access token") + szDone + "; the log says why", errorOf(call));
    };
    failsTo("INSERT", " could not be created", [&] { m_tokens.create(0, "VPN"); });
    failsTo(SELECT, " could not be looked up", [&] { m_tokens.lookup("t"); });
    failsTo(REPLACE, " could not be updated", [&] { m_tokens.update("t", m_jCountOf7); });
    failsTo(DELETE_T, " could not be revoked", [&] { m_tokens.revoke("t"); });
    failsTo(deleteSql("bind_sid", "S1"), "s of a session could not be revoked",
            [&] { m_tokens.revokeSession("S1"); });
    failsTo(deleteSql("function", "VPN"), "s of a purpose could not be revoked",
            [&] { m_tokens.revokeFunction("VPN"); });
    EXPECT_EQ("3", countOf());
}

TEST_F(TokensTest, ReportWhyTheyCannotTakeTheLock)
{
    insert();
    VEMO_ACCESS_TOKEN::logToStdout(true);
    const CallLock lock;
    const AccessTokens tokens(std::chrono::milliseconds(0));
    const std::string strReason = "/run/vemo-access-token.lock: Connection timed out";
    ::testing::internal::CaptureStdout();
    EXPECT_EQ(FAILED, tokens.grant("t", "Api", "get"));
    const std::string strLine = ::testing::internal::GetCapturedStdout();
    EXPECT_EQ(strReason + "\n", strLine.substr(std::min(strLine.size(), strLine.find(' ') + 1)));
    EXPECT_EQ(0u, strLine.find("AccessTokens.h:"));
    EXPECT_EQ(strReason, errorOf([&] { tokens.revoke("t"); }));
    EXPECT_EQ(Texts{}, seam().callsOf({"sqlite3_open"}));
    EXPECT_EQ("3", countOf());
}

} // namespace
