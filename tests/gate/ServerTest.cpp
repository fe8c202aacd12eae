// The process that reads HTTP runs in a child of the test. The test acts as its clients and as the other
// process, and moves its clock. A client's user is the number at the end of the client's address.

#include "gate/http/Server.h"

#include <gtest/gtest.h>
#include <signal.h>
#include <sys/mman.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <cstring>
#include <tuple>

#include "gate/Clock.h"

namespace {

// How far the clock is ahead, in ns; shared with the child.
std::atomic<int64_t>* const g_pLater =
    new (mmap(nullptr, sizeof(*g_pLater), PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS, -1, 0))
        std::atomic<int64_t>(0);

} // namespace

extern "C" int clock_gettime(clockid_t clock, struct timespec* pTime) noexcept
{
    const int nResult = static_cast<int>(syscall(SYS_clock_gettime, clock, pTime));
    if (g_pLater && CLOCK_REALTIME != clock) {
        const int64_t nTime = pTime->tv_sec * gate::SECOND + pTime->tv_nsec + *g_pLater;
        *pTime = {nTime / gate::SECOND, nTime % gate::SECOND};
    }
    return nResult;
}

extern "C" int getsockopt(int nSocket, int nLevel, int nOption, void* pValue, socklen_t* pcbValue) noexcept
{
    const long nResult = syscall(SYS_getsockopt, nSocket, nLevel, nOption, pValue, pcbValue);
    if (SO_PEERCRED == nOption) {
        struct sockaddr_un address = {};
        socklen_t cbAddress = sizeof(address);
        getpeername(nSocket, reinterpret_cast<struct sockaddr*>(&address), &cbAddress);
        const char* szUser = strrchr(&address.sun_path[1], ' ');
        static_cast<struct ucred*>(pValue)->uid = static_cast<uid_t>(atoi(szUser ? szUser : "0"));
    }
    return static_cast<int>(nResult);
}

namespace {

using gate::Ask;
using gate::Outcome;
using gate::Reply;
using gate::Request;

const std::string CALL = "GET /grant/Api/get HTTP/1.1\r\nHost: gate\r\nAuthorization: Bearer id\r\n\r\n";
const std::string KEYED = CALL.substr(0, CALL.size() - 2) + "X-Once: key\r\n\r\n";
const std::string NO_CALL = "GET /grant/Api HTTP/1.1\r\nHost: gate\r\n\r\n";

// An end of a connection.
class Socket {
public:
    explicit Socket(int nSocket) : m_nSocket(nSocket)
    {
        const struct timeval timeout = {5, 0};
        setsockopt(nSocket, SOL_SOCKET, SO_RCVTIMEO, &timeout, sizeof(timeout));
    }
    ~Socket() { close(); }
    Socket(Socket&& other) noexcept : m_nSocket(std::exchange(other.m_nSocket, -1)) {}
    Socket& operator=(Socket&& other) noexcept
    {
        std::swap(m_nSocket, other.m_nSocket);
        return *this;
    }
    int number() const { return m_nSocket; }
    void close()
    {
        if (0 <= m_nSocket) {
            ::close(std::exchange(m_nSocket, -1));
        }
    }
    ssize_t send(std::string_view strBytes) const
    {
        return ::send(m_nSocket, strBytes.data(), strBytes.size(), MSG_NOSIGNAL | MSG_DONTWAIT);
    }
    // The next bytes; "end" after the last ones; "error" if receiving fails, also if nothing has come yet.
    std::string receive(int nFlags = 0) const
    {
        char rgBytes[32768];
        const ssize_t cbBytes = recv(m_nSocket, rgBytes, sizeof(rgBytes), nFlags);
        return 0 < cbBytes ? std::string(rgBytes, static_cast<size_t>(cbBytes)) : cbBytes ? "error" : "end";
    }
    std::string status() const { return receive().substr(9, 3); }
    bool isOpen() const { return receive(MSG_DONTWAIT) == "error" && EAGAIN == errno; }

private:
    int m_nSocket;
};

class Server : public testing::Test {
protected:
    void SetUp() override
    {
        struct rlimit files = {};
        getrlimit(RLIMIT_NOFILE, &files);
        files.rlim_cur = files.rlim_max;
        setrlimit(RLIMIT_NOFILE, &files);

        int rgEnd[2];
        ASSERT_EQ(0, socketpair(AF_UNIX, SOCK_SEQPACKET, 0, rgEnd));
        const Socket calls = listening("calls");
        const Socket status = listening("status");
        m_pid = fork();
        if (0 == m_pid) {
            ::close(rgEnd[0]);
            gate::Server(rgEnd[1], calls.number(), status.number(), "x-once").run();
            _exit(0);
        }
        ::close(rgEnd[1]);
        m_link = Socket(rgEnd[0]);
    }

