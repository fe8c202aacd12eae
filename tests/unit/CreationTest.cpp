// Creating tokens, with ids that the caller chooses and with generated ones.

#include <type_traits>

#include "AccessTokenUtil.h"
#include "Statements.h"
#include "StoreTest.h"

static_assert(UID_ERR == 4294967295U && std::is_unsigned_v<decltype(UID_ERR)>);
static_assert(VEMO_ATOKEN_LENGTH_MIN == 127);

namespace {

typedef int (AccessTokenApi::*CreateFunction)(unsigned int&, std::string&, Json::Value&, std::string&);

const char* const SHORT_TID = "strTidIn.length() < VEMO_ATOKEN_LENGTH_MIN";
const std::string CREATE_FAILED = "0 > m_pDb->tokenCreate(jParam)";

class Creation : public TableTest {
protected:
    // The operations, which leave their arguments as they are.
    int createByTid() { return create(&AccessTokenApi::tokenCreateByTid, m_strTid); }
    int createGenerated()
    {
        const int rv = create(&AccessTokenApi::tokenCreate, m_strOut);
        EXPECT_EQ(0 != rv, "before" == m_strOut);
        return rv;
    }

    std::string summary() const
    {
        return ordinary(SERVICE, "tokenCreate failed, tid=" + m_strTid +
                                     ", uid=" + std::to_string(static_cast<int>(m_uid)) +
                                     ", strFunction=" + m_strFunction + ", jTokenOption=" + text(m_jOption));
    }

    // The record that the option makes.
    Json::Value record() const
    {
        Json::Value jRecord = json(R"({"bind_sid":"","count":1,"create_time":1700000000,"deadline":1700086400,
                     "extra":{},"function":"VPN","uid":1026,"webapi_allow":{}})");
        jRecord["tid"] = m_strTid;
        for (const std::string& strName : m_jOption.getMemberNames()) {
            jRecord[strName] = m_jOption[strName];
        }
        return jRecord;
    }

    Texts duplicateLines() const
    {
        return failureOf(saveSql("INSERT", record()), "UNIQUE constraint failed: token.tid") +
               Texts{failed(STORE, "0 > runSql()"), failed(SERVICE, CREATE_FAILED), summary()};
    }

    unsigned int m_uid = 1026;
    std::string m_strFunction = "VPN";
    std::string m_strTid = tid();
    Json::Value m_jOption;
    std::string m_strOut = "before";

private:
    int create(CreateFunction operation, std::string& strTid)
    {
        const unsigned int uid = m_uid;
        const std::string strFunction = m_strFunction;
        const std::string strTidIn = m_strTid;
        const Json::Value jOption = m_jOption;
        const int rv = (api().*operation)(m_uid, m_strFunction, m_jOption, strTid);
        EXPECT_EQ(uid, m_uid);
        EXPECT_EQ(strFunction, m_strFunction);
        EXPECT_EQ(strTidIn, m_strTid);
        EXPECT_EQ(jOption, m_jOption);
        return rv;
    }
};

// The model check creates tokens with all kinds of options.
TEST_F(Creation, RunsOneStatement)
{
    for (const char* szOption :
         {"null", "{}",
          R"({"bind_sid":"S'1","count":-1,"webapi_allow":{"A":{"method":["get"]}},"extra":{"a":"it's"}})"}) {
        query("DELETE FROM token");
        seam().calls.clear();
        m_jOption = json(szOption);
        EXPECT_EQ(0, createByTid());
        EXPECT_EQ((Texts{saveSql("INSERT", record())}), seam().statements());
        EXPECT_EQ((Texts{row(record())}), rows());
    }
}

TEST_F(Creation, RefusesArgumentsInOrder)
{
    const std::string strOption =
        "jTokenOption.type() != Json::objectValue && jTokenOption.type() != Json::nullValue";
    const auto refuses = [&](unsigned int uid, const char* szFunction, const std::string& strTid,
                             const char* szOption, const std::string& strCondition,
                             const char* szPrintedUid) {
        SCOPED_TRACE(strCondition + szOption);
        m_uid = uid;
        m_strFunction = szFunction;
        m_strTid = strTid;
        m_jOption = json(szOption);
        errno = EACCES;
        EXPECT_FAILURE(createByTid(), failed(SERVICE, strCondition, EACCES),
                       ordinary(SERVICE, "tokenCreate failed, tid=" + strTid + ", uid=" + szPrintedUid +
                                             ", strFunction=" + szFunction + ", jTokenOption=" + szOption));
    };
    refuses(4294967295U, "", "", "[]", "uid == UID_ERR", "-1");
    refuses(2147483648U, "", "short", "[]", "strFunction.empty()", "-2147483648");
    refuses(1026, "VPN", std::string(126, 'x'), "{}", SHORT_TID, "1026");
    refuses(4294967294U, "VPN", "", "[]", SHORT_TID, "-2");
    refuses(0, "VPN", tid(), "[]", strOption, "0");
    refuses(0, "VPN", tid(), R"("")", strOption, "0");
    refuses(0, "VPN", tid(), "5", strOption, "0");
    refuses(0, "VPN", tid(), "false", strOption, "0");
    EXPECT_EQ(Texts{}, seam().statements());
}

