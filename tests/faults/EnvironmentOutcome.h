// What becomes of an operation in a bad environment, in words.

#ifndef TESTS_ENVIRONMENT_OUTCOME_H
#define TESTS_ENVIRONMENT_OUTCOME_H

#include <functional>
#include <string>

#include "Operations.h"
#include "TokenStore.h"

// Runs an operation between arm and disarm and has the oracle judge it. Returns
// - "done": it gave its result, and the store holds what it does
// - "refused: WHY": it failed, the store is as it was, and the next call in peace works; WHY is the first
// line
//   that it logged, without location and statement
// - "leaves no table: WHY": it failed, and leaves a file without the table, so that the next call fails too
// - "fails late: WHY": it failed, and yet the store holds what it does
// A first creation that leaves a file says its mode, "done, mode 0700"; a file that was there keeps its own.
// Waits for a lock are counted for each statement: ", 500 waits". Whatever the oracle finds wrong comes last,
// after "; WRONG: ".
std::string outcomeOf(const TokenStore& store, const Operation& operation, const std::function<void()>& arm,
                      const std::function<void()>& disarm);

// The first line of the log without location, errno and statement.
std::string firstLine(const std::string& strLog);

// One of the operations, by its name.
const Operation& operationNamed(const char* szName);

#endif
