// The service object and the creation of tokens.

#include <dlfcn.h>

#include <climits>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <type_traits>

#include "AccessTokenApi.h"
#include "AccessTokenUtil.h"
#include "StoreTest.h"

// Compiled callers hold the object in a pointer's room and link to these very signatures.
static_assert(sizeof(AccessTokenApi) == sizeof(void*));
static_assert(!std::is_polymorphic_v<AccessTokenApi>);
static_assert(!std::is_copy_constructible_v<AccessTokenApi> && !std::is_copy_assignable_v<AccessTokenApi>);
static_assert(!std::is_move_constructible_v<AccessTokenApi> && !std::is_move_assignable_v<AccessTokenApi>);
typedef int (AccessTokenApi::*CreateFunction)(unsigned int&, std::string&, Json::Value&, std::string&);
static_assert(std::is_same_v<CreateFunction, decltype(&AccessTokenApi::tokenCreateByTid)>);
static_assert(std::is_same_v<CreateFunction, decltype(&AccessTokenApi::tokenCreate)>);
static_assert(UID_ERR == 4294967295U && std::is_unsigned_v<decltype(UID_ERR)>);
static_assert(VEMO_ATOKEN_LENGTH_MIN == 127);

namespace {

typedef std::vector<std::string> Texts;

const char* const SERVICE = "AccessTokenApi.cpp";
const char* const STORE = "AccessTokenSqlite.cpp";
const char* const UTIL = "util.cpp";
const char* const DATABASE = VEMO_ATOKEN_DB_PATH;
const time_t NOW = 1700000000;
const char* const OPTION_TYPE_FAILED =
    "jTokenOption.type() != Json::objectValue && jTokenOption.type() != Json::nullValue";

bool g_blFillingFails = false;

} // namespace

// Nothing makes the completion of a record fail but a stand-in.
int VEMO_ACCESS_TOKEN::fillDefaultValue(Json::Value& jToken, bool blCheck)
{
    typedef int Function(Json::Value&, bool);
    const char* szName = "_ZN17VEMO_ACCESS_TOKEN16fillDefaultValueERN4Json5ValueEb";
    return g_blFillingFails ? -1 : reinterpret_cast<Function*>(dlsym(RTLD_NEXT, szName))(jToken, blCheck);
}

