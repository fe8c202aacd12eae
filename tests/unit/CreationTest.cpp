// Creating tokens, with ids of the caller's and with generated ones.

#include <climits>
#include <memory>
#include <type_traits>

#include "AccessTokenApi.h"
#include "AccessTokenUtil.h"
#include "StandIns.h"
#include "Statements.h"
#include "StoreTest.h"

// Compiled callers link to these very signatures.
typedef int (AccessTokenApi::*CreateFunction)(unsigned int&, std::string&, Json::Value&, std::string&);
static_assert(std::is_same_v<CreateFunction, decltype(&AccessTokenApi::tokenCreateByTid)>);
static_assert(std::is_same_v<CreateFunction, decltype(&AccessTokenApi::tokenCreate)>);
static_assert(UID_ERR == 4294967295U && std::is_unsigned_v<decltype(UID_ERR)>);
static_assert(VEMO_ATOKEN_LENGTH_MIN == 127);

namespace {

const time_t NOW = 1700000000;
const char* const OPTION_TYPE_FAILED =
    "jTokenOption.type() != Json::objectValue && jTokenOption.type() != Json::nullValue";

// Creation in an empty database, at a fixed time.
class Creation : public StoreTest {
protected:
    using StoreTest::StoreTest;

    void SetUp() override
    {
        StoreTest::SetUp();
        makeDatabase();
        seam().clock = NOW;
        m_pApi = std::make_unique<AccessTokenApi>();
        seam().calls.clear();
    }

    // The operations, which only read what they are given.
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

    // The record that the option makes, in its JSON form.
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

    std::string insertion() const
    {
        return std::string("INSERT INTO token (") + COLUMNS + ") VALUES ('" + m_strTid +
               "','',1026,1700086400,1,1700000000,'VPN','{}','{}')";
    }

    Texts duplicateLines() const
    {
        return failureOf(insertion(), "UNIQUE constraint failed: token.tid") +
               Texts{failed(STORE, "0 > runSql()"), failed(SERVICE, "0 > m_pDb->tokenCreate(jParam)"),
                     summary()};
    }

