// What calls of other programs can still do to a change that has been made.

#ifndef TOOLS_AFTERMATH_H
#define TOOLS_AFTERMATH_H

#include <cstdint>
#include <functional>
#include <string>

namespace tool {

// A call that takes no lock, and that had read a token before it was changed here, can write it back as it
// was. Looks again, right after the change, until no call can do so: each has closed the database since, or
// has had all the time that a call can take. restore() makes the change again where it was undone, and
// returns how often it was.
//
// Tells on standard error how often that was, by a sentence such as "a token came back 3 times ...", and
// which programs have had the database open all the time.
void outlastCalls(const std::function<uint64_t()>& restore, const std::string& strUndone,
                  const std::string& strDone);

} // namespace tool

#endif
