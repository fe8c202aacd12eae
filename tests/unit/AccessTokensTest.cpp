// The operations of AccessTokens: what each does and says, also where the store makes it wait or fails.

#include "AccessTokens.h"

#include <filesystem>

#include "Statements.h"
#include "StoreTest.h"

namespace {

const std::string ALLOW = R"({"Api":{"method":["get"]},"Odd":{"method":[{}]}})";
const std::string REPLACE = "REPLACE INTO token";
const std::string DELETE_T = deleteSql("tid", "t");
const AccessTokens::Answer GRANTED = AccessTokens::Answer::Granted;
const AccessTokens::Answer REFUSED = AccessTokens::Answer::Refused;
const AccessTokens::Answer FAILED = AccessTokens::Answer::Failed;

class TokensTest : public StoreTest {
protected:
    void SetUp() override
    {
        StoreTest::SetUp();
        makeDatabase();
    }

    void TearDown() override
    {
        std::filesystem::remove(directory() + ".lock");
        StoreTest::TearDown();
    }

    void insertToken(const std::string& strCount, const std::string& strDeadline = "9999999999") const
    {
        insert("t", "'S1',1000," + strDeadline + "," + strCount + ",1700000000,'VPN','" + ALLOW + "','{}'");
    }

    // The text of the std::runtime_error that a call throws.
    template <typename Call>
    static std::string failureOf(Call call)
    {
        try {
            call();
        } catch (const std::runtime_error& error) {
            return error.what();
        }
        return "none";
    }

