// vemo-access-token-gate grants tokens over HTTP to programs that are not root. This process runs as root and
// holds the token database. It starts another one, which reads HTTP and may do nothing else.

#include <fcntl.h>
#include <getopt.h>
#include <signal.h>
#include <sys/signalfd.h>
#include <sys/wait.h>
#include <syslog.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <exception>
#include <memory>
#include <string>
#include <system_error>

#include "AccessTokenUtil.h"
#include "Child.h"
#include "Log.h"
#include "Service.h"
#include "Sockets.h"

namespace {

const char* const GROUP = "vemo-access-token"; // whose users may ask

const char* const HELP = R"(usage: vemo-access-token-gate [--socket PATH] [--status-socket PATH]
                              [--user NAME] [--once-header NAME]
Grants access tokens over HTTP on a Unix socket, to the group vemo-access-token.
  --socket PATH         listen there for calls, unless the service manager
                        passes sockets
  --status-socket PATH  listen there for /health and /metrics
  --user NAME           the user as whom the process that reads HTTP runs
                        (default: vemo-access-token-gate)
  --once-header NAME    the header by whose value a repeated call is recognised
  --help, --version     print this, or the version, and exit
The manual page vemo-access-token-gate(8) tells the rest.
)";

struct Options {
    std::string strSocket;
    std::string strStatusSocket;
    gate::Child child = {VEMO_GATE_CHILD, "vemo-access-token-gate", ""};
};

bool isHeaderName(const std::string& strName)
{
    return !strName.empty() && std::string::npos == strName.find_first_not_of(
                                                        "abcdefghijklmnopqrstuvwxyzABCDEFGHIJKLMNOPQRSTUVWXYZ"
                                                        "0123456789!#$%&'*+-.^_`|~");
}

Options read(int nArguments, char** rgArguments)
{
    enum { SOCKET = 1, STATUS_SOCKET, USER, ONCE_HEADER, SHOW_HELP, SHOW_VERSION };
    static const struct option rgOption[] = {
        {"socket", required_argument, nullptr, SOCKET},
        {"status-socket", required_argument, nullptr, STATUS_SOCKET},
        {"user", required_argument, nullptr, USER},
        {"once-header", required_argument, nullptr, ONCE_HEADER},
        {"help", no_argument, nullptr, SHOW_HELP},
        {"version", no_argument, nullptr, SHOW_VERSION},
        {},
    };
    Options options;
    for (int nOption = 0; 0 <= (nOption = getopt_long(nArguments, rgArguments, "", rgOption, nullptr));) {
        switch (nOption) {
        case SOCKET: options.strSocket = optarg; break;
        case STATUS_SOCKET: options.strStatusSocket = optarg; break;
        case USER: options.child.strUser = optarg; break;
        case ONCE_HEADER:
            options.child.strOnceHeader = optarg;
            if (!isHeaderName(optarg)) { // no request could have it, so each repetition would spend a use
                fprintf(stderr, "vemo-access-token-gate: \"%s\" is no name of a header\n", optarg);
                exit(2);
            }
            break;
        case SHOW_HELP: fputs(HELP, stdout); exit(EXIT_SUCCESS);
        case SHOW_VERSION: puts("vemo-access-token-gate " VEMO_ATOKEN_VERSION); exit(EXIT_SUCCESS);
        default: exit(2);
        }
    }
    if (optind < nArguments) {
        fprintf(stderr, "vemo-access-token-gate: unexpected argument \"%s\"\n", rgArguments[optind]);
        exit(2);
    }
    return options;
}

// Opens each closed standard stream, so that no socket gets its number. Ignores SIGPIPE, so that a log that
// nobody reads does not end the gate. The child inherits both.
void prepareStreams()
{
    int nStream = 0;
    do {
        nStream = open("/dev/null", O_RDWR);
    } while (0 <= nStream && nStream <= STDERR_FILENO);
    if (STDERR_FILENO < nStream) {
        close(nStream);
    }
    signal(SIGPIPE, SIG_IGN);
}

gate::Sockets listenWhere(const Options& options)
{
    gate::Sockets sockets = gate::handedOver();
    if (0 <= sockets.nCalls) {
        return sockets;
    }
    if (options.strSocket.empty()) {
        fputs("vemo-access-token-gate: no socket was handed over, and none is named by --socket\n", stderr);
        exit(2);
    }
    if (options.strSocket == options.strStatusSocket) {
        fputs("vemo-access-token-gate: --socket and --status-socket name the same path\n", stderr);
        exit(2);
    }
    sockets.nCalls = gate::listenAt(options.strSocket, GROUP);
    if (!options.strStatusSocket.empty()) {
        sockets.nStatus = gate::listenAt(options.strStatusSocket, GROUP);
    }
    return sockets;
}

// Blocks SIGTERM and SIGINT, and returns a descriptor that reads them.
int catchSignals()
{
    sigset_t signals;
    sigemptyset(&signals);
    sigaddset(&signals, SIGTERM);
    sigaddset(&signals, SIGINT);
    sigprocmask(SIG_BLOCK, &signals, nullptr);
    const int nSignals = signalfd(-1, &signals, SFD_CLOEXEC | SFD_NONBLOCK);
    if (0 > nSignals) {
        throw std::system_error(errno, std::generic_category(), "signalfd");
    }
    return nSignals;
}

int serve(const Options& options)
{
    if (0 != geteuid()) {
        throw std::runtime_error("the token database is root's: run it as root");
    }
    const gate::Sockets sockets = listenWhere(options);
    const int nSignals = catchSignals();
    auto pLink = std::make_unique<gate::Link>(gate::start(options.child, sockets));
    // The library's log lines are discarded: they hold whole ids, and would be written within transactions.
    if (!freopen("/dev/null", "w", stdout)) {
        throw std::system_error(errno, std::generic_category(), "/dev/null");
    }
    VEMO_ACCESS_TOKEN::logToStdout(true);
    VEMO_ACCESS_TOKEN::tokenType(); // the first call must be made before there are threads

    const bool blAsked = (new gate::Service(*pLink, nSignals))->run();
    pLink.reset(); // then the other process ends
    int nStatus = 0;
    wait(&nStatus);
    if (blAsked && 0 == nStatus) {
        return EXIT_SUCCESS;
    }
    gate::log(LOG_ERR,
              WIFSIGNALED(nStatus)
                  ? "the process that reads HTTP was ended by signal " + std::to_string(WTERMSIG(nStatus))
                  : "the process that reads HTTP ended with " + std::to_string(WEXITSTATUS(nStatus)));
    return EXIT_FAILURE;
}

} // namespace

int main(int nArguments, char** rgArguments)
{
    prepareStreams();
    try {
        // _exit(), because threads of the service may be stuck, and nothing may wait for them.
        _exit(serve(read(nArguments, rgArguments)));
    } catch (const std::exception& exception) {
        gate::log(LOG_ERR, std::string("vemo-access-token-gate: ") + exception.what());
    }
    _exit(EXIT_FAILURE);
}
