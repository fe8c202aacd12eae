// What a request to the gate asks for: the target names API and method, a header carries the id.

#ifndef GATE_HTTP_CALL_H
#define GATE_HTTP_CALL_H

#include <string>

#include "Head.h"

namespace gate {

struct Call {
    std::string strTid;
    std::string strApi;
    std::string strMethod; // empty: the API alone
    std::string strOnce;   // tells it from its repetition; empty: each is a call of its own
    bool blRecord = false;
};

// The status that answers a request which is no call, or 0 and the call. strOnceHeader is in lower case, or
// empty.
int readCall(const Head& head, const std::string& strOnceHeader, Call& call);

} // namespace gate

#endif
