// A token in the model's table, and its fields.

#ifndef TESTS_MODEL_ROW_H
#define TESTS_MODEL_ROW_H

#include <json/json.h>

#include <memory>
#include <string>
#include <vector>

enum class Kind { Text, Json, Number };

struct Field {
    const char* szName;
    Kind kind;
    Json::Value jDefault; // except for create_time: the present time
};

// In the order of the columns.
inline const std::vector<Field> FIELDS = {
    {"tid", Kind::Text, "INVALID_TOKEN_ID"},
    {"bind_sid", Kind::Text, ""},
    {"uid", Kind::Number, 4294967295U},
    {"deadline", Kind::Number, -1},
    {"count", Kind::Number, 1},
    {"create_time", Kind::Number, Json::Value()},
    {"function", Kind::Text, "VEMO_ACCESS_TOKEN"},
    {"webapi_allow", Kind::Json, Json::objectValue},
    {"extra", Kind::Json, Json::objectValue},
};

// The number of the field in FIELDS, or FIELDS.size().
inline size_t fieldNumber(const std::string& strName)
{
    size_t i = 0;
    while (i < FIELDS.size() && strName != FIELDS[i].szName) {
        ++i;
    }
    return i;
}

struct Row {
    std::vector<std::string> columns; // as the table holds them; numbers as decimal text
    Json::Value jRecord;              // as the library returns it
};

// The JSON text that the table holds, and that filters compare: compact, strings byte for byte; and its
// value.
inline std::string jsonText(const Json::Value& jValue)
{
    static const Json::StreamWriterBuilder builder = [] {
        Json::StreamWriterBuilder compact;
        compact["indentation"] = "";
        compact["precision"] = 17;
        compact["useSpecialFloats"] = true;
        compact["emitUTF8"] = true;
        return compact;
    }();
    return Json::writeString(builder, jValue);
}

inline Json::Value jsonValue(const std::string& strText)
{
    static const std::unique_ptr<Json::CharReader> pReader = [] {
        Json::CharReaderBuilder builder;
        builder["allowSpecialFloats"] = true;
        return std::unique_ptr<Json::CharReader>(builder.newCharReader());
    }();
    Json::Value jValue;
    pReader->parse(strText.data(), strText.data() + strText.size(), &jValue, nullptr);
    return jValue;
}

// The row that a complete record becomes. Throws Json::LogicError when a member cannot be converted.
inline Row rowOf(const Json::Value& jRecord)
{
    Row row;
    for (const Field& field : FIELDS) {
        const Json::Value& jValue = jRecord[field.szName];
        Json::Value& jMember = row.jRecord[field.szName];
        switch (field.kind) {
        case Kind::Text:
            row.columns.emplace_back(jValue.asCString());
            jMember = row.columns.back();
            break;
        case Kind::Json:
            row.columns.push_back(jsonText(jValue));
            jMember = jsonValue(row.columns.back());
            break;
        case Kind::Number:
            jMember = jValue.asInt64();
            row.columns.push_back(jMember.asString());
            break;
        }
    }
    return row;
}

#endif
