// How the id of a new token reaches who asked for it. A token whose id nobody got to know is taken back.

#ifndef TOOLS_HANDOVER_H
#define TOOLS_HANDOVER_H

#include <functional>
#include <memory>
#include <string>

#include "Store.h"

namespace tool {

// A fresh id.
std::string newTid();

// Undoes what a transaction has done, in one of its own, and returns what to say of that; "" when there was
// nothing to undo.
typedef std::function<std::string(Store&)> Undo;

// Commits the transaction, and prints the result, which holds the id. When it cannot be printed, or a signal
// comes before that, undoes the transaction, and fails or ends by the signal.
void handOver(std::unique_ptr<Store> pStore, const std::string& strResult, const Undo& undo);

} // namespace tool

#endif
