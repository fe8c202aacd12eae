// The head of an HTTP/1 request, read strictly: what two readers could read in two ways is refused. A proxy
// sends the requests of many clients over one connection, and who makes it and the gate disagree about where
// a request ends would get another client's answer.
//
// Bodies are not read: a request that announces one is answered, and its connection ends.

#ifndef GATE_HTTP_HEAD_H
#define GATE_HTTP_HEAD_H

#include <cstddef>
#include <string>
#include <string_view>
#include <vector>

namespace gate {

const size_t LINE_MAX_BYTES = 16384; // of the request line
const size_t HEAD_MAX_BYTES = 65536; // of all, cookies included
const size_t HEADERS_MAX = 256;

struct Head {
    std::string_view strMethod;
    std::string_view strTarget;
    bool blOld = false;       // of HTTP/1.0
    bool blKeepAlive = false; // the connection can take another request afterwards
    bool blBody = false;      // a body follows

    // How many headers of a name there are (in lower case), and the value of the first.
    size_t count(std::string_view strName) const;
    std::string_view value(std::string_view strName) const;

    // Whether an element (in lower case) stands in the headers of a name that are lists. Parameters do not
    // count.
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

// Reads the head that strBytes begins with. cbHead receives its size when it is whole; the head's views are
// of strBytes. cbSeen, 0 at first, tells from call to call how much has been looked at, so that a slow head
// costs no more than a quick one, and is read alike.
Reading readHead(std::string_view strBytes, size_t& cbSeen, Head& head, size_t& cbHead);

} // namespace gate

#endif