namespace {

std::string text(const Json::Value& jValue)
{
    Json::StreamWriterBuilder builder;
    builder["indentation"] = "";
    return Json::writeString(builder, jValue);
}

std::string summary(const std::string& strTid, const std::string& strUid, const std::string& strFunction,
                    const Json::Value& jOption)
{
    return "tokenCreate failed, tid=" + strTid + ", uid=" + strUid + ", strFunction=" + strFunction +
           ", jTokenOption=" + text(jOption);
}

// The line with its token id, which is random, as "TID".
std::string withoutTid(std::string strLine)
{
    const size_t nEnd = strLine.find(", uid=");
    if (std::string::npos != nEnd) {
        const size_t nTid = strLine.find("tid=") + 4;
        strLine.replace(nTid, nEnd - nTid, "TID");
    }
    return strLine;
}

// SQLite leaves in errno whatever it met on its way.
int runQuietly(sqlite3* pDb, const char* szSql, int (*callback)(void*, int, char**, char**), void* pArgument,
               char** pszError)
{
    const int nResult = sqlite3_exec(pDb, szSql, callback, pArgument, pszError);
    errno = 0;
    return nResult;
}

class ServiceObject : public StoreTest {};

TEST_F(ServiceObject, CreatesTheDatabaseAndClosesItAtItsEnd)
{
    {
        AccessTokenApi api;
        const Texts calls = seam().callsOf(
            {"operator", "geteuid", "seteuid", "access", "open", "chmod", "sqlite3_open", "sqlite3_close"});
        EXPECT_EQ((Texts{"operator new", "geteuid", "seteuid 0", std::string("access ") + DATABASE,
                         std::string("open ") + DATABASE, std::string("chmod ") + DATABASE + " 0700",
                         std::string("sqlite3_open ") + DATABASE, "seteuid 0"}),
                  calls);
        EXPECT_EQ(1u, seam().callsOf({"sqlite3_exec"}).size());
        seam().calls.clear();
    }
    EXPECT_EQ((Texts{"sqlite3_close"}), seam().calls);
    EXPECT_EQ((Texts{"0"}), query("SELECT count(*) FROM token"));
    EXPECT_EQ((Texts{}), takeLines());
}

TEST_F(ServiceObject, OpensAnExistingDatabaseAsItsConstructorsLastAction)
{
    makeDatabase();
    {
        AccessTokenApi api;
        EXPECT_EQ((Texts{"operator new", "geteuid", "seteuid 0", std::string("access ") + DATABASE,
                         std::string("sqlite3_open ") + DATABASE, "seteuid 0"}),
                  seam().calls);
        seam().calls.clear();
    }
    EXPECT_EQ((Texts{"sqlite3_close"}), seam().calls);
    EXPECT_EQ((Texts{}), takeLines());
}

TEST_F(ServiceObject, EachObjectHasAConnectionOfItsOwn)
{
    {
        AccessTokenApi apiFirst;
        AccessTokenApi apiSecond;
    }
    EXPECT_EQ(2u, seam().callsOf({"sqlite3_open"}).size());
    EXPECT_EQ(2u, seam().callsOf({"sqlite3_close"}).size());
}

TEST_F(ServiceObject, OpensAgainAfterAFailedOpening)
{
    makeDatabase();
    seam().fail("seteuid", EPERM);
    AccessTokenApi api;
    EXPECT_EQ((Texts{failed(STORE, "0 > seteuid(0)", EPERM)}), takeLines());
    EXPECT_EQ((Texts{}), seam().callsOf({"sqlite3_open"}));

    Json::Value jFilter;
    Json::Value jTokens(Json::arrayValue);
    EXPECT_EQ(0, api.tokenList(jFilter, jTokens));
    EXPECT_EQ(1u, seam().callsOf({"sqlite3_open"}).size());
    EXPECT_EQ((Texts{}), takeLines());
}

TEST_F(ServiceObject, ReportsALastingFailureOfTheOpeningInItsOperations)
{
    seam().fail("seteuid", EPERM, 1, INT_MAX);
    {
        AccessTokenApi api;
        Json::Value jFilter;
        Json::Value jTokens(Json::arrayValue);
        EXPECT_EQ(-1, api.tokenList(jFilter, jTokens));
    }
    EXPECT_EQ((Texts{failed(STORE, "0 > seteuid(0)", EPERM), failed(STORE, "0 > seteuid(0)", EPERM),
                     failed(STORE, "0 > initDb()", EPERM),
                     failed(STORE, "0 > runSql(FillList, &jTokenArrayOut)", EPERM),
                     failed(SERVICE, "0 > m_pDb->tokenGet(jFilter, jTokenArrayOut)", EPERM)}),
              takeLines());
    EXPECT_EQ((Texts{}), seam().callsOf({"access", "sqlite3_open", "sqlite3_close"}));
}

TEST_F(ServiceObject, ClosingThatFailsIsTriedAgainByTheStoresEnd)
{
    seam().sqliteClose = [](sqlite3* pDb) {
        errno = 0;
        return 1 == seam().counts["sqlite3_close"] ? SQLITE_BUSY : sqlite3_close(pDb);
    };
    {
        AccessTokenApi api;
    }
    EXPECT_EQ((Texts{"sqlite3_close", "sqlite3_close"}), seam().callsOf({"sqlite3_close"}));
    EXPECT_EQ((Texts{failed(STORE, "SQLITE_OK != sqlite3_close(m_pDb)")}), takeLines());
}

// An object whose store could not be allocated.
class WithoutStore : public StoreTest {
protected:
    void SetUp() override
    {
        StoreTest::SetUp();
        seam().fail("operator new", ENOMEM);
        m_pApi = std::make_unique<AccessTokenApi>();
        m_linesOfConstructor = takeLines();
    }

    std::unique_ptr<AccessTokenApi> m_pApi;
    Texts m_linesOfConstructor;
};

TEST_F(WithoutStore, IsLoggedByTheConstructorWhichTouchesNothing)
{
    m_pApi.reset();
    EXPECT_EQ((Texts{ordinary(SERVICE, "new AccessTokenDbApi failed")}), m_linesOfConstructor);
    EXPECT_EQ((Texts{"operator new", "printf"}), seam().calls);
    EXPECT_EQ((Texts{}), takeLines());
}

TEST_F(WithoutStore, EveryOperationThatNeedsItFails)
{
    unsigned int uid = 1026;
    std::string strTid = tid();
    std::string strValue = "a";
    Texts strVector{"a"};
    Json::Value jNull;
    Json::Value jObject(Json::objectValue);
    Json::Value jArray(Json::arrayValue);
    Json::Value jSpent = json(R"({"tid":"a","bind_sid":"","uid":1,"deadline":1,"count":1,"create_time":1,
                                  "function":"f","webapi_allow":{},"extra":{}})");
    Json::Value jToken = jSpent;
    jToken["count"] = 2;
    AccessTokenApi& api = *m_pApi;

