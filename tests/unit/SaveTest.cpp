// Saving records: the statements, what is refused, and that what was saved comes back as it was.

#include <cmath>
#include <cstring>
#include <limits>

#include "AccessTokenUtil.h"
#include "Statements.h"
#include "StoreTest.h"

namespace {

// What is logged of a save whose statement failed.
Texts failureLines(const std::string& strSql, const std::string& strError)
{
    return failureOf(strSql, strError) + Texts{failed(STORE, "0 > runSql()")};
}

std::string bytesFrom(int nFirst)
{
    std::string strBytes;
    for (int nByte = nFirst; nByte < 256; ++nByte) {
        strBytes += static_cast<char>(nByte);
    }
    return strBytes;
}

class Save : public TableTest {
protected:
    void SetUp() override
    {
        TableTest::SetUp();
        ASSERT_EQ(0, m_db.initDb());
        reset();
    }

    // Saves a record, which stays as it is.
    int save(Json::Value jToken, bool blCreate = false)
    {
        const Json::Value jBefore = jToken;
        const int nResult = m_db.tokenSave(jToken, blCreate);
        EXPECT_EQ(jBefore, jToken);
        return nResult;
    }

    // The record of a token, as it comes back.
    Json::Value stored(std::string strTid = "t")
    {
        Json::Value jToken;
        EXPECT_EQ(1, m_db.tokenGetOne("tid", strTid, jToken));
        return jToken;
    }

