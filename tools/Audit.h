// The system log says who has changed what: one line for each change that was committed, with the facility
// LOG_AUTHPRIV, such as
//
//     revoke: 2 tokens deleted (21IRmWbM..., Zk3T0qVd...); by uid 1000 (sudo), login uid 1000
//
// A line never holds a whole id. A process makes one change at a time.

#ifndef TOOLS_AUDIT_H
#define TOOLS_AUDIT_H

#include <cstdint>
#include <string>
#include <vector>

namespace tool {
namespace audit {

// A line shows this many prefixes of ids at most; for more tokens, it only says how many they are.
const size_t PREFIXES_MAX = 5;

// Names the command in the lines that follow.
void setCommand(const std::string& strCommand);

// Notes what the change that is being made does to a token, in one word such as "created". The second one
// notes it for nTokens tokens; strTids may hold fewer ids if there are more tokens than PREFIXES_MAX.
void note(const char* szDone, const std::string& strTid);
void note(const char* szDone, const std::vector<std::string>& strTids, uint64_t nTokens);

// Whether there are notes of a change that was neither made nor forgotten yet.
bool hasNotes();

// To be called when the change is committed, or may be: what was noted is now made. Takes no memory.
enum class Certainty { Certain, Perhaps };
void made(Certainty certainty = Certainty::Certain);

// Writes the line about the change that was made, and forgets all notes. Call it without any lock or open
// transaction: it waits until the system log takes the line.
void tell();

// Calls tell() when it is destroyed.
class Teller {
public:
    Teller() = default;
    ~Teller() { tell(); }
    Teller(const Teller&) = delete;
    Teller& operator=(const Teller&) = delete;
};

} // namespace audit
} // namespace tool

#endif
