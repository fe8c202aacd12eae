// Changing tokens, field by field and as a whole. The test of the model covers more changes.

#include "AccessTokenUtil.h"
#include "Statements.h"
#include "StoreTest.h"

namespace {

// What is logged when the service refuses a save by overwriting.
Texts refusedLines(const std::string& strCondition, const Json::Value& jToken)
{
    return {failed(SERVICE, strCondition),
            ordinary(SERVICE, "tokenSaveByOverwrite failed, jToken=" + text(jToken))};
}

// The token is t.
class Update : public TableTest {
protected:
    void SetUp() override
    {
        TableTest::SetUp();
        insert();
    }

    int update(Json::Value jParam, std::string strTid = "t")
    {
        return api().tokenUpdateByTid(strTid, jParam);
    }
};

TEST_F(Update, ReplacesTheGivenFieldsInTheOrderOfTheList)
{
    const Texts lookedUp = {ordinary(STORE, "run sql=" + selectSql("t"))};
    VEMO_ACCESS_TOKEN::debugInfo(true);
    const auto replaces = [&](const Json::Value& jChange) {
        SCOPED_TRACE(text(jChange));
        query("DELETE FROM token");
        insert();
        Json::Value jExpected = token();
        Texts lines = lookedUp;
        for (const Field& field : fields()) {
            if (jChange.isMember(field.szName)) {
                jExpected[field.szName] = jChange[field.szName];
                lines.push_back(
                    ordinary(fieldList(field.nLine), std::string("overwrite token[") + field.szName + "]"));
            }
        }
        const std::string strRun = "run sql=" + saveSql("REPLACE", jExpected);
        lines = lines + Texts{ordinary(STORE, "tokenSave, blCreate=0, jParam=" + text(jExpected)),
                              ordinary(STORE, strRun), ordinary(STORE, strRun),
                              ordinary(STORE, "change rv=1, " + strRun)};
        EXPECT_EQ(0, update(jChange));
        EXPECT_LINES(lines);
        // With another tid, the old row stays.
        EXPECT_EQ((jChange.isMember("tid") ? Texts{row(jExpected), row(token())} : Texts{row(jExpected)}),
                  rows());
    };
    Json::Value jAll = json(R"({"colour":"red"})"); // other members than fields are ignored
    replaces(jAll);
    for (const Field& field : fields()) {
        Json::Value jOne;
        jAll[field.szName] = jOne[field.szName] = json(field.szOther);
        replaces(jOne);
    }
    replaces(jAll);
    EXPECT_EQ(0, update(jAll, "unknown"));
    EXPECT_LINES(ordinary(STORE, "run sql=" + selectSql("unknown"))); // no REPLACE for a missing token
}

TEST_F(Update, RefusesBadArguments)
{
    const Json::Value jWrong = token(R"({"count":"5"})");
    Json::Value jNull;
    EXPECT_FAILURE(update(jNull, ""), failed(SERVICE, "strTid.empty()"));
    EXPECT_FAILURE(update(jNull), failed(SERVICE, "jParam.type() != Json::objectValue"));
    EXPECT_FAILURE(api().tokenSaveByOverwrite(jNull),
                   refusedLines("jToken.type() != Json::objectValue", jNull));
    EXPECT_EQ(Texts{}, seam().statements());
    EXPECT_FAILURE(update(json(R"({"count":"5"})")),
                   Texts{fail(UTIL, "type failed, jmList[i]=count, jTokenParam=" + text(jWrong))} +
                       refusedLines("0 > checkJsonType(jToken)", jWrong) +
                       Texts{failed(SERVICE, "0 > tokenSaveByOverwrite(jToken)")});
    EXPECT_EQ((Texts{row(token())}), rows());
}

// Reading and writing are not one transaction.
TEST_F(Update, OverwritesChangesMadeSinceItsRead)
{
    for (const char* szOthers : {"UPDATE token SET uid = 7, count = 8", "DELETE FROM token"}) {
        SCOPED_TRACE(szOthers);
        beforeStatements(
            [&](const std::string& strSql) { query(0 == strSql.find("REPLACE") ? szOthers : ""); });
        EXPECT_EQ(0, update(json(R"({"count":5})")));
        EXPECT_EQ((Texts{row(token(R"({"count":5})"))}), rows());
    }
}

} // namespace
