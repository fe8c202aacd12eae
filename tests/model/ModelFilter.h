// What filters select, oddities included.

#ifndef TESTS_MODEL_FILTER_H
#define TESTS_MODEL_FILTER_H

#include <algorithm>
#include <cctype>
#include <cstdint>
#include <cstdlib>
#include <iomanip>
#include <map>
#include <optional>
#include <sstream>

#include "ModelRow.h"

// The library puts no separator between the numbers of a list: 1 and 2 become 12. A negative number is
// subtracted: 3 and -2 become 1. Returns nothing for other texts.
inline std::optional<std::string> valueOf(const std::string& strText)
{
    long double sum = 0; // holds every 64-bit integer exactly
    std::istringstream parts(strText);
    std::string strPart;
    for (int nSign = 1; std::getline(parts, strPart, '-'); nSign = -1) {
        char* szRest = strPart.data();
        sum += nSign * ("true" == strPart ? 1 : strtold(szRest, &szRest));
        if (*szRest && "true" != strPart && "false" != strPart) {
            return std::nullopt;
        }
    }
    std::ostringstream value;
    value << std::setprecision(20) << sum;
    return strText.empty() ? std::nullopt : std::optional(value.str());
}

inline bool isName(const std::string& strText)
{
    const auto isPart = [](unsigned char c) { return '_' == c || 0 != isalnum(c); };
    return !strText.empty() && 0 == isdigit(static_cast<unsigned char>(strText[0])) &&
           std::all_of(strText.begin(), strText.end(), isPart);
}

// SQL gets the part of a text before its first NUL.
inline std::string textOf(Kind kind, const Json::Value& jValue)
{
    return Kind::Json == kind ? jsonText(jValue) : jValue.asString().c_str();
}

// The library puts no separator between the elements of a list. Texts are quoted, so two quotes meet, which
// mean one quote in the text.
inline std::string listText(Kind kind, const Json::Value& jList)
{
    std::string strText;
    for (Json::ArrayIndex i = 0; i < jList.size(); ++i) {
        strText += (0 < i && Kind::Number != kind ? "'" : "") + textOf(kind, jList[i]);
    }
    return strText;
}

// The keyword from a position on; only 32 bits of the position count.
inline std::string tail(const std::string& strKeyword, Json::Int64 nNumber)
{
    return strKeyword.substr(std::min<size_t>(static_cast<uint32_t>(nNumber), strKeyword.size()));
}

// The conditions of a filter: those members that name fields.
struct Where {
    explicit Where(const Json::Value& jFilter)
    {
        for (const std::string& strName : jFilter.getMemberNames()) {
            const size_t nField = fieldNumber(strName);
            if (FIELDS.size() == nField) {
                continue;
            }
            blEmpty = false;
            if (jFilter[strName].isObject()) {
                blRefused = true;
                return;
            }
            add(nField, jFilter[strName]);
        }
        blBroken = blBroken || (m_blUnknownName && !m_blNever);
    }

    bool matches(const Row& row) const
    {
        return !m_blNever && std::all_of(m_expected.begin(), m_expected.end(), [&](const auto& expected) {
            return row.columns[expected.first] == expected.second;
        });
    }

    bool blRefused = false; // a field was given an object
    bool blBroken = false;  // no valid SQL
    bool blEmpty = true;    // no field was named

private:
    void add(size_t nField, const Json::Value& jValue)
    {
        const Kind kind = FIELDS[nField].kind;
        const bool blList = jValue.isArray();
        const std::string strText = blList ? listText(kind, jValue) : textOf(kind, jValue);
        if (blList && jValue.empty()) {
            blBroken = true;
        } else if (Kind::Number != kind) {
            m_expected[nField] = strText;
        } else if (const std::optional<std::string> strValue = valueOf(strText)) {
            m_expected[nField] = *strValue;
        } else if (isName(strText)) {
            m_blUnknownName = true;
        } else if (blList && strText.empty()) {
            m_blNever = true;
        } else {
            blBroken = true;
        }
    }

    std::map<size_t, std::string> m_expected; // the columns of a row that matches, by their numbers
    bool m_blUnknownName = false;             // of a column
    bool m_blNever = false; // SQLite notices that at once, and then does not look for the column
};

// Whether ordering and paging make the query invalid. They have no other effect.
inline bool isSpoiledByPaging(const Json::Value& jFilter, bool blWithoutFields)
{
    bool blSorted = false;
    std::string strTail;
    if (jFilter.isMember("sort_by")) {
        static_cast<void>(jFilter["sort_by"].asCString()); // throws unless it is a string
        static_cast<void>(jFilter["sort_direction"].asString());
        blSorted = true;
    }
    if (jFilter.isMember("limit")) {
        strTail = tail(" LIMIT ", jFilter["limit"].asInt64());
        strTail += jFilter.isMember("offset") ? tail(" OFFSET ", jFilter["offset"].asInt64()) : "";
    }
    // A part of a keyword is not valid SQL; nor is "WHERE" without a condition.
    return std::string::npos != strTail.find_first_not_of(' ') ||
           (blWithoutFields && (blSorted || !strTail.empty()));
}

#endif
