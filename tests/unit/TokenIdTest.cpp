// Generated token ids, and times as text.

#include <climits>

#include "AccessTokenUtil.h"
#include "StoreTest.h"

using VEMO_ACCESS_TOKEN::getTimeAfterNow;
using VEMO_ACCESS_TOKEN::tokenGenerate;

namespace {

class TokenId : public SeamTest {};

// Eight bytes, the least significant first, choose the length; then each byte chooses one of 62 characters.
// The 8 greatest values of a byte would favour the first characters; they are skipped.
TEST_F(TokenId, TakesCharactersInTheOrderOfTheAlphabet)
{
    const std::string strAlphabet = "0987654321abcdefghijklmnopqrstuvwxyzABCDEFGHIJKLMNOPQRSTUVWXYZ";
    // nLength of 129; the bytes that follow start at nFirst and count up.
    const auto generates = [](unsigned char nLength, unsigned char nFirst, const std::string& strExpected) {
        SCOPED_TRACE(strExpected);
        seam().calls.clear();
        seam().random = [=, nByte = nFirst](void* pBuffer, size_t cbBuffer, unsigned int) mutable {
            unsigned char* const pBytes = static_cast<unsigned char*>(pBuffer);
            const bool blLength = 1 == seam().calls.size();
            for (size_t i = 0; i < cbBuffer; ++i) {
                pBytes[i] = blLength ? (0 == i ? nLength : 0) : nByte++;
            }
            return static_cast<ssize_t>(cbBuffer);
        };
        std::string strTid;
        EXPECT_LE(0, tokenGenerate(strTid));
        EXPECT_EQ(strExpected, strTid);
    };
    generates(0, 0, strAlphabet + strAlphabet + "098");
    generates(61, 0, strAlphabet + strAlphabet + strAlphabet + "09");
    generates(128, 0, strAlphabet + strAlphabet + strAlphabet + strAlphabet + "0987654");
    generates(129, 0, strAlphabet + strAlphabet + "098");
    generates(0, 61, "Z" + strAlphabet + strAlphabet + "09");
    generates(0, 246, "YZ" + strAlphabet + strAlphabet + "0");
}

class TimeAfterNow : public SeamTest {};

TEST_F(TimeAfterNow, IsANumberOrADateInUtc)
{
    // The time zone of the process does not matter.
    setenv("TZ", "XXX-05:30", 1);
    tzset();
    const time_t noon = 1767355200;
    const struct {
        time_t now;
        int nOffset;
        const char* szText;
    } rows[] = {
        {noon, 3600, "Fri, 02 Jan 2026 13:00:00 GMT"},    {noon, 0, "Fri, 02 Jan 2026 12:00:00 GMT"},
        {noon, -129600, "Thu, 01 Jan 2026 00:00:00 GMT"}, {noon, -129601, "Wed, 31 Dec 2025 23:59:59 GMT"},
        {noon, INT_MAX, "Wed, 20 Jan 2094 15:14:07 GMT"}, {noon, INT_MIN, "Sun, 15 Dec 1957 08:45:52 GMT"},
        {951782399, 1, "Tue, 29 Feb 2000 00:00:00 GMT"},  {INT_MAX, 1, "Tue, 19 Jan 2038 03:14:08 GMT"},
        {0, 0, "Thu, 01 Jan 1970 00:00:00 GMT"},          {0, -1, "Wed, 31 Dec 1969 23:59:59 GMT"},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(row.szText);
        seam().calls.clear();
        seam().clock = row.now;
        long nTime = 7;
        std::string strTime = "replaced";
        EXPECT_EQ(0, getTimeAfterNow(row.nOffset, nTime));
        EXPECT_EQ(0, getTimeAfterNow(row.nOffset, strTime));
        EXPECT_EQ(static_cast<long>(row.now) + row.nOffset, nTime);
        EXPECT_EQ(row.szText, strTime);
        EXPECT_EQ((Texts{"time", "time"}), seam().calls);
    }
}

} // namespace
