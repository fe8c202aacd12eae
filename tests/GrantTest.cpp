// Granting tokens and counting their uses.

#include <climits>
#include <cstring>
#include <functional>
#include <optional>

#include "AccessTokenApi.h"
#include "AccessTokenUtil.h"
#include "StoreTest.h"

namespace {

typedef std::vector<std::string> Texts;

const char* const API = "AccessTokenApi.cpp";
const char* const STORE = "AccessTokenSqlite.cpp";
const char* const UTIL = "util.cpp";
const Json::Value UNTOUCHED = "what the caller had";
const std::string ALLOW = R"({"Api":{"method":["get","post"]},"Odd":7})";
const std::string SELECT = std::string("SELECT ") + COLUMNS + " FROM token  WHERE  (tid='t' );";
const std::string DELETE = "DELETE FROM token WHERE  (tid in ('t' ) );";

std::string replaceSql(Json::Int64 nCount)
{
    return std::string("REPLACE INTO token (") + COLUMNS + ") VALUES ('t','S1',1000,1700000100," +
           std::to_string(nCount) + R"(,1700000000,'VPN',')" + ALLOW + R"(','{"note":"mine"}'))";
}

std::string recordText(Json::Int64 nCount)
{
    return R"({"bind_sid":"S1","count":)" + std::to_string(nCount) +
           R"(,"create_time":1700000000,"deadline":1700000100,"extra":{"note":"mine"},"function":"VPN",)" +
           R"("tid":"t","uid":1000,"webapi_allow":)" + ALLOW + "}";
}

// A line, and whether only debug mode has it.
struct Line {
    std::string strText;
    bool blDebug = false;
};

Line debug(const std::string& strFile, const std::string& strMessage)
{
    return {ordinary(strFile, strMessage), true};
}

Line refused(const std::string& strTid, const std::string& strApi, const std::string& strMethod)
{
    return debug(API, "token grant failed!!, strTid=" + strTid + ", szWebapiName=" + strApi +
                          ", szWebapiMethod=" + strMethod);
}

Texts texts(const std::vector<Line>& lines, bool blDebug)
{
    Texts found;
    for (const Line& line : lines) {
        if (blDebug || !line.blDebug) {
            found.push_back(line.strText);
        }
    }
    return found;
}

// Fails the first statement that starts with strStart; leaves EIO. What SQLite does to errno in the
// statements that run is its own affair and is hidden from the log lines.
void failStatement(const std::string& strStart, const char* szError)
{
    seam().sqliteExec = [strStart, szError, blDone = false](sqlite3* pDb, const char* szSql, auto callback,
                                                            void* pArgument, char** pszError) mutable {
        if (!blDone && 0 == strncmp(szSql, strStart.c_str(), strStart.size())) {
            blDone = true;
            *pszError = sqlite3_mprintf("%s", szError);
            errno = EIO;
            return SQLITE_ERROR;
        }
        const int nErrno = errno;
        const int nResult = sqlite3_exec(pDb, szSql, callback, pArgument, pszError);
        errno = nErrno;
        return nResult;
    };
}

class Grant : public StoreTest {
protected:
    void SetUp() override
    {
        StoreTest::SetUp();
        makeDatabase();
        m_api.emplace();
        failStatement("none", "");
        seam().calls.clear();
        errno = 0;
    }

    void insertToken(const std::string& strCount, const std::string& strAllow = ALLOW) const
    {
        insert("t", "'S1',1000,1700000100," + strCount + ",1700000000,'VPN','" + strAllow +
                        R"(','{"note":"mine"}')");
    }

    // The count of the token in the table, "" when it is gone.
    std::string stored() const
    {
        const Texts rows = query("SELECT count FROM token WHERE tid = 't'");
        return rows.empty() ? "" : rows[0];
    }

    int grant(std::string strTid, const char* szApi, const char* szMethod)
    {
        errno = 0; // what the test's own SQL left there
        return m_api->tokenGrant(strTid, szApi, szMethod, m_jToken);
    }