    const std::string strCreate = summary("TID", "1026", "a", jNull);
    const std::string strSave = "tokenSaveByOverwrite failed, jToken=" + text(jSpent);
    const auto byArray = [](const std::string& strName) {
        return Texts{"!m_pDb", "tokenDeleteByArray failed, name=" + strName + ", strVector=a"};
    };
    const auto byName = [&](const std::string& strName, const Texts& more = {}) {
        Texts messages = byArray(strName);
        messages.push_back("0 > (err = tokenDeleteByArray(strVector, szName))");
        messages.push_back("tokenDeleteByName failed, name=" + strName + ", strValue=a");
        messages.insert(messages.end(), more.begin(), more.end());
        return messages;
    };
    struct Case {
        const char* szOperation;
        std::function<int()> operation;
        Texts messages; // conditions, and the operations' own lines, which say "failed"
    };
    const std::vector<Case> cases = {
        {"tokenCreateByTid",
         [&] { return api.tokenCreateByTid(uid, strValue, jNull, strTid); },
         {"!m_pDb", strCreate}},
        {"tokenCreate",
         [&] { return api.tokenCreate(uid, strValue, jNull, strValue); },
         {"!m_pDb", strCreate, "0 > tokenCreateByTid(uid, strFunction, jTokenOption, strTid)"}},
        {"tokenList", [&] { return api.tokenList(jObject, jArray); }, {"!m_pDb"}},
        {"tokenGetByTid", [&] { return api.tokenGetByTid(strValue, jNull); }, {"!m_pDb"}},
        {"tokenGetByTidArray", [&] { return api.tokenGetByTidArray(strVector, jArray); }, {"!m_pDb"}},
        {"tokenUpdateByTid",
         [&] { return api.tokenUpdateByTid(strValue, jObject); },
         {"!m_pDb", "0 > (nCount = tokenGetByTid(strTid, jToken))"}},
        {"tokenSaveByOverwrite", [&] { return api.tokenSaveByOverwrite(jSpent); }, {"!m_pDb", strSave}},
        {"tokenDeleteByArray", [&] { return api.tokenDeleteByArray(strVector, "tid"); }, byArray("tid")},
        {"tokenDeleteByName", [&] { return api.tokenDeleteByName(strValue, "tid"); }, byName("tid")},
        {"tokenDeleteByTid", [&] { return api.tokenDeleteByTid(strValue); }, byName("tid")},
        {"tokenDeleteByBindSid", [&] { return api.tokenDeleteByBindSid(strValue); }, byName("bind_sid")},
        {"tokenDeleteByFunction", [&] { return api.tokenDeleteByFunction(strValue); }, byName("function")},
        {"tokenDeleteByTidArray", [&] { return api.tokenDeleteByTidArray(strVector); }, byArray("tid")},
        {"tokenDeleteAll", [&] { return api.tokenDeleteAll(); }, {"!m_pDb"}},
        {"cleanExpireToken", [&] { return api.cleanExpireToken(true); }, {"!m_pDb"}},
        {"quiet cleanExpireToken", [&] { return api.cleanExpireToken(false); }, {}},
        {"tokenGrant",
         [&] { return api.tokenGrant(strValue, "Example.Api", "get", jNull); },
         {"!m_pDb", "0 > (err = tokenGetByTid(strTid, jToken))"}},
        {"tokenCountDegrade",
         [&] { return api.tokenCountDegrade(jToken); },
         {"!m_pDb", strSave, "0 > tokenSaveByOverwrite(jToken)"}},
        {"tokenCountDegrade of the last use", [&] { return api.tokenCountDegrade(jSpent); },
         byName("tid", {"0 > tokenDeleteByTid(strTid)"})},
    };
    for (const Case& testCase : cases) {
        SCOPED_TRACE(testCase.szOperation);
        Texts expected;
        for (const std::string& strMessage : testCase.messages) {
            const bool blOwnLine = std::string::npos != strMessage.find(" failed, ");
            expected.push_back(blOwnLine ? ordinary(SERVICE, strMessage) : failed(SERVICE, strMessage));
        }
        errno = 0;
        EXPECT_EQ(-1, testCase.operation());
        Texts lines;
        for (const std::string& strLine : takeLines()) {
            lines.push_back(withoutTid(strLine));
        }
        EXPECT_EQ(expected, lines);
    }
    EXPECT_EQ("a", strValue);
    EXPECT_EQ(Json::Value(), jNull);
    EXPECT_EQ(Json::Value(Json::arrayValue), jArray);
    EXPECT_EQ((Texts{}), seam().callsOf(OPENING_CALLS));
}

