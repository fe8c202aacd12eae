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
    Failure(ExitStatus status, const std::string& strSentence)
        : std::runtime_error(strSentence), m_status(status)
    {
    }
    ExitStatus status() const { return m_status; }

private:
    ExitStatus m_status;
};

// A value that cannot be used; who knows where it came from says so in front of the reason.
class BadValue : public std::runtime_error {
    using std::runtime_error::runtime_error;
};

// What convert() gives; a BadValue in it becomes a usage failure that names the argument.
template <typename Convert>
auto argument(const std::string& strName, Convert convert)
{
    try {
        return convert();
    } catch (const BadValue& bad) {
        throw Failure(EXIT_STATUS_USAGE, strName + ": " + bad.what());
    }
}

} // namespace tool

#endif
