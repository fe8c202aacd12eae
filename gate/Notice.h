// Messages to the service manager, if there is one, by the protocol of sd_notify(3).

#ifndef GATE_NOTICE_H
#define GATE_NOTICE_H

#include <cstdint>

namespace gate {

// Sends lines such as "READY=1".
void notify(const char* szState);

// The longest time, in ns, that the service manager waits for the next "WATCHDOG=1"; 0: it waits for none.
int64_t watchdogPeriod();

} // namespace gate

#endif