    AccessTokenApi& api() { return *m_api; }

    Json::Value m_jToken = UNTOUCHED;

private:
    std::optional<AccessTokenApi> m_api; // opened when its database stands
};

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
    {"One", "1", "", 1, DELETE},
    {"Zero", "0", "", 0, DELETE},
    {"MinusOne", "-1", "-1", -1, ""},
    {"Least", "-9223372036854775808", "-9223372036854775808", INT64_MIN, ""},
    {"Most", "9223372036854775807", "9223372036854775806", INT64_MAX - 1, replaceSql(INT64_MAX - 1)}};

class GrantOfCount : public Grant, public ::testing::WithParamInterface<CountCase> {};

TEST_P(GrantOfCount, SpendsOneUse)
{
    insertToken(GetParam().szCount);

    EXPECT_EQ(0, grant("t", "Api", "get"));

    EXPECT_EQ(GetParam().szStored, stored());
    Json::Value jExpected = json(recordText(0));
    jExpected["count"] = GetParam().nHandedBack;
    EXPECT_EQ(jExpected, m_jToken);
    Texts statements = {"sqlite3_exec " + SELECT};
    if (!GetParam().strStatement.empty()) {
        statements.push_back("sqlite3_exec " + GetParam().strStatement);
    }
    EXPECT_EQ(statements, seam().callsOf({"sqlite3_exec"}));
    EXPECT_EQ(Texts{}, takeLines());
}

INSTANTIATE_TEST_SUITE_P(Counts, GrantOfCount, ::testing::ValuesIn(COUNTS),
                         [](const auto& test) { return std::string(test.param.szName); });

TEST_F(Grant, OfThreeUsesSucceedsThreeTimes)
{
    insertToken("3");
    for (const char* szStored : {"2", "1", ""}) {
        EXPECT_EQ(0, grant("t", "Api", "get"));
        EXPECT_EQ(szStored, stored());
    }
    m_jToken = UNTOUCHED;

    EXPECT_EQ(-1, grant("t", "Api", "get"));

    EXPECT_EQ(UNTOUCHED, m_jToken);
    EXPECT_EQ(Texts{}, takeLines());
}

TEST_F(Grant, OfUnlimitedTokenNeverEnds)
{
    insertToken("-1");
    for (int i = 0; i < 10; ++i) {
        EXPECT_EQ(0, grant("t", "Api", "get"));
        EXPECT_EQ(json(recordText(-1)), m_jToken);
        EXPECT_EQ("-1", stored());
    }
}

TEST_F(Grant, OfTokenWithDefaultCountSucceedsOnce)
{
    unsigned int uid = 1000;
    std::string strFunction = "VPN";
    std::string strTid = tid();
    Json::Value jOption = json(R"({"webapi_allow": {"Api": {}}})");
    ASSERT_EQ(0, api().tokenCreateByTid(uid, strFunction, jOption, strTid));

    EXPECT_EQ(0, grant(strTid, "Api", nullptr));
    EXPECT_EQ(Json::Value(1), m_jToken["count"]);
    EXPECT_EQ(-1, grant(strTid, "Api", nullptr));

    EXPECT_EQ(Texts{}, query("SELECT tid FROM token"));
}

// Expired tokens fall to the purge before the grant, and to nothing else.
TEST_F(Grant, DoesNotLookAtTheDeadline)
{
    insertToken("2");
    query("UPDATE token SET deadline = -1");

    EXPECT_EQ(0, grant("t", "Api", "get"));

    EXPECT_EQ(Json::Value(-1), m_jToken["deadline"]);
}

TEST_F(Grant, AllowsListedMethodsAndTheApiAlone)
{
    insertToken("-1");
    const std::pair<const char*, const char*> allowed[] = {
        {"Api", "get"}, {"Api", "post"}, {"Api", ""}, {"Api", nullptr}, {"Odd", ""}, {"Odd", nullptr}};
    for (const auto& [szApi, szMethod] : allowed) {
        SCOPED_TRACE(szApi);
        EXPECT_EQ(0, grant("t", szApi, szMethod));
    }
    EXPECT_EQ(Texts{}, takeLines());
}

