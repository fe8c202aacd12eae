// Ids are credentials. These functions shorten ids, and texts that may be ids, for messages.

#ifndef TOOLS_MASKING_H
#define TOOLS_MASKING_H

#include <cstddef>
#include <string>

namespace tool {

// The shortest prefix of an id by which an argument may name a token.
const size_t PREFIX_MIN = 8;

// The first PREFIX_MIN characters of an id: enough to tell tokens apart, but not to use one.
std::string masked(const std::string& strTid);

// masked(), with "..." if the id is longer.
std::string shortened(const std::string& strTid);

// A text in quotation marks, for messages that repeat an argument. A text that is as long as an id is
// shortened, because it may be an id in the wrong place.
std::string quoted(const std::string& strText);

// A path for messages: each part that is as long as an id is shortened. If the path is still as long as an
// id, all parts are shortened.
std::string shownPath(const std::string& strPath);

// A library's error text. What it quotes is shortened if it is as long as an id.
std::string shownReason(const std::string& strReason);

} // namespace tool

#endif
