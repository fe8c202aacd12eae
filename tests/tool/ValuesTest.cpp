#include "tools/Values.h"

#include <gtest/gtest.h>

#include <sstream>
#include <tuple>

#include "Seam.h"
#include "tools/Failure.h"

using tool::parseDuration;
using tool::parseTime;
using tool::relativeText;

namespace {

const int64_t MINUTE = 60;
const int64_t HOUR = 60 * MINUTE;
const int64_t DAY = 24 * HOUR;

// The message of a reader that refuses a text.
template <typename Read>
std::string refusal(Read read, const std::string& strText)
{
    try {
        return "read as " + std::to_string(read(strText));
    } catch (const tool::BadValue& bad) {
        return bad.what();
    }
}

// The parts of a text, which are separated by bars.
std::vector<std::string> split(const std::string& strText)
{
    std::istringstream stream(strText);
    std::vector<std::string> strParts;
    for (std::string strPart; std::getline(stream, strPart, '|');) {
        strParts.push_back(strPart);
    }
    return strParts;
}

void setZone(const char* szZone)
{
    setenv("TZ", szZone, 1);
    tzset();
}

} // namespace

TEST(Users, AreLookedUpOnceInAList)
{
    for (const char* szTime : {"first", "second"}) {
        EXPECT_EQ("root", tool::userNameIfKnown(0)) << szTime;
        EXPECT_EQ(std::nullopt, tool::userNameIfKnown(4000000000)) << szTime;
    }
    EXPECT_EQ((std::vector<std::string>{"getpwuid_r 0", "getpwuid_r 4000000000"}),
              seam().callsOf({"getpwuid_r"}));
}

TEST(Users, AreNotLookedUpByImpossibleNumbers)
{
    for (const int64_t nUid : {int64_t{-1}, int64_t{-4294967296}, int64_t{4294967296}}) {
        EXPECT_THROW(tool::userName(nUid), tool::Failure);
    }
    EXPECT_EQ(std::vector<std::string>(), seam().callsOf({"getpwuid_r"}));
}

TEST(Durations, AreANumberOfSecondsOrNumbersWithUnits)
{
    const std::pair<const char*, int64_t> CASES[] = {
        {"1", 1},
        {"45s", 45},
        {"1w1d1h1m1s", 8 * DAY + HOUR + MINUTE + 1},
        {"0h1s", 1},
        {"52178w", 365246 * DAY},
        {"365250d", 365250 * DAY},
        {"365249d24h", 365250 * DAY},
        {"31557600000", 365250 * DAY},
    };
    for (const auto& [szText, nSeconds] : CASES) {
        EXPECT_EQ(nSeconds, parseDuration(szText)) << szText;
    }
}

TEST(Durations, AreFromASecondToAThousandYears)
{
    for (const std::string& strText :
         split("0|0s|00||h|1x|1H|1y|1.5h|-1m|1h-1m|+5m| 5m|5 m|5m,|1h30|1hh|1h99999999999999999999w|P1D|"
               "365251d|52179w|31557600001|365250d1s|9223372036854775807|9223372036854775808s|"
               "9223372036854775807w|99999999999999999999w")) {
        EXPECT_EQ("\"" + strText + "\" is not a duration: write 90s, 15m, 8h, 2d12h or 1w",
                  refusal(parseDuration, strText));
    }
}

