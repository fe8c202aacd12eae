// The log of the gate: standard error, which systemd hands to the journal.

#ifndef GATE_LOG_H
#define GATE_LOG_H

#include <string>

namespace gate {

// Writes a line with a priority of syslog(3) before it, in systemd's form ("<4>"). Never blocks: a line that
// cannot be written now is dropped. A text that repeats itself is written once a second at most.
void log(int nPriority, const std::string& strText);

} // namespace gate

#endif
