// Reads and writes JSON.

#ifndef TOOLS_JSON_H
#define TOOLS_JSON_H

#include <json/reader.h>

#include <memory>
#include <string>

namespace tool {

// The library reads objects and arrays nested up to this depth.
const int NESTED_MAX = 1000;

// Reads one JSON object, strictly. Throws BadValue.
Json::Value parseObject(const std::string& strText, int nNestedMax = NESTED_MAX);

// Reads many JSON objects like parseObject(), with one reader.
class ObjectReader {
public:
    explicit ObjectReader(int nNestedMax = NESTED_MAX);
    Json::Value read(const std::string& strText) const;

private:
    const std::unique_ptr<Json::CharReader> m_pReader;
};

// How deep a text is nested, valid JSON or not; an object alone is one level.
int nestingOf(const std::string& strText);

// Why the library cannot read a stored text completely, as the rest of a sentence; "" if it can.
std::string flawOfStored(const std::string& strText);

// The value on one line. Like all JSON of the tool, invisible characters are escaped.
std::string compactJson(const Json::Value& jValue);

// The value with line breaks and indentation, for people.
std::string styledJson(const Json::Value& jValue);

} // namespace tool

#endif
