// Changing tokens, field by field and as a whole.

#include "AccessTokenUtil.h"
#include "Statements.h"
#include "StoreTest.h"

namespace {

std::string overwritten(const Field& field)
{
    return ordinary(fieldList(field.nLine), std::string("overwrite token[") + field.szName + "]");
}

std::string overwriteFailed(const Json::Value& jToken)
{
    return ordinary(SERVICE, "tokenSaveByOverwrite failed, jToken=" + text(jToken));
}

// The token is t.
class Update : public TableTest {
protected:
    void SetUp() override
    {
        TableTest::SetUp();
        insert();
    }

    // The update, which leaves its argument as it is.
    int update(const Json::Value& jChange, std::string strTid = "t")
    {
        Json::Value jParam = jChange;
        errno = 0;
        const int rv = api().tokenUpdateByTid(strTid, jParam);
        EXPECT_EQ(jChange, jParam);
        return rv;
    }
    int update(const char* szChange, const char* szTid = "t") { return update(json(szChange), szTid); }

    int overwrite(Json::Value jToken)
    {
        const Json::Value jBefore = jToken;
        const int rv = api().tokenSaveByOverwrite(jToken);
        EXPECT_EQ(jBefore, jToken);
        return rv;
    }
};

TEST_F(Update, ReplacesEachFieldAlone)
{
    for (const bool blDebug : {false, true}) {
        VEMO_ACCESS_TOKEN::debugInfo(blDebug);
        for (const Field& field : fields()) {
            SCOPED_TRACE(field.szName);
            query("DELETE FROM token");
            insert();
            Json::Value jChange;
            jChange[field.szName] = json(field.szOther);
            Json::Value jExpected = token();
            jExpected[field.szName] = jChange[field.szName];
            EXPECT_EQ(0, update(jChange));
            // With another tid, the old row stays.
            const bool blCopy = std::string("tid") == field.szName;
            EXPECT_EQ((blCopy ? Texts{row(jExpected), row(token())} : Texts{row(jExpected)}), rows());
            const std::string strRun = "run sql=" + saveSql("REPLACE", jExpected);
            const Texts lines = Texts{ordinary(STORE, "run sql=" + selectSql("t")), overwritten(field),
                                      ordinary(STORE, "tokenSave, blCreate=0, jParam=" + text(jExpected))} +
                                Texts(2, ordinary(STORE, strRun)) +
                                Texts{ordinary(STORE, "change rv=1, " + strRun)};
            EXPECT_LINES(blDebug ? lines : Texts{});
        }
    }
}

TEST_F(Update, ReplacesAllFieldsInTheListsOrder)
{
    Json::Value jChange = json(R"({"colour":"red"})");
    Texts lines;
    for (const Field& field : fields()) {
        jChange[field.szName] = json(field.szOther);
        lines.push_back(overwritten(field));
    }
    VEMO_ACCESS_TOKEN::debugInfo(true);
    EXPECT_EQ(0, update(jChange));
    EXPECT_EQ((Texts{row(jChange), row(token())}), rows());
    const Texts all = takeLines();
    EXPECT_EQ(lines, Texts(all.begin() + 1, all.begin() + 10));
    EXPECT_EQ(0, update(R"({"count":5})", "unknown"));
    EXPECT_LINES(ordinary(STORE, "run sql=" + selectSql("unknown"))); // none for a missing token
}

TEST_F(Update, RewritesTheTokenUnchangedWhenNoFieldIsGiven)
{
    for (const char* szChange : {R"({"colour":"red"})", "{}", R"({"Count":9,"sort_by":"tid","limit":0})"}) {
        SCOPED_TRACE(szChange);
        seam().calls.clear();
        EXPECT_EQ(0, update(szChange));
        EXPECT_EQ((Texts{selectSql("t"), saveSql("REPLACE", token())}), seam().statements());
        EXPECT_EQ((Texts{row(token())}), rows());
    }
}

TEST_F(Update, RefusesBadArguments)
{
    EXPECT_FAILURE(update("null", ""), failed(SERVICE, "strTid.empty()"));
    for (const char* szChange : {"null", "[]", R"("{}")", "0", "true"}) {
        EXPECT_FAILURE(update(szChange), failed(SERVICE, "jParam.type() != Json::objectValue"));
    }
    EXPECT_EQ(Texts{}, seam().statements());
    const std::string strWrong = text(token(R"({"count":"5"})"));
    EXPECT_FAILURE(update(R"({"count":"5"})"),
                   fail(UTIL, "type failed, jmList[i]=count, jTokenParam=" + strWrong),
                   failed(SERVICE, "0 > checkJsonType(jToken)"),
                   ordinary(SERVICE, "tokenSaveByOverwrite failed, jToken=" + strWrong),
                   failed(SERVICE, "0 > tokenSaveByOverwrite(jToken)"));
    EXPECT_THROW(update(R"({"count":18446744073709551615})"), Json::LogicError);
    EXPECT_EQ((Texts{row(token())}), rows());
}

// No transaction holds reading and writing together.
TEST_F(Update, WinsOverWhatOthersDidSinceItsRead)
{
    for (const char* szOthers : {"UPDATE token SET uid = 7, count = 8", "DELETE FROM token"}) {
        SCOPED_TRACE(szOthers);
        beforeStatements(
            [&](const std::string& strSql) { query(0 == strSql.find("REPLACE") ? szOthers : ""); });
        EXPECT_EQ(0, update(R"({"count":5})"));
        EXPECT_EQ((Texts{row(token(R"({"count":5})"))}), rows());
    }
}

// Saving by overwriting

TEST_F(Update, OverwriteTakesWholeRecordsOnly)
{
    for (const char* szToken : {"null", "[]", "[{}]", R"("{}")", "5", "1.5", "false"}) {
        errno = EACCES;
        EXPECT_EQ(-1, overwrite(json(szToken)));
        EXPECT_EQ(EACCES, errno);
        EXPECT_LINES(failed(SERVICE, "jToken.type() != Json::objectValue", EACCES),
                     overwriteFailed(json(szToken)));
    }
    errno = 0;
    for (const Field& field : fields()) {
        SCOPED_TRACE(field.szName);
        EXPECT_FAILURE(overwrite(without(field.szName)),
                       ordinary(fieldList(field.nLine), std::string("lost data member=") + field.szName),
                       failed(SERVICE, "0 > fillDefaultValue(jToken, true)"),
                       overwriteFailed(without(field.szName)));
        const std::string strMessage = std::string("type failed, jmList[i]=") + field.szName;
        EXPECT_FAILURE(overwrite(withWrong(field)),
                       fail(UTIL, strMessage + ", jTokenParam=" + text(withWrong(field))),
                       failed(SERVICE, "0 > checkJsonType(jToken)"), overwriteFailed(withWrong(field)));
    }
    EXPECT_EQ(Texts{}, seam().statements());
    EXPECT_EQ(0, overwrite(token(R"({"tid":"new","colour":"red"})"))); // what is no field is dropped
    EXPECT_EQ((Texts{saveSql("REPLACE", token(R"({"tid":"new"})"))}), seam().statements());
}

} // namespace
