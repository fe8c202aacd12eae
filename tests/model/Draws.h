// Draws the arguments of operations at random: from a few values, so that calls meet, or from odd ones.

#ifndef TESTS_DRAWS_H
#define TESTS_DRAWS_H

#include <cstdint>
#include <functional>
#include <map>
#include <optional>
#include <random>
#include <string>
#include <vector>

#include "Model.h"
#include "TokenStore.h"

namespace {

const Json::UInt USER_SIZE = 16;

std::string withNul(const std::string& strHead, const std::string& strTail)
{
    return strHead + '\0' + strTail;
}

template <typename... Values>
Json::Value list(const Values&... values)
{
    Json::Value jList(Json::arrayValue);
    (jList.append(values), ...);
    return jList;
}

// Ids, long enough or not. Two are equal up to a NUL, and one is what two others become in a list.
const Json::Value g_jTid =
    list(idOf("a"), idOf("b"), idOf("c"), idOf("d"), idOf("e"), idOf("it's"), idOf("\xff\xfe\xc3"),
         idOf("'; DROP TABLE token; --"), idOf("a") + "'" + idOf("b"), std::string(6000, 'l'),
         withNul(idOf("a"), "tail"), withNul("short", idOf("")), withNul("", idOf("")), "short",
         std::string(TID_MIN - 1, 'x'), "");

const Json::Value g_jSession =
    list("", "s1", "s2", "s1's2", withNul("", "hidden"), withNul("s1", "tail"), "\xc3(", "' or '1'='1", "1");

const Json::Value g_jPurpose =
    list("VPN", "VPN", "Mail", "VPN'Mail", "it's", "\xf0\x9f\x94\x91", withNul("", "x"), "");

const Json::Value g_jWebapi = list("Example.File", "a\"b\\c\n", "\xff", withNul("Example.Api", "x"), "");

const Json::Value g_jMethod = list("list", "Get", "5", "it's", "");

const Json::Value g_jExtra = list(jsonValue("{}"), jsonValue(R"({"note":"it's"})"),
                                  jsonValue(R"({"a":{"b":[1,-2,3.5,true,null,"x"]},"":0})"),
                                  jsonValue(R"({"n":18446744073709551615,"m":-9223372036854775808,"d":0.1})"),
                                  jsonValue("{\"t\":\"\\u0000\\u0001\\n\\t\\\"\\\\/\xff\xc3\xa9\"}"));

// Texts for number fields, which become part of a statement without quotes. (FilterTest shows that of
// others.)
const Json::Value g_jNumberText = list("7", "-1", "", "no_column", "1 1");

const Json::Value g_jUid = list(UID_ROOT, UID_ANNA, UID_ANNA, UID_UNREADABLE, 77, 4294967294U, 4294967295U);

const Json::Value g_jSize = list(0, 1, 4, 5, USER_SIZE, USER_SIZE, USER_SIZE, USER_SIZE);

// A clock that was never set or is years wrong; the end of 32 bits; the end of SQLite's dates.
const Json::Value g_jWrongTime =
    list(-DAY - 1, -1, 0, 1700000000 - 1000 * DAY, 1700000000 + 1000 * DAY, INT32_MAX, INT32_MAX + time_t(1),
         UINT32_MAX, UINT32_MAX + time_t(1), YEAR_10000 - DAY - 2, YEAR_10000 - 1, YEAR_10000);

const Json::Value g_jName = list("tid", "tid", "bind_sid", "function", "function", "uid", "count", "extra",
                                 "limit", "sort_by", "no_field", "");

const Json::Value g_jAnything =
    jsonValue(R"([null, "5", "", true, 5, 5.0, 2.5, 18446744073709551615, [], {}, ["get"]])");

const Json::Value g_jCount = jsonValue("[-1, -1, 0, 1, 2, 2, 3, 9223372036854775807, -9223372036854775808]");

// As options of creations.
const Json::Value g_jLifetime =
    jsonValue(R"([-1, 0, 1, 60, 3600, 3600, 3600, 2.5, true, null, "60", 2147483647, 2147483648])");

// For lists in number fields.
const Json::Value g_jListed = jsonValue(R"([0, 1, 2, -1, -2, 5, 2.5, true, false, "1", null])");

// As limits and offsets; the last two have more than 32 bits.
const Json::Value g_jPosition =
    jsonValue(R"([0, 1, 2, 3, 4, 5, 6, 6, 7, 7, 8, 8, 9, 100, -1, 7.5, true, "5", 4294967296, 4294967303])");

} // namespace

class Draws {
public:
    // Some draws repeat values of these rows, which must live as long as this object.
    Draws(uint64_t nSeed, const std::vector<Row>& rows) : m_source(nSeed), m_rows(rows) {}

    size_t below(size_t nLimit) { return static_cast<size_t>(m_source() % nLimit); }
    bool oneIn(size_t nTimes) { return 0 == below(nTimes); }

