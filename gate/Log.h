// The log of the gate: standard error, which systemd hands to the journal.

#ifndef GATE_LOG_H
#define GATE_LOG_H

#include <string>

namespace gate {

// Writes one line with a priority of syslog(3) ahead of it, as systemd reads it ("<4>"). Never blocks: a line
// that nobody takes is dropped. Of the same text, one line a second at most.
void log(int nPriority, const std::string& strText);

} // namespace gate

#endif