TEST(Times, AreLocalOrUtcOrSeconds)
{
    const std::tuple<const char*, const char*, int64_t> CASES[] = {
        {"Europe/Berlin", "2060-02-29", 2845234800},
        {"Europe/Berlin", "2060-02-29Z", 2845238400},
        {"Europe/Berlin", "2060-06-30 12:34", 2855817240},
        {"Europe/Berlin", "2060-06-30 12:34:56", 2855817296},
        {"Europe/Berlin", "2060-06-30T12:34", 2855817240},
        {"Europe/Berlin", "2060-06-30T12:34:56", 2855817296},
        {"Europe/Berlin", "2060-06-30T12:34:56Z", 2855824496},
        {"Europe/Berlin", "9999-12-31 23:59:59Z", 253402300799},
        {"Europe/Berlin", "@9223372036854775807", INT64_MAX},
        {"America/New_York", "2060-01-01", 2840158800},
        // The clocks go from 2 to 3 o'clock on 28 March and from 3 to 2 on 31 October.
        {"Europe/Berlin", "2060-03-28 03:00", 2847661200},
        {"Europe/Berlin", "2060-03-28 02:30Z", 2847666600},
        {"Europe/Berlin", "2060-10-31 01:59:59", 2866406399},
        {"Africa/Cairo", "2060-04-30", 2850501600}, // a day that begins at 1 o'clock
    };
    for (const auto& [szZone, szText, nTime] : CASES) {
        setZone(szZone);
        EXPECT_EQ(nTime, parseTime(szText)) << szText;
    }
    setZone("Europe/Berlin");
    const int64_t nTwice = parseTime("2060-10-31 02:30");
    EXPECT_TRUE(2866408200 == nTwice || 2866411800 == nTwice) << nTwice;
}

TEST(Times, ThatDoNotExistAreRefused)
{
    const auto sentence = [](const std::string& strText) {
        return "\"" + strText +
               "\" is not a time: write 2026-12-31, \"2026-12-31 23:59\", 2026-12-31T23:59:59Z or "
               "@1798761599";
    };
    setZone("Europe/Berlin");
    for (const std::string& strText :
         split("|Z|tomorrow|2061-02-29|2060-06-31|2060-00-10|2060-13-01|2060-01-00|2060-01|10000-01-01|"
               "2060-01-01 |2060-01-01 12|2060-01-01 24:00|2060-01-01 12:60|2060-01-01 12:00:60|"
               "2060-01-01 12:00:61|2060-01-01 23:59:60|2060-01-01T12:00:00z|2060-01-01ZZ|"
               "2060-01-01T12:00:00+01:00|2060-01-01 12:00:00.5|01.01.2060|2060-03-28 02:00|"
               "2060-03-28 02:30|2060-03-28T02:59:59|31-12-60|2060-1-1|2060- 1- 1| 2060-01-01|"
               "2060-01-0112:00|2060-01-01  12:00|2060-01-01\n12:00")) {
        EXPECT_EQ(sentence(strText), refusal(parseTime, strText));
    }
    setZone("Australia/Lord_Howe"); // its clocks change by half an hour
    EXPECT_EQ(sentence("2060-10-03 02:15"), refusal(parseTime, "2060-10-03 02:15"));
    for (const std::string& strSeconds : split("|-1| 1|1x|1.5|9223372036854775808|4000000000Z")) {
        EXPECT_EQ("\"" + strSeconds + "\" is not a number from 0 to 9223372036854775807",
                  refusal(parseTime, "@" + strSeconds));
    }
}

TEST(RelativeText, HasOneUnit)
{
    const std::pair<int64_t, const char*> CASES[] = {
        {0, "in 0 s"},           {MINUTE - 1, "in 59 s"}, {MINUTE, "in 1 min"},
        {HOUR - 1, "in 59 min"}, {HOUR, "in 1 h"},        {2 * DAY - 1, "in 47 h"},
        {2 * DAY, "in 2 d"},     {-1, "expired 1 s ago"}, {-2 * DAY, "expired 2 d ago"},
    };
    const int64_t nNow = 1767225600;
    for (const auto& [nLeft, szText] : CASES) {
        EXPECT_EQ(szText, relativeText(nNow + nLeft, nNow)) << nLeft;
    }
    // Times that are too far away to be counted, and times just within the limit.
    EXPECT_EQ("far off", relativeText(INT64_MAX, -1));
    EXPECT_EQ("in 106751991167300 d", relativeText(INT64_MAX, 0));
    EXPECT_EQ("expired 106751991167300 d ago", relativeText(INT64_MIN + 1, 0));
    EXPECT_EQ("expired", relativeText(INT64_MIN, 0));
    EXPECT_EQ("expired", relativeText(INT64_MIN, 1));
}
