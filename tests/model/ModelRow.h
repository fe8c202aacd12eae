// A token in the model's table, and its fields.

#ifndef TESTS_MODEL_ROW_H
#define TESTS_MODEL_ROW_H

#include <json/json.h>

#include <string>
#include <vector>

enum class Kind { Text, Json, Number };

struct Field {
    const char* szName;
    Kind kind;
    Json::Value jDefault; // but for create_time, which is the time
};

// In the order of the columns.
extern const std::vector<Field> FIELDS;

// The number of the field in FIELDS, or FIELDS.size().
size_t fieldNumber(const std::string& strName);

struct Row {
    std::vector<std::string> columns; // as the table holds them; numbers as decimal text
    Json::Value jRecord;              // as the library returns it
};

// The row that a complete record becomes. Throws Json::LogicError when a member cannot be converted.
Row rowOf(const Json::Value& jRecord);

// A text up to its first NUL, which is what SQL gets.
std::string untilNul(const std::string& strText);

// The JSON text that the table holds, and that filters compare: compact, strings byte for byte.
std::string jsonText(const Json::Value& jValue);

#endif
