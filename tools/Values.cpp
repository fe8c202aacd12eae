#include "Values.h"

#include <pwd.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <cstdio>
#include <cstring>
#include <ctime>
#include <map>
#include <memory>

#include "AccessTokenDefine.h"
#include "Failure.h"
#include "InputFile.h"
#include "Json.h"
#include "Masking.h"

namespace {

const int64_t MINUTE = 60;
const int64_t HOUR = 60 * MINUTE;
const int64_t DAY = 24 * HOUR;
const int64_t WEEK = 7 * DAY;
const size_t KNOWN_MAX = 10000;            // users whose names are remembered
const int64_t DURATION_MAX = 365250 * DAY; // a thousand years

int64_t secondsOf(char cUnit)
{
    switch (cUnit) {
    case 's': return 1;
    case 'm': return MINUTE;
    case 'h': return HOUR;
    case 'd': return DAY;
    case 'w': return WEEK;
    default: return 0;
    }
}

std::string count(int64_t nSeconds)
{
    if (nSeconds < MINUTE) {
        return std::to_string(nSeconds) + " s";
    }
    if (nSeconds < HOUR) {
        return std::to_string(nSeconds / MINUTE) + " min";
    }
    if (nSeconds < 2 * DAY) {
        return std::to_string(nSeconds / HOUR) + " h";
    }
    return std::to_string(nSeconds / DAY) + " d";
}

// Whether a result of getpwnam_r() means that there is no such user. Some user databases return ENOENT or
// ESRCH for that, not success without an entry. The other errors that the manual allows for it (EBADF, EPERM)
// are more often real failures.
bool isNotFound(int nError)
{
    return 0 == nError || ENOENT == nError || ESRCH == nError;
}

struct User {
    std::string strName;
    uid_t uid;
};

// Looks up a user, with a buffer that is as large as needed. Throws Failure if the user database fails.
template <typename Lookup>
std::optional<User> lookUp(const std::string& strWho, Lookup lookup)
{
    std::vector<char> buffer;
    struct passwd entry = {};
    struct passwd* pFound = nullptr;
    for (;;) {
        buffer.resize(buffer.size() + 1024);
        const int nError = lookup(&entry, buffer.data(), buffer.size(), &pFound);
        if (pFound) {
            return User{entry.pw_name, entry.pw_uid};
        }
        if (isNotFound(nError)) {
            return std::nullopt;
        }
        if (ERANGE != nError) {
            throw tool::Failure(tool::EXIT_STATUS_STORE,
                                "the " + strWho + " could not be looked up: " + strerror(nError));
        }
    }
}

std::string userOfNumber(Json::Int64 nUid)
{
    return "user of the number " + std::to_string(nUid);
}

// Fails if /etc/passwd has the user, or cannot be read. Where another user database follows that file, the C
// library looks on there, and then only says that it has found nobody.
void requireNotInFile(uid_t uid)
{
    const std::unique_ptr<FILE, int (*)(FILE*)> pFile(fopen("/etc/passwd", "re"), fclose);
    const struct passwd* pEntry = nullptr;
    do {
        pEntry = pFile ? fgetpwent(pFile.get()) : nullptr;
    } while (pEntry && pEntry->pw_uid != uid);
    if (pEntry || !pFile || 0 != ferror(pFile.get())) {
        throw tool::Failure(tool::EXIT_STATUS_STORE,
                            "the " + userOfNumber(uid) + " could not be looked up: /etc/passwd " +
                                (pEntry ? "has it, but the user database does not"
                                        : "cannot be read: " + std::string(strerror(errno))));
    }
}

// Reads the decimal number at the beginning of a text, and moves szText past it. Nothing if there is none.
std::optional<int64_t> readNumber(const char*& szText, const char* szEnd)
{
    int64_t nNumber = 0;
    const auto [szRest, error] = std::from_chars(szText, szEnd, nNumber);
    szText = szRest;
    return std::errc() == error ? std::optional(nNumber) : std::nullopt;
}

[[noreturn]] void failOnDuration(const std::string& strText)
{
    throw tool::BadValue(tool::quoted(strText) + " is not a duration: write 90s, 15m, 8h, 2d12h or 1w");
}

} // namespace

