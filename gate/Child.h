// The process that reads HTTP, as the process that holds the tokens starts it.

#ifndef GATE_CHILD_H
#define GATE_CHILD_H

#include <string>

#include "Sockets.h"

namespace gate {

// Where the child finds what it is handed over.
enum ChildDescriptor { CHILD_LINK = 3, CHILD_CALLS = 4, CHILD_STATUS = 5 };

struct Child {
    std::string strProgram;
    std::string strUser;       // that it becomes
    std::string strOnceHeader; // "": none
};

// Starts it with the sockets, which are closed here, and nothing else that is open but standard error.
// Returns the other end of its link. Throws std::system_error.
int start(const Child& child, const Sockets& sockets);

} // namespace gate

#endif