    void TearDown() override
    {
        m_link.close();
        int nStatus = -1;
        waitpid(m_pid, &nStatus, 0);
        EXPECT_EQ(0, nStatus);
    }

    Socket listening(const std::string& strWhat) const
    {
        Socket socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_NONBLOCK, 0));
        at(bind, socket, strWhat);
        listen(socket.number(), 2048);
        return socket;
    }

    // Binds or connects to a name in the abstract name space, which needs no files.
    template <typename Function>
    void at(Function function, const Socket& socket, const std::string& strWhat) const
    {
        struct sockaddr_un address = {};
        address.sun_family = AF_UNIX;
        const std::string strName = "vemo-gate-test " + std::to_string(getpid()) + strWhat;
        memcpy(&address.sun_path[1], strName.data(), strName.size());
        EXPECT_EQ(0, function(socket.number(), reinterpret_cast<const struct sockaddr*>(&address),
                              sizeof(address)));
    }

    // A client of that user, which has sent something.
    Socket client(const std::string& strBytes = "", int nUser = 1000, const char* szWhere = "calls")
    {
        Socket socket(::socket(AF_UNIX, SOCK_STREAM, 0));
        at(bind, socket, " " + std::to_string(++m_nClients) + " " + std::to_string(nUser));
        at(connect, socket, szWhere);
        socket.send(strBytes);
        return socket;
    }

    // The next request to the other process. Requests for figures are answered here.
    Request asked()
    {
        for (;;) {
            const std::optional<Request> request = gate::decodeRequest(m_link.receive());
            if (!request) {
                ADD_FAILURE() << "no request";
                return {};
            }
            if (Ask::Figures != request->ask) {
                return *request;
            }
            Reply told;
            told.nNumber = request->nNumber;
            told.outcome = Outcome::Told;
            told.figures[gate::STORE_BYTES] = 4711;
            m_link.send(gate::encode(told));
        }
    }

    void answer(const Request& request, Outcome outcome)
    {
        Reply answer;
        answer.nNumber = request.nNumber;
        answer.outcome = outcome;
        answer.strUser = Outcome::Granted == outcome ? "anna" : "";
        m_link.send(gate::encode(answer));
    }

    // Returns when the server has handled all earlier events.
    void settle() { EXPECT_EQ("404", client(NO_CALL, 0, "status").status()); }

    void pass(int64_t nTime)
    {
        *g_pLater += nTime;
        answer({}, Outcome::Late); // wakes it up
        settle();
    }

    std::string metric(const std::string& strName)
    {
        const std::string strText =
            client("GET /metrics HTTP/1.1\r\nHost: gate\r\n\r\n", 0, "status").receive();
        const size_t nBegin = strText.find("\n" + strName + " ") + strName.size() + 2;
        return strText.substr(nBegin, strText.find('\n', nBegin) - nBegin);
    }

    // Sends the same text again and again, up to so many bytes, until the server accepts no more. Returns how
    // many bytes it accepted.
    size_t fill(const Socket& socket, const std::string& strBytes, size_t cbMax)
    {
        size_t cbSent = 0;
        for (int nFull = 0; nFull < 20 && cbSent < cbMax;) {
            const ssize_t cbNow = socket.send(strBytes);
            if (0 < cbNow) {
                cbSent += static_cast<size_t>(cbNow);
                nFull = 0;
            } else {
                ++nFull;
                settle();
            }
        }
        return cbSent;
    }

    Socket m_link{-1};
    pid_t m_pid = -1;