TEST_F(Grant, IsTracedInDebugMode)
{
    insertToken("2");
    VEMO_ACCESS_TOKEN::debugInfo(true);

    EXPECT_EQ(0, grant("t", "Api", "get"));
    const std::string strReplace = replaceSql(1);
    EXPECT_EQ((Texts{ordinary(STORE, "run sql=" + SELECT), ordinary(API, "get token tid=t"),
                     ordinary(STORE, "tokenSave, blCreate=0, jParam=" + recordText(1)),
                     ordinary(STORE, "run sql=" + strReplace), ordinary(STORE, "run sql=" + strReplace),
                     ordinary(STORE, "change rv=1, run sql=" + strReplace),
                     ordinary(API, "token grant success!!")}),
              takeLines());

    EXPECT_EQ(0, grant("t", "Api", nullptr));
    EXPECT_EQ((Texts{ordinary(STORE, "run sql=" + SELECT), ordinary(API, "get token tid=t"),
                     ordinary(STORE, "run sql=" + DELETE), ordinary(STORE, "change rv=1, run sql=" + DELETE),
                     ordinary(STORE, "delete token number=1"), ordinary(API, "token grant success!!")}),
              takeLines());
}

const Line FOUND = debug(API, "get token tid=t");
const Line NO_API = {failed(API, "!szWebapiName || !szWebapiName[0]")};
const Line NO_TID = {failed(API, "strTid.empty()")};
const Line NOT_PERMITTED = {failed(API, "0 > (err = checkPermission(jToken, szWebapiName, szWebapiMethod))")};
const Line RECORD = debug(UTIL, "jToken=" + recordText(2));
const Line UNLISTED_API = debug(UTIL, "webapi=api not in allow list, jToken=" + recordText(2));
const Line MALFORMED_API = {
    failed(UTIL, "jToken[\"webapi_allow\"][szWebapiName].type() != Json::objectValue")};

Line lookup(const std::string& strTidInSql)
{
    return debug(STORE, std::string("run sql=SELECT ") + COLUMNS + " FROM token  WHERE  (tid='" +
                            strTidInSql + "' );");
}

std::vector<Line> unknownTid(const std::string& strTid, const std::string& strTidInSql)
{
    return {lookup(strTidInSql), refused(strTid, "Api", "get")};
}

std::vector<Line> deniedApi(const Line& reason, const std::string& strApi, const std::string& strMethod)
{
    return {lookup("t"), FOUND, reason, RECORD, NOT_PERMITTED, refused("t", strApi, strMethod)};
}

std::vector<Line> unlistedMethod(const std::string& strMethod)
{
    const std::string strReason =
        "webapi=Api , method=" + strMethod + ", not in allow list, jToken=" + recordText(2);
    return {lookup("t"), FOUND, debug(UTIL, strReason), refused("t", "Api", strMethod)};
}

struct Refusal {
    const char* szName;
    const char* szTid;
    const char* szApi;
    const char* szMethod;
    std::vector<Line> lines;
};

void PrintTo(const Refusal& refusal, std::ostream* pStream)
{
    *pStream << refusal.szName;
}

const Refusal REFUSALS[] = {
    {"EmptyTid", "", "Api", "get", {NO_TID, refused("", "Api", "get")}},
    {"EmptyTidBeforeApi", "", nullptr, nullptr, {NO_TID, refused("", "(null)", "(null)")}},
    {"NullApi", "t", nullptr, "get", {NO_API, refused("t", "(null)", "get")}},
    {"EmptyApi", "t", "", "", {NO_API, refused("t", "", "")}},
    {"UnknownTid", "z", "Api", "get", unknownTid("z", "z")},
    {"TidThatIsSql", "' or ''='", "Api", "get", unknownTid("' or ''='", "'' or ''''=''")},
    {"UnlistedApi", "t", "api", nullptr, deniedApi(UNLISTED_API, "api", "(null)")},
    {"MalformedApi", "t", "Odd", "get", deniedApi(MALFORMED_API, "Odd", "get")},
    {"UnlistedMethod", "t", "Api", "put", unlistedMethod("put")},
    {"MethodOfOtherCase", "t", "Api", "Get", unlistedMethod("Get")},
    {"MethodThatOnlyStartsSo", "t", "Api", "ge", unlistedMethod("ge")}};