namespace tool {

int64_t parseNumber(const std::string& strText, int64_t nMin, int64_t nMax)
{
    const char* szRest = strText.data();
    const char* szEnd = szRest + strText.size();
    const auto nNumber = readNumber(szRest, szEnd);
    if (!nNumber || szRest != szEnd || *nNumber < nMin || *nNumber > nMax) {
        throw BadValue(quoted(strText) + " is not a number from " + std::to_string(nMin) + " to " +
                       std::to_string(nMax));
    }
    return *nNumber;
}

unsigned int parseUid(const std::string& strText)
{
    return static_cast<unsigned int>(parseNumber(strText, 0, int64_t{UID_ERR} - 1));
}

unsigned int parseUser(const std::string& strName)
{
    const std::string strWho = "user " + quoted(strName);
    const auto found =
        lookUp(strWho, [&strName](auto... arguments) { return getpwnam_r(strName.c_str(), arguments...); });
    if (!found) {
        throw BadValue("there is no " + strWho);
    }
    return found->uid;
}

std::optional<std::string> findUserName(Json::Int64 nUid)
{
    const uid_t uid = static_cast<uid_t>(nUid);
    if (uid != nUid) { // it would become the number of another user
        return std::nullopt;
    }
    const auto found =
        lookUp(userOfNumber(nUid), [uid](auto... arguments) { return getpwuid_r(uid, arguments...); });
    if (!found) {
        requireNotInFile(uid);
        return std::nullopt;
    }
    return found->strName;
}

std::string userName(Json::Int64 nUid)
{
    const auto strName = findUserName(nUid);
    if (!strName) {
        throw Failure(EXIT_STATUS_STORE, "there is no " + userOfNumber(nUid));
    }
    return *strName;
}

std::optional<std::string> userNameIfKnown(Json::Int64 nUid)
{
    static std::map<Json::Int64, std::optional<std::string>> known; // a look-up can use the network
    if (known.size() == KNOWN_MAX) {
        known.clear();
    }
    const auto [pKnown, blNew] = known.try_emplace(nUid);
    if (blNew) {
        try {
            pKnown->second = findUserName(nUid);
        } catch (const Failure&) {
            // The caller shows the number instead.
        }
    }
    return pKnown->second;
}

int64_t parseDuration(const std::string& strText)
{
    // A number without a unit is in seconds.
    const bool blBare = strText.find_first_not_of("0123456789") == std::string::npos;
    const std::string strParts = blBare ? strText + "s" : strText;
    const char* szRest = strParts.data();
    const char* szEnd = szRest + strParts.size();
    int64_t nTotal = 0;
    while (szRest != szEnd) {
        const auto nNumber = readNumber(szRest, szEnd);
        const int64_t nUnit = secondsOf(*szRest); // a NUL at the end
        if (!nNumber || *nNumber < 0 || 0 == nUnit || *nNumber > (DURATION_MAX - nTotal) / nUnit) {
            failOnDuration(strText);
        }
        nTotal += *nNumber * nUnit;
        ++szRest;
    }
    if (0 == nTotal) {
        failOnDuration(strText);
    }
    return nTotal;
}

int64_t parseTime(const std::string& strText)
{
    if (strText[0] == '@') {
        return parseNumber(strText.substr(1), 0, INT64_MAX);
    }
    const bool blUtc = !strText.empty() && 'Z' == strText.back();
    const std::string strTime = strText.substr(0, strText.size() - (blUtc ? 1 : 0));
    // strptime() also takes fewer digits, so that 26-12-31 would be in the year 26, and blanks anywhere. So
    // the shape is checked first.
    std::string strShape = strTime;
    std::replace_if(
        strShape.begin(), strShape.end(), [](char c) { return '0' <= c && c <= '9'; }, '0');
    for (const auto& [szShape, szFormat] : {std::pair("0000-00-00", "%Y-%m-%d"),
                                            {"0000-00-00 00:00", "%Y-%m-%d %H:%M"},
                                            {"0000-00-00T00:00", "%Y-%m-%dT%H:%M"},
                                            {"0000-00-00 00:00:00", "%Y-%m-%d %H:%M:%S"},
                                            {"0000-00-00T00:00:00", "%Y-%m-%dT%H:%M:%S"}}) {
        struct tm tmTime = {};
        const char* szRest = strShape == szShape ? strptime(strTime.c_str(), szFormat, &tmTime) : nullptr;
        if (!szRest || *szRest) {
            continue;
        }
        const struct tm tmAsked = tmTime;
        tmTime.tm_isdst = -1;
        const time_t nTime = blUtc ? timegm(&tmTime) : mktime(&tmTime);
        // mktime() turns 31 June, and an hour that a change of clocks skips, into another time: these are
        // refused. But a day without midnight may begin later.
        const bool blDay = 0 == strcmp(szFormat, "%Y-%m-%d");
        if (tmTime.tm_mday == tmAsked.tm_mday &&
            (blDay || (tmTime.tm_hour == tmAsked.tm_hour && tmTime.tm_min == tmAsked.tm_min))) {
            return nTime;
        }
    }
    throw BadValue(
        quoted(strText) +
        " is not a time: write 2026-12-31, \"2026-12-31 23:59\", 2026-12-31T23:59:59Z or @1798761599");
}

std::string countText(uint64_t nCount, const std::string& strWhat)
{
    return std::to_string(nCount) + " " + strWhat + (1 == nCount ? "" : "s");
}

std::string timeText(Json::Int64 nTime, bool blUtc)
{
    const time_t nSeconds = static_cast<time_t>(nTime);
    struct tm tmTime = {};
    char szText[64];
    if (!(blUtc ? gmtime_r(&nSeconds, &tmTime) : localtime_r(&nSeconds, &tmTime))) {
        return "@" + std::to_string(nTime); // beyond the calendar
    }
    strftime(szText, sizeof(szText), blUtc ? "%Y-%m-%d %H:%M:%SZ" : "%Y-%m-%d %H:%M:%S", &tmTime);
    return szText;
}

std::string relativeText(Json::Int64 nDeadline, int64_t nNow)
{
    int64_t nLeft = 0;
    if (__builtin_sub_overflow(int64_t{nDeadline}, nNow, &nLeft) || nLeft == INT64_MIN) {
        return nDeadline < nNow ? "expired" : "far off";
    }
    return nLeft < 0 ? "expired " + count(-nLeft) + " ago" : "in " + count(nLeft);
}

Allowance parseAllowance(const std::string& strText)
{
    const size_t nColon = strText.find(':');
    Allowance allowance{strText.substr(0, nColon), {}};
    if (allowance.strApi.empty()) {
        throw BadValue(quoted(strText) + " names no API: write API or API:METHOD,METHOD");
    }
    for (size_t nStart = nColon; nStart != std::string::npos;) {
        const size_t nEnd = strText.find(',', nStart + 1);
        const std::string strMethod = strText.substr(nStart + 1, nEnd - nStart - 1);
        if (strMethod.empty()) {
            throw BadValue(quoted(strText) + " has an empty method: write API or API:METHOD,METHOD");
        }
        allowance.strMethods.push_back(strMethod);
        nStart = nEnd;
    }
    return allowance;
}

Json::Value allowanceJson(const std::vector<Allowance>& allowances)
{
    Json::Value jAllow(Json::objectValue);
    for (const Allowance& allowance : allowances) {
        Json::Value& jMethods = jAllow[allowance.strApi]["method"];
        if (jMethods.isNull()) {
            jMethods = Json::Value(Json::arrayValue);
        }
        for (const std::string& strMethod : allowance.strMethods) {
            if (std::find(jMethods.begin(), jMethods.end(), Json::Value(strMethod)) == jMethods.end()) {
                jMethods.append(strMethod);
            }
        }
    }
    return jAllow;
}

Json::Value parseExtra(const std::string& strText)
{
    if (strText[0] != '@') {
        return parseObject(strText);
    }
    const std::string strFile = strText.substr(1);
    if (strFile.empty()) {
        throw BadValue("\"@\" names no file");
    }
    InputFile file(strFile);
    std::string strContent;
    try {
        std::getline(file, strContent, '\0');
    } catch (const std::ios_base::failure&) {
        throw BadValue(shownPath(strFile) + ": " + strerror(errno));
    }
    if (!file.eof()) {
        throw BadValue(shownPath(strFile) + " holds a NUL byte");
    }
    return parseObject(strContent);
}

} // namespace tool