TEST_F(WithoutStore, OperationsThatNeedNoneWork)
{
    Texts strVector{"a"};
    Json::Value jParam;
    EXPECT_EQ(0, m_pApi->VectorParamToJson(strVector, "tid", jParam));
    Json::Value jUnlimited = json(R"({"count":-1})");
    EXPECT_EQ(0, m_pApi->tokenCountDegrade(jUnlimited));
    EXPECT_EQ((Texts{}), takeLines());
}

TEST_F(WithoutStore, AFailedPurgeIsToldInDebugMode)
{
    VEMO_ACCESS_TOKEN::debugInfo(true);
    errno = 0;
    EXPECT_EQ(-1, m_pApi->cleanExpireToken(false));
    EXPECT_EQ((Texts{fail(SERVICE, "run fail 0 > m_pDb->cleanExpireToken(blLogErr)")}), takeLines());
}

// Creation in an empty database, at a fixed time.
class Creation : public StoreTest {
protected:
    void SetUp() override
    {
        StoreTest::SetUp();
        makeDatabase();
        seam().clock = NOW;
        m_pApi = std::make_unique<AccessTokenApi>();
        seam().calls.clear();
        seam().sqliteExec = runQuietly;
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
        return ordinary(
            SERVICE, ::summary(m_strTid, std::to_string(static_cast<int>(m_uid)), m_strFunction, m_jOption));
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
        return {ordinary(STORE,
                         "i=0,run sql failed, error=UNIQUE constraint failed: token.tid, sql=" + insertion()),
                fail(STORE, "run sql failed, sql=" + insertion()), failed(STORE, "0 > runSql()"),
                failed(SERVICE, "0 > m_pDb->tokenCreate(jParam)"), summary()};
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
    EXPECT_EQ((Texts{}), takeLines());
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
    EXPECT_EQ((Texts{}), takeLines());
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
    EXPECT_EQ((Texts{}), takeLines());
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
    EXPECT_EQ((Texts{}), takeLines());
    EXPECT_EQ((Texts{}), seam().callsOf({"sqlite3_exec"}));
}

TEST_F(Creation, CountBeyond64BitsThrowsAndLeavesNothing)
{
    m_jOption = json(R"({"count":18446744073709551615})");
    EXPECT_THROW(createByTid(), Json::LogicError);
    EXPECT_THROW(createGenerated(), Json::LogicError);
    EXPECT_EQ("before", m_strOut);
    EXPECT_EQ((Texts{}), seam().callsOf({"sqlite3_exec"}));
    m_jOption = json(R"({"count":9223372036854775807})");
    EXPECT_EQ(0, createByTid());
    EXPECT_EQ((Texts{"9223372036854775807"}), query("SELECT count FROM token"));
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
    EXPECT_EQ((Texts{}), seam().callsOf({"sqlite3_exec"}));
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
    EXPECT_EQ((Texts{}), seam().callsOf({"sqlite3_exec"}));
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
    EXPECT_EQ((Texts{}), seam().callsOf({"getrandom", "time", "sqlite3_exec"}));
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
    EXPECT_EQ((Texts{}), takeLines());
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
    EXPECT_EQ((Texts{}), seam().callsOf({"sqlite3_exec"}));
}

TEST_F(Creation, FailsWhenTheRecordCannotBeCompleted)
{
    g_blFillingFails = true;
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
    Texts created = begin;
    created.push_back(ordinary(STORE, "change rv=1, run sql=" + insertion()));
    EXPECT_EQ(0, createByTid());
    EXPECT_EQ(created, takeLines());

    // A creation that the store refuses was announced all the same.
    Texts refused = begin;
    const Texts duplicate = duplicateLines();
    refused.insert(refused.end(), duplicate.begin(), duplicate.end());
    EXPECT_EQ(-1, createByTid());
    EXPECT_EQ(refused, takeLines());

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
    EXPECT_EQ((Texts{}), takeLines());
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
    EXPECT_EQ((Texts{}), seam().callsOf({"sqlite3_exec"}));
}

TEST_F(Creation, DoesNotTryAnotherIdWhenTheGeneratedOneExists)
{
    seam().sqliteExec = [](sqlite3* pDb, const char* szSql, auto callback, void* pArgument, char** pszError) {
        sqlite3_exec(pDb, szSql, nullptr, nullptr, nullptr); // someone else had the same luck
        return runQuietly(pDb, szSql, callback, pArgument, pszError);
    };
    EXPECT_EQ(-1, createGenerated());
    const Texts tids = query("SELECT tid FROM token");
    ASSERT_EQ(1u, tids.size());
    m_strTid = tids[0];
    Texts lines = duplicateLines();
    lines.push_back(failed(SERVICE, "0 > tokenCreateByTid(uid, strFunction, jTokenOption, strTid)"));
    EXPECT_EQ(lines, takeLines());
    EXPECT_EQ(1u, seam().callsOf({"sqlite3_exec"}).size());
}

TEST_F(Creation, ReportsFailureAfterWaitingForALockAlthoughTheTokenIsThere)
{
    seam().sqliteExec = [](sqlite3* pDb, const char* szSql, auto callback, void* pArgument, char** pszError) {
        if (1 == seam().counts["sqlite3_exec"]) {
            *pszError = sqlite3_mprintf("%s", "database is locked");
            return SQLITE_BUSY;
        }
        return runQuietly(pDb, szSql, callback, pArgument, pszError);
    };
    const Texts lines = {fail(STORE, "sql error, sql=" + insertion()),
                         failed(SERVICE, "0 > m_pDb->tokenCreate(jParam)"), summary()};
    seam().counts.clear();
    EXPECT_EQ(-1, createByTid());
    EXPECT_EQ(lines, takeLines());
    seam().counts.clear();
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

// The system log, with a store that never gets as far as the database.
class ServiceSystemLog : public ::testing::Test {
protected:
    void SetUp() override
    {
        setenv("VEMO_REDIRECT_DIR", "/nonexistent", 1);
        seam() = Seam();
        seam().fail("seteuid", EPERM, 1, INT_MAX);
        errno = 0;
    }

    // A line of the system log while errno is EPERM.
    static std::string withErrno(const std::string& strLine)
    {
        const size_t nPrefix = strLine.find(' ') + 1;
        return strLine.substr(0, nPrefix) + "(" + strerror(EPERM) + ")" + strLine.substr(nPrefix);
    }

    unsigned int m_uid = 1026;
    std::string m_strFunction = "VPN";
    std::string m_strTid = tid();
    Json::Value m_jOption;
};

TEST_F(ServiceSystemLog, TellsErrnoInFrontOfEachLineWhenThereIsOne)
{
    VEMO_ACCESS_TOKEN::debugInfo(true);
    seam().clock = NOW;
    AccessTokenApi api;
    EXPECT_EQ((Texts{withErrno(failed(STORE, "0 > seteuid(0)", EPERM))}), takeLines(Destination::Syslog));

    errno = 0;
    EXPECT_EQ(-1, api.tokenCreateByTid(m_uid, m_strFunction, m_jOption, m_strTid));
    const Texts lines = takeLines(Destination::Syslog);
    ASSERT_EQ(8u, lines.size());
    EXPECT_EQ(ordinary(SERVICE, R"(create token ok, token={"bind_sid":"","count":1,"create_time":1700000000,)"
                                R"("deadline":1700086400,"extra":{},"function":"VPN","tid":")" +
                                    m_strTid + R"(","uid":1026,"webapi_allow":{}})"),
              lines[0]);
    EXPECT_EQ((Texts{withErrno(failed(STORE, "0 > seteuid(0)", EPERM)),
                     withErrno(failed(STORE, "0 > initDb()", EPERM)),
                     withErrno(failed(STORE, "0 > runSql()", EPERM)),
                     withErrno(failed(SERVICE, "0 > m_pDb->tokenCreate(jParam)", EPERM)),
                     ordinary(SERVICE, summary(m_strTid, "1026", "VPN", m_jOption), EPERM)}),
              Texts(lines.begin() + 3, lines.end()));
    const Texts calls = seam().callsOf({"syslog"});
    EXPECT_EQ(Texts(calls.size(), "syslog 3"), calls); // LOG_ERR
}

TEST_F(ServiceSystemLog, GetsTheConstructorsLine)
{
    for (int nErrno : {0, ENOMEM}) {
        seam().counts.clear();
        seam().fail("operator new", nErrno);
        AccessTokenApi api;
        EXPECT_EQ((Texts{ordinary(SERVICE, "new AccessTokenDbApi failed", nErrno)}),
                  takeLines(Destination::Syslog));
    }
}

} // namespace
