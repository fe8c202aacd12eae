// Defaults, token ids and times.

#include <climits>
#include <ctime>
#include <set>

#include "AccessTokenUtil.h"
#include "StandIns.h"
#include "StoreTest.h"

using VEMO_ACCESS_TOKEN::debugInfo;
using VEMO_ACCESS_TOKEN::fillDefaultValue;
using VEMO_ACCESS_TOKEN::getTimeAfterNow;
using VEMO_ACCESS_TOKEN::tokenGenerate;

namespace {

const time_t NOW = 1767355200; // Fri, 02 Jan 2026 12:00:00 GMT

Json::Value defaults()
{
    Json::Value jToken = json(R"({"tid":"INVALID_TOKEN_ID","bind_sid":"","deadline":-1,"count":1,
                                  "create_time":1767355200,"function":"VEMO_ACCESS_TOKEN",
                                  "webapi_allow":{},"extra":{}})");
    jToken["uid"] = 4294967295U;
    return jToken;
}

class Defaults : public SeamTest {
protected:
    void SetUp() override
    {
        SeamTest::SetUp();
        seam().clock = NOW;
    }
};

TEST_F(Defaults, CompleteAnEmptyRecord)
{
    for (const Json::ValueType type : {Json::objectValue, Json::nullValue}) {
        SCOPED_TRACE(type);
        Json::Value jToken(type);

        EXPECT_EQ(0, fillDefaultValue(jToken, false));

        EXPECT_EQ(defaults(), jToken);
        EXPECT_EQ(Json::uintValue, jToken["uid"].type());
        EXPECT_EQ(Json::intValue, jToken["create_time"].type());
    }
    EXPECT_EQ(Texts{}, takeLines());
}

TEST_F(Defaults, CompleteRecordPassesTheCheck)
{
    Json::Value jToken = defaults();

    EXPECT_EQ(0, fillDefaultValue(jToken, true));

    EXPECT_EQ(defaults(), jToken);
    EXPECT_EQ(Texts{}, takeLines());
    EXPECT_EQ(Texts{}, seam().callsOf({"time"}));
}

TEST_F(Defaults, CheckReportsTheFirstMissingFieldAndAddsNothing)
{
    const struct {
        std::vector<const char*> missing;
        int nLine;
        const char* szName;
    } rows[] = {
        {{"extra"}, 22, "extra"},
        {{"create_time"}, 14, "create_time"},
        {{"function", "extra", "webapi_allow"}, 16, "function"},
        {{"uid", "tid"}, 2, "tid"},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(row.szName);
        Json::Value jToken = defaults();
        for (const char* szMissing : row.missing) {
            jToken.removeMember(szMissing);
        }
        const Json::Value jBefore = jToken;

        EXPECT_EQ(-1, fillDefaultValue(jToken, true));

        EXPECT_EQ(jBefore, jToken);
        EXPECT_EQ((Texts{ordinary(fieldList(row.nLine), std::string("lost data member=") + row.szName)}),
                  takeLines());
    }
    EXPECT_EQ(Texts{}, seam().callsOf({"time"}));
}

TEST_F(Defaults, CheckOfAnEmptyRecordMissesTheId)
{
    for (const Json::ValueType type : {Json::objectValue, Json::nullValue}) {
        SCOPED_TRACE(type);
        Json::Value jToken(type);

        EXPECT_EQ(-1, fillDefaultValue(jToken, true));

        EXPECT_EQ(Json::Value(type), jToken);
        EXPECT_EQ((Texts{ordinary(fieldList(2), "lost data member=tid")}), takeLines());
    }
}

TEST_F(Defaults, PresentMembersStayAsTheyAre)
{
    const Json::Value jGiven =
        json(R"({"count":"5","tid":null,"uid":-1,"extra":[1],"create_time":{},"function":false,"note":7})");
    Json::Value jToken = jGiven;
    Json::Value jExpected = defaults();
    for (const std::string& strName : jGiven.getMemberNames()) {
        jExpected[strName] = jGiven[strName];
    }

    EXPECT_EQ(0, fillDefaultValue(jToken, false));
    EXPECT_EQ(jExpected, jToken);
    EXPECT_EQ(0, fillDefaultValue(jToken, true));
    EXPECT_EQ(jExpected, jToken);
    EXPECT_EQ(Texts{}, seam().callsOf({"time"}));
}

