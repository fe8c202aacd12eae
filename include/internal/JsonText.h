// JSON values as text and back, in the one form that the database stores and conditions compare.
//
// Threads: both may run in several threads at once.

#ifndef VEMO_ACCESS_TOKEN_JSON_TEXT_H
#define VEMO_ACCESS_TOKEN_JSON_TEXT_H

#include <json/value.h>

#include <string>
#include <string_view>

namespace VEMO_ACCESS_TOKEN {

// The value as compact text on one line. Strings come out byte for byte (but for the escapes that
// JSON demands), valid UTF-8 or not. Integers of 64 bits and doubles, infinities included, are read
// back equal. Preserves errno, so that it may stand among the arguments of a log line.
std::string toString(const Json::Value& jValue);

// Parses text into jValue. Never throws on bad text, and reports nothing: text that does not parse,
// or is nested deeper than the reader allows (1000 levels), leaves in jValue what was read up to
// there.
void fromString(std::string_view strText, Json::Value& jValue);

} // namespace VEMO_ACCESS_TOKEN

#endif
