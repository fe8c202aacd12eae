// What calls of other programs can still do to a change that has been made.

#ifndef TOOLS_AFTERMATH_H
#define TOOLS_AFTERMATH_H

#include <cstdint>
#include <functional>
#include <string>

#include "Store.h"

namespace tool {

// A change that has been made.
struct Change {
    // Whether it was undone; looks in transactions of its own.
    std::function<bool()> isUndone;

    // Makes it again where it was undone, in a transaction, and returns how often it was.
    std::function<uint64_t(Store&)> makeAgain;
};

// A call that takes no lock, and that had read a token before it was changed here, can write it back as it
// was. Looks again, right after the change, until no call can do so: each has closed the database since, or
// has had all the time that a call can take. Where calls that follow each other undo it again and again,
// keeps them from writing for as long as one can take.
//
// Tells on standard error how often that was, by a sentence such as "a token came back 3 times ...", and
// which programs have had the database open all the time.
void outlastCalls(const Change& change, const std::string& strUndone, const std::string& strDone);

} // namespace tool

#endif
