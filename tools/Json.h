// JSON texts, in and out.

#ifndef TOOLS_JSON_H
#define TOOLS_JSON_H

#include <json/reader.h>

#include <memory>
#include <string>

namespace tool {

// How deep the library reads what is nested.
const int NESTED_MAX = 1000;

// Reads one JSON object, strictly. Throws BadValue.
Json::Value parseObject(const std::string& strText, int nNestedMax = NESTED_MAX);

// The same for many, without making a reader for each.
class ObjectReader {
public:
    explicit ObjectReader(int nNestedMax = NESTED_MAX);
    Json::Value read(const std::string& strText) const;

private:
    const std::unique_ptr<Json::CharReader> m_pReader;
};

// How deep a JSON text is nested, sound or not; an object alone is one level.
int nestingOf(const std::string& strText);

// Why the library does not read all of a text that a token holds, as the rest of a sentence; "" when it does.
std::string flawOfStored(const std::string& strText);

// On one line. As all JSON that is written, it escapes what cannot be seen.
std::string compactJson(const Json::Value& jValue);

// For people, with line breaks and indentation.
std::string styledJson(const Json::Value& jValue);

} // namespace tool

#endif
