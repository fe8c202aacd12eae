// What filters select, oddities included.

#ifndef TESTS_MODEL_FILTER_H
#define TESTS_MODEL_FILTER_H

#include <functional>

#include "ModelRow.h"

typedef std::function<bool(const Row&)> Condition;

// The conditions of a filter: those members that name fields.
struct Where {
    explicit Where(const Json::Value& jFilter);
    bool matches(const Row& row) const;

    bool blRefused = false; // a field was given an object
    bool blBroken = false;  // no valid SQL
    bool blEmpty = true;    // no field was named

private:
    void add(size_t nField, const Json::Value& jValue);
    void addNumber(size_t nField, const std::string& strText, bool blList);
    void addCondition(const Condition& condition) { m_alternatives.back().conditions.push_back(condition); }

    // Holds when all its conditions do.
    struct Alternative {
        std::vector<Condition> conditions;
        bool blUnknownName = false; // of a column
        bool blNever = false;       // SQLite notices that at once, and does not look for the column then
    };
    std::vector<Alternative> m_alternatives = {{}}; // one of which must hold
};

// Whether ordering and paging make the query invalid. They have no other effect.
bool isSpoiledByPaging(const Json::Value& jFilter, bool blWithoutFields);

// A text for a number field that contains SQL. It ends the conditions so far and adds an alternative that
// always holds; later conditions belong to that alternative.
const char* const TEXT_OR_TRUE = "0 or 1=1";

#endif
