// Ids are credentials: what is shown of them, and of what may be one.

#ifndef TOOLS_MASKING_H
#define TOOLS_MASKING_H

#include <cstddef>
#include <string>

namespace tool {

// What an argument may name a token by, at least.
const size_t PREFIX_MIN = 8;

// An id's first characters: enough to tell tokens apart, but not to use one.
std::string masked(const std::string& strTid);

// The same with "..." where more follows.
std::string shortened(const std::string& strTid);

// In quotation marks, for sentences that repeat an argument or a part of one. What is as long as an id may be
// one in a wrong place, and is shortened.
std::string quoted(const std::string& strText);

// The same for the name of a file: each part of the path is shortened that is so long; all are, where the
// whole still is.
std::string shownPath(const std::string& strPath);

// What a library says of what it was given, with what it quotes of that shortened in the same way.
std::string shownReason(const std::string& strReason);

} // namespace tool

#endif