class GrantRefuses : public Grant, public ::testing::WithParamInterface<std::tuple<Refusal, bool>> {};

TEST_P(GrantRefuses, AndSpendsNothing)
{
    const auto& [refusal, blDebug] = GetParam();
    insertToken("2");
    VEMO_ACCESS_TOKEN::debugInfo(blDebug);

    EXPECT_EQ(-1, grant(refusal.szTid, refusal.szApi, refusal.szMethod));

    EXPECT_EQ(texts(refusal.lines, blDebug), takeLines());
    EXPECT_EQ(UNTOUCHED, m_jToken);
    EXPECT_EQ("2", stored());
    EXPECT_EQ(Texts{}, seam().callsOf({"sqlite3_changes"})); // nothing but a SELECT was run
}

INSTANTIATE_TEST_SUITE_P(Calls, GrantRefuses,
                         ::testing::Combine(::testing::ValuesIn(REFUSALS), ::testing::Bool()),
                         [](const auto& test) {
                             return std::string(std::get<0>(test.param).szName) +
                                    (std::get<1>(test.param) ? "Debug" : "");
                         });

TEST_F(Grant, RefusesAllowListsThatAreNoObjects)
{
    insertToken("2");
    for (const char* szAllow : {"[]", "[\"Api\"]", "\"Api\"", "7", "null", "true"}) {
        SCOPED_TRACE(szAllow);
        query(std::string("UPDATE token SET webapi_allow = '") + szAllow + "'");

        EXPECT_EQ(-1, grant("t", "Api", nullptr));

        EXPECT_EQ((Texts{failed(UTIL, "jToken[\"webapi_allow\"].type() != Json::objectValue"),
                         NOT_PERMITTED.strText}),
                  takeLines());
        EXPECT_EQ("2", stored());
    }
}

TEST_F(Grant, LetsTheExceptionOfAMalformedMethodPass)
{
    insertToken("2", R"({"Api":{"method":[{}]}})");

    EXPECT_THROW(grant("t", "Api", "get"), Json::LogicError);

    EXPECT_EQ(UNTOUCHED, m_jToken);
    EXPECT_EQ("2", stored());
    EXPECT_EQ(Texts{}, takeLines());
}

struct StoreFailure {
    const char* szName;
    const char* szStatement; // the one that fails: how it starts
    const char* szError;
    const char* szCount;
    const char* szStored;
    Texts lines;
};

void PrintTo(const StoreFailure& failure, std::ostream* pStream)
{
    *pStream << failure.szName;
}

Texts operator+(Texts left, const Texts& right)
{
    left.insert(left.end(), right.begin(), right.end());
    return left;
}

Texts notRun(const std::string& strSql)
{
    return {ordinary(STORE, "i=0,run sql failed, error=disk I/O error, sql=" + strSql),
            fail(STORE, "run sql failed, sql=" + strSql, EIO)};
}

Texts lockedBefore(const std::string& strSql)
{
    return {fail(STORE, "sql error, sql=" + strSql, EIO)};
}

Texts failures(const char* szFile, const Texts& conditions)
{
    Texts lines;
    for (const std::string& strCondition : conditions) {
        lines.push_back(failed(szFile, strCondition, EIO));
    }
    return lines;
}

const Texts LOOKUP_FAILED = failures(STORE, {"0 > tokenGet(jParam, jTokenArray)"}) +
                            failures(API, {"0 > (rv = m_pDb->tokenGetOne(\"tid\", strTid, jTokenOut))",
                                           "0 > (err = tokenGetByTid(strTid, jToken))"});
