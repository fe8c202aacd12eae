// The service object: its database, and what it does without one.

#include <climits>
#include <functional>
#include <memory>
#include <type_traits>

#include "AccessTokenApi.h"
#include "AccessTokenUtil.h"
#include "Opening.h"

// Compiled callers hold the object in a pointer's room.
static_assert(sizeof(AccessTokenApi) == sizeof(void*));
static_assert(!std::is_polymorphic_v<AccessTokenApi>);
static_assert(!std::is_copy_constructible_v<AccessTokenApi> && !std::is_copy_assignable_v<AccessTokenApi>);
static_assert(!std::is_move_constructible_v<AccessTokenApi> && !std::is_move_assignable_v<AccessTokenApi>);

namespace {

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

class ServiceObject : public StoreTest {};

TEST_F(ServiceObject, CreatesTheDatabaseAndClosesItAtItsEnd)
{
    {
        AccessTokenApi api;
        const Texts calls = seam().callsOf(
            {"operator", "geteuid", "seteuid", "access", "open", "chmod", "sqlite3_open", "sqlite3_close"});
        EXPECT_EQ((Texts{"operator new", UID, RAISE, ACCESS, TOUCH, CHMOD, OPEN, RAISE}), calls);
        EXPECT_EQ(1u, seam().callsOf({"sqlite3_exec"}).size());
        seam().calls.clear();
    }
    EXPECT_EQ((Texts{"sqlite3_close"}), seam().calls);
    EXPECT_EQ((Texts{"0"}), query("SELECT count(*) FROM token"));
    EXPECT_EQ(Texts{}, takeLines());
}

TEST_F(ServiceObject, OpensAnExistingDatabaseAsItsConstructorsLastAction)
{
    makeDatabase();
    {
        AccessTokenApi api;
        EXPECT_EQ((Texts{"operator new", UID, RAISE, ACCESS, OPEN, RAISE}), seam().calls);
        seam().calls.clear();
    }
    EXPECT_EQ((Texts{"sqlite3_close"}), seam().calls);
    EXPECT_EQ(Texts{}, takeLines());
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
    EXPECT_EQ((Texts{NOT_ROOT}), takeLines());
    EXPECT_EQ(Texts{}, seam().callsOf({"sqlite3_open"}));

    Json::Value jFilter;
    Json::Value jTokens(Json::arrayValue);
    EXPECT_EQ(0, api.tokenList(jFilter, jTokens));
    EXPECT_EQ(1u, seam().callsOf({"sqlite3_open"}).size());
    EXPECT_EQ(Texts{}, takeLines());
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
    EXPECT_EQ(Texts{NOT_ROOT} + NOT_OPENED +
                  (Texts{failed(STORE, "0 > runSql(FillList, &jTokenArrayOut)", EPERM),
                         failed(SERVICE, "0 > m_pDb->tokenGet(jFilter, jTokenArrayOut)", EPERM)}),
              takeLines());
    EXPECT_EQ(Texts{}, seam().callsOf({"access", "sqlite3_open", "sqlite3_close"}));
}

// A caller may have a failure of its last operation still to report.
TEST_F(ServiceObject, ItsEndKeepsErrno)
{
    seam().sqliteClose = [](sqlite3* pDb) {
        const int nResult = sqlite3_close(pDb);
        errno = EIO;
        return nResult;
    };
    {
        AccessTokenApi api;
        errno = EACCES;
    }
    EXPECT_EQ(EACCES, errno);
    EXPECT_EQ((Texts{"sqlite3_close"}), seam().callsOf({"sqlite3_close"}));
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
    EXPECT_EQ(Texts{}, takeLines());
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

    const std::string strCreate = "tokenCreate failed, tid=TID, uid=1026, strFunction=a, jTokenOption=null";
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
    EXPECT_EQ(Texts{}, seam().callsOf(OPENING_CALLS));
}

TEST_F(WithoutStore, OperationsThatNeedNoneWork)
{
    Texts strVector{"a"};
    Json::Value jParam;
    EXPECT_EQ(0, m_pApi->VectorParamToJson(strVector, "tid", jParam));
    Json::Value jUnlimited = json(R"({"count":-1})");
    EXPECT_EQ(0, m_pApi->tokenCountDegrade(jUnlimited));
    EXPECT_EQ(Texts{}, takeLines());
}

TEST_F(WithoutStore, AFailedPurgeIsToldInDebugMode)
{
    VEMO_ACCESS_TOKEN::debugInfo(true);
    errno = 0;
    EXPECT_EQ(-1, m_pApi->cleanExpireToken(false));
    EXPECT_EQ((Texts{fail(SERVICE, "run fail 0 > m_pDb->cleanExpireToken(blLogErr)")}), takeLines());
}

class ServiceSystemLog : public StoreTest {
protected:
    ServiceSystemLog() : StoreTest(Destination::Syslog) {}
};

TEST_F(ServiceSystemLog, GetsTheLinesOfAServiceWithoutStore)
{
    VEMO_ACCESS_TOKEN::debugInfo(true);
    for (int nErrno : {0, ENOMEM}) {
        seam().counts.clear();
        seam().fail("operator new", nErrno);
        AccessTokenApi api;
        EXPECT_EQ(-1, api.cleanExpireToken(false));
        EXPECT_EQ(inSystemLog({ordinary(SERVICE, "new AccessTokenDbApi failed"),
                               fail(SERVICE, "run fail 0 > m_pDb->cleanExpireToken(blLogErr)", nErrno)},
                              nErrno),
                  takeLines(Destination::Syslog));
    }
}

} // namespace