    // What is saved comes back equal, and once more when that is saved again.
    void expectSame(const Json::Value& jJson, const std::string& strText = "t")
    {
        Json::Value jToken = token();
        jToken["extra"] = jToken["webapi_allow"] = jJson;
        jToken["tid"] = jToken["bind_sid"] = jToken["function"] = strText;
        EXPECT_EQ(0, save(jToken));
        EXPECT_EQ(jToken, stored(strText));
        EXPECT_EQ(0, save(stored(strText)));
        EXPECT_EQ(jToken, stored(strText));
    }
};

TEST_F(Save, RunsOneStatement)
{
    const struct {
        const char* szVerb;
        int (*pSave)(AccessTokenDbApi&, Json::Value&);
    } rows[] = {
        {"INSERT", [](AccessTokenDbApi& db, Json::Value& j) { return db.tokenCreate(j); }},
        {"INSERT", [](AccessTokenDbApi& db, Json::Value& j) { return db.tokenSave(j, true); }},
        {"REPLACE", [](AccessTokenDbApi& db, Json::Value& j) { return db.tokenUpdate(j); }},
        {"REPLACE", [](AccessTokenDbApi& db, Json::Value& j) { return db.tokenSave(j, false); }},
    };
    const std::string strValues =
        " INTO token (tid,bind_sid,uid,deadline,count,create_time,function,webapi_allow,extra) VALUES (";
    for (const auto& row : rows) {
        const std::string strSql =
            row.szVerb + strValues +
            R"('t','S1',1000,9999999999,3,1690000000,'VPN',)"
            R"('{"Api":{"method":["get","post"]},"Odd":{"method":[{}]}}','{"note":"it''s mine"}'))";
        SCOPED_TRACE(row.szVerb);
        query("DELETE FROM token");
        seam().calls.clear();
        m_db.m_strErr = "stale";
        Json::Value jToken = token();
        EXPECT_EQ(0, row.pSave(m_db, jToken));
        EXPECT_EQ(
            (Texts{"sqlite3_mprintf " + (row.szVerb + strValues) + "%Q,%Q,%lld,%lld,%lld,%lld,%Q,%Q,%Q)",
                   "sqlite3_exec " + strSql, "sqlite3_changes"}),
            seam().calls);
        EXPECT_EQ(strSql, m_db.m_strSql);
        EXPECT_EQ("", m_db.m_strErr);
        EXPECT_EQ(token(), jToken);
        EXPECT_EQ((Texts{R"(t|S1|1000|9999999999|3|1690000000|VPN|)"
                         R"({"Api":{"method":["get","post"]},"Odd":{"method":[{}]}}|{"note":"it's mine"})"}),
                  TableTest::rows());
    }
    EXPECT_EQ((Texts{"text|text|integer|integer|integer|integer|text|text|text"}),
              query("SELECT typeof(tid),typeof(bind_sid),typeof(uid),typeof(deadline),typeof(count),"
                    "typeof(create_time),typeof(function),typeof(webapi_allow),typeof(extra) FROM token"));
}

TEST_F(Save, ExpandersAppend)
{
    std::string strSql = "SELECT ";
    EXPECT_EQ(0, m_db.SqlExpandMemberName(strSql));
    EXPECT_EQ(SELECT, strSql + " FROM token ");
    EXPECT_EQ(0, m_db.SqlExpandMemberSymbol(strSql = "("));
    EXPECT_EQ("(%Q,%Q,%lld,%lld,%lld,%lld,%Q,%Q,%Q)", strSql);
}

// The caller is responsible for types: a value is written as the JSON library converts it.
TEST_F(Save, RendersEachField)
{
    seam().sqliteExec = [](sqlite3*, const char*, auto, void*, char**) { return SQLITE_OK; };
    const auto renders = [&](const char* szField, const char* szValue, const char* szSql) {
        SCOPED_TRACE(std::string(szField) + " " + szValue);
        // The statement of a record with a mark in place of the value.
        Json::Value jToken = token();
        const bool blNumber = jToken[szField].isNumeric();
        jToken[szField] = blNumber ? Json::Value(77777) : "MARK";
        std::string strSql = saveSql("INSERT", jToken);
        const std::string strMark = blNumber ? "77777" : "'MARK'";
        strSql.replace(strSql.find(strMark), strMark.size(), szSql);
        jToken[szField] = json(szValue);
        EXPECT_EQ(0, save(jToken, true));
        EXPECT_EQ(strSql, m_db.m_strSql);
    };
    renders("tid", R"("it's")", "'it''s'");
    renders("tid", R"("%Q %s %n %%")", "'%Q %s %n %%'");
    renders("tid", R"("a\\\"\n;--")", "'a\\\"\n;--'");
    renders("tid", R"("x'); DROP TABLE token; --")", "'x''); DROP TABLE token; --'");
    renders("bind_sid", R"("")", "''");
    renders("bind_sid", R"("cut\u0000here")", "'cut'");
    renders("uid", "4294967295", "4294967295");
    renders("uid", "null", "0");
    renders("deadline", "-9223372036854775808", "-9223372036854775808");
    renders("deadline", "9223372036854775807", "9223372036854775807");
    renders("count", "2.9", "2");
    renders("webapi_allow", "null", "'null'");
    renders("webapi_allow", R"({"it's":["'"]})", R"('{"it''s":["''"]}')");
    renders("extra", R"("text")", R"('"text"')");
    renders("extra", R"({"b":1, "a" : {"c":true}})", R"('{"a":{"c":true},"b":1}')");
    renders("extra", R"("\u0000\u001f\n\u007fü")", "'\"\\u0000\\u001f\\n\x7fü\"'");
}

// For what the JSON library cannot convert, it throws; nothing is run.
TEST_F(Save, ThrowsForMembersThatDoNotConvert)
{
    m_db.m_strSql = "before";
    for (const char* szChange :
         {R"({"tid":null})", R"({"tid":1})", R"({"bind_sid":null})", R"({"function":{}})", R"({"uid":"1"})",
          R"({"deadline":18446744073709551615})", R"({"deadline":1e30})", R"({"count":[]})"}) {
        SCOPED_TRACE(szChange);
        EXPECT_THROW(save(token(szChange)), Json::LogicError);
    }
    EXPECT_THROW(save(Json::Value(Json::arrayValue)), Json::LogicError);
    EXPECT_EQ(Texts{}, seam().calls);
    EXPECT_EQ("before", m_db.m_strSql);
}

TEST_F(Save, RefusesARecordThatLacksAField)
{
    AccessTokenDbApi db;
    Json::Value jRest = token();
    for (auto field = fields().rbegin(); fields().rend() != field; ++field) {
        jRest.removeMember(field->szName); // and all that follow are gone already
        for (Json::Value jToken : {without(field->szName), jRest}) {
            for (const bool blCreate : {false, true}) {
                SCOPED_TRACE(text(jToken));
                errno = EACCES;
                EXPECT_FAILURE(db.tokenSave(jToken, blCreate),
                               failed(fieldList(field->nLine),
                                      std::string("!jParam.isMember(\"") + field->szName + "\")", EACCES));
            }
        }
    }
    Json::Value jNull;
    EXPECT_EQ(-1, db.tokenCreate(jNull));
    EXPECT_EQ(1u, takeLines().size());
    EXPECT_EQ("", db.m_strSql);
    EXPECT_EQ(Texts{}, seam().calls);
}

TEST_F(Save, FailsWithoutMemoryForTheStatement)
{
    seam().fail("sqlite3_mprintf", ENOMEM);
    EXPECT_FAILURE(save(token()), failed(STORE, "!szSql || !szSql[0]", ENOMEM));
    EXPECT_EQ("", m_db.m_strSql);
    EXPECT_EQ(Texts{}, seam().statements());
}

TEST_F(Save, FailsWithItsStatement)
{
    const std::string strSql = saveSql("REPLACE", token());
    failStatements("REPLACE", LOCKED); // callers see a failure, although the row is there
    EXPECT_FAILURE(save(token()), fail(STORE, "sql error, sql=" + strSql, EIO));
    EXPECT_EQ("database is locked", m_db.m_strErr);
    EXPECT_EQ(token(), stored());
    query("DROP TABLE token");
    errno = 0;
    EXPECT_FAILURE(save(token()), failureLines(strSql, "no such table: token"));

    EXPECT_EQ(0, m_db.freeDb());
    seam().fail("seteuid", EPERM);
    EXPECT_FAILURE(save(token()), NOT_OPENED + Texts{failed(STORE, "0 > runSql()", EPERM)});
}

// What was saved comes back

TEST_F(Save, KeepsJsonOfAnySizeAndDepth)
{
    Json::Value jDeep(Json::objectValue);
    for (int nLevel = 1; nLevel < 1000; ++nLevel) { // as deep as the reader goes
        Json::Value jOuter;
        jOuter["a"].swap(jDeep);
        jDeep.swap(jOuter);
    }
    expectSame(jDeep);
    Json::Value jLarge;
    jLarge["a"] = std::string(1 << 20, '\'');
    expectSame(jLarge);
    expectSame(json(R"({"":"","a":{},"b":[[],{},[{}]],"c":[null,true,false],"it's":"it''s","\"":"\\\"/",
                        "größe":"日本語 😀","\u0001":"\u2028\ud83d\ude00","text":["null","1","// no comment","%Q%lld"],
                        "n":[-9223372036854775808,-2147483649,2147483648,4294967295,18446744073709551615]})"));
}

// Byte for byte, as text and as name: valid UTF-8 or not, and control characters. JSON keeps NUL too.
TEST_F(Save, KeepsBytes)
{
    Json::Value jValue;
    for (const std::string& strBytes :
         {bytesFrom(0), std::string("a\0b", 3), std::string("a\0c", 3), std::string("\0", 1),
          std::string("\xc3"), std::string("\xed\xa0\x80"), std::string("\xf4\x90\x80\x80"),
          std::string("\xe2\x82")}) {
        jValue[strBytes] = strBytes;
    }
    for (int nByte = 0; nByte < 256; ++nByte) {
        const std::string strByte(1, static_cast<char>(nByte));
        jValue["bytes"].append(strByte);
        jValue[strByte] = nByte;
    }
    expectSame(jValue, bytesFrom(1));
}

TEST_F(Save, KeepsDoublesToTheBit)
{
    typedef std::numeric_limits<double> Limits;
    for (const double value : {-0.0,
                               0.1,
                               0.1 + 0.2,
                               1.0 / 3,
                               1.0,
                               1e16,
                               1e17,
                               1e22,
                               1e23,
                               0x1p53,
                               0x1p63,
                               -0x1p63,
                               0x1p64,
                               -1e-300,
                               Limits::max(),
                               Limits::min(),
                               Limits::denorm_min(),
                               -Limits::infinity(),
                               Limits::infinity(),
                               Limits::quiet_NaN()}) {
        SCOPED_TRACE(value);
        Json::Value jToken = token();
        jToken["extra"]["d"] = value;
        EXPECT_EQ(0, m_db.tokenUpdate(jToken));
        const Json::Value jStored = stored()["extra"]["d"];
        ASSERT_EQ(Json::realValue, jStored.type());
        const double read = jStored.asDouble();
        EXPECT_TRUE(std::isnan(value) ? std::isnan(read) : 0 == memcmp(&value, &read, sizeof(read)));
    }
}

// Conditions compare texts, so a value must always become the same text.
TEST_F(Save, DropsCommentsOtherMembersAndWhatFollowsANul)
{
    Json::Value jToken = token(R"({"extra":[1],"more":"text","TID":1,"sort_by":"tid"})");
    jToken["tid"] = std::string("t\0b", 3);
    jToken["extra"][0].setComment(std::string("// a comment"), Json::commentBefore);
    EXPECT_EQ(0, save(jToken));
    EXPECT_EQ((Texts{"t|1|[1]"}), query("SELECT tid, length(CAST(tid AS BLOB)), extra FROM token"));
    EXPECT_EQ(token(R"({"extra":[1]})"), stored());
}

} // namespace
