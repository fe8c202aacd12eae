// The grant that tells the name of the token's user.

#include <malloc.h>

#include <climits>
#include <cstring>

#include "ExportedTest.h"
#include "StandIns.h"
#include "vemo-access-token.h"

namespace {

const char* const LOOKUP_FAILED = "0 > VEMOUserGetByUID(jToken[\"uid\"].asInt64(), &pUser)";

// The user database: one user, of any uid.
void setUser(const std::string& strName)
{
    seam().getUser = [strName](uid_t, struct passwd* pEntry, char* szBuffer, size_t cbBuffer,
                               struct passwd** ppEntry) {
        *ppEntry = nullptr;
        if (cbBuffer <= strName.size()) {
            return ERANGE;
        }
        *pEntry = {};
        pEntry->pw_name = strcpy(szBuffer, strName.c_str());
        *ppEntry = pEntry;
        return 0;
    };
}

class GrantWithName : public ExportedTest {
protected:
    void SetUp() override
    {
        ExportedTest::SetUp();
        setUser("alice");
        memset(m_szUser, '#', sizeof(m_szUser) - 1);
    }

    int grant(const char* szApi = "Api", const char* szMethod = "get", size_t cbUser = sizeof(m_szUser))
    {
        std::string strTid = "t";
        return VemoAccessTokenGrant(strTid, szApi, szMethod, m_szUser, cbUser);
    }

