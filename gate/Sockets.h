// The sockets that the gate listens on.

#ifndef GATE_SOCKETS_H
#define GATE_SOCKETS_H

#include <string>

namespace gate {

struct Sockets {
    int nCalls = -1;
    int nStatus = -1; // for /health and /metrics; -1: none
};

// Those that the service manager hands over (sd_listen_fds(3)): the one that is named "status", and the
// other; without names, the first is for calls. Their variables are removed from the environment. Nothing
// where there are none. Throws std::runtime_error for what cannot be.
Sockets handedOver();

// Listens at a path, with mode 0660 for the group, or 0600 where there is no such group. What stands at the
// path is replaced at once, so that nobody is refused while another process takes over. Throws
// std::system_error.
int listenAt(const std::string& strPath, const char* szGroup);

} // namespace gate

#endif
