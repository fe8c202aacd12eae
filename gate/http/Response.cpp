#include "Response.h"

#include <ctime>

namespace {

struct Status {
    int nStatus;
    const char* szLine;
    const char* szHeaders;
    const char* szBody;
};

const Status STATUSES[] = {
    {200, "200 OK", "", ""},
    {400, "400 Bad Request", "", "malformed\n"},
    {401, "401 Unauthorized", "WWW-Authenticate: Bearer\r\n",
     "a token is needed: Authorization: Bearer ID\n"},
    {403, "403 Forbidden", "", "refused\n"},
    {404, "404 Not Found", "", "there are /health and /metrics\n"},
    {405, "405 Method Not Allowed", "Allow: GET, HEAD\r\n", "not by this method\n"},
    {414, "414 URI Too Long", "", "too long\n"},
    {431, "431 Request Header Fields Too Large", "", "too large\n"},
    {503, "503 Service Unavailable", "Retry-After: 1\r\n", "not now; nothing was spent\n"},
};

const Status& statusOf(int nStatus)
{
    for (const Status& status : STATUSES) {
        if (nStatus == status.nStatus) {
            return status;
        }
    }
    return STATUSES[1];
}

// The header "Date", made once in each second.
const std::string& date()
{
    static time_t nLast = 0;
    static std::string strDate;
    const time_t nNow = time(nullptr);
    if (nNow != nLast) {
        struct tm tmNow = {};
        char szDate[64] = "";
        gmtime_r(&nNow, &tmNow);
        strftime(szDate, sizeof(szDate), "Date: %a, %d %b %Y %T GMT\r\n", &tmNow);
        strDate = szDate;
        nLast = nNow;
    }
    return strDate;
}

std::string response(const Status& status, std::string_view strHeaders, std::string_view strType,
                     std::string_view strBody, const gate::Manner& manner)
{
    std::string strResponse;
    strResponse.reserve(512 + strBody.size());
    strResponse.append("HTTP/1.1 ").append(status.szLine).append("\r\n").append(date());
    strResponse.append(status.szHeaders).append(strHeaders).append("Cache-Control: no-store\r\n");
    if (!strBody.empty()) {
        strResponse.append("Content-Type: ").append(strType).append("\r\n");
    }
    strResponse.append("Content-Length: ").append(std::to_string(strBody.size())).append("\r\n");
    if (!manner.blKeepAlive || manner.blOld) {
        strResponse.append(manner.blKeepAlive ? "Connection: keep-alive\r\n" : "Connection: close\r\n");
    }
    strResponse.append("\r\n");
    if (!manner.blHead) {
        strResponse.append(strBody);
    }
    return strResponse;
}

} // namespace

namespace gate {

std::string headerText(std::string_view strText)
{
    const char* const HEX = "0123456789ABCDEF";
    std::string strHeader;
    for (const char c : strText) {
        const unsigned char n = static_cast<unsigned char>(c);
        if (' ' < n && n < 0x7f && '%' != c) {
            strHeader += c;
        } else {
            strHeader.append({'%', HEX[n >> 4], HEX[n & 15]});
        }
    }
    return strHeader;
}

std::string grantedResponse(const Reply& answer, const Manner& manner)
{
    std::string strHeaders = "X-Token-User: " + headerText(answer.strUser);
    strHeaders.append("\r\nX-Token-Uid: ").append(std::to_string(answer.nUid));
    strHeaders.append("\r\nX-Token-Function: ").append(headerText(answer.strFunction)).append("\r\n");
    return response(statusOf(200), strHeaders, "application/json", answer.strRecord, manner);
}

std::string plainResponse(int nStatus, const Manner& manner)
{
    const Status& status = statusOf(nStatus);
    return response(status, "", "text/plain", status.szBody, manner);
}

std::string textResponse(int nStatus, std::string_view strType, std::string_view strBody,
                         const Manner& manner)
{
    return response(statusOf(nStatus), "", strType, strBody, manner);
}

} // namespace gate
