// Calls of other programs can still undo a change after it was made. This file watches for that.

#ifndef TOOLS_AFTERMATH_H
#define TOOLS_AFTERMATH_H

#include <cstdint>
#include <functional>
#include <string>

#include "Store.h"

namespace tool {

// A change that has been made.
struct Change {
    // Whether other calls have undone the change. Opens transactions of its own.
    std::function<bool()> isUndone;

    // Makes the change again where it was undone, within the caller's transaction. Returns how many times it
    // had been undone: for how many tokens.
    std::function<uint64_t(Store&)> makeAgain;
};

// A call that takes no lock can have read a token before the change. It then writes the old token back. This
// function looks until no call can do so any more: each process has closed the database since the change, or
// has had the time that the longest call takes. It makes the change again where it was undone. When calls
// undo it again and again, it holds the lock and a transaction, so that nobody can write, for as long as the
// longest call takes. Fails if a trigger undoes the change.
//
// Says on standard error how often the change was undone ("a token came back 3 times ..."), and which
// programs had the database open all the time. Throws Failure.
void outlastCalls(const Change& change, const std::string& strUndone, const std::string& strDone);

} // namespace tool

#endif
