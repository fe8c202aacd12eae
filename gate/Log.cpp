#include "Log.h"

#include <poll.h>
#include <unistd.h>

#include "Clock.h"

namespace gate {

void log(int nPriority, const std::string& strText)
{
    static std::string strLast;
    static int64_t nLast = 0;
    const int64_t nNow = now();
    if (strText == strLast && nNow - nLast < SECOND) {
        return;
    }
    strLast = strText;
    nLast = nNow;
    const std::string strLine = "<" + std::to_string(nPriority) + ">" + strText + "\n";
    struct pollfd end = {STDERR_FILENO, POLLOUT, 0};
    if (1 == poll(&end, 1, 0) && end.revents & POLLOUT) {
        [[maybe_unused]] const ssize_t cbWritten = write(STDERR_FILENO, strLine.data(), strLine.size());
    }
}

} // namespace gate
