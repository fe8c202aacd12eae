// The sockets that the gate listens on.

#ifndef GATE_SOCKETS_H
#define GATE_SOCKETS_H

#include <string>

namespace gate {

struct Sockets {
    int nCalls = -1;
    int nStatus = -1; // for /health and /metrics; -1: none
};

// Returns the sockets that the service manager has passed (sd_listen_fds(3)): the one named "status", and the
// other one; without names, the first is for calls. Removes their variables from the environment. Without
// such sockets, nCalls is -1. Throws std::runtime_error if there are wrong ones.
Sockets handedOver();

// Listens at a path, with mode 0660 for the group, or 0600 if there is no such group. Replaces an existing
// file in one step, so that no client is refused while another process takes over. Throws std::system_error.
int listenAt(const std::string& strPath, const char* szGroup);

} // namespace gate

#endif
