// A call, read from a request: the target names API and method, and a header carries the id.

#ifndef GATE_HTTP_CALL_H
#define GATE_HTTP_CALL_H

#include <string>

#include "Head.h"

namespace gate {

struct Call {
    std::string strTid;
    std::string strApi;
    std::string strMethod; // empty: the API alone
    std::string strOnce;   // a repetition has the same; empty: each request is a new call
    bool blRecord = false;
};

// Reads a call. Returns 0, or the status for a request that is not a call. strOnceHeader is in lower case.
int readCall(const Head& head, const std::string& strOnceHeader, Call& call);

} // namespace gate

#endif
