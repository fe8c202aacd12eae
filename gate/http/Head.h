// The head of an HTTP/1 request, read strictly: what two readers could understand differently is refused. A
// proxy sends the requests of many clients over one connection. If the proxy and the gate disagreed about
// where a request ends, a client could get the answer to another client's request.
//
// Bodies are not read: a request with a body is answered, and its connection ends.

#ifndef GATE_HTTP_HEAD_H
#define GATE_HTTP_HEAD_H

#include <cstddef>
#include <string>
#include <string_view>
#include <vector>

namespace gate {

const size_t LINE_MAX_BYTES = 16384; // of the request line
const size_t HEAD_MAX_BYTES = 65536; // of the whole head, cookies included
const size_t HEADERS_MAX = 256;

struct Head {
    std::string_view strMethod;
    std::string_view strTarget;
    bool blOld = false;       // the request is of HTTP/1.0
    bool blKeepAlive = false; // another request may follow on the connection
    bool blBody = false;      // a body follows

    // The number of headers with this name, which is in lower case; and the value of the first.
    size_t count(std::string_view strName) const;
    std::string_view value(std::string_view strName) const;

    // Whether a list in the headers of this name holds an element. Both are in lower case; parameters are
    // ignored.
    bool lists(std::string_view strName, std::string_view strElement) const;

    struct Header {
        std::string strName; // in lower case
        std::string_view strValue;
    };
    std::vector<Header> headers;
};

enum class Reading {
    Incomplete, // more must come
    Whole,
    BadRequest,    // 400
    TargetTooLong, // 414
    HeadTooLarge   // 431
};

// Reads the head at the beginning of strBytes. If it is complete, cbHead is set to its size; the views in
// head are of strBytes. cbSeen is 0 at first and keeps, from call to call, how much was scanned. So a head
// that comes in pieces costs no more, and is read in the same way.
Reading readHead(std::string_view strBytes, size_t& cbSeen, Head& head, size_t& cbHead);

} // namespace gate

#endif
