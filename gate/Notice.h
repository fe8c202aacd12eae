// What the gate tells the service manager, by the protocol of sd_notify(3). Without one, nothing happens.

#ifndef GATE_NOTICE_H
#define GATE_NOTICE_H

#include <cstdint>

namespace gate {

// Sends lines such as "READY=1".
void notify(const char* szState);

// How often the service manager wants to hear "WATCHDOG=1" at least, in ns; 0 for never.
int64_t watchdogPeriod();

} // namespace gate

#endif
