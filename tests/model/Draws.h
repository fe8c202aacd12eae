// Draws the arguments of operations at random: from a few values, so that calls meet, and from strange ones.

#ifndef TESTS_DRAWS_H
#define TESTS_DRAWS_H

#include <cstdint>
#include <optional>
#include <random>
#include <string>
#include <vector>

#include "ModelRow.h"

class Draws {
public:
    // Some draws repeat values of these rows, which must live as long as this object.
    Draws(uint64_t nSeed, const std::vector<Row>& rows) : m_source(nSeed), m_rows(rows) {}

    size_t below(size_t nLimit) { return static_cast<size_t>(m_source() % nLimit); }
    bool oneIn(size_t nTimes) { return 0 == below(nTimes); }

    // Moves it on a little now and then; rarely sets it to a wrong time for about ten operations.
    void moveClock();

    // The argument of that name:
    //   tid, fresh     an id that a row has, mostly; an id that no row has, mostly
    //   granted, webapi, method
    //                  mostly what a row allows; the last two are null now and then
    //   option, param  of a creation; of an update
    //   name           mostly that of a field
    //   text, texts    values of text fields, mostly ids
    //   list           what a caller passes for a list
    //   user, size     a buffer for the user's name
    //   made, answer   a value that the operation must not read
    //   uid, function, sid, sid_or_null, record, filter, flag, rare_flag
    Json::Value argument(const std::string& strName);

private:
    Json::Value tid();
    Json::Value granted();
    Json::Value webapi();
    Json::Value option();
    Json::Value param();
    Json::Value record();
    Json::Value filter();
    Json::Value texts();
    template <typename Values>
    auto oneOf(const Values& values)
    {
        return values[below(std::size(values))];
    }
    Json::Value oneOf(const Json::Value& jValues)
    {
        return jValues[static_cast<Json::ArrayIndex>(below(jValues.size()))];
    }
    Json::Value anything();
    const Row& row() { return m_rows[below(m_rows.size())]; }
    Json::Value allow();
    Json::Value extra();
    Json::Value deadline();
    Json::Value field(const Field& field);     // a value to store, sometimes of a wrong type
    Json::Value condition(const Field& field); // a value to filter by
    Json::Value scalar(const Field& field);
    void addPaging(Json::Value& jFilter);

    std::mt19937_64 m_source;
    const std::vector<Row>& m_rows;
    std::optional<time_t> m_usualTime; // while the clock is wrong
    Json::Value m_jAllow;              // of the id that was drawn last for a grant
};

#endif