    const AccessTokens m_tokens;
};

TEST_F(TokensTest, GoThroughTheirLife)
{
    Json::Value jOption;
    jOption["count"] = 2;
    jOption["webapi_allow"]["Api"]["method"].append("get");
    const std::string strTid = m_tokens.create(1000, "VPN", jOption);
    EXPECT_EQ("2", countOf(strTid));
    EXPECT_EQ(2, m_tokens.lookup(strTid)->get("count", 0).asInt());

    Json::Value jChange;
    jChange["count"] = 3;
    EXPECT_TRUE(m_tokens.update(strTid, jChange));
    Json::Value jToken;
    EXPECT_EQ(GRANTED, m_tokens.grant(strTid, "Api", "get", &jToken));
    EXPECT_EQ(2, jToken["count"].asInt());
    EXPECT_EQ(1000, jToken["uid"].asInt());
    EXPECT_EQ(GRANTED, m_tokens.grant(strTid, "Api"));

    EXPECT_TRUE(m_tokens.revoke(strTid));
    EXPECT_EQ("", countOf(strTid));
    EXPECT_FALSE(m_tokens.revoke(strTid));
    EXPECT_FALSE(m_tokens.update(strTid, jChange));
    EXPECT_EQ(std::nullopt, m_tokens.lookup(strTid));
}

TEST_F(TokensTest, AreRevokedBySessionAndByPurpose)
{
    insert("a", "'S1',1000,9999999999,1,1700000000,'VPN','{}','{}'");
    insert("b", "'S2',1000,9999999999,1,1700000000,'VPN','{}','{}'");
    insert("c", "'S2',1000,9999999999,1,1700000000,'MAIL','{}','{}'");
    insert("d", "'',1000,9999999999,1,1700000000,'MAIL','{}','{}'");
    m_tokens.revokeSession("S1");
    EXPECT_EQ((Texts{"b", "c", "d"}), query("SELECT tid FROM token"));
    m_tokens.revokeFunction("VPN");
    EXPECT_EQ((Texts{"c", "d"}), query("SELECT tid FROM token"));

    // The library would take it for "no session", and delete those that are bound to none.
    EXPECT_THROW(m_tokens.revokeSession(std::string("\0S2", 3)), std::runtime_error);
    EXPECT_EQ((Texts{"c", "d"}), query("SELECT tid FROM token"));
}

TEST_F(TokensTest, KeepTheirId)
{
    insertToken("1");
    Json::Value jChange;
    jChange["tid"] = "u";
    EXPECT_THROW(m_tokens.update("t", jChange), std::invalid_argument);
    EXPECT_EQ(Texts{"t"}, query("SELECT tid FROM token"));
}

struct GrantCase {
    const char* szName;
    std::string strCount;
    std::string strStatement; // of which the first tries are answered
    std::vector<Answer> answers;
    AccessTokens::Answer answer;
    std::string strStored; // the count afterwards
};

const GrantCase GRANTS[] = {
    {"SpendsOneUse", "2", "", {}, GRANTED, "1"},
    {"SpendsOneUseAfterAWait", "2", REPLACE, {LOCKED, LOCKED}, GRANTED, "1"},
    {"SpendsTheLastUseAfterAWait", "1", DELETE_T, {LOCKED}, GRANTED, ""},
    {"TakesZeroForALastUse", "0", DELETE_T, {LOCKED}, GRANTED, ""},
    {"LooksAgainAfterAWait", "2", SELECT, {LOCKED}, GRANTED, "1"},
    {"CannotSpendAUse", "2", REPLACE, {DISK_ERROR}, FAILED, "2"},
    {"CannotSpendTheLastUse", "1", DELETE_T, {DISK_ERROR}, FAILED, "1"},
    {"CannotLookUp", "2", SELECT, {DISK_ERROR, DISK_ERROR}, FAILED, "2"},
    {"CannotLookUpWhatTheLibraryGrants", "2", SELECT, {RUN, DISK_ERROR}, FAILED, "2"},
    {"NeedsNoChangeWhereItIsUnlimited", "-1", SELECT, {RUN, LOCKED}, GRANTED, "-1"},
};

class GrantByTokens : public TokensTest, public ::testing::WithParamInterface<GrantCase> {};

TEST_P(GrantByTokens, SaysWhatHappened)
{
    insertToken(GetParam().strCount);
    answerStatements(GetParam().strStatement, GetParam().answers);

    Json::Value jToken = "what the caller had";
    EXPECT_EQ(GetParam().answer, m_tokens.grant("t", "Api", "get", &jToken));

    EXPECT_EQ(GetParam().strStored, countOf("t"));
    if (GRANTED != GetParam().answer) {
        EXPECT_EQ(Json::Value("what the caller had"), jToken);
    } else if (!GetParam().strStored.empty()) {
        EXPECT_EQ(GetParam().strStored, jToken["count"].asString());
    } else {
        EXPECT_EQ(GetParam().strCount, jToken["count"].asString());
    }
}

INSTANTIATE_TEST_SUITE_P(Grants, GrantByTokens, ::testing::ValuesIn(GRANTS),
                         [](const auto& test) { return std::string(test.param.szName); });

TEST_F(TokensTest, RefuseWhatATokenDoesNotOpen)
{
    insertToken("2");
    EXPECT_EQ(REFUSED, m_tokens.grant("u", "Api", "get"));
    EXPECT_EQ(REFUSED, m_tokens.grant("", "Api", "get"));
    EXPECT_EQ(REFUSED, m_tokens.grant(std::string("\0t", 2), "Api", "get"));
    EXPECT_EQ(REFUSED, m_tokens.grant("t", "", "get"));
    EXPECT_EQ(REFUSED, m_tokens.grant("t", "Else", "get"));
    EXPECT_EQ(REFUSED, m_tokens.grant("t", "Api", "put"));
    EXPECT_EQ(REFUSED, m_tokens.grant("t", "Odd", "get")); // the library throws
    EXPECT_EQ("2", countOf("t"));
}

TEST_F(TokensTest, TakeWhatHasExpiredForGoneThoughItCannotBePurged)
{
    insertToken("2", "1700000000");
    failStatements(PURGE, DISK_ERROR, 3);
    EXPECT_EQ(REFUSED, m_tokens.grant("t", "Api", "get"));
    EXPECT_EQ(std::nullopt, m_tokens.lookup("t"));
    EXPECT_FALSE(m_tokens.update("t", Json::Value(Json::objectValue)));
    EXPECT_EQ("2", countOf("t"));
}

TEST_F(TokensTest, WaitAndDoWhatTheySay)
{
    answerStatements("INSERT", {LOCKED});
    const std::string strTid = m_tokens.create(0, "VPN");
    EXPECT_EQ("1", countOf(strTid));

    answerStatements(REPLACE, {LOCKED});
    Json::Value jChange;
    jChange["count"] = 7;
    EXPECT_TRUE(m_tokens.update(strTid, jChange));
    EXPECT_EQ("7", countOf(strTid));

    answerStatements("DELETE FROM token WHERE tid", {LOCKED});
    EXPECT_TRUE(m_tokens.revoke(strTid));
    EXPECT_EQ("", countOf(strTid));
}

TEST_F(TokensTest, ThrowWhatTheyCannotDo)
{
    insertToken("2");
    const auto failsTo = [](const std::string& strStatement, const char* szDone, const auto& call) {
        failStatements(strStatement, DISK_ERROR, 2);
        EXPECT_EQ(std::string("the access token") + szDone + "; the log says why", failureOf(call));
    };
    failsTo("INSERT", " could not be created", [&] { m_tokens.create(0, "VPN"); });
    failsTo(SELECT, " could not be looked up", [&] { m_tokens.lookup("t"); });
    failsTo(REPLACE, " could not be updated", [&] { m_tokens.update("t", Json::Value(Json::objectValue)); });
    failsTo(DELETE_T, " could not be revoked", [&] { m_tokens.revoke("t"); });
    failsTo(deleteSql("bind_sid", "S1"), "s of a session could not be revoked",
            [&] { m_tokens.revokeSession("S1"); });
    failsTo(deleteSql("function", "VPN"), "s of a purpose could not be revoked",
            [&] { m_tokens.revokeFunction("VPN"); });
    EXPECT_EQ(Texts{"t"}, query("SELECT tid FROM token"));
}

TEST_F(TokensTest, SayWhyTheyCannotHaveTheLock)
{
    insertToken("2");
    const CallLock lock;
    const AccessTokens tokens(std::chrono::milliseconds(0));
    const std::string strReason = "/run/vemo-access-token.lock: Connection timed out";

    ::testing::internal::CaptureStdout();
    EXPECT_EQ(FAILED, tokens.grant("t", "Api", "get"));
    const std::string strLine = ::testing::internal::GetCapturedStdout();
    EXPECT_EQ(strReason + "\n", strLine.substr(std::min(strLine.size(), strLine.find(' ') + 1)));
    EXPECT_EQ(0u, strLine.find("AccessTokens.h:"));

    EXPECT_EQ(strReason, failureOf([&] { tokens.revoke("t"); }));
    EXPECT_EQ(Texts{}, seam().callsOf({"sqlite3_open"}));
    EXPECT_EQ("2", countOf("t"));
}

} // namespace