private:
    int m_nClients = 0;
};

} // namespace

TEST_F(Server, ClosesConnectionsThatAreTooSlow)
{
    const std::tuple<std::string, std::string, int64_t> CLIENTS[] = {
        {"", "", 75},
        {"G", "", 5},
        {CALL.substr(0, CALL.size() - 1), "", 5},
        {NO_CALL, "401", 75},
        {NO_CALL + "G", "401", 5},
    };
    for (const auto& [strSent, strReceived, nSeconds] : CLIENTS) {
        const Socket slow = client(strSent);
        EXPECT_EQ(strReceived, strReceived.empty() ? "" : slow.status());
        settle();
        pass(nSeconds * gate::SECOND - gate::SECOND / 2);
        EXPECT_TRUE(slow.isOpen()) << strSent;
        pass(gate::SECOND);
        EXPECT_EQ("end", slow.receive()) << strSent;
    }
}

TEST_F(Server, BuffersLittleForAClientThatDoesNotRead)
{
    const Socket greedy = client();
    const size_t cbMuch = 4 << 20; // more than the buffers of all sockets
    std::string strMany;
    while (strMany.size() < 10000) {
        strMany += NO_CALL;
    }
    EXPECT_LT(fill(greedy, strMany, cbMuch), cbMuch);
    pass(6 * gate::SECOND);
    EXPECT_EQ(-1, greedy.send(NO_CALL));
    EXPECT_EQ(EPIPE, errno);
}

TEST_F(Server, ServesAClientThatReadsLate)
{
    const Socket late = client();
    const size_t nSent = fill(late, NO_CALL, SIZE_MAX) / NO_CALL.size();
    shutdown(late.number(), SHUT_WR);
    EXPECT_LT(1000U, nSent) << "more than the server holds";
    const std::string strBegin = "HTTP/1.1 401";
    size_t nReceived = 0;
    std::string strAll;
    for (std::string strNow; (strNow = late.receive()) != "end" && strNow != "error";) {
        strAll += strNow;
    }
    for (size_t n = 0; (n = strAll.find(strBegin, n)) != std::string::npos; ++n) {
        ++nReceived;
    }
    EXPECT_EQ(nSent, nReceived);
}

TEST_F(Server, ClosesTheOldestIdleConnectionToMakeRoom)
{
    const Socket oldest = client("", 2);
    std::vector<Socket> idle;
    for (int i = 0; i < 768; ++i) {
        idle.push_back(client("", 1));
    }
    settle();
    EXPECT_TRUE(idle[0].isOpen());
    const Socket one = client("", 1);
    settle();
    EXPECT_EQ("end", idle[0].receive()) << "the oldest connection of the user who has too many";
    for (int i = 0; i < 254; ++i) {
        idle.push_back(client("", 2));
    }
    settle(); // with the last connection that there is room for
    EXPECT_TRUE(oldest.isOpen());
    EXPECT_TRUE(std::all_of(idle.begin() + 1, idle.end(), [](const Socket& each) { return each.isOpen(); }));
    idle.push_back(client("", 2));
    settle();
    EXPECT_EQ("end", oldest.receive()) << "the oldest connection of all";
    EXPECT_EQ("401", client(NO_CALL, 3).status());
    one.send(NO_CALL);
    EXPECT_EQ("401", one.status());
    EXPECT_TRUE(
        std::all_of(idle.begin() + 768, idle.end(), [](const Socket& each) { return each.isOpen(); }));
}