    // Sometimes moves the clock on a little; rarely sets it to a wrong time for about ten operations.
    void moveClock()
    {
        if (oneIn(m_usualTime ? 10 : 1000)) {
            const time_t wrong = oneOf(g_jWrongTime).asInt64();
            const time_t now = worldClock();
            worldClock() = m_usualTime.value_or(wrong);
            m_usualTime = m_usualTime ? std::nullopt : std::optional<time_t>(now);
            return;
        }
        worldClock() += oneIn(3000)  ? 100000
                        : oneIn(100) ? 500
                        : oneIn(4)   ? static_cast<time_t>(below(4))
                                     : 0;
    }

    // The argument of that name, one of those in m_draws.
    Json::Value argument(const std::string& strName) const { return m_draws.at(strName)(); }

private:
    // One of the first values of a list.
    Json::Value oneOf(const Json::Value& jValues, Json::ArrayIndex nValues)
    {
        return jValues[static_cast<Json::ArrayIndex>(below(nValues))];
    }
    Json::Value oneOf(const Json::Value& jValues) { return oneOf(jValues, jValues.size()); }
    const Row& row() { return m_rows[below(m_rows.size())]; }

    Json::Value anything() { return oneOf(g_jAnything); }

    // Mostly the id of a row.
    Json::Value tid() { return m_rows.empty() || oneIn(4) ? oneOf(g_jTid) : row().columns[0]; }

    // Mostly the same, so that many grants are of a method that the token allows.
    Json::Value webapi() { return oneIn(3) ? oneOf(g_jWebapi) : "Example.Api"; }
    Json::Value method() { return oneIn(3) ? oneOf(g_jMethod) : "get"; }

    Json::Value allow()
    {
        Json::Value jAllow(Json::objectValue);
        for (size_t i = oneIn(8) ? 0 : 1 + below(3); 0 < i; --i) {
            Json::Value& jEntry = jAllow[webapi().asString()];
            if (oneIn(8)) {
                jEntry = anything();
                continue;
            }
            Json::Value jMethods(Json::arrayValue);
            for (size_t j = 1 + below(3); 0 < j; --j) {
                jMethods.append(oneIn(8) ? anything() : method());
            }
            jEntry = Json::Value(Json::objectValue);
            jEntry["method"] = jMethods;
        }
        return jAllow;
    }

    Json::Value deadline()
    {
        const Json::Int64 nNow = worldClock();
        return oneOf(list(-1, nNow - 1, nNow, nNow + 1, nNow + 3, nNow + 5000, nNow + 1000000, nNow + 1000000,
                          nNow + 1000000, INT64_MAX));
    }

    Json::Value option()
    {
        if (oneIn(20)) {
            return anything();
        }
        Json::Value jOption(Json::objectValue);
        for (const Field& other : FIELDS) {
            if (!oneIn(3)) {
                jOption[other.szName] = field(other);
            }
        }
        jOption.removeMember("deadline");
        if (oneIn(3)) {
            jOption["deadline"] = oneOf(g_jLifetime);
        }
        if (oneIn(8)) {
            jOption["no_field"] = anything();
        }
        return jOption;
    }

    // A value to store, sometimes of a wrong type.
    Json::Value field(const Field& other)
    {
        if (oneIn(50)) {
            return anything();
        }
        switch (fieldNumber(other.szName)) {
        case 0: return oneOf(g_jTid);
        case 1: return oneOf(g_jSession);
        case 2: return oneIn(4) ? Json::Value(Json::Int64(1) << 32) : oneOf(g_jUid);
        case 3: return deadline();
        case 4: return oneOf(g_jCount);
        case 5: return static_cast<Json::Int64>(worldClock());
        case 6: return oneOf(g_jPurpose);
        case 7: return allow();
        default: return oneOf(g_jExtra);
        }
    }

    Json::Value param()
    {
        if (oneIn(30)) {
            return anything();
        }
        Json::Value jParam(Json::objectValue);
        for (size_t i = below(4); 0 < i; --i) {
            const Field& changed = FIELDS[oneIn(4) ? below(FIELDS.size()) : 1 + below(FIELDS.size() - 1)];
            jParam[changed.szName] = field(changed);
        }
        return jParam;
    }

    Json::Value record()
    {
        if (oneIn(20)) {
            return anything();
        }
        Json::Value jRecord(Json::objectValue);
        const bool blFresh = m_rows.empty() || oneIn(3);
        if (!blFresh) {
            jRecord = row().jRecord;
        }
        for (const Field& changed : FIELDS) {
            if (blFresh || oneIn(10)) {
                jRecord[changed.szName] = field(changed);
            }
        }
        if (oneIn(15)) {
            jRecord.removeMember(FIELDS[below(FIELDS.size())].szName);
        }
        return jRecord;
    }

