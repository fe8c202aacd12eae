// Changing tokens, field by field and as a whole.

#include <type_traits>

#include "AccessTokenUtil.h"
#include "OneToken.h"
#include "StandIns.h"

// The signatures that compiled callers link to.
static_assert(std::is_same_v<int (AccessTokenApi::*)(std::string&, Json::Value&),
                             decltype(&AccessTokenApi::tokenUpdateByTid)>);
static_assert(
    std::is_same_v<int (AccessTokenApi::*)(Json::Value&), decltype(&AccessTokenApi::tokenSaveByOverwrite)>);

namespace {

const char* const GET_BY_TID_FAILED = "0 > (nCount = tokenGetByTid(strTid, jToken))";
const std::string REPLACE_ONE =
    std::string("REPLACE INTO token (") + COLUMNS +
    R"() VALUES ('one','S1',1026,1000,3,900,'VPN','{"A":{"method":["get"]}}','{"a":1,"b":[2]}'))";

struct Field {
    const char* szName;
    int nLine; // in the field list
    const char* szValue;
    const char* szStored;
    const char* szWrong;
};

// In the field list's order, with a new value, what the column then holds, and a value of a wrong type.
const std::vector<Field> FIELDS = {
    {"tid", 2, R"("new")", "new", "5"},
    {"bind_sid", 4, R"("S'2")", "S'2", "null"},
    {"uid", 6, "0", "0", R"("0")"},
    {"deadline", 8, "3600", "3600", "1.5"}, // absolute, unlike a deadline at creation
    {"count", 10, "-1", "-1", R"("5")"},
    {"create_time", 14, "-5", "-5", "[]"},
    {"function", 16, R"("")", "", "{}"},
    {"webapi_allow", 18, R"({"B":{}})", R"({"B":{}})", "[]"},
    {"extra", 22, R"({"z":null})", R"({"z":null})", R"("{}")"},
};

class UpdateTest : public OneToken {
protected:
    static std::string overwriteFailed(const Json::Value& jToken)
    {
        return ordinary(SERVICE, "tokenSaveByOverwrite failed, jToken=" + text(jToken));
    }

    // The update, which only reads what it is given.
    int update(const std::string& strParam, std::string strTid = "one")
    {
        const std::string strTidBefore = strTid;
        Json::Value jParam = json(strParam);
        const Json::Value jBefore = jParam;
        errno = 0;
        const int rv = m_pApi->tokenUpdateByTid(strTid, jParam);
        EXPECT_EQ(strTidBefore, strTid);
        EXPECT_EQ(jBefore, jParam);
        return rv;
    }

    int overwrite(Json::Value jToken)
    {
        const Json::Value jBefore = jToken;
        errno = 0;
        const int rv = m_pApi->tokenSaveByOverwrite(jToken);
        EXPECT_EQ(jBefore, jToken);
        return rv;
    }
};

class TokenUpdate : public UpdateTest {};

TEST_F(TokenUpdate, ReplacesEachFieldAlone)
{
    for (const Field& field : FIELDS) {
        SCOPED_TRACE(field.szName);
        query("DELETE FROM token");
        insertOne();
        EXPECT_EQ(0, update(std::string("{\"") + field.szName + "\":" + field.szValue + "}"));

        // All else is as it was, and the old row stays beside one of another tid.
        Texts expected;
        for (const Field& column : FIELDS) {
            const Json::Value jOld = one()[column.szName];
            const std::string strOld = jOld.isObject() ? text(jOld) : jOld.asString();
            expected.push_back(&column == &field ? field.szStored : strOld);
        }
        std::string strRow;
        for (const std::string& strColumn : expected) {
            strRow.append(&strColumn == &expected[0] ? "" : "|").append(strColumn);
        }
        const bool blCopy = std::string("tid") == field.szName;
        EXPECT_EQ((blCopy ? Texts{strRow, m_rows[0]} : Texts{strRow}), rows());
    }
    EXPECT_EQ(Texts{}, takeLines());
}

TEST_F(TokenUpdate, ReplacesObjectsAsAWhole)
{
    EXPECT_EQ(0, update(R"({"extra":{"b":{}},"webapi_allow":{}})"));
    EXPECT_EQ((Texts{R"({}|{"b":{}})"}), query("SELECT webapi_allow,extra FROM token"));
}

TEST_F(TokenUpdate, RewritesTheTokenUnchangedWhenNoFieldIsGiven)
{
    for (const char* szParam : {R"({"colour":"red"})", "{}", R"({"Count":9,"sort_by":"tid","limit":0})"}) {
        SCOPED_TRACE(szParam);
        seam().calls.clear();
        EXPECT_EQ(0, update(szParam));
        EXPECT_EQ((Texts{"sqlite3_exec " + SELECT_ONE, "sqlite3_exec " + REPLACE_ONE}), statements());
        EXPECT_EQ(m_rows, rows());
    }
    EXPECT_EQ(Texts{}, takeLines());
}

TEST_F(TokenUpdate, MissingTokenIsNoFailureAndNothingIsWritten)
{
    EXPECT_EQ(0, update(R"({"count":5,"tid":"new"})", "unknown"));
    EXPECT_EQ((Texts{"sqlite3_exec " + selectSql("unknown")}), statements());
    EXPECT_EQ(m_rows, rows());
    EXPECT_EQ(Texts{}, takeLines());
}

TEST_F(TokenUpdate, AnotherTokensTidOverwritesThatToken)
{
    insert("two", "'',0,-1,0,0,'','{}','{}'");
    EXPECT_EQ(0, update(R"({"tid":"two"})"));
    EXPECT_EQ((Texts{"one|1026|VPN", "two|1026|VPN"}), query("SELECT tid,uid,function FROM token"));
}

TEST_F(TokenUpdate, RefusesBadArguments)
{
    EXPECT_EQ(-1, update("{}", ""));
    EXPECT_EQ((Texts{failed(SERVICE, "strTid.empty()")}), takeLines());
    EXPECT_EQ(-1, update("null", ""));
    EXPECT_EQ((Texts{failed(SERVICE, "strTid.empty()")}), takeLines());
    for (const char* szParam : {"null", "[]", R"("{}")", "0", "true"}) {
        SCOPED_TRACE(szParam);
        EXPECT_EQ(-1, update(szParam));
        EXPECT_EQ((Texts{failed(SERVICE, "jParam.type() != Json::objectValue")}), takeLines());
    }
    EXPECT_EQ(Texts{}, statements());
}

TEST_F(TokenUpdate, FieldOfAWrongTypeLeavesTheStoredTokenAlone)
{
    for (const Field& field : FIELDS) {
        SCOPED_TRACE(field.szName);
        seam().calls.clear();
        Json::Value jMerged = one();
        jMerged[field.szName] = json(field.szWrong);
        EXPECT_EQ(-1, update(std::string("{\"") + field.szName + "\":" + field.szWrong + "}"));
        EXPECT_EQ((Texts{fail(UTIL, std::string("type failed, jmList[i]=") + field.szName +
                                        ", jTokenParam=" + text(jMerged)),
                         failed(SERVICE, "0 > checkJsonType(jToken)"), overwriteFailed(jMerged),
                         failed(SERVICE, "0 > tokenSaveByOverwrite(jToken)")}),
                  takeLines());
        EXPECT_EQ(1u, statements().size());
    }
    EXPECT_EQ(m_rows, rows());
}

TEST_F(TokenUpdate, NumberBeyond64BitsThrowsAndLeavesTheStoredTokenAlone)
{
    EXPECT_THROW(update(R"({"count":18446744073709551615})"), Json::LogicError);
    EXPECT_EQ(m_rows, rows());
}

TEST_F(TokenUpdate, TracesOverwrittenFieldsInTheListsOrderInDebugMode)
{
    Json::Value jParam = json(R"({"colour":"red"})");
    Json::Value jNew;
    VEMO_ACCESS_TOKEN::debugInfo(true);
    const std::string strSelect = SELECT_ONE;
    const std::string strReplace = std::string("REPLACE INTO token (") + COLUMNS +
                                   R"() VALUES ('new','S''2',0,3600,-1,-5,'','{"B":{}}','{"z":null}'))";
    Texts lines{ordinary(STORE, "run sql=" + strSelect)};
    for (const Field& field : FIELDS) {
        jParam[field.szName] = jNew[field.szName] = json(field.szValue);
        lines.push_back(
            ordinary(fieldList(field.nLine), std::string("overwrite token[") + field.szName + "]"));
    }
    lines.push_back(ordinary(STORE, "tokenSave, blCreate=0, jParam=" + text(jNew)));
    lines.push_back(ordinary(STORE, "run sql=" + strReplace)); // by tokenSave
    lines.push_back(ordinary(STORE, "run sql=" + strReplace)); // by runSqlEx
    lines.push_back(ordinary(STORE, "change rv=1, run sql=" + strReplace));
    EXPECT_EQ(0, update(text(jParam)));
    EXPECT_EQ(lines, takeLines());
}

TEST_F(TokenUpdate, TracesOnlyGivenFieldsAndNoneOfAMissingTokenInDebugMode)
{
    VEMO_ACCESS_TOKEN::debugInfo(true);
    for (const Field& field : FIELDS) {
        SCOPED_TRACE(field.szName);
        EXPECT_EQ(-1, update(std::string("{\"") + field.szName + "\":" + field.szWrong + "}"));
        const Texts lines = takeLines();
        ASSERT_EQ(6u, lines.size());
        EXPECT_EQ(ordinary(fieldList(field.nLine), std::string("overwrite token[") + field.szName + "]"),
                  lines[1]);
    }
    EXPECT_EQ(0, update(R"({"count":5})", "unknown"));
    EXPECT_EQ((Texts{ordinary(STORE, "run sql=" + selectSql("unknown"))}), takeLines());
}

TEST_F(TokenUpdate, ReportsAFailedRead)
{
    failStatements("SELECT", DISK_ERROR);
    EXPECT_EQ(-1, update(R"({"count":5})"));
    EXPECT_EQ(broken(SELECT_ONE,
                     {"0 > runSql(FillList, &jTokenArrayOut)", "0 > tokenGet(jParam, jTokenArray)"},
                     {GET_ONE_FAILED, GET_BY_TID_FAILED}),
              takeLines());
    EXPECT_EQ(m_rows, rows());
}

TEST_F(TokenUpdate, ReportsAFailedWrite)
{
    failStatements("REPLACE", DISK_ERROR);
    EXPECT_EQ(-1, update("{}"));
    EXPECT_EQ(broken(REPLACE_ONE, {"0 > runSql()"}, {"0 > m_pDb->tokenUpdate(jToken)"}) +
                  (Texts{overwriteFailed(one()), failed(SERVICE, "0 > tokenSaveByOverwrite(jToken)", EIO)}),
              takeLines());
    EXPECT_EQ(m_rows, rows());
}

TEST_F(TokenUpdate, ReportsFailureAfterWaitingForALock)
{
    failStatements("SELECT", LOCKED);
    EXPECT_EQ(-1, update(R"({"count":5})")); // nothing is written after a read that had to wait
    EXPECT_EQ((Texts{fail(STORE, "sql error, sql=" + SELECT_ONE, EIO),
                     failed(STORE, "0 > tokenGet(jParam, jTokenArray)", EIO),
                     failed(SERVICE, GET_ONE_FAILED, EIO), failed(SERVICE, GET_BY_TID_FAILED, EIO)}),
              takeLines());
    EXPECT_EQ(m_rows, rows());

    failStatements("REPLACE", LOCKED);
    EXPECT_EQ(-1, update(R"({"count":5})")); // and a write that had to wait has been made
    EXPECT_EQ((Texts{"5"}), query("SELECT count FROM token"));
    EXPECT_EQ(4u, takeLines().size());
}

TEST_F(TokenUpdate, MakesOneFailureOfAnyNegativeResultOfTheStore)
{
    standIns().tokenGetOne = [](const char*, std::string&, Json::Value&) { return -7; };
    EXPECT_EQ(-1, update("{}"));
    EXPECT_EQ((Texts{failed(SERVICE, GET_ONE_FAILED), failed(SERVICE, GET_BY_TID_FAILED)}), takeLines());
}

// No transaction holds reading and writing together.
TEST_F(TokenUpdate, WinsWholeOverWhatOthersDidSinceItsRead)
{
    for (const char* szOthers : {"UPDATE token SET uid = 7, count = 8", "DELETE FROM token"}) {
        SCOPED_TRACE(szOthers);
        seam().sqliteExec = [&](sqlite3* pDb, const char* szSql, SqlCallback callback, void* pArgument,
                                char** pszError) {
            if (0 == std::string(szSql).find("REPLACE")) {
                query(szOthers);
            }
            return Seam::exec(pDb, szSql, callback, pArgument, pszError);
        };
        EXPECT_EQ(0, update(R"({"count":5})"));
        EXPECT_EQ((Texts{"one|1026|5"}), query("SELECT tid,uid,count FROM token"));
    }
}

class TokenOverwrite : public UpdateTest {};

TEST_F(TokenOverwrite, WritesOverAStoredTokenOrMakesANewOne)
{
    Json::Value jToken = one();
    EXPECT_EQ(0, overwrite(jToken));
    EXPECT_EQ((Texts{"sqlite3_exec " + REPLACE_ONE}), statements());
    EXPECT_EQ(m_rows, rows());
    jToken["count"] = 2;
    jToken["colour"] = "red"; // no field, dropped
    EXPECT_EQ(0, overwrite(jToken));
    jToken["tid"] = "new";
    EXPECT_EQ(0, overwrite(jToken));
    EXPECT_EQ((Texts{"new|2", "one|2"}), query("SELECT tid,count FROM token ORDER BY tid"));
    EXPECT_EQ(Texts{}, takeLines());
}

TEST_F(TokenOverwrite, RefusesWhatIsNoObject)
{
    for (const char* szToken : {"null", "[]", "[{}]", R"("{}")", "5", "1.5", "false"}) {
        SCOPED_TRACE(szToken);
        EXPECT_EQ(-1, overwrite(json(szToken)));
        EXPECT_EQ((Texts{failed(SERVICE, "jToken.type() != Json::objectValue"),
                         ordinary(SERVICE, std::string("tokenSaveByOverwrite failed, jToken=") + szToken)}),
                  takeLines());
    }
    EXPECT_EQ(Texts{}, statements());
}

TEST_F(TokenOverwrite, RefusesARecordThatLacksAFieldAndAddsNothing)
{
    // First the last field goes, then the one before it as well, ...: the first missing is told.
    Json::Value jAll = one();
    for (auto field = FIELDS.rbegin(); FIELDS.rend() != field; ++field) {
        Json::Value jLacksOne = one();
        jLacksOne.removeMember(field->szName);
        jAll.removeMember(field->szName);
        for (const Json::Value& jToken : {jLacksOne, jAll}) {
            SCOPED_TRACE(text(jToken));
            EXPECT_EQ(-1, overwrite(jToken));
            EXPECT_EQ(
                (Texts{ordinary(fieldList(field->nLine), std::string("lost data member=") + field->szName),
                       failed(SERVICE, "0 > fillDefaultValue(jToken, true)"), overwriteFailed(jToken)}),
                takeLines());
        }
    }
    EXPECT_EQ(Texts{}, statements());
}

TEST_F(TokenOverwrite, RefusesAFieldOfAWrongType)
{
    for (const Field& field : FIELDS) {
        SCOPED_TRACE(field.szName);
        Json::Value jToken = one();
        jToken[field.szName] = json(field.szWrong);
        EXPECT_EQ(-1, overwrite(jToken));
        EXPECT_EQ((Texts{fail(UTIL, std::string("type failed, jmList[i]=") + field.szName +
                                        ", jTokenParam=" + text(jToken)),
                         failed(SERVICE, "0 > checkJsonType(jToken)"), overwriteFailed(jToken)}),
                  takeLines());
    }
    EXPECT_EQ(Texts{}, statements());
}

TEST_F(TokenOverwrite, ReportsAFailedStore)
{
    failStatements("REPLACE", DISK_ERROR);
    EXPECT_EQ(-1, overwrite(one()));
    EXPECT_EQ(broken(REPLACE_ONE, {"0 > runSql()"}, {"0 > m_pDb->tokenUpdate(jToken)"}) +
                  Texts{overwriteFailed(one())},
              takeLines());
}

TEST_F(TokenOverwrite, FailureLinesTellErrno)
{
    Json::Value jToken;
    errno = EACCES;
    EXPECT_EQ(-1, m_pApi->tokenSaveByOverwrite(jToken));
    EXPECT_EQ((Texts{failed(SERVICE, "jToken.type() != Json::objectValue", EACCES),
                     overwriteFailed(Json::Value())}),
              takeLines(Destination::Stdout));
    EXPECT_EQ(EACCES, errno);
}

class UpdateSystemLog : public StoreTest {
protected:
    UpdateSystemLog() : StoreTest(Destination::Syslog) {}
};

// Of each field: that it is overwritten, and that the check misses it.
TEST_F(UpdateSystemLog, TellsErrnoInFrontOfEachLineWhenThereIsOne)
{
    // The lookup pretends to find something and leaves the record as it is.
    standIns().tokenGetOne = [](const char*, std::string&, Json::Value&) { return 1; };
    VEMO_ACCESS_TOKEN::debugInfo(true);
    AccessTokenApi api;
    takeLines();
    std::string strTid = "one";
    for (const Field& missing : FIELDS) {
        Json::Value jParam;
        Texts overwritten;
        for (const Field& field : FIELDS) {
            if (&field != &missing) {
                jParam[field.szName] = json(field.szValue);
                overwritten.push_back(
                    ordinary(fieldList(field.nLine), std::string("overwrite token[") + field.szName + "]"));
            }
        }
        for (int nErrno : {0, EACCES}) {
            errno = nErrno;
            EXPECT_EQ(-1, api.tokenUpdateByTid(strTid, jParam));
            const Texts lines =
                overwritten +
                Texts{ordinary(fieldList(missing.nLine), std::string("lost data member=") + missing.szName),
                      failed(SERVICE, "0 > fillDefaultValue(jToken, true)", nErrno),
                      ordinary(SERVICE, "tokenSaveByOverwrite failed, jToken=" + text(jParam)),
                      failed(SERVICE, "0 > tokenSaveByOverwrite(jToken)", nErrno)};
            EXPECT_EQ(inSystemLog(lines, nErrno), takeLines(Destination::Syslog));
        }
    }
}

} // namespace