const Texts SAVE_FAILED =
    failures(API, {"0 > m_pDb->tokenUpdate(jToken)"}) +
    Texts{ordinary(API, "tokenSaveByOverwrite failed, jToken=" + recordText(1))} +
    failures(API, {"0 > tokenSaveByOverwrite(jToken)", "0 > tokenCountDegrade(jToken)"});
const Texts DELETE_FAILED = failures(API, {"0 > (err = m_pDb->tokenDelete(jParam))"}) +
                            Texts{ordinary(API, "tokenDeleteByArray failed, name=tid, strVector=t")} +
                            failures(API, {"0 > (err = tokenDeleteByArray(strVector, szName))"}) +
                            Texts{ordinary(API, "tokenDeleteByName failed, name=tid, strValue=t")} +
                            failures(API, {"0 > tokenDeleteByTid(strTid)", "0 > tokenCountDegrade(jToken)"});
const char* const DISK = "disk I/O error";
const char* const LOCK = "database is locked";

// After a lock that was waited out the statement has taken effect, and the grant is refused.
const StoreFailure STORE_FAILURES[] = {
    {"InLookup", "SELECT", DISK, "2", "2",
     notRun(SELECT) + failures(STORE, {"0 > runSql(FillList, &jTokenArrayOut)"}) + LOOKUP_FAILED},
    {"InLookupAfterLock", "SELECT", LOCK, "2", "2", lockedBefore(SELECT) + LOOKUP_FAILED},
    {"InSave", "REPLACE", DISK, "2", "2",
     notRun(replaceSql(1)) + failures(STORE, {"0 > runSql()"}) + SAVE_FAILED},
    {"InSaveAfterLock", "REPLACE", LOCK, "2", "1", lockedBefore(replaceSql(1)) + SAVE_FAILED},
    {"InDelete", "DELETE", DISK, "1", "1",
     notRun(DELETE) + failures(STORE, {"0 > (err = runSql())"}) + DELETE_FAILED},
    {"InDeleteAfterLock", "DELETE", LOCK, "1", "", lockedBefore(DELETE) + DELETE_FAILED}};

class GrantFails : public Grant, public ::testing::WithParamInterface<StoreFailure> {};

TEST_P(GrantFails, AndLeavesTheCallersRecordAlone)
{
    insertToken(GetParam().szCount);
    failStatement(GetParam().szStatement, GetParam().szError);

    EXPECT_EQ(-1, grant("t", "Api", "get"));

    EXPECT_EQ(GetParam().lines, takeLines());
    EXPECT_EQ(UNTOUCHED, m_jToken);
    EXPECT_EQ(GetParam().szStored, stored());
}

INSTANTIATE_TEST_SUITE_P(Store, GrantFails, ::testing::ValuesIn(STORE_FAILURES),
                         [](const auto& test) { return std::string(test.param.szName); });

