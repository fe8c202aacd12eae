// What this process has changed for good.

#ifndef TOOLS_CHANGE_H
#define TOOLS_CHANGE_H

namespace tool {

// To be called after a change that stays. Failures tell from then on that there is one, and once this returns
// no power cut undoes it: the end of the journal, which is what makes a change, is on the disk only when the
// directory is. Throws Failure.
void settleChange();

// Whether there is one.
bool hasChanged();

} // namespace tool

#endif
