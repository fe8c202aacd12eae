// The process that reads HTTP. vemo-access-token-gate starts it. Its arguments are the user that it becomes
// and the header of --once-header; its sockets have the numbers of ChildDescriptor.

#include <sys/socket.h>
#include <syslog.h>
#include <unistd.h>

#include <cstdlib>
#include <ctime>
#include <exception>
#include <string>

#include "Confinement.h"
#include "Server.h"
#include "gate/Child.h"
#include "gate/Log.h"

int main(int nArguments, char** rgArguments)
{
    try {
        if (3 != nArguments) {
            gate::log(LOG_ERR, "vemo-access-token-gate starts this program");
            return 2;
        }
        int nListens = 0;
        socklen_t cbListens = sizeof(nListens);
        const bool blStatus =
            0 == getsockopt(gate::CHILD_STATUS, SOL_SOCKET, SO_ACCEPTCONN, &nListens, &cbListens);
        std::string strOnceHeader = rgArguments[2];
        for (char& c : strOnceHeader) {
            c = 'A' <= c && c <= 'Z' ? static_cast<char>(c | 0x20) : c;
        }
        gate::Server server(gate::CHILD_LINK, gate::CHILD_CALLS, blStatus ? gate::CHILD_STATUS : -1,
                            strOnceHeader);
        setenv("TZ", "UTC0", 1); // else the first date would open a time zone file
        tzset();
        gate::confine(rgArguments[1]);
        server.run();
        _exit(EXIT_SUCCESS);
    } catch (const std::exception& exception) {
        gate::log(LOG_ERR, exception.what());
    }
    _exit(EXIT_FAILURE);
}
