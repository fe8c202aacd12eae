// Suggests a name to a user who wrote one that does not exist.

#ifndef TOOLS_NEAREST_H
#define TOOLS_NEAREST_H

#include <string>
#include <vector>

namespace tool {

// The fewest edits that make one word of the other. An edit inserts, deletes or replaces a character, or
// swaps two neighbours.
size_t distance(const std::string& strOne, const std::string& strOther);

// A question such as: did you mean "list"? Names the most similar name. Returns "" if even that name takes
// more edits than a third of the longer word's length.
std::string didYouMean(const std::string& strWord, const std::vector<std::string>& strNames);

} // namespace tool

#endif
