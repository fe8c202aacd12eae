// Creating tokens, with ids that the caller chooses and with generated ids: what is refused and logged. The
// test of the model shows what is created.

#include <type_traits>

#include "AccessTokenUtil.h"
#include "Statements.h"
#include "StoreTest.h"

static_assert(UID_ERR == 4294967295U && std::is_unsigned_v<decltype(UID_ERR)>);
static_assert(VEMO_ATOKEN_LENGTH_MIN == 127);

namespace {

std::string summary(const std::string& strTid, const std::string& strUid = "1000",
                    const std::string& strFunction = "VPN", const std::string& strOption = "null")
{
    return ordinary(SERVICE, "tokenCreate failed, tid=" + strTid + ", uid=" + strUid +
                                 ", strFunction=" + strFunction + ", jTokenOption=" + strOption);
}

// What is logged when a token with that id exists.
Texts duplicateLines(const std::string& strTid)
{
    return failureOf(saveSql("INSERT", created(strTid)), "UNIQUE constraint failed: token.tid") +
           Texts{failed(STORE, "0 > runSql()"), failed(SERVICE, "0 > m_pDb->tokenCreate(jParam)"),
                 summary(strTid)};
}

class Creation : public TableTest {
protected:
    int createByTid() { return api().tokenCreateByTid(m_uid, m_strFunction, m_jOption, m_strTid); }
    int createGenerated() { return api().tokenCreate(m_uid, m_strFunction, m_jOption, m_strOut); }

    unsigned int m_uid = 1000;
    std::string m_strFunction = "VPN";
    std::string m_strTid = tid();
    Json::Value m_jOption;
    std::string m_strOut = "before";
};

TEST_F(Creation, RefusesArgumentsInOrder)
{
    const std::string strShort = "strTidIn.length() < VEMO_ATOKEN_LENGTH_MIN";
    const std::string strOption =
        "jTokenOption.type() != Json::objectValue && jTokenOption.type() != Json::nullValue";
    const auto refuses = [&](unsigned int uid, const char* szFunction, const std::string& strTid,
                             const char* szOption, const std::string& strCondition,
                             const char* szPrintedUid) {
        m_uid = uid;
        m_strFunction = szFunction;
        m_strTid = strTid;
        m_jOption = json(szOption);
        errno = EACCES;
        EXPECT_FAILURE(createByTid(), failed(SERVICE, strCondition, EACCES),
                       summary(strTid, szPrintedUid, szFunction, szOption));
    };
    refuses(4294967295U, "", "", "[]", "uid == UID_ERR", "-1");
    refuses(2147483648U, "", "short", "[]", "strFunction.empty()", "-2147483648");
    refuses(1000, "VPN", std::string(126, 'x'), "[]", strShort, "1000");
    refuses(0, "VPN", tid(), "[]", strOption, "0");
    EXPECT_EQ(Texts{}, seam().statements());
}

TEST_F(Creation, RefusesMembersOfAWrongType)
{
    Json::Value jRecord = created(m_strTid);
    m_jOption["count"] = jRecord["count"] = "5";
    EXPECT_FAILURE(createByTid(), fail(UTIL, "type failed, jmList[i]=count, jTokenParam=" + text(jRecord)),
                   failed(SERVICE, "0 > checkJsonType(jParam)"),
                   summary(m_strTid, "1000", "VPN", text(m_jOption)));
    EXPECT_EQ(Texts{}, seam().statements());
}

TEST_F(Creation, RefusesAnExistingIdAndLogsTheStepsInDebugMode)
{
    const std::string strInsert = saveSql("INSERT", created(m_strTid));
    const Texts begin = {ordinary(SERVICE, "create token ok, token=" + text(created(m_strTid))),
                         ordinary(STORE, "tokenSave, blCreate=1, jParam=" + text(created(m_strTid))),
                         ordinary(STORE, "run sql=" + strInsert),  // by tokenSave
                         ordinary(STORE, "run sql=" + strInsert)}; // by runSqlEx
    EXPECT_EQ(0, createByTid());
    EXPECT_FAILURE(createByTid(), duplicateLines(m_strTid));
    EXPECT_EQ((Texts{row(created(m_strTid))}), rows());
    // The debug line is written before the call of the store, so a refusal has it too.
    VEMO_ACCESS_TOKEN::debugInfo(true);
    EXPECT_FAILURE(createByTid(), begin + duplicateLines(m_strTid));
    query("DELETE FROM token");
    EXPECT_EQ(0, createByTid());
    EXPECT_LINES(begin + Texts{ordinary(STORE, "change rv=1, run sql=" + strInsert)});
}

TEST_F(Creation, GeneratesNoIdForARefusedUidOrFunction)
{
    m_strFunction = "";
    m_uid = UID_ERR;
    EXPECT_FAILURE(createGenerated(), failed(SERVICE, "uid == UID_ERR"));
    m_uid = 0;
    EXPECT_FAILURE(createGenerated(), failed(SERVICE, "strFunction.empty()"));
    EXPECT_EQ(Texts{}, seam().calls);
    m_strFunction = "VPN";
    seam().fail("getrandom", EIO);
    EXPECT_FAILURE(createGenerated(), failed(SERVICE, "0 > tokenGenerate(strTid)", EIO));
    EXPECT_EQ(Texts{}, seam().statements());
    EXPECT_EQ("before", m_strOut);
}

TEST_F(Creation, TriesNoOtherIdWhenTheGeneratedOneExists)
{
    beforeStatements(
        [this](const std::string& strSql) { query(strSql); }); // another process creates the same id first
    EXPECT_EQ(-1, createGenerated());
    EXPECT_EQ("before", m_strOut);
    EXPECT_LINES(duplicateLines(tids()) +
                 Texts{failed(SERVICE, "0 > tokenCreateByTid(uid, strFunction, jTokenOption, strTid)")});
    EXPECT_EQ(1u, seam().statements().size());
}

} // namespace