TEST_F(Defaults, ClockIsReadForEachRecord)
{
    Json::Value jFirst;
    Json::Value jSecond;

    fillDefaultValue(jFirst, false);
    seam().clock = NOW + 5;
    fillDefaultValue(jSecond, false);

    EXPECT_EQ(Json::Value(1767355200), jFirst["create_time"]);
    EXPECT_EQ(Json::Value(1767355205), jSecond["create_time"]);
    EXPECT_EQ((Texts{"time", "time"}), seam().calls);
}

TEST_F(Defaults, ClockMayPass32Bits)
{
    seam().clock = 4294967296;
    Json::Value jToken;

    EXPECT_EQ(0, fillDefaultValue(jToken, false));

    EXPECT_EQ(Json::Value(Json::Int64(4294967296)), jToken["create_time"]);
}

TEST_F(Defaults, WhatIsNoRecordThrows)
{
    for (const char* szRecord : {"[]", "5", "\"\""}) {
        SCOPED_TRACE(szRecord);
        Json::Value jToken = json(szRecord);
        EXPECT_THROW(fillDefaultValue(jToken, false), Json::LogicError);
        EXPECT_THROW(fillDefaultValue(jToken, true), Json::LogicError);
        EXPECT_EQ(json(szRecord), jToken);
    }
}

class TokenId : public SeamTest {};

// With so many ids, a length or character that can occur and yet does not is no chance: for a length
// it is about one in 10^20.
TEST_F(TokenId, HasEveryLengthFrom127To255AndEveryLetterAndDigit)
{
    const int nIds = 6000;
    std::set<std::string> ids;
    std::set<size_t> lengths;
    std::set<char> letters;
    for (int i = 0; i < nIds; ++i) {
        std::string strTid;
        ASSERT_LE(0, tokenGenerate(strTid));
        ids.insert(strTid);
        lengths.insert(strTid.size());
        letters.insert(strTid.begin(), strTid.end());
    }

    EXPECT_EQ(static_cast<size_t>(nIds), ids.size());
    EXPECT_EQ(255u - 127u + 1u, lengths.size());
    EXPECT_EQ(127u, *lengths.begin());
    EXPECT_EQ(255u, *lengths.rbegin());
    EXPECT_EQ("0123456789ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz",
              std::string(letters.begin(), letters.end()));
    EXPECT_EQ(Texts{}, takeLines());
}

// Eight bytes, least significant first, choose the length; then each byte chooses a character, 62
// different ones in turn. The last 8 of the 256 bytes would favour the first characters and are passed
// over.
TEST_F(TokenId, TakesCharactersInTheOrderOfTheAlphabet)
{
    const std::string strAlphabet = "0987654321abcdefghijklmnopqrstuvwxyzABCDEFGHIJKLMNOPQRSTUVWXYZ";
    const struct {
        unsigned char nLength; // of 129
        unsigned char nFirst;  // of the bytes that follow, each one greater than the one before it
        std::string strTid;
    } rows[] = {
        {0, 0, strAlphabet + strAlphabet + "098"},
        {61, 0, strAlphabet + strAlphabet + strAlphabet + "09"},
        {128, 0, strAlphabet + strAlphabet + strAlphabet + strAlphabet + "0987654"},
        {0, 61, "Z" + strAlphabet + strAlphabet + "09"},
        {0, 246, "YZ" + strAlphabet + strAlphabet + "0"},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(row.strTid);
        seam().calls.clear();
        seam().random = [&row, nByte = row.nFirst](void* pBuffer, size_t cbBuffer, unsigned int) mutable {
            unsigned char* const pBytes = static_cast<unsigned char*>(pBuffer);
            const bool blLength = 1 == seam().calls.size();
            for (size_t i = 0; i < cbBuffer; ++i) {
                pBytes[i] = blLength ? (0 == i ? row.nLength : 0) : nByte++;
            }
            return static_cast<ssize_t>(cbBuffer);
        };
        std::string strTid;

        EXPECT_LE(0, tokenGenerate(strTid));

        EXPECT_EQ(row.strTid, strTid);
    }
}

