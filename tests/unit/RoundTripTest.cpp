// Records that are saved come back as they were.

#include <cmath>
#include <limits>

#include "SaveTest.h"

namespace {

std::string bytesFrom(int nFirst)
{
    std::string strBytes;
    for (int nByte = nFirst; nByte < 256; ++nByte) {
        strBytes += static_cast<char>(nByte);
    }
    return strBytes;
}

// What is saved comes back equal, and once more when that is saved again.
class SaveRoundTrip : public SaveTest {
protected:
    void expectSame(const Json::Value& jExtra)
    {
        Json::Value jToken = record();
        jToken["extra"] = jExtra;
        jToken["webapi_allow"] = jExtra;
        EXPECT_EQ(0, m_db.tokenUpdate(jToken));
        Json::Value jStored = stored();
        EXPECT_EQ(jToken, jStored);
        EXPECT_EQ(0, m_db.tokenUpdate(jStored));
        EXPECT_EQ(jToken, stored());
        EXPECT_EQ(Texts{}, takeLines());
    }
};

TEST_F(SaveRoundTrip, KeepsJsonValues)
{
    for (const char* szExtra :
         {"{}", R"({"":""})", R"({"a":{},"b":[],"c":null,"d":[[],{},[{}]],"e":[null,true,false]})",
          R"({"it's":"it''s","\"":"\\\"/"})", R"({"größe":"日本語 😀","\u0001":"\u2028\ud83d\ude00"})",
          R"({"min":-9223372036854775808,"max":9223372036854775807,"unsigned":18446744073709551615})",
          R"({"limits":[-2147483649,-2147483648,2147483647,2147483648,4294967295,9223372036854775808]})",
          R"({"Example.Api":{"method":["get","list"]},"Other.Api":{"method":[]}})",
          R"({"text":["null","1","{}","// no comment","/* none */","%Q%lld"]})"}) {
        SCOPED_TRACE(szExtra);
        expectSame(json(szExtra));
    }
}

// Byte for byte, as text and as name: valid UTF-8 or not, NUL and other control characters too.
TEST_F(SaveRoundTrip, KeepsBytes)
{
    Json::Value jExtra;
    for (const std::string& strBytes :
         {bytesFrom(0), std::string("a\0b", 3), std::string("a\0c", 3), std::string("\0", 1),
          std::string("a"), std::string("\xff\xfe"), std::string("\xc3"), std::string("\xc0\x80"),
          std::string("\xed\xa0\x80"), std::string("\xf4\x90\x80\x80"), std::string("\xe2\x82"),
          std::string("\x7f\x80\xbf")}) {
        jExtra[strBytes] = strBytes;
    }
    for (int nByte = 0; nByte < 256; ++nByte) {
        const std::string strByte(1, static_cast<char>(nByte));
        jExtra["bytes"].append(strByte);
        jExtra[strByte] = nByte;
    }
    expectSame(jExtra);
}

TEST_F(SaveRoundTrip, KeepsSizeAndDepth)
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
}

// Conditions compare texts, so a value must always become the same one.
TEST_F(SaveRoundTrip, StoresNoComments)
{
    Json::Value jToken = record();
    jToken["extra"] = json("[1]");
    jToken["extra"][0].setComment(std::string("// a comment"), Json::commentBefore);

    EXPECT_EQ(0, m_db.tokenUpdate(jToken));

    EXPECT_EQ(Texts{"[1]"}, query("SELECT extra FROM token"));
}

TEST_F(SaveRoundTrip, KeepsDoublesToTheBit)
{
    typedef std::numeric_limits<double> Limits;
    Json::Value jToken = record();
    for (const double value : {0.0,
                               -0.0,
                               0.1,
                               0.1 + 0.2,
                               1.0 / 3,
                               1.0,
                               -1.0,
                               100.0,
                               1e15,
                               1e16,
                               1e17,
                               1e22,
                               1e23,
                               9007199254740993.0,
                               9223372036854775808.0,
                               -9223372036854775808.0,
                               18446744073709551616.0,
                               1e300,
                               -1e-300,
                               Limits::max(),
                               Limits::lowest(),
                               Limits::min(),
                               Limits::denorm_min(),
                               -Limits::denorm_min(),
                               Limits::min() / 3,
                               Limits::infinity(),
                               -Limits::infinity()}) {
        SCOPED_TRACE(value);
        jToken["extra"]["d"] = value;
        jToken["webapi_allow"]["d"][0] = value;
        EXPECT_EQ(0, m_db.tokenUpdate(jToken));
        const Json::Value jStored = stored();
        for (const Json::Value& jDouble : {jStored["extra"]["d"], jStored["webapi_allow"]["d"][0]}) {
            ASSERT_EQ(Json::realValue, jDouble.type());
            EXPECT_EQ(value, jDouble.asDouble());
            EXPECT_EQ(std::signbit(value), std::signbit(jDouble.asDouble()));
        }
    }
    jToken["extra"]["d"] = Limits::quiet_NaN();
    EXPECT_EQ(0, m_db.tokenUpdate(jToken));
    EXPECT_TRUE(std::isnan(stored()["extra"]["d"].asDouble()));
}

TEST_F(SaveRoundTrip, KeepsNumberFields)
{
    for (const char* szField : {"uid", "deadline", "count", "create_time"}) {
        for (const Json::Int64 nValue : {Json::Value::minInt64, Json::Int64(-1), Json::Int64(0),
                                         Json::Int64(4294967295LL), Json::Value::maxInt64}) {
            SCOPED_TRACE(std::string(szField) + " " + std::to_string(nValue));
            Json::Value jToken = record();
            jToken[szField] = nValue;
            EXPECT_EQ(0, m_db.tokenUpdate(jToken));
            EXPECT_EQ(jToken, stored());
        }
    }
}

TEST_F(SaveRoundTrip, KeepsTextFields)
{
    for (const std::string& strText :
         Texts{bytesFrom(1), "it's", "''", "\"", "\\", "%q", " ", "x'); DROP TABLE token; --", "größe"}) {
        SCOPED_TRACE(strText);
        Json::Value jToken = record();
        jToken["tid"] = strText;
        jToken["bind_sid"] = strText;
        jToken["function"] = strText;
        EXPECT_EQ(0, m_db.tokenCreate(jToken));
        EXPECT_EQ(jToken, stored(strText));
    }
    EXPECT_EQ(Texts{}, takeLines());
}

TEST_F(SaveRoundTrip, CutsTextFieldsAtNul)
{
    Json::Value jToken = record();
    jToken["tid"] = std::string("a\0b", 3);
    EXPECT_EQ(0, m_db.tokenCreate(jToken));
    EXPECT_EQ(record(), stored());
    EXPECT_EQ((Texts{"1"}), query("SELECT length(CAST(tid AS BLOB)) FROM token"));
}

TEST_F(SaveRoundTrip, DropsMembersThatAreNoFields)
{
    Json::Value jToken = record();
    jToken["more"] = "text";
    jToken["TID"] = 1;
    jToken["sort_by"] = "tid";
    const Json::Value jBefore = jToken;
    EXPECT_EQ(0, m_db.tokenCreate(jToken));
    EXPECT_EQ(jBefore, jToken);
    EXPECT_EQ(record(), stored());
}

} // namespace