    // A value to compare a field with: mostly the value of some row.
    Json::Value scalar(const Field& compared)
    {
        Json::Value jValue = field(compared);
        if (!m_rows.empty() && !oneIn(3)) {
            jValue = row().jRecord[compared.szName];
        }
        if (Kind::Number == compared.kind && oneIn(8)) {
            jValue = oneOf(g_jNumberText);
        }
        return jValue;
    }

    // A value to filter by.
    Json::Value condition(const Field& compared)
    {
        const bool blList = oneIn(3) || (Kind::Json == compared.kind && !oneIn(10));
        if (!blList) {
            return scalar(compared);
        }
        Json::Value jList(Json::arrayValue);
        if (!oneIn(3)) {
            jList.append(scalar(compared));
            return jList;
        }
        const Json::Value jText = list("VPN", "Mail", "s1", "s2");
        for (size_t i = below(4); 0 < i; --i) {
            jList.append(Kind::Number == compared.kind       ? oneOf(g_jListed)
                         : Kind::Json == compared.kind       ? oneOf(g_jExtra)
                         : 0 == fieldNumber(compared.szName) ? oneOf(g_jTid, 3)
                                                             : oneOf(jText));
        }
        return jList;
    }

    Json::Value filter()
    {
        if (oneIn(25)) {
            return anything();
        }
        Json::Value jFilter(Json::objectValue);
        for (size_t i = oneIn(3) ? below(4) : 1; 0 < i; --i) {
            const Field& compared = FIELDS[below(FIELDS.size())];
            jFilter[compared.szName] = condition(compared);
        }
        if (oneIn(6)) {
            const Json::Value jUnknown = list("no_field", "Tid", "", withNul("tid", "x"));
            jFilter[oneOf(jUnknown).asString()] = anything();
        }
        if (oneIn(4)) {
            addPaging(jFilter);
        }
        return jFilter;
    }

    void addPaging(Json::Value& jFilter)
    {
        if (oneIn(2)) {
            jFilter["sort_by"] = oneIn(8) ? anything() : oneOf(g_jName);
        }
        if (oneIn(2)) {
            const Json::Value jDirection = list("desc", "desc", "DESC", "asc", "");
            jFilter["sort_direction"] = oneIn(8) ? anything() : oneOf(jDirection);
        }
        if (oneIn(2)) {
            jFilter["limit"] = oneOf(g_jPosition);
        }
        if (oneIn(3)) {
            jFilter["offset"] = oneOf(g_jPosition);
        }
    }

    // Values of text fields, mostly ids.
    Json::Value texts()
    {
        Json::Value jTexts(Json::arrayValue);
        for (size_t i = oneIn(3) ? below(4) : 1; 0 < i; --i) {
            jTexts.append(oneIn(3)   ? oneIn(2) ? oneOf(g_jSession) : oneOf(g_jPurpose)
                            : oneIn(2) ? oneOf(g_jTid, 3)
                                     : tid());
        }
        return jTexts;
    }

    // The draw of each argument. Those that an operation must not read are "untouched".
    const std::map<std::string, std::function<Json::Value()>> m_draws = {
        {"tid", [this] { return tid(); }},
        {"fresh", [this] { return oneOf(g_jTid); }},
        {"granted", [this] { return tid(); }},
        {"webapi", [this] { return oneIn(30) ? Json::Value() : webapi(); }},
        {"method", [this] { return oneIn(10) ? Json::Value() : method(); }},
        {"uid", [this] { return oneOf(g_jUid); }},
        {"function", [this] { return oneOf(g_jPurpose); }},
        {"sid", [this] { return oneOf(g_jSession); }},
        {"sid_or_null", [this] { return oneIn(20) ? Json::Value() : oneOf(g_jSession); }},
        {"name", [this] { return oneIn(20) ? Json::Value() : oneOf(g_jName); }},
        {"option", [this] { return option(); }},
        {"param", [this] { return param(); }},
        {"record", [this] { return record(); }},
        {"filter", [this] { return filter(); }},
        {"text", [this] { return oneIn(5) ? Json::Value("1") : texts().get(0U, "-1"); }},
        {"texts", [this] { return texts(); }},
        {"list", [this] { return oneIn(12) ? anything() : Json::arrayValue; }},
        {"user", [this] { return oneIn(8) ? Json::Value() : std::string(USER_SIZE, '?'); }},
        {"size", [this] { return oneOf(g_jSize); }},
        {"flag", [this] { return oneIn(2); }},
        {"rare_flag", [this] { return oneIn(8); }},
        {"made", [] { return "untouched"; }},
        {"answer", [] { return "untouched"; }},
    };

    std::mt19937_64 m_source;
    const std::vector<Row>& m_rows;
    std::optional<time_t> m_usualTime; // while the clock is wrong
};

#endif