TEST_F(Creation, GeneratesNoIdForARefusedUidOrFunction)
{
    m_jOption = json("[]");
    m_strFunction = "";
    m_uid = UID_ERR;
    EXPECT_FAILURE(createGenerated(), failed(SERVICE, "uid == UID_ERR"));
    m_uid = 0;
    EXPECT_FAILURE(createGenerated(), failed(SERVICE, "strFunction.empty()"));
    EXPECT_EQ(Texts{}, seam().calls);
    m_strFunction = "VPN";
    EXPECT_EQ(-1, createGenerated());
    EXPECT_EQ(3u, takeLines().size()); // they hold a random id
}

TEST_F(Creation, RefusesMembersOfAWrongType)
{
    for (const char* szOption : {R"({"count":"5"})", R"({"count":1.5})", R"({"count":null})",
                                 R"({"bind_sid":5})", R"({"bind_sid":null})", R"({"webapi_allow":[]})",
                                 R"({"webapi_allow":"{}"})", R"({"extra":null})", R"({"extra":[1]})"}) {
        SCOPED_TRACE(szOption);
        m_jOption = json(szOption);
        EXPECT_FAILURE(createByTid(),
                       fail(UTIL, "type failed, jmList[i]=" + m_jOption.getMemberNames()[0] +
                                      ", jTokenParam=" + text(record())),
                       failed(SERVICE, "0 > checkJsonType(jParam)"), summary());
    }
    EXPECT_EQ(Texts{}, seam().statements());
}

TEST_F(Creation, RefusesAnIdThatExistsWithItsStepsInDebugMode)
{
    const Texts begin = {ordinary(SERVICE, "create token ok, token=" + text(record())),
                         ordinary(STORE, "tokenSave, blCreate=1, jParam=" + text(record())),
                         ordinary(STORE, "run sql=" + saveSql("INSERT", record())),  // by tokenSave
                         ordinary(STORE, "run sql=" + saveSql("INSERT", record()))}; // by runSqlEx
    EXPECT_EQ(0, createByTid());
    EXPECT_FAILURE(createByTid(), duplicateLines());
    EXPECT_EQ((Texts{row(record())}), rows());
    // The debug line comes before the store is asked, so also when it refuses.
    VEMO_ACCESS_TOKEN::debugInfo(true);
    EXPECT_FAILURE(createByTid(), begin + duplicateLines());
    query("DELETE FROM token");
    EXPECT_EQ(0, createByTid());
    EXPECT_LINES(begin + Texts{ordinary(STORE, "change rv=1, run sql=" + saveSql("INSERT", record()))});
}

TEST_F(Creation, GeneratesAnId)
{
    EXPECT_EQ(0, createGenerated());
    EXPECT_LE(127u, m_strOut.size());
    EXPECT_GE(255u, m_strOut.size());
    EXPECT_EQ((Texts{m_strOut + "||1026|1700086400|1|1700000000|VPN|{}|{}"}), rows());
    const std::string strFirst = m_strOut;
    EXPECT_EQ(0, createGenerated());
    EXPECT_NE(strFirst, m_strOut);
    EXPECT_EQ(2u, rows().size());
}

TEST_F(Creation, ReportsAFailedRandomSource)
{
    for (const int nDraw : {1, 2}) { // the first is for the length, the second for the id
        seam().counts.clear();
        seam().fail("getrandom", EIO, nDraw, nDraw);
        EXPECT_FAILURE(createGenerated(), failed(SERVICE, "0 > tokenGenerate(strTid)", EIO));
    }
    EXPECT_EQ(Texts{}, seam().statements());
}

TEST_F(Creation, TriesNoOtherIdWhenTheGeneratedOneExists)
{
    beforeStatements(
        [this](const std::string& strSql) { query(strSql); }); // another process creates the same id first
    EXPECT_EQ(-1, createGenerated());
    m_strTid = tids();
    EXPECT_LINES(duplicateLines() +
                 Texts{failed(SERVICE, "0 > tokenCreateByTid(uid, strFunction, jTokenOption, strTid)")});
    EXPECT_EQ(1u, seam().statements().size());
}

} // namespace
