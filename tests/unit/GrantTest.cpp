// Granting tokens: who is granted what, and how the store's failures show.

#include "AccessTokenUtil.h"
#include "OneGrant.h"
#include "StandIns.h"
#include "Statements.h"

namespace {

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
    return debug(SERVICE, "token grant failed!!, strTid=" + strTid + ", szWebapiName=" + strApi +
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

class Grant : public OneGrant {};

TEST_F(Grant, OfThreeUsesSucceedsThreeTimes)
{
    insertToken("3");
    for (const char* szStored : {"2", "1", ""}) {
        EXPECT_EQ(0, grant("t", "Api", "get"));
        EXPECT_EQ(szStored, countOf("t"));
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
        EXPECT_EQ("-1", countOf("t"));
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
    EXPECT_EQ((Texts{ordinary(STORE, "run sql=" + SELECT_T), ordinary(SERVICE, "get token tid=t"),
                     ordinary(STORE, "tokenSave, blCreate=0, jParam=" + recordText(1)),
                     ordinary(STORE, "run sql=" + strReplace), ordinary(STORE, "run sql=" + strReplace),
                     ordinary(STORE, "change rv=1, run sql=" + strReplace),
                     ordinary(SERVICE, "token grant success!!")}),
              takeLines());

    EXPECT_EQ(0, grant("t", "Api", nullptr));
    EXPECT_EQ(
        (Texts{ordinary(STORE, "run sql=" + SELECT_T), ordinary(SERVICE, "get token tid=t"),
               ordinary(STORE, "run sql=" + DELETE_T), ordinary(STORE, "change rv=1, run sql=" + DELETE_T),
               ordinary(STORE, "delete token number=1"), ordinary(SERVICE, "token grant success!!")}),
        takeLines());
}

const Line FOUND = debug(SERVICE, "get token tid=t");
const Line NO_API = {failed(SERVICE, "!szWebapiName || !szWebapiName[0]")};
const Line NO_TID = {failed(SERVICE, "strTid.empty()")};
const Line NOT_PERMITTED = {
    failed(SERVICE, "0 > (err = checkPermission(jToken, szWebapiName, szWebapiMethod))")};
const Line RECORD = debug(UTIL, "jToken=" + recordText(2));
const Line UNLISTED_API = debug(UTIL, "webapi=api not in allow list, jToken=" + recordText(2));
const Line MALFORMED_API = {
    failed(UTIL, "jToken[\"webapi_allow\"][szWebapiName].type() != Json::objectValue")};

Line lookup(const std::string& strTidInSql)
{
    return debug(STORE, "run sql=" + selectSql(strTidInSql));
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

class GrantRefuses : public OneGrant, public ::testing::WithParamInterface<std::tuple<Refusal, bool>> {};

TEST_P(GrantRefuses, AndSpendsNothing)
{
    const auto& [refusal, blDebug] = GetParam();
    insertToken("2");
    VEMO_ACCESS_TOKEN::debugInfo(blDebug);

    EXPECT_EQ(-1, grant(refusal.szTid, refusal.szApi, refusal.szMethod));

    EXPECT_EQ(texts(refusal.lines, blDebug), takeLines());
    EXPECT_EQ(UNTOUCHED, m_jToken);
    EXPECT_EQ("2", countOf("t"));
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
        EXPECT_EQ("2", countOf("t"));
    }
}

TEST_F(Grant, LetsTheExceptionOfAMalformedMethodPass)
{
    insertToken("2", R"({"Api":{"method":[{}]}})");

    EXPECT_THROW(grant("t", "Api", "get"), Json::LogicError);

    EXPECT_EQ(UNTOUCHED, m_jToken);
    EXPECT_EQ("2", countOf("t"));
    EXPECT_EQ(Texts{}, takeLines());
}

struct StoreFailure {
    const char* szName;
    const char* szStatement; // the one that fails: how it starts
    Answer failure;
    const char* szCount;
    const char* szStored;
    Texts lines;
};

void PrintTo(const StoreFailure& failure, std::ostream* pStream)
{
    *pStream << failure.szName;
}

Texts inStore(const Texts& conditions)
{
    return allFailed(STORE, conditions, EIO);
}

Texts inService(const Texts& conditions)
{
    return allFailed(SERVICE, conditions, EIO);
}

Texts refusedBySqlite(const std::string& strSql)
{
    return failureOf(strSql, DISK_ERROR.szError, EIO);
}

Texts lockedBefore(const std::string& strSql)
{
    return {fail(STORE, "sql error, sql=" + strSql, EIO)};
}

const Texts LOOKUP_FAILED = inStore({"0 > tokenGet(jParam, jTokenArray)"}) +
                            inService({"0 > (rv = m_pDb->tokenGetOne(\"tid\", strTid, jTokenOut))",
                                       "0 > (err = tokenGetByTid(strTid, jToken))"});
const Texts SAVE_FAILED = inService({"0 > m_pDb->tokenUpdate(jToken)"}) +
                          Texts{ordinary(SERVICE, "tokenSaveByOverwrite failed, jToken=" + recordText(1))} +
                          inService({"0 > tokenSaveByOverwrite(jToken)", "0 > tokenCountDegrade(jToken)"});
const Texts DELETE_FAILED = inService({"0 > (err = m_pDb->tokenDelete(jParam))"}) +
                            Texts{ordinary(SERVICE, "tokenDeleteByArray failed, name=tid, strVector=t")} +
                            inService({"0 > (err = tokenDeleteByArray(strVector, szName))"}) +
                            Texts{ordinary(SERVICE, "tokenDeleteByName failed, name=tid, strValue=t")} +
                            inService({"0 > tokenDeleteByTid(strTid)", "0 > tokenCountDegrade(jToken)"});

// After a lock that was waited out the statement has taken effect, and the grant is refused.
const StoreFailure STORE_FAILURES[] = {
    {"InLookup", "SELECT", DISK_ERROR, "2", "2",
     refusedBySqlite(SELECT_T) + inStore({"0 > runSql(FillList, &jTokenArrayOut)"}) + LOOKUP_FAILED},
    {"InLookupAfterLock", "SELECT", LOCKED, "2", "2", lockedBefore(SELECT_T) + LOOKUP_FAILED},
    {"InSave", "REPLACE", DISK_ERROR, "2", "2",
     refusedBySqlite(replaceSql(1)) + inStore({"0 > runSql()"}) + SAVE_FAILED},
    {"InSaveAfterLock", "REPLACE", LOCKED, "2", "1", lockedBefore(replaceSql(1)) + SAVE_FAILED},
    {"InDelete", "DELETE", DISK_ERROR, "1", "1",
     refusedBySqlite(DELETE_T) + inStore({"0 > (err = runSql())"}) + DELETE_FAILED},
    {"InDeleteAfterLock", "DELETE", LOCKED, "1", "", lockedBefore(DELETE_T) + DELETE_FAILED}};

class GrantFails : public OneGrant, public ::testing::WithParamInterface<StoreFailure> {};

TEST_P(GrantFails, AndLeavesTheCallersRecordAlone)
{
    insertToken(GetParam().szCount);
    failStatements(GetParam().szStatement, GetParam().failure);

    EXPECT_EQ(-1, grant("t", "Api", "get"));

    EXPECT_EQ(GetParam().lines, takeLines());
    EXPECT_EQ(UNTOUCHED, m_jToken);
    EXPECT_EQ(GetParam().szStored, countOf("t"));
}

INSTANTIATE_TEST_SUITE_P(Store, GrantFails, ::testing::ValuesIn(STORE_FAILURES),
                         [](const auto& test) { return std::string(test.param.szName); });

// The record that the table yields, reduced to some columns, as an older table may have them.
class GrantOfPart : public OneGrant {
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
    const std::string strDegrade = failed(SERVICE, "0 > tokenCountDegrade(jToken)");
    const struct {
        std::vector<const char*> names;
        std::vector<const char*> values;
        Texts lines;
    } parts[] = {
        {{"uid"}, {"7"}, {failed(UTIL, "!jToken.isMember(\"webapi_allow\")"), NOT_PERMITTED.strText}},
        {{"webapi_allow"}, {"{}"}, {NOT_PERMITTED.strText}},
        {{"webapi_allow"}, {szAllow}, {failed(SERVICE, "!jToken.isMember(\"uid\")")}},
        {{"webapi_allow", "uid"},
         {szAllow, "7"},
         {failed(SERVICE, "!jToken.isMember(\"count\")"), strDegrade}},
        {{"webapi_allow", "uid", "count"},
         {szAllow, "7", "1"},
         {failed(SERVICE, "!jToken.isMember(\"tid\")"), strDegrade}}};
    for (const auto& part : parts) {
        SCOPED_TRACE(part.names.size());
        answer(part.names, part.values);

        EXPECT_EQ(-1, grant("t", "Api", nullptr));

        EXPECT_EQ(part.lines, takeLines());
        EXPECT_EQ(UNTOUCHED, m_jToken);
    }
}

class GrantInSystemLog : public StoreTest {
protected:
    GrantInSystemLog() : StoreTest(Destination::Syslog) {}
};

TEST_F(GrantInSystemLog, TellsErrnoInFrontOfEachLineWhenThereIsOne)
{
    // The lookup finds a token, and at the next grant none.
    int nFound = 0;
    standIns().tokenGetOne = [&](const char*, std::string&, Json::Value& jToken) {
        jToken = json(recordText(-1));
        return nFound = 1 - nFound;
    };
    AccessTokenApi api;
    VEMO_ACCESS_TOKEN::debugInfo(true);
    std::string strTid = "t";
    Json::Value jToken;
    for (const int nErrno : {0, EACCES}) {
        errno = nErrno;
        EXPECT_EQ(0, api.tokenGrant(strTid, "Api", "get", jToken));
        EXPECT_EQ(-1, api.tokenGrant(strTid, "Api", "get", jToken));
        EXPECT_EQ(inSystemLog({FOUND.strText, ordinary(SERVICE, "token grant success!!"),
                               refused("t", "Api", "get").strText},
                              nErrno),
                  takeLines(Destination::Syslog));
    }
}

} // namespace
