// The bytes of HTTP responses.

#ifndef GATE_HTTP_RESPONSE_H
#define GATE_HTTP_RESPONSE_H

#include <string>
#include <string_view>

#include "gate/Messages.h"

namespace gate {

// How a response must be sent: this depends on the request and the connection.
struct Manner {
    bool blKeepAlive = false;
    bool blHead = false; // the answer to HEAD has no body
    bool blOld = false;  // for HTTP/1.0, which needs a header to keep the connection
};

// The response to a call that was granted.
std::string grantedResponse(const Reply& answer, const Manner& manner);

// A response whose body is a line that depends only on the status: a refusal shows a client nothing else.
std::string plainResponse(int nStatus, const Manner& manner);

// A response for /health or /metrics: 200 or 503.
std::string textResponse(int nStatus, std::string_view strType, std::string_view strBody,
                         const Manner& manner);

// A text as a header can carry it: the percent sign, and all but visible ASCII, become "%XX".
std::string headerText(std::string_view strText);

} // namespace gate

#endif
