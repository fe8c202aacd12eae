#include "Call.h"

#include <algorithm>

#include "gate/Messages.h"

namespace {

const size_t ONCE_MAX = 128;

int hexDigit(char c)
{
    if ('0' <= c && c <= '9') {
        return c - '0';
    }
    const char cLower = static_cast<char>(c | 0x20);
    return 'a' <= cLower && cLower <= 'f' ? cLower - 'a' + 10 : -1;
}

// Takes the first part of a path, and removes it with the slash before it. Returns false for a part that has
// no meaning here, or could have two.
bool takePart(std::string_view& strPath, std::string& strPart)
{
    strPath.remove_prefix(1);
    const size_t cbPart = std::min(strPath.find('/'), strPath.size());
    for (size_t i = 0; i < cbPart; ++i) {
        char c = strPath[i];
        if ('%' == c) {
            const int nHigh = i + 2 < cbPart ? hexDigit(strPath[i + 1]) : -1;
            const int nLow = i + 2 < cbPart ? hexDigit(strPath[i + 2]) : -1;
            if (0 > nHigh || 0 > nLow) {
                return false;
            }
            c = static_cast<char>(16 * nHigh + nLow);
            i += 2;
        }
        if ('\0' == c || '/' == c) {
            return false;
        }
        strPart += c;
    }
    strPath.remove_prefix(cbPart);
    return !strPart.empty() && strPart != "." && strPart != "..";
}

int readTarget(std::string_view strTarget, gate::Call& call)
{
    const std::string_view strGrant = "/grant/";
    if (strTarget.substr(0, strGrant.size()) != strGrant || std::string_view::npos != strTarget.find('#')) {
        return 400;
    }
    std::string_view strPath = strTarget.substr(strGrant.size() - 1);
    strPath = strPath.substr(0, strPath.find('?'));
    // An empty method is refused: it must not mean the API alone, which would allow more than expected.
    if (!takePart(strPath, call.strApi) || (!strPath.empty() && !takePart(strPath, call.strMethod))) {
        return 400;
    }
    return call.strApi.size() > gate::API_MAX || call.strMethod.size() > gate::METHOD_MAX ? 414 : 0;
}

// The id in "Bearer ID"; empty if there is none.
std::string_view bearer(std::string_view strCredential)
{
    const std::string_view strScheme = "bearer ";
    if (strCredential.size() <= strScheme.size()) {
        return {};
    }
    for (size_t i = 0; i < strScheme.size(); ++i) {
        if ((' ' == strScheme[i] ? strCredential[i] : strCredential[i] | 0x20) != strScheme[i]) {
            return {};
        }
    }
    strCredential.remove_prefix(strScheme.size());
    strCredential.remove_prefix(std::min(strCredential.find_first_not_of(' '), strCredential.size()));
    return strCredential;
}

} // namespace

namespace gate {

int readCall(const Head& head, const std::string& strOnceHeader, Call& call)
{
    if ("CONNECT" == head.strMethod || "TRACE" == head.strMethod) {
        return 405;
    }
    if (const int nStatus = readTarget(head.strTarget, call)) {
        return nStatus;
    }
    if (head.count("authorization") > 1) {
        return 400;
    }
    call.strTid = bearer(head.value("authorization"));
    if (call.strTid.empty()) {
        return 401;
    }
    if (call.strTid.size() > TID_MAX || std::string::npos != call.strTid.find_first_of(" \t")) {
        return 403; // no id can look like this
    }
    if (!strOnceHeader.empty()) {
        call.strOnce = head.value(strOnceHeader);
        if (head.count(strOnceHeader) > 1 || call.strOnce.size() > ONCE_MAX) {
            return 400;
        }
    }
    call.blRecord = head.lists("accept", "application/json");
    return 0;
}

} // namespace gate