TEST_F(TokenId, ReplacesTheCallersText)
{
    std::string strTid(1000, '#');

    EXPECT_LE(0, tokenGenerate(strTid));

    EXPECT_GE(255u, strTid.size());
    EXPECT_EQ(std::string::npos, strTid.find('#'));
}

TEST_F(TokenId, FailsWithTheRandomSource)
{
    const struct {
        const char* szCall;
        int nCall;
    } rows[] = {{"the length", 1}, {"the characters", 2}};
    for (const auto& row : rows) {
        SCOPED_TRACE(row.szCall);
        seam() = Seam();
        seam().fail("getrandom", ENOSYS, row.nCall, INT_MAX);
        debugInfo(true);
        std::string strTid = "before";

        EXPECT_GT(0, tokenGenerate(strTid));

        EXPECT_EQ(ENOSYS, errno);
        EXPECT_EQ("before", strTid);
        EXPECT_EQ(static_cast<size_t>(row.nCall), seam().calls.size());
        EXPECT_EQ(Texts{}, takeLines());
    }
}

TEST_F(TokenId, InterruptedRandomSourceIsAskedAgain)
{
    seam().fail("getrandom", EINTR, 1, 3);
    std::string strTid;

    EXPECT_LE(0, tokenGenerate(strTid));

    EXPECT_LE(127u, strTid.size());
}

class TimeAfterNow : public Defaults {};

TEST_F(TimeAfterNow, AddsTheOffset)
{
    for (const int nOffset : {0, 1, 3600, -1, -3600, 86400, INT_MAX, INT_MIN}) {
        SCOPED_TRACE(nOffset);
        seam().calls.clear();
        long nNow = 7;

        EXPECT_EQ(0, getTimeAfterNow(nOffset, nNow));

        EXPECT_EQ(static_cast<long>(NOW) + nOffset, nNow);
        EXPECT_EQ((Texts{"time"}), seam().calls);
    }
}

TEST_F(TimeAfterNow, IsToldAsDateOfTheInternet)
{
    // The text is in UTC, wherever the process lives.
    setenv("TZ", "XXX-05:30", 1);
    tzset();
    const struct {
        time_t now;
        int nOffset;
        const char* szText;
    } rows[] = {
        {NOW, 3600, "Fri, 02 Jan 2026 13:00:00 GMT"},    {NOW, 0, "Fri, 02 Jan 2026 12:00:00 GMT"},
        {NOW, -129600, "Thu, 01 Jan 2026 00:00:00 GMT"}, {NOW, -129601, "Wed, 31 Dec 2025 23:59:59 GMT"},
        {NOW, INT_MAX, "Wed, 20 Jan 2094 15:14:07 GMT"}, {NOW, INT_MIN, "Sun, 15 Dec 1957 08:45:52 GMT"},
        {951782399, 1, "Tue, 29 Feb 2000 00:00:00 GMT"}, {INT_MAX, 1, "Tue, 19 Jan 2038 03:14:08 GMT"},
        {0, 0, "Thu, 01 Jan 1970 00:00:00 GMT"},         {0, -1, "Wed, 31 Dec 1969 23:59:59 GMT"},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(row.szText);
        seam().clock = row.now;
        std::string strTime = "replaced";

        EXPECT_EQ(0, getTimeAfterNow(row.nOffset, strTime));

        EXPECT_EQ(row.szText, strTime);
    }
    EXPECT_EQ(Texts{}, takeLines());
}

TEST_F(TimeAfterNow, TextFailsWithTheTime)
{
    std::string strTime;
    EXPECT_EQ(0, getTimeAfterNow(3600, strTime));
    standIns().getTimeAfterNow = [](int, long&) { return -1; };
    errno = EACCES;
    strTime = "before";

    EXPECT_EQ(-1, getTimeAfterNow(3600, strTime));

    EXPECT_EQ("before", strTime);
    EXPECT_EQ((Texts{failed(UTIL, "0 > getTimeAfterNow(offsetSecond, now)", EACCES)}), takeLines());
}

} // namespace
