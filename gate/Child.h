// Starts the process that reads HTTP from the process that holds the tokens.

#ifndef GATE_CHILD_H
#define GATE_CHILD_H

#include <string>

#include "Sockets.h"

namespace gate {

// The child's descriptors: the link, and the sockets for calls and for the status.
enum ChildDescriptor { CHILD_LINK = 3, CHILD_CALLS = 4, CHILD_STATUS = 5 };

struct Child {
    std::string strProgram;
    std::string strUser;       // the user that the child becomes
    std::string strOnceHeader; // "": there is none
};

// Starts the child with the sockets, which it closes in this process, and with standard error. Nothing else
// stays open in the child. Returns the other end of its link. Throws std::system_error.
int start(const Child& child, const Sockets& sockets);

} // namespace gate

#endif
