// The bytes of HTTP responses.

#ifndef GATE_HTTP_RESPONSE_H
#define GATE_HTTP_RESPONSE_H

#include <string>
#include <string_view>

#include "gate/Messages.h"

namespace gate {

// How a response goes out, as its request and connection demand.
struct Manner {
    bool blKeepAlive = false;
    bool blHead = false; // without its body, as HEAD has it
    bool blOld = false;  // for HTTP/1.0, which is told that the connection goes on
};

// For a call that has been decided.
std::string grantedResponse(const Answer& answer, const Manner& manner);

// With a body of one line that tells the status. All that a client can be told beside the status of a
// refusal, or of a failure, is in the status.
std::string plainResponse(int nStatus, const Manner& manner);

// For people and their programs: 200 or 503.
std::string textResponse(int nStatus, std::string_view strType, std::string_view strBody,
                         const Manner& manner);

// As a header can carry it: all but visible ASCII, and the percent sign, as "%XX".
std::string headerText(std::string_view strText);

} // namespace gate

#endif