TEST_F(Server, AsksOnceForCallsWithTheSameKeyWithinFiveSeconds)
{
    for (const auto& [outcome, szStatus] : {std::pair(Outcome::Granted, "200"), {Outcome::Refused, "403"}}) {
        const Socket first = client(KEYED);
        const Request request = asked();
        const Socket second = client(KEYED);
        settle();
        answer(request, outcome);
        EXPECT_EQ(szStatus, first.status());
        EXPECT_EQ(szStatus, second.status());
        pass(3 * gate::SECOND);
        EXPECT_EQ(szStatus, client(KEYED).status());
        pass(2 * gate::SECOND);
    }
    EXPECT_EQ("4", metric("vemo_gate_repeated_total"));
    const Socket later = client();
    for (const Outcome outcome : {Outcome::Failed, Outcome::Late}) { // nothing was spent
        later.send(KEYED);
        answer(asked(), outcome);
        EXPECT_EQ("503", later.status());
    }
}

TEST_F(Server, KeepsTheKeyOfADisconnectedClientUntilItsCallIsDecided)
{
    for (const bool blCancelled : {true, false}) {
        Socket gone = client(KEYED);
        const Request request = asked();
        gone.close();
        const Request cancel = asked();
        EXPECT_EQ(Ask::Cancel, cancel.ask);
        EXPECT_EQ(request.nNumber, cancel.nNumber);
        const Socket again = client(KEYED);
        const Socket andAgain = client(KEYED);
        settle();
        Request decided = request;
        if (blCancelled) {
            answer(request, Outcome::Cancelled);
            decided = asked();
            EXPECT_EQ(Ask::Grant, decided.ask);
            EXPECT_LT(request.nNumber, decided.nNumber);
        }
        answer(decided, Outcome::Granted);
        EXPECT_EQ("200", again.status());
        EXPECT_EQ("200", andAgain.status());
        EXPECT_EQ("200", client(KEYED).status());
        pass(6 * gate::SECOND);
    }
}

TEST_F(Server, ReportsTheFiguresThatItReceivedAndNoOthers)
{
    const Socket call = client(CALL);
    answer(asked(), Outcome::Refused); // asked() also answers the request for figures
    EXPECT_EQ("403", call.status());
    EXPECT_EQ("4711", metric("vemo_gate_store_bytes"));
    Socket prober = client("GET /health HTTP/1.1\r\nHost: gate\r\n\r\n", 0, "status");
    const Request health = asked();
    EXPECT_EQ(Ask::Health, health.ask);
    prober.close();
    EXPECT_EQ(Ask::Cancel, asked().ask);
    answer(health, Outcome::Told);
    EXPECT_EQ("4711", metric("vemo_gate_store_bytes"));
}

TEST_F(Server, LimitsTheQueueToTheOtherProcess)
{
    size_t nClients = 0;
    for (std::string strStatus; strStatus != "503" && ++nClients < 8000;) {
        const Socket one = client(CALL);
        if (nClients % 100 == 0) { // all others have disconnected
            const struct timeval timeout = {0, 50000};
            setsockopt(one.number(), SOL_SOCKET, SO_RCVTIMEO, &timeout, sizeof(timeout));
            const std::string strReceived = one.receive();
            strStatus = strReceived.size() > 12 ? strReceived.substr(9, 3) : "";
        }
    }
    EXPECT_GT(8000U, nClients);
    for (int nEmpty = 0; nEmpty < 3;) { // the other process goes on
        const bool blEmpty = m_link.receive(MSG_DONTWAIT) == "error";
        nEmpty = blEmpty ? nEmpty + 1 : 0;
        if (blEmpty) {
            settle();
        }
    }
    const Socket last = client(CALL);
    answer(asked(), Outcome::Refused);
    EXPECT_EQ("403", last.status());
}

TEST_F(Server, ServesConnectedClientsBeforeItStops)
{
    settle();
    kill(m_pid, SIGSTOP);
    std::vector<Socket> clients;
    for (size_t i = 0; i < 200; ++i) {
        clients.push_back(client(CALL));
    }
    answer({}, Outcome::Stop);
    kill(m_pid, SIGCONT);
    for (size_t i = 0; i < clients.size(); ++i) {
        answer(asked(), Outcome::Granted);
    }
    for (const Socket& one : clients) {
        EXPECT_NE(std::string::npos, one.receive().find("\r\nConnection: close\r\n"));
        EXPECT_EQ("end", one.receive());
    }
}
