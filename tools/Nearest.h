// What somebody may have meant who wrote a name that there is not.

#ifndef TOOLS_NEAREST_H
#define TOOLS_NEAREST_H

#include <string>
#include <vector>

namespace tool {

// How many characters must be inserted, deleted, replaced or exchanged with the next one to make one word of
// another.
size_t distance(const std::string& strOne, const std::string& strOther);

// A question for the name that is nearest to a word: did you mean "list"? It is "" where none is near: more
// than a third of the longer one would have to change.
std::string didYouMean(const std::string& strWord, const std::vector<std::string>& strNames);

} // namespace tool

#endif
