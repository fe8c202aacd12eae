#include "Head.h"

#include <algorithm>
#include <optional>

namespace {

bool isToken(char c)
{
    return ('0' <= c && c <= '9') || ('a' <= (c | 0x20) && (c | 0x20) <= 'z') ||
           std::string_view::npos != std::string_view("!#$%&'*+-.^_`|~").find(c);
}

bool isToken(std::string_view strText)
{
    return !strText.empty() && std::all_of(strText.begin(), strText.end(), [](char c) { return isToken(c); });
}

// Whether a byte may be in a value: any but control characters, and the tab.
bool isText(char c)
{
    const unsigned char n = static_cast<unsigned char>(c);
    return '\t' == c || (' ' <= n && 0x7f != n);
}

std::string lower(std::string_view strText)
{
    std::string strLower(strText);
    for (char& c : strLower) {
        c = 'A' <= c && c <= 'Z' ? static_cast<char>(c | 0x20) : c;
    }
    return strLower;
}

std::string_view trimmed(std::string_view strText)
{
    const size_t nBegin = strText.find_first_not_of(" \t");
    if (std::string_view::npos == nBegin) {
        return {};
    }
    return strText.substr(nBegin, strText.find_last_not_of(" \t") - nBegin + 1);
}

// Cuts off the text up to a separator, or all of it if there is none. Returns it without the separator.
std::string_view cut(std::string_view& strText, std::string_view strSeparator)
{
    const size_t nEnd = strText.find(strSeparator);
    const std::string_view strPart = strText.substr(0, nEnd);
    strText.remove_prefix(std::string_view::npos == nEnd ? strText.size() : nEnd + strSeparator.size());
    return strPart;
}

// Looks, from nPlace on, for the end of the head, or for bytes that no head can have: a control character, or
// a line that does not end in CR LF. Moves nPlace there.
enum class Scan { Incomplete, End, Bad };
Scan scan(std::string_view strBytes, size_t& nPlace)
{
    for (; nPlace < strBytes.size(); ++nPlace) {
        const char c = strBytes[nPlace];
        if ('\n' == c) {
            if (0 == nPlace || '\r' != strBytes[nPlace - 1]) {
                return Scan::Bad;
            }
            if (3 <= nPlace && "\r\n\r" == strBytes.substr(nPlace - 3, 3)) {
                ++nPlace;
                return Scan::End;
            }
        } else if ((0 < nPlace && '\r' == strBytes[nPlace - 1]) || ('\r' != c && !isText(c))) {
            return Scan::Bad;
        }
    }
    return Scan::Incomplete;
}

bool readLine(std::string_view strLine, gate::Head& head)
{
    head.strMethod = cut(strLine, " ");
    head.strTarget = cut(strLine, " ");
    head.blOld = "HTTP/1.0" == strLine;
    const bool blPlain = std::all_of(head.strTarget.begin(), head.strTarget.end(), [](char c) {
        return '\t' != c; // a blank would have ended the target
    });
    return isToken(head.strMethod) && !head.strTarget.empty() && blPlain &&
           (head.blOld || "HTTP/1.1" == strLine);
}

bool readHeader(std::string_view strLine, gate::Head& head)
{
    const size_t nColon = strLine.find(':');
    if (std::string_view::npos == nColon || !isToken(strLine.substr(0, nColon))) {
        return false; // also for a continuation of the line before
    }
    head.headers.push_back({lower(strLine.substr(0, nColon)), trimmed(strLine.substr(nColon + 1))});
    return true;
}

// Whether a body follows; nothing if that is not clear.
std::optional<bool> announcesBody(const gate::Head& head)
{
    const size_t nCoded = head.count("transfer-encoding");
    const size_t nSized = head.count("content-length");
    if (nCoded) {
        const bool blClear =
            1 == nCoded && 0 == nSized && !head.blOld && "chunked" == lower(head.value("transfer-encoding"));
        return blClear ? std::optional<bool>(true) : std::nullopt;
    }
    if (0 == nSized) {
        return false;
    }
    const std::string_view strSize = head.value("content-length");
    const bool blNumber = !strSize.empty() && strSize.size() <= 18 &&
                          std::string_view::npos == strSize.find_first_not_of("0123456789");
    if (1 != nSized || !blNumber) {
        return std::nullopt;
    }
    return std::string_view::npos != strSize.find_first_not_of('0');
}

} // namespace

namespace gate {

size_t Head::count(std::string_view strName) const
{
    return static_cast<size_t>(std::count_if(headers.begin(), headers.end(), [strName](const Header& header) {
        return strName == header.strName;
    }));
}

std::string_view Head::value(std::string_view strName) const
{
    for (const Header& header : headers) {
        if (strName == header.strName) {
            return header.strValue;
        }
    }
    return {};
}

bool Head::lists(std::string_view strName, std::string_view strElement) const
{
    for (const Header& header : headers) {
        std::string_view strRest = strName == header.strName ? header.strValue : std::string_view();
        while (!strRest.empty()) {
            std::string_view strOne = cut(strRest, ",");
            if (strElement == lower(trimmed(cut(strOne, ";")))) {
                return true;
            }
        }
    }
    return false;
}

Reading readHead(std::string_view strBytes, size_t& cbSeen, Head& head, size_t& cbHead)
{
    if (!strBytes.empty() && !isToken(strBytes[0])) {
        return Reading::BadRequest;
    }
    const Scan found = scan(strBytes, cbSeen);
    const size_t cbLine = strBytes.substr(0, cbSeen).find('\r');
    // Limits come first, because the bytes after them may not have come yet.
    if (std::min(cbLine, cbSeen) > LINE_MAX_BYTES) {
        return Reading::TargetTooLong;
    }
    if (cbSeen > HEAD_MAX_BYTES) {
        return Reading::HeadTooLarge;
    }
    if (Scan::Bad == found) {
        return Reading::BadRequest;
    }
    if (Scan::Incomplete == found) {
        return Reading::Incomplete;
    }

    cbHead = cbSeen;
    head = Head();
    std::string_view strRest = strBytes.substr(0, cbHead - 2); // without the empty line
    if (!readLine(cut(strRest, "\r\n"), head)) {
        return Reading::BadRequest;
    }
    while (!strRest.empty()) {
        if (HEADERS_MAX == head.headers.size()) {
            return Reading::HeadTooLarge;
        }
        if (!readHeader(cut(strRest, "\r\n"), head)) {
            return Reading::BadRequest;
        }
    }
    const std::optional<bool> blBody = announcesBody(head);
    if (!blBody || head.count("host") > 1 || (0 == head.count("host") && !head.blOld)) {
        return Reading::BadRequest;
    }
    head.blBody = *blBody;
    head.blKeepAlive = !head.blBody && !head.lists("connection", "close") &&
                       (!head.blOld || head.lists("connection", "keep-alive"));
    return Reading::Whole;
}

} // namespace gate
