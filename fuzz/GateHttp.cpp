// What clients send to the gate.

#include "Require.h"
#include "gate/Messages.h"
#include "gate/http/Call.h"

namespace {

using gate::Call;
using gate::Head;
using gate::Reading;

struct Read {
    Reading reading = Reading::Incomplete;
    Head head;
    size_t cbHead = 0;
};

// The first bytes arrive at once, and the others one by one.
Read readFrom(size_t cbFirst, std::string_view strBytes)
{
    Read read;
    size_t cbSeen = 0;
    for (size_t cb = cbFirst; cb <= strBytes.size() && Reading::Incomplete == read.reading; ++cb) {
        read.reading = gate::readHead(strBytes.substr(0, cb), cbSeen, read.head, read.cbHead);
    }
    return read;
}

// The head in its simplest form.
std::string plain(const Head& head)
{
    std::string strPlain;
    strPlain.append(head.strMethod).append(" ").append(head.strTarget);
    strPlain.append(head.blOld ? " HTTP/1.0\r\n" : " HTTP/1.1\r\n");
    for (const Head::Header& header : head.headers) {
        strPlain.append(header.strName).append(":").append(header.strValue).append("\r\n");
    }
    return strPlain + "\r\n";
}

Read readAtOnce(std::string_view strBytes)
{
    return readFrom(strBytes.size(), strBytes);
}

void requireSame(const Read& one, const Read& other)
{
    FUZZ_REQUIRE(one.reading == other.reading);
    if (Reading::Whole == one.reading) {
        FUZZ_REQUIRE(plain(one.head) == plain(other.head));
        FUZZ_REQUIRE(one.head.blBody == other.head.blBody);
        FUZZ_REQUIRE(one.head.blKeepAlive == other.head.blKeepAlive);
    }
}

// Whether any reader finds the same lines: they end with CR LF, and there are no other control characters.
bool hasPlainLines(std::string_view strHead, size_t nLines)
{
    size_t nFound = 0;
    for (size_t n = 0; n < strHead.size(); ++n) {
        if ("\r\n" == strHead.substr(n, 2)) {
            ++n;
            ++nFound;
        } else if (const auto c = static_cast<unsigned char>(strHead[n]);
                   (c < ' ' && '\t' != c) || 0x7f == c) {
            return false;
        }
    }
    return nFound == nLines;
}

std::string escaped(const std::string& strPart)
{
    const char* const HEX = "0123456789abcdef";
    std::string strEscaped;
    for (const char c : strPart) {
        const auto n = static_cast<unsigned char>(c);
        strEscaped.append({'%', HEX[n >> 4], HEX[n & 15]});
    }
    return strEscaped;
}

// The same call in its simplest form.
std::string plain(const Call& call)
{
    std::string strPlain = "GET /grant/" + escaped(call.strApi);
    strPlain.append(call.strMethod.empty() ? "" : "/" + escaped(call.strMethod))
        .append(" HTTP/1.1\r\nHost:\r\n");
    strPlain.append("X-Once: " + call.strOnce + "\r\nAuthorization: Bearer " + call.strTid + "\r\n");
    return strPlain + (call.blRecord ? "Accept: application/json\r\n\r\n" : "\r\n");
}

void requireSound(const Call& call)
{
    gate::Request request;
    request.strTid = call.strTid;
    request.strApi = call.strApi;
    request.strMethod = call.strMethod;
    FUZZ_REQUIRE(gate::decodeRequest(gate::encode(request))); // the other process ends if this fails
    FUZZ_REQUIRE(std::string::npos == call.strApi.find('/') && std::string::npos == call.strMethod.find('/'));
    const std::string strPlain = plain(call);
    Call again;
    FUZZ_REQUIRE(0 == gate::readCall(readAtOnce(strPlain).head, "x-once", again));
    FUZZ_REQUIRE(plain(again) == strPlain);
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* pBytes, size_t cbBytes)
{
    const std::string_view strBytes(reinterpret_cast<const char*>(pBytes), cbBytes);
    const Read read = readAtOnce(strBytes);
    const Read slowly = readFrom(0, strBytes);
    requireSame(read, slowly);
    if (Reading::Whole != read.reading) {
        return 0;
    }
    const Head& head = read.head;
    FUZZ_REQUIRE(read.cbHead == slowly.cbHead && read.cbHead <= cbBytes);
    FUZZ_REQUIRE(hasPlainLines(strBytes.substr(0, read.cbHead), head.headers.size() + 2));
    const std::string strPlain = plain(head);
    const std::string strMore = strPlain + "what follows";
    const Read again = readAtOnce(strMore);
    requireSame(read, again);
    FUZZ_REQUIRE(again.cbHead == strPlain.size());
    // The length of a request is given at most once. If it is unknown, the connection ends after it.
    const size_t nCoded = head.count("transfer-encoding");
    const size_t nSized = head.count("content-length");
    FUZZ_REQUIRE(nCoded + nSized <= 1 && head.count("host") <= 1);
    FUZZ_REQUIRE(!(head.blKeepAlive && head.blBody) && (nCoded ? head.blBody : true));
    Call call;
    if (0 == gate::readCall(head, "x-once", call)) {
        requireSound(call);
    }
    return 0;
}
