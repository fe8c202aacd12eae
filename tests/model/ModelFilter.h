// What filters select, oddities included.

#ifndef TESTS_MODEL_FILTER_H
#define TESTS_MODEL_FILTER_H

#include <algorithm>
#include <cctype>
#include <cstdint>
#include <functional>
#include <optional>

#include "ModelRow.h"

typedef std::function<bool(const Row&)> Condition;

// A text for a number field that contains SQL. It ends the conditions so far and adds an alternative that
// always holds; later conditions belong to that alternative.
const char* const TEXT_OR_TRUE = "0 or 1=1";

inline bool never(const Row&)
{
    return false;
}

inline Condition textIs(size_t nField, const std::string& strText)
{
    return [=](const Row& row) { return row.columns[nField] == strText; };
}

inline Json::Int64 number(const Row& row, size_t nField)
{
    return row.jRecord[FIELDS[nField].szName].asInt64();
}

// A long double holds every 64-bit integer exactly.
inline Condition numberIs(size_t nField, long double number64)
{
    return [=](const Row& row) { return static_cast<long double>(number(row, nField)) == number64; };
}

// Removes "12", "2.5" or "true" from the beginning of a text.
inline std::optional<long double> takeNumber(std::string& strText)
{
    long double number64 = 0;
    size_t cch = 0;
    if (0 == strText.compare(0, 4, "true")) {
        number64 = 1;
        cch = 4;
    } else if (0 == strText.compare(0, 5, "false")) {
        cch = 5;
    } else if (!strText.empty() && isdigit(static_cast<unsigned char>(strText[0]))) {
        number64 = std::stold(strText, &cch);
    } else {
        return std::nullopt;
    }
    strText.erase(0, cch);
    return number64;
}

// The library puts no separator between the numbers of a list: 1 and 2 become 12. A negative number is
// subtracted: 3 and -2 become 1. Returns nothing if the text is not valid SQL.
inline std::optional<long double> valueOf(std::string strText)
{
    long double sum = 0;
    do {
        const bool blMinus = 0 == strText.compare(0, 1, "-");
        strText.erase(0, blMinus ? 1 : 0);
        const std::optional<long double> next = takeNumber(strText);
        if (!next) {
            return std::nullopt;
        }
        sum += blMinus ? -*next : *next;
    } while (0 == strText.compare(0, 1, "-"));
    return strText.empty() ? std::optional<long double>(sum) : std::nullopt;
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
        for (const Alternative& alternative : m_alternatives) {
            blBroken = blBroken || (alternative.blUnknownName && !alternative.blNever);
        }
    }

    bool matches(const Row& row) const
    {
        return std::any_of(m_alternatives.begin(), m_alternatives.end(), [&](const Alternative& alternative) {
            return std::all_of(alternative.conditions.begin(), alternative.conditions.end(),
                               [&](const Condition& condition) { return condition(row); });
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
        } else if (Kind::Number == kind) {
            addNumber(nField, strText, blList);
        } else {
            addCondition(textIs(nField, strText));
        }
    }

    // The text becomes part of the statement without quotes, so it may contain SQL.
    void addNumber(size_t nField, const std::string& strText, bool blList)
    {
        const size_t nOther = fieldNumber(strText);
        if (strText == TEXT_OR_TRUE) {
            addCondition(numberIs(nField, blList ? 1 : 0));
            if (!blList) {
                m_alternatives.emplace_back();
            }
        } else if (nOther < FIELDS.size()) {
            addCondition([=](const Row& row) { return number(row, nField) == number(row, nOther); });
        } else if ("null" == strText || "'" == strText) {
            addCondition(&never); // a quote is doubled, and becomes an empty text
        } else if (blList && strText.empty()) {
            addCondition(&never);
            m_alternatives.back().blNever = true;
        } else if (const std::optional<long double> value = valueOf(strText)) {
            addCondition(numberIs(nField, *value));
        } else if (isName(strText)) {
            addCondition(&never);
            m_alternatives.back().blUnknownName = true;
        } else {
            blBroken = true;
        }
    }

    void addCondition(const Condition& condition) { m_alternatives.back().conditions.push_back(condition); }

    // Holds when all its conditions do.
    struct Alternative {
        std::vector<Condition> conditions;
        bool blUnknownName = false; // of a column
        bool blNever = false;       // SQLite notices that at once, and then does not look for the column
    };
    std::vector<Alternative> m_alternatives = {{}}; // one of these must hold
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
