// Delivers the id of a new token to the user. If that fails, the token is deleted again, because nobody knows
// its id.

#ifndef TOOLS_HANDOVER_H
#define TOOLS_HANDOVER_H

#include <functional>
#include <memory>
#include <string>

#include "Store.h"

namespace tool {

// Makes a new id. Throws Failure.
std::string newTid();

// Undoes a committed transaction, within the caller's. Returns what to say about that, or "" if there was
// nothing to undo.
typedef std::function<std::string(Store&)> Undo;

// Commits the transaction, then prints the result, which holds the id. If the result cannot be printed, or if
// a signal comes before that, it undoes the transaction. Then it throws Failure, or ends the process by the
// signal.
void handOver(std::unique_ptr<Store> pStore, const std::string& strResult, const Undo& undo);

} // namespace tool

#endif
