// Whether this process has made a change that stays.

#ifndef TOOLS_CHANGE_H
#define TOOLS_CHANGE_H

namespace tool {

// To be called after a change that stays. From then on, messages about failures say that the change was made.
// When it returns, a power cut does not undo the change any more: SQLite makes a change final by removing the
// journal, and that is on the disk only after a sync of the directory. Throws Failure.
void settleChange();

// Whether settleChange() was called.
bool hasChanged();

} // namespace tool

#endif
