// The arguments of operations, drawn at random: from few values, so that they meet, and from strange ones.

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
    // Some draws repeat what is in the rows, which must live as long.
    Draws(uint64_t nSeed, const std::vector<Row>& rows) : m_source(nSeed), m_rows(rows) {}

    size_t below(size_t nLimit) { return static_cast<size_t>(m_source() % nLimit); }
    bool oneIn(size_t nTimes) { return 0 == below(nTimes); }

    // Now and then ahead, and rarely to a time that is quite wrong, for some ten operations.
    void moveClock();

    // The argument of that name:
    //   tid, fresh     ids that a row has, mostly; that no row has, mostly
    //   granted, webapi, method
    //                  mostly what a row allows; the last two null now and then
    //   uid, function, sid, sid_or_null, name (of a field, mostly), option (of a creation), param (of an
    //   update), record, filter text, texts    values that the fields of kind Text have, mostly ids list,
    //   user, size
    //                  what a caller hands over for a list, or for the user's name
    //   flag, rare_flag
    //   made, answer   what is not to be read
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
    Json::Value field(const Field& field);     // a value to store, now and then of a wrong type
    Json::Value condition(const Field& field); // a value to filter by
    Json::Value scalar(const Field& field);
    void addPaging(Json::Value& jFilter);

    std::mt19937_64 m_source;
    const std::vector<Row>& m_rows;
    std::optional<time_t> m_usualTime; // while the clock is wrong
    Json::Value m_jAllow;              // of the id that was drawn last for a grant
};

#endif