    char m_szUser[17] = "";
    const std::string m_strUntouched = std::string(16, '#');
};

TEST_F(GrantWithName, LooksTheUserUpAfterTheDatabaseIsClosed)
{
    EXPECT_EQ(0, grant());

    EXPECT_STREQ("alice", m_szUser);
    EXPECT_EQ((Texts{"sqlite3_close", "getpwuid_r 1000"}), seam().callsOf({"sqlite3_close", "getpwuid_r"}));
    EXPECT_EQ("1", countOf("t"));
    EXPECT_EQ(Texts{}, takeLines());
}

TEST_F(GrantWithName, FindsRealUsers)
{
    seam().getUser = nullptr;
    query("UPDATE token SET uid = 0");

    EXPECT_EQ(0, grant());

    EXPECT_STREQ("root", m_szUser);
}

TEST_F(GrantWithName, NarrowsTheUid)
{
    const std::pair<const char*, const char*> uids[] = {{"4294968296", "1000"},
                                                        {"-1", "4294967295"},
                                                        {"4294967295", "4294967295"},
                                                        {"-9223372036854775808", "0"}};
    for (const auto& [szStored, szLookedUp] : uids) {
        query(std::string("UPDATE token SET count = -1, uid = ") + szStored);
        seam().calls.clear();

        EXPECT_EQ(0, grant());

        EXPECT_EQ((Texts{std::string("getpwuid_r ") + szLookedUp}), seam().callsOf({"getpwuid_r"}));
    }
}

TEST_F(GrantWithName, LooksNobodyUpWithoutABuffer)
{
    std::string strTid = "t";

    EXPECT_EQ(0, VemoAccessTokenGrant(strTid, "Api", "get", nullptr, sizeof(m_szUser)));
    EXPECT_EQ("1", countOf("t"));
    EXPECT_EQ(0, VemoAccessTokenGrant(strTid, "Api", "get", m_szUser, 0));

    EXPECT_EQ("", countOf("t"));
    EXPECT_EQ(m_strUntouched, m_szUser);
    EXPECT_EQ(Texts{}, seam().callsOf({"getpwuid_r"}));
    EXPECT_EQ(Texts{}, takeLines());
}

TEST_F(GrantWithName, WritesWhatFits)
{
    const size_t cbHuge = static_cast<size_t>(UINT_MAX) + 1;
    const struct {
        const char* szName;
        size_t cbUser;
        int nResult;
        const char* szWritten;
    } rows[] = {{"alice", 6, 0, "alice"},
                {"alice", 5, -1, "alic"},
                {"alice", 2, -1, "a"},
                {"alice", 1, -1, ""},
                {"alice", 17, 0, "alice"},
                {"", 1, 0, ""},
                {"%s%n%d", 17, 0, "%s%n%d"},
                // The size counts as an int, whatever was written by then.
                {"alice", static_cast<size_t>(INT_MAX), 0, "alice"},
                {"alice", static_cast<size_t>(INT_MAX) + 1, -1, "alice"},
                {"alice", cbHuge + 5, -1, "alice"},
                {"alice", cbHuge + 6, 0, "alice"}};
    query("UPDATE token SET count = -1");
    for (const auto& row : rows) {
        SCOPED_TRACE(row.cbUser);
        setUser(row.szName);
        memset(m_szUser, '#', 16);
        errno = 0;

        EXPECT_EQ(row.nResult, grant("Api", "get", row.cbUser));

        EXPECT_STREQ(row.szWritten, m_szUser);
        EXPECT_EQ('#', m_szUser[strlen(row.szWritten) + 1]);
        const std::string strLine =
            failed(WRAPPER, "(int)cbUser <= snprintf(szUser,cbUser, \"%s\", pUser->szName)");
        EXPECT_EQ(0 == row.nResult ? Texts{} : Texts{strLine}, takeLines());
    }
}

TEST_F(GrantWithName, LeavesTheNameAloneWhenRefused)
{
    const struct {
        const char* szTid;
        const char* szApi;
        const char* szMethod;
        Texts lines;
    } refusals[] = {
        {"", "Api", "get", {failed(SERVICE, "strTid.empty()"), GRANT_REFUSED}},
        {"t", nullptr, "get", {failed(SERVICE, "!szWebapiName || !szWebapiName[0]"), GRANT_REFUSED}},
        {"unknown", "Api", "get", {GRANT_REFUSED}},
        {"old", "Api", "get", {GRANT_REFUSED}},
        {"t", "api", "get", {NOT_PERMITTED, GRANT_REFUSED}},
        {"t", "Api", "put", {GRANT_REFUSED}}};
    for (const auto& refusal : refusals) {
        SCOPED_TRACE(refusal.szTid);
        std::string strTid = refusal.szTid;

        EXPECT_EQ(-1,
                  VemoAccessTokenGrant(strTid, refusal.szApi, refusal.szMethod, m_szUser, sizeof(m_szUser)));

        EXPECT_EQ(refusal.lines, takeLines());
        EXPECT_EQ(m_strUntouched, m_szUser);
    }
    EXPECT_EQ("2", countOf("t"));
    EXPECT_EQ(Texts{}, seam().callsOf({"getpwuid_r"}));
}

// The use is spent by then, and nothing gives it back.
TEST_F(GrantWithName, FailsForUsersThatCannotBeFound)
{
    // What getpwuid_r returns, which finds no entry, and the errno that is logged.
    const std::pair<int, int> answers[] = {{0, ENOENT}, {ESRCH, ESRCH}, {EIO, EIO}};
    for (const auto& [nResult, nErrno] : answers) {
        SCOPED_TRACE(nResult);
        query("UPDATE token SET count = 2");
        seam().getUser = [n = nResult](uid_t, struct passwd*, char*, size_t, struct passwd** ppEntry) {
            *ppEntry = nullptr;
            return n;
        };
        errno = 0;

        EXPECT_EQ(-1, grant());

        EXPECT_EQ((Texts{failed(WRAPPER, LOOKUP_FAILED, nErrno)}), takeLines());
        EXPECT_EQ(m_strUntouched, m_szUser);
        EXPECT_EQ("1", countOf("t"));
    }
}

TEST_F(GrantWithName, FailsWithoutMemoryForTheUser)
{
    seam().fail("operator new[]", ENOMEM);

    EXPECT_EQ(-1, grant());

    EXPECT_EQ((Texts{failed(WRAPPER, LOOKUP_FAILED, ENOMEM)}), takeLines());
    EXPECT_EQ(m_strUntouched, m_szUser);
}

TEST_F(GrantWithName, FailsForARecordWithoutUid)
{
    standIns().grantEx = [](std::string&, const char*, const char*, Json::Value&) { return 0; };

    EXPECT_EQ(-1, grant());

    EXPECT_EQ((Texts{failed(WRAPPER, "!jToken.isMember(\"uid\")")}), takeLines());
    EXPECT_EQ(m_strUntouched, m_szUser);
    EXPECT_EQ(Texts{}, seam().callsOf({"getpwuid_r"}));
}

// Whether the name fits or not. (Under a sanitizer, which has an allocator of its own, its own report
// at exit tells.)
TEST_F(GrantWithName, FreesTheUser)
{
    const size_t cbName = 50000;
    setUser(std::string(cbName, 'x'));
    query("UPDATE token SET count = -1");
    std::string strTid = "t";
    std::vector<char> user(cbName + 1);
    const auto grantTwice = [&] {
        seam().calls.clear(); // whose memory would count
        EXPECT_EQ(-1, VemoAccessTokenGrant(strTid, "Api", "get", user.data(), cbName));
        EXPECT_EQ(0, VemoAccessTokenGrant(strTid, "Api", "get", user.data(), cbName + 1));
    };
    grantTwice();
    const size_t cbBefore = mallinfo2().uordblks;

    for (int i = 0; i < 10; ++i) {
        grantTwice();
    }

    EXPECT_GT(cbBefore + cbName, mallinfo2().uordblks);
}

} // namespace
