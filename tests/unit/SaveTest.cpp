// Saving records: the statements, what is refused, and that a saved record is read back equal.

#include <cmath>
#include <cstdlib>
#include <cstring>

#include "StoreTest.h"

namespace {

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

    int save(Json::Value jToken, bool blCreate = false) { return m_db.tokenSave(jToken, blCreate); }

    // The record of a token, as it is read back.
    Json::Value stored(std::string strTid = "t")
    {
        Json::Value jToken;
        EXPECT_EQ(1, m_db.tokenGetOne("tid", strTid, jToken));
        return jToken;
    }

    // A saved record is read back equal; and again when the result is saved.
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
    const std::string strNames = "tid,bind_sid,uid,deadline,count,create_time,function,webapi_allow,extra";
    const std::string strDirectives = "%Q,%Q,%lld,%lld,%lld,%lld,%Q,%Q,%Q)";
    for (const bool blCreate : {true, false}) {
        SCOPED_TRACE(blCreate);
        const std::string strStart =
            std::string(blCreate ? "INSERT" : "REPLACE") + " INTO token (" + strNames + ") VALUES (";
        const std::string strSql =
            strStart +
            R"('t','S1',1000,9999999999,3,1690000000,'VPN',)"
            R"('{"Api":{"method":["get","post"]},"Odd":{"method":[{}]}}','{"note":"it''s mine"}'))";
        query("DELETE FROM token");
        seam().calls.clear();
        m_db.m_strErr = "stale";
        EXPECT_EQ(0, save(token(), blCreate));
        EXPECT_EQ((Texts{"sqlite3_mprintf " + strStart + strDirectives, "sqlite3_exec " + strSql}),
                  seam().calls);
        EXPECT_EQ(strSql, m_db.m_strSql);
        EXPECT_EQ("", m_db.m_strErr);
    }
    EXPECT_EQ((Texts{"text|text|integer|integer|integer|integer|text|text|text"}),
              query("SELECT typeof(tid),typeof(bind_sid),typeof(uid),typeof(deadline),typeof(count),"
                    "typeof(create_time),typeof(function),typeof(webapi_allow),typeof(extra) FROM token"));
    // The builders append.
    std::string strText = "names ";
    EXPECT_EQ(0, m_db.SqlExpandMemberName(strText));
    EXPECT_EQ(0, m_db.SqlExpandMemberSymbol(strText));
    EXPECT_EQ("names " + strNames + strDirectives, strText);
}

TEST_F(Save, RefusesARecordThatLacksAFieldOrHasNoMemory)
{
    m_db.m_strSql = "before";
    errno = EACCES;
    Json::Value jRest = token();
    for (auto field = fields().rbegin(); fields().rend() != field; ++field) {
        jRest.removeMember(field->szName); // the fields after it are removed already
        const std::string strCondition = std::string("!jParam.isMember(\"") + field->szName + "\")";
        EXPECT_FAILURE(save(jRest), failed(fieldList(field->nLine), strCondition, EACCES));
    }
    EXPECT_EQ(Texts{}, seam().calls);
    seam().fail("sqlite3_mprintf", ENOMEM);
    EXPECT_FAILURE(save(token()), failed(STORE, "!szSql || !szSql[0]", ENOMEM));
    EXPECT_EQ(Texts{}, seam().statements());
    EXPECT_EQ("before", m_db.m_strSql);
}

// What was saved is read back

TEST_F(Save, KeepsJsonOfAnySizeAndDepth)
{
    Json::Value jDeep(Json::objectValue);
    for (int nLevel = 1; nLevel < 1000; ++nLevel) { // as deep as the reader reads
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

// Each byte is kept, in texts and in names: valid UTF-8 or not, and control characters. JSON keeps NUL too.
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
    for (const char* szValue :
         {"-0.0", "0.1", "0.30000000000000004", "0.3333333333333333", "1.0", "1e17", "1e22", "1e23", "0x1p53",
          "0x1p64", "-1e-300", "0x1.fffffffffffffp1023", "0x1p-1074", "-inf", "inf", "nan"}) {
        const double value = strtod(szValue, nullptr);
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
TEST_F(Save, DropsCommentsOtherMembersAndTextAfterANul)
{
    Json::Value jToken = token(R"({"extra":[1],"more":"text","TID":1,"sort_by":"tid"})");
    jToken["tid"] = std::string("t\0b", 3);
    jToken["extra"][0].setComment(std::string("// a comment"), Json::commentBefore);
    EXPECT_EQ(0, save(jToken));
    EXPECT_EQ((Texts{"t|1|[1]"}), query("SELECT tid, length(CAST(tid AS BLOB)), extra FROM token"));
    EXPECT_EQ(token(R"({"extra":[1]})"), stored());
}

} // namespace
