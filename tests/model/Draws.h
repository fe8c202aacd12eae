// The arguments of operations, drawn at random: from few values, so that they meet, and from strange ones.

#ifndef TESTS_DRAWS_H
#define TESTS_DRAWS_H

#include <cstdint>
#include <random>

#include "ModelRow.h"

class Draws {
public:
    // Some draws repeat what is in the rows, which must live as long.
    Draws(uint64_t nSeed, const std::vector<Row>& rows) : m_source(nSeed), m_rows(rows) {}

    size_t below(size_t nLimit) { return static_cast<size_t>(m_source() % nLimit); }
    bool oneIn(size_t nTimes) { return 0 == below(nTimes); }
    time_t step(); // how far the clock moves on

    std::string tid();    // mostly one that a row has
    std::string newTid(); // mostly one that no row has
    Json::Value uid();    // as an argument of creations
    std::string session();
    std::string purpose();
    Json::Value grant();  // "tid", "webapi" and "method", the last two null now and then
    Json::Value name();   // of a field, mostly
    Json::Value option(); // of a creation
    Json::Value param();  // of an update
    Json::Value record();
    Json::Value filter();
    Json::Value texts(); // an array of values that the fields of kind Text have, mostly ids
    Json::Value out();   // what a caller hands over for a list

private:
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
};

#endif