    unsigned int m_uid = 1026;
    std::string m_strFunction = "VPN";
    std::string m_strTid = tid();
    Json::Value m_jOption;
    std::string m_strOut = "before";
    std::unique_ptr<AccessTokenApi> m_pApi;

private:
    int create(CreateFunction operation, std::string& strTid)
    {
        const unsigned int uid = m_uid;
        const std::string strFunction = m_strFunction;
        const std::string strTidIn = m_strTid;
        const Json::Value jOption = m_jOption;
        errno = 0;
        const int rv = (*m_pApi.*operation)(m_uid, m_strFunction, m_jOption, strTid);
        EXPECT_EQ(uid, m_uid);
        EXPECT_EQ(strFunction, m_strFunction);
        EXPECT_EQ(strTidIn, m_strTid);
        EXPECT_EQ(jOption, m_jOption);
        return rv;
    }
};

TEST_F(Creation, NullOptionMeansDefaults)
{
    EXPECT_EQ(0, createByTid());
    EXPECT_EQ((Texts{"sqlite3_exec " + insertion()}), seam().callsOf({"sqlite3_exec"}));
    EXPECT_EQ((Texts{m_strTid + "||1026|1700086400|1|1700000000|VPN|{}|{}"}), query("SELECT * FROM token"));
    EXPECT_EQ(Texts{}, takeLines());
}

TEST_F(Creation, EmptyOptionMeansDefaultsToo)
{
    m_jOption = Json::Value(Json::objectValue);
    EXPECT_EQ(0, createByTid());
    EXPECT_EQ((Texts{"sqlite3_exec " + insertion()}), seam().callsOf({"sqlite3_exec"}));
}

TEST_F(Creation, CarriesOptionsAndDropsWhatIsNoField)
{
    m_jOption = json(R"({"bind_sid":"S'1","count":-1,"deadline":60,"webapi_allow":{"A":{"method":["get"]}},
                         "extra":{"b":[1,null],"a":"it's"},"Count":9,"colour":"red"})");
    EXPECT_EQ(0, createByTid());
    EXPECT_EQ((Texts{m_strTid + R"(|S'1|1026|1700000060|-1|1700000000|VPN|{"A":{"method":["get"]}}|)"
                                R"({"a":"it's","b":[1,null]})"}),
              query("SELECT * FROM token"));
    EXPECT_EQ(Texts{}, takeLines());
}

TEST_F(Creation, ArgumentsAndClockOverrideTheOption)
{
    m_jOption = json(R"({"tid":"other","uid":1,"function":"other","create_time":5})");
    EXPECT_EQ(0, createByTid());
    m_jOption = json(R"({"tid":[],"uid":"1","function":null,"create_time":"now"})");
    m_strTid = tid("second");
    EXPECT_EQ(0, createByTid());
    EXPECT_EQ((Texts{"1026|1700000000|VPN|1700086400", "1026|1700000000|VPN|1700086400"}),
              query("SELECT uid,create_time,function,deadline FROM token"));
}

TEST_F(Creation, DeadlineCountsFromCreationIn64Bits)
{
    struct Case {
        const char* szOption;
        time_t now;
        const char* szDeadline;
    };
    const std::vector<Case> cases = {
        {"{}", NOW, "1700086400"},
        {R"({"deadline":3600})", NOW, "1700003600"},
        {R"({"deadline":-1})", NOW, "1699999999"},
        {R"({"deadline":0})", NOW, "1700000000"},
        {R"({"deadline":null})", NOW, "1700000000"},
        {R"({"deadline":true})", NOW, "1700000001"},
        {R"({"deadline":false})", NOW, "1700000000"},
        {R"({"deadline":1.9})", NOW, "1700000001"},
        {R"({"deadline":-1.9})", NOW, "1699999999"},
        {R"({"deadline":2147483647})", NOW, "3847483647"},
        {R"({"deadline":2147483647})", INT_MAX, "4294967294"},
        {R"({"deadline":1})", INT_MAX, "2147483648"},
        {R"({"deadline":-2147483648})", -10, "-2147483658"},
        {"{}", INT_MAX, "2147570047"},
        {"{}", static_cast<time_t>(INT_MAX) + 1, "2147570048"},
    };
    for (const Case& testCase : cases) {
        SCOPED_TRACE(testing::Message() << testCase.szOption << " at " << testCase.now);
        query("DELETE FROM token");
        seam().clock = testCase.now;
        m_jOption = json(testCase.szOption);
        EXPECT_EQ(0, createByTid());
        EXPECT_EQ((Texts{std::string("integer|") + testCase.szDeadline + "|" + std::to_string(testCase.now)}),
                  query("SELECT typeof(deadline),deadline,create_time FROM token"));
    }
    EXPECT_EQ(Texts{}, takeLines());
}

TEST_F(Creation, DeadlineThatIsNo32BitNumberThrowsAndLeavesNothing)
{
    for (const char* szDeadline : {"2147483648", "-2147483649", "4294967295", "1e300", "18446744073709551615",
                                   R"("3600")", R"("")", "[]", "{}"}) {
        SCOPED_TRACE(szDeadline);
        m_jOption["deadline"] = json(szDeadline);
        const Json::Value jOption = m_jOption;
        EXPECT_THROW(createByTid(), Json::LogicError);
        EXPECT_THROW(createGenerated(), Json::LogicError);
        EXPECT_EQ(jOption, m_jOption);
    }
    // Without an option, a clock beyond 32 bits is fine; added to one, it is not.
    seam().clock = static_cast<time_t>(INT_MAX) + 1;
    m_jOption["deadline"] = 0;
    EXPECT_THROW(createByTid(), Json::LogicError);

    EXPECT_EQ("before", m_strOut);
    EXPECT_EQ(Texts{}, takeLines());
    EXPECT_EQ(Texts{}, seam().callsOf({"sqlite3_exec"}));
}

TEST_F(Creation, CountBeyond64BitsThrowsAndLeavesNothing)
{
    m_jOption = json(R"({"count":18446744073709551615})");
    EXPECT_THROW(createByTid(), Json::LogicError);
    EXPECT_THROW(createGenerated(), Json::LogicError);
    EXPECT_EQ("before", m_strOut);
    EXPECT_EQ(Texts{}, seam().callsOf({"sqlite3_exec"}));
    m_jOption = json(R"({"count":9223372036854775807})");
    EXPECT_EQ(0, createByTid());
    EXPECT_EQ((Texts{"9223372036854775807"}), query("SELECT count FROM token"));
}

TEST_F(Creation, LooksAtUidFunctionAndIdBeforeTheOption)
{
    m_jOption = json("[]");
    m_uid = UID_ERR;
    m_strFunction = "";
    m_strTid = "short";
    EXPECT_EQ(-1, createByTid());
    EXPECT_EQ((Texts{failed(SERVICE, "uid == UID_ERR"), summary()}), takeLines());
    m_uid = 1026;
    EXPECT_EQ(-1, createByTid());
    EXPECT_EQ((Texts{failed(SERVICE, "strFunction.empty()"), summary()}), takeLines());
    m_strFunction = "VPN";
    EXPECT_EQ(-1, createByTid());
    EXPECT_EQ((Texts{failed(SERVICE, "strTidIn.length() < VEMO_ATOKEN_LENGTH_MIN"), summary()}), takeLines());
}

TEST_F(Creation, RefusesOptionThatIsNoObject)
{
    for (const char* szOption : {"[]", "[{}]", R"("")", R"("text")", "5", "-5", "1.5", "true", "false"}) {
        SCOPED_TRACE(szOption);
        m_jOption = json(szOption);
        EXPECT_EQ(-1, createByTid());
        EXPECT_EQ((Texts{failed(SERVICE, OPTION_TYPE_FAILED), summary()}), takeLines());
        EXPECT_EQ(-1, createGenerated());
        takeLines(); // they hold a random id
    }
    EXPECT_EQ(Texts{}, seam().callsOf({"sqlite3_exec"}));
}

TEST_F(Creation, RefusesArgumentsInOrder)
{
    struct Case {
        unsigned int uid;
        const char* szFunction;
        std::string strTid;
        const char* szCondition;
        const char* szPrintedUid;
    };
    const char* szShort = "strTidIn.length() < VEMO_ATOKEN_LENGTH_MIN";
    for (const Case& testCase : std::vector<Case>{
             {4294967295U, "VPN", tid(), "uid == UID_ERR", "-1"},
             {1026, "", tid(), "strFunction.empty()", "1026"},
             {1026, "VPN", std::string(126, 'x'), szShort, "1026"},
             {4294967294U, "VPN", "", szShort, "-2"},
             {4294967295U, "", "", "uid == UID_ERR", "-1"},
             {2147483648U, "", "", "strFunction.empty()", "-2147483648"},
         }) {
        SCOPED_TRACE(testCase.szCondition);
        m_uid = testCase.uid;
        m_strFunction = testCase.szFunction;
        m_strTid = testCase.strTid;
        m_jOption = json(R"({"deadline":60})");
        EXPECT_EQ(-1, createByTid());
        EXPECT_EQ((Texts{failed(SERVICE, testCase.szCondition),
                         ordinary(SERVICE, "tokenCreate failed, tid=" + testCase.strTid +
                                               ", uid=" + testCase.szPrintedUid + ", strFunction=" +
                                               testCase.szFunction + R"(, jTokenOption={"deadline":60})")}),
                  takeLines());
    }
    EXPECT_EQ(Texts{}, seam().callsOf({"sqlite3_exec"}));
}

TEST_F(Creation, GeneratesNoIdForRefusedArguments)
{
    m_uid = UID_ERR;
    m_strFunction = "";
    EXPECT_EQ(-1, createGenerated());
    EXPECT_EQ((Texts{failed(SERVICE, "uid == UID_ERR")}), takeLines());
    m_uid = 0;
    EXPECT_EQ(-1, createGenerated());
    EXPECT_EQ((Texts{failed(SERVICE, "strFunction.empty()")}), takeLines());
    EXPECT_EQ(Texts{}, seam().callsOf({"getrandom", "time", "sqlite3_exec"}));
}

TEST_F(Creation, AcceptsTheBoundsOfItsArguments)
{
    for (const unsigned int uid : {0U, 1U, 2147483648U, 4294967294U}) {
        for (const size_t cchTid : {size_t{127}, size_t{128}, size_t{255}, size_t{100000}}) {
            SCOPED_TRACE(testing::Message() << uid << " " << cchTid);
            query("DELETE FROM token");
            m_uid = uid;
            m_strFunction = "x";
            m_strTid = "it's \xC3\xA4 " + std::string(cchTid - 8, '%');
            EXPECT_EQ(0, createByTid());
            EXPECT_EQ((Texts{m_strTid + "|" + std::to_string(uid) + "|x"}),
                      query("SELECT tid,uid,function FROM token"));
        }
    }
    EXPECT_EQ(Texts{}, takeLines());
}

TEST_F(Creation, RefusesMembersOfAWrongType)
{
    for (const char* szOption : {R"({"count":"5"})", R"({"count":1.5})", R"({"count":null})",
                                 R"({"bind_sid":5})", R"({"bind_sid":null})", R"({"webapi_allow":[]})",
                                 R"({"webapi_allow":"{}"})", R"({"extra":null})", R"({"extra":[1]})"}) {
        SCOPED_TRACE(szOption);
        m_jOption = json(szOption);
        EXPECT_EQ(-1, createByTid());
        EXPECT_EQ((Texts{fail(UTIL, "type failed, jmList[i]=" + m_jOption.getMemberNames()[0] +
                                        ", jTokenParam=" + text(record())),
                         failed(SERVICE, "0 > checkJsonType(jParam)"), summary()}),
                  takeLines());
    }
    EXPECT_EQ(Texts{}, seam().callsOf({"sqlite3_exec"}));
}

TEST_F(Creation, FailsWhenTheRecordCannotBeCompleted)
{
    standIns().fillDefaultValue = [](Json::Value&, bool) { return -1; };
    EXPECT_EQ(-1, createByTid());
    EXPECT_EQ((Texts{failed(SERVICE, "0 > fillDefaultValue(jParam, false)"), summary()}), takeLines());
}

TEST_F(Creation, RefusesAnIdThatExists)
{
    EXPECT_EQ(0, createByTid());
    m_jOption = json(R"({"extra":{"colour":"red"}})");
    const Texts rows = query("SELECT * FROM token");
    EXPECT_EQ(-1, createByTid());
    EXPECT_EQ(rows, query("SELECT * FROM token"));
    m_jOption = Json::Value();
    takeLines();
    EXPECT_EQ(-1, createByTid());
    EXPECT_EQ(duplicateLines(), takeLines());
    EXPECT_EQ((Texts{"1"}), query("SELECT count(*) FROM token"));
}

TEST_F(Creation, TracesItsStepsInDebugMode)
{
    VEMO_ACCESS_TOKEN::debugInfo(true);
    const Texts begin = {
        ordinary(SERVICE, "create token ok, token=" + text(record())),
        ordinary(STORE, "tokenSave, blCreate=1, jParam=" + text(record())),
        ordinary(STORE, "run sql=" + insertion()), // by tokenSave
        ordinary(STORE, "run sql=" + insertion()), // by runSqlEx
    };
    EXPECT_EQ(0, createByTid());
    EXPECT_EQ((begin + Texts{ordinary(STORE, "change rv=1, run sql=" + insertion())}), takeLines());

    // A creation that the store refuses was announced all the same.
    EXPECT_EQ(-1, createByTid());
    EXPECT_EQ(begin + duplicateLines(), takeLines());

    m_uid = UID_ERR;
    EXPECT_EQ(-1, createByTid());
    EXPECT_EQ((Texts{failed(SERVICE, "uid == UID_ERR"), summary()}), takeLines());
}

TEST_F(Creation, GeneratesAnId)
{
    EXPECT_EQ(0, createGenerated());
    const std::string strFirst = m_strOut;
    EXPECT_LE(127u, strFirst.size());
    EXPECT_GE(255u, strFirst.size());
    EXPECT_EQ(std::string::npos,
              strFirst.find_first_not_of("0123456789abcdefghijklmnopqrstuvwxyzABCDEFGHIJKLMNOPQRSTUVWXYZ"));
    EXPECT_EQ((Texts{strFirst + "||1026|1700086400|1|1700000000|VPN|{}|{}"}), query("SELECT * FROM token"));
    EXPECT_EQ(1u, seam().callsOf({"sqlite3_exec"}).size());

    m_uid = 0;
    EXPECT_EQ(0, createGenerated());
    EXPECT_NE(strFirst, m_strOut);
    EXPECT_EQ((Texts{"2"}), query("SELECT count(*) FROM token"));
    EXPECT_EQ(Texts{}, takeLines());
}

TEST_F(Creation, ReportsAFailedRandomSource)
{
    // The first draw is for the length, the second for the id.
    for (int nDraw : {1, 2}) {
        SCOPED_TRACE(nDraw);
        seam().counts.clear();
        seam().fail("getrandom", EIO, nDraw, nDraw);
        EXPECT_EQ(-1, createGenerated());
        EXPECT_EQ((Texts{failed(SERVICE, "0 > tokenGenerate(strTid)", EIO)}), takeLines());
    }
    EXPECT_EQ(Texts{}, seam().callsOf({"sqlite3_exec"}));
}

TEST_F(Creation, DoesNotTryAnotherIdWhenTheGeneratedOneExists)
{
    seam().sqliteExec = [](sqlite3* pDb, const char* szSql, SqlCallback callback, void* pArgument,
                           char** pszError) {
        Seam::exec(pDb, szSql, nullptr, nullptr, nullptr); // someone else had the same luck
        return Seam::exec(pDb, szSql, callback, pArgument, pszError);
    };
    EXPECT_EQ(-1, createGenerated());
    const Texts tids = query("SELECT tid FROM token");
    ASSERT_EQ(1u, tids.size());
    m_strTid = tids[0];
    EXPECT_EQ(duplicateLines() +
                  Texts{failed(SERVICE, "0 > tokenCreateByTid(uid, strFunction, jTokenOption, strTid)")},
              takeLines());
    EXPECT_EQ(1u, seam().callsOf({"sqlite3_exec"}).size());
}

TEST_F(Creation, ReportsFailureAfterWaitingForALockAlthoughTheTokenIsThere)
{
    const Texts lines = {fail(STORE, "sql error, sql=" + insertion(), EIO),
                         failed(SERVICE, "0 > m_pDb->tokenCreate(jParam)", EIO), summary()};
    failStatements("INSERT", LOCKED);
    EXPECT_EQ(-1, createByTid());
    EXPECT_EQ(lines, takeLines());
    failStatements("INSERT", LOCKED);
    EXPECT_EQ(-1, createGenerated());
    EXPECT_EQ((Texts{"2"}), query("SELECT count(*) FROM token"));
    EXPECT_EQ((Texts{"usleep 10000", "usleep 10000"}), seam().callsOf({"usleep"}));
}

TEST_F(Creation, FailureLinesTellErrno)
{
    errno = EACCES;
    m_strTid = "short";
    EXPECT_EQ(-1, m_pApi->tokenCreateByTid(m_uid, m_strFunction, m_jOption, m_strTid));
    EXPECT_EQ((Texts{failed(SERVICE, "strTidIn.length() < VEMO_ATOKEN_LENGTH_MIN", EACCES), summary()}),
              takeLines(Destination::Stdout));
}

class CreationSystemLog : public Creation {
protected:
    CreationSystemLog() : Creation(Destination::Syslog) {}
};

TEST_F(CreationSystemLog, TellsErrnoInFrontOfEachLineWhenThereIsOne)
{
    VEMO_ACCESS_TOKEN::debugInfo(true);
    seam().fail("seteuid", EPERM, 1, INT_MAX); // the store never gets as far as the database
    m_pApi = std::make_unique<AccessTokenApi>();
    EXPECT_EQ(inSystemLog({NOT_ROOT}, EPERM), takeLines(Destination::Syslog));

    EXPECT_EQ(-1, createByTid());

    const Texts steps = {ordinary(SERVICE, "create token ok, token=" + text(record())),
                         ordinary(STORE, "tokenSave, blCreate=1, jParam=" + text(record())),
                         ordinary(STORE, "run sql=" + insertion())};
    const Texts failures = {failed(STORE, "0 > runSql()", EPERM),
                            failed(SERVICE, "0 > m_pDb->tokenCreate(jParam)", EPERM), summary()};
    EXPECT_EQ(steps + inSystemLog(NOT_OPENED + failures, EPERM), takeLines(Destination::Syslog));
    EXPECT_EQ(Texts(9, "syslog 3"), seam().callsOf({"syslog"})); // LOG_ERR
}

} // namespace
