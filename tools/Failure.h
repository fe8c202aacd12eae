// How a command ends when it does not succeed: one sentence and an exit status.

#ifndef TOOLS_FAILURE_H
#define TOOLS_FAILURE_H

#include <stdexcept>
#include <string>

namespace tool {

enum ExitStatus {
    EXIT_STATUS_DONE = 0,     // done, or granted
    EXIT_STATUS_REFUSED = 1,  // grant and check: not granted
    EXIT_STATUS_USAGE = 2,    // bad arguments or bad input
    EXIT_STATUS_NO_TOKEN = 3, // there is no such token
    EXIT_STATUS_STORE = 4,    // the store, the system or a permission failed
    EXIT_STATUS_FINDINGS = 5, // doctor found something
};

class Failure : public std::runtime_error {
public:
    // The hint says what to do or what the failure means. It ends the sentence.
    Failure(ExitStatus status, const std::string& strFact, const std::string& strHint = "")
        : std::runtime_error(strFact + (strHint.empty() ? "" : "; " + strHint)),
          m_status(status),
          m_strFact(strFact)
    {
    }
    ExitStatus status() const { return m_status; }
    const std::string& fact() const { return m_strFact; }

private:
    ExitStatus m_status;
    std::string m_strFact;
};

// Other programs held the lock or the database for too long. The command may succeed later.
class LockedFailure : public Failure {
    using Failure::Failure;
};

// A value that cannot be used. Whoever catches it adds where the value came from, before the reason.
class BadValue : public std::runtime_error {
    using std::runtime_error::runtime_error;
};

} // namespace tool

#endif
