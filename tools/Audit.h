// The lines in the system log that tell who has changed what: one for each change that stays, with the
// facility LOG_AUTHPRIV, such as
//
//     revoke: 2 tokens deleted (21IRmWbM..., Zk3T0qVd...); by uid 1000 (sudo), login uid 1000
//
// Whole ids never stand there. A process has one change at a time.

#ifndef TOOLS_AUDIT_H
#define TOOLS_AUDIT_H

#include <cstdint>
#include <string>
#include <vector>

namespace tool {
namespace audit {

// Prefixes of ids that a line shows; where there are more tokens, it tells only how many.
const size_t PREFIXES_MAX = 5;

// Whose changes those that follow are.
void setCommand(const std::string& strCommand);

// What a change that is being made does to a token, in one word such as "created"; and to several, of whose
// ids some may be missing where there are more than PREFIXES_MAX.
void note(const char* szDone, const std::string& strTid);
void note(const char* szDone, const std::vector<std::string>& strTids, uint64_t nTokens);

// Whether something was noted that is neither made nor forgotten.
bool hasNotes();

// The change is made, with all that was noted of it, or perhaps so. Takes no memory.
enum class Certainty { Certain, Perhaps };
void made(Certainty certainty = Certainty::Certain);

// Writes the line of a change that was made, and forgets what is not. To be called where no lock is held and
// no transaction is open: it waits for whoever reads the log.
void tell();

// Does that in the end.
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