// Nothing is locked between the lookup and the change: another process may come in between.
class GrantOverlaps : public Grant {
protected:
    // Runs something once, just ahead of the first statement that is no SELECT.
    void meanwhile(std::function<void()> run)
    {
        seam().sqliteExec = [run](sqlite3* pDb, const char* szSql, auto callback, void* pArgument,
                                  char** pszError) mutable {
            if (run && 0 != strncmp(szSql, "SELECT", 6)) {
                const std::function<void()> runOnce = std::move(run);
                run = nullptr;
                runOnce();
            }
            return sqlite3_exec(pDb, szSql, callback, pArgument, pszError);
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

    EXPECT_EQ("2", stored());
    EXPECT_EQ(json(recordText(2)), m_jToken);
}

TEST_F(GrantOverlaps, AndBothSpendTheLastUse)
{
    insertToken("1");
    meanwhile([this] { grantElsewhere(); });

    EXPECT_EQ(0, grant("t", "Api", "get"));

    EXPECT_EQ("", stored());
    EXPECT_EQ(json(recordText(1)), m_jToken);
    EXPECT_EQ(Texts{}, takeLines());
}

TEST_F(GrantOverlaps, AndSavesATokenThatWasDeletedMeanwhile)
{
    insertToken("3");
    meanwhile([this] { query("DELETE FROM token"); });

    EXPECT_EQ(0, grant("t", "Api", "get"));

    EXPECT_EQ("2", stored());
}

// The record that the table yields, reduced to some columns, as an older table may have them.
class GrantOfPart : public Grant {
protected:
    void answer(std::vector<const char*> names, std::vector<const char*> values)
    {
        seam().sqliteExec = [names, values](sqlite3*, const char*, auto callback, void* pArgument, char**) {
            std::vector<char*> columns, texts;
            for (size_t i = 0; i < names.size(); ++i) {
                columns.push_back(const_cast<char*>(names[i]));
                texts.push_back(const_cast<char*>(values[i]));
            }
            return callback(pArgument, static_cast<int>(names.size()), texts.data(), columns.data());
        };
    }
};

TEST_F(GrantOfPart, NamesWhatIsMissing)
{
    const char* const szAllow = R"({"Api":{}})";
    const std::string strDegrade = failed(API, "0 > tokenCountDegrade(jToken)");
    const struct {
        std::vector<const char*> names;
        std::vector<const char*> values;
        Texts lines;
    } parts[] = {
        {{"uid"}, {"7"}, {failed(UTIL, "!jToken.isMember(\"webapi_allow\")"), NOT_PERMITTED.strText}},
        {{"webapi_allow"}, {"{}"}, {NOT_PERMITTED.strText}},
        {{"webapi_allow"}, {szAllow}, {failed(API, "!jToken.isMember(\"uid\")")}},
        {{"webapi_allow", "uid"}, {szAllow, "7"}, {failed(API, "!jToken.isMember(\"count\")"), strDegrade}},
        {{"webapi_allow", "uid", "count"},
         {szAllow, "7", "1"},
         {failed(API, "!jToken.isMember(\"tid\")"), strDegrade}}};
    for (const auto& part : parts) {
        SCOPED_TRACE(part.names.size());
        answer(part.names, part.values);

        EXPECT_EQ(-1, grant("t", "Api", nullptr));

        EXPECT_EQ(part.lines, takeLines());
        EXPECT_EQ(UNTOUCHED, m_jToken);
    }
}

class Degrade : public Grant {};

// What a record may be that no table yielded.
TEST_F(Degrade, RefusesMalformedRecords)
{
    const std::string strCount = failed(API, "!jToken.isMember(\"count\")");
    const std::string strObject = failed(API, "jToken.type() != Json::objectValue");
    const std::string strTid = failed(API, "!jToken.isMember(\"tid\")");
    const std::string strString = failed(API, "jToken[\"tid\"].type() != Json::stringValue");
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
         {failed(API, "strValue.empty()"), ordinary(API, "tokenDeleteByName failed, name=tid, strValue="),
          failed(API, "0 > tokenDeleteByTid(strTid)")}}};
    for (const bool blDebug : {false, true}) {
        VEMO_ACCESS_TOKEN::debugInfo(blDebug);
        for (const auto& [szRecord, lines] : records) {
            SCOPED_TRACE(szRecord);
            Json::Value jToken = json(szRecord);

            EXPECT_EQ(-1, api().tokenCountDegrade(jToken));

            Texts expected = lines;
            if (blDebug) {
                expected.push_back(
                    ordinary(API, std::string("tokenCountDegrade failed, jToken=") + szRecord));
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
    EXPECT_EQ((Texts{ordinary(std::string(FIELD_LIST) + ":4", "lost data member=bind_sid"),
                     failed(API, "0 > fillDefaultValue(jToken, true)"),
                     ordinary(API, R"(tokenSaveByOverwrite failed, jToken={"count":1,"tid":"t"})"),
                     failed(API, "0 > tokenSaveByOverwrite(jToken)"),
                     ordinary(API, R"(tokenCountDegrade failed, jToken={"count":1,"tid":"t"})")}),
              takeLines());
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
    EXPECT_EQ("", stored());
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
