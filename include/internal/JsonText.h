// Converts JSON values to text and back, in the form that the database stores and conditions compare.
//
// Threads: both may run in several threads at once.

#ifndef VEMO_ACCESS_TOKEN_JSON_TEXT_H
#define VEMO_ACCESS_TOKEN_JSON_TEXT_H

#include <json/value.h>

#include <string>
#include <string_view>

namespace VEMO_ACCESS_TOKEN {

// Returns the value as compact text on one line. Apart from the escapes that JSON demands, strings are
// written byte for byte, valid UTF-8 or not. 64-bit integers and doubles, infinities included, are read
// back equal. Preserves errno, so that it can be an argument of a log line.
std::string toString(const Json::Value& jValue);

// Parses text into jValue. Bad text, and text with more than 1000 levels, is neither reported nor thrown:
// jValue then holds what was read before the error.
void fromString(std::string_view strText, Json::Value& jValue);

} // namespace VEMO_ACCESS_TOKEN

#endif
