// The process that reads HTTP: its connections, and its questions to the other process.

#ifndef GATE_HTTP_SERVER_H
#define GATE_HTTP_SERVER_H

#include <event2/event.h>

#include <list>
#include <memory>
#include <string>
#include <unordered_map>
#include <vector>

#include "Call.h"
#include "Connection.h"
#include "Metrics.h"
#include "Repeats.h"
#include "gate/Link.h"

namespace gate {

// The most descriptors that serving needs.
const size_t DESCRIPTORS = 1024 + 64;

class Server {
public:
    // nCalls and nStatus are listening sockets; nStatus is -1 for none. Takes over all three descriptors.
    Server(int nLink, int nCalls, int nStatus, std::string strOnceHeader);

    // Serves until the other process ends, or until it asks to stop and all calls are answered.
    void run();

private:
    struct BaseDeleter {
        void operator()(struct event_base* pBase) const { event_base_free(pBase); }
    };
    typedef std::list<Connection> Connections;
    // A question to the other process that was not answered yet.
    struct Asked {
        std::vector<Connection*> waiting; // for the answer; several if the call was repeated
        Call call;                        // for Ask::Grant
        std::string strKey;               // for Repeats; empty: none
        bool blHealth = false;
    };

    Event listen(int nSocket);
    static void onConnection(int nSocket, short, void* pServer);
    static void onLink(int, short, void* pServer);
    static void onTick(int, short, void* pServer);
    void accept(int nSocket);
    bool makeRoomFor(const Connection& connection);
    bool closeOldest(const Connection& newest, bool blOfUser);
    void changed(Connection& connection);
    void readNext(Connection& connection);
    void readStatus(Connection& connection, const Head& head);
    void askCall(Connection& connection, const Call& call);
    void ask(Request request, Connection& connection, Asked asked);
    void respond(Connection& connection, int nStatus, const std::string& strResponse);
    void respond(Connection& connection, int nStatus);
    void respond(Connection& connection, const Reply& answer);
    void forget(Connection& connection);
    void sweep();
    void take(std::string_view strMessage);
    void tick();
    void stop();

    const std::unique_ptr<struct event_base, BaseDeleter> m_pBase;
    const std::string m_strOnceHeader;
    Link m_link;
    const int m_nCalls;
    const int m_nStatus;
    Connections m_connections;
    bool m_blOver = false;                       // some are over; sweep() destroys them
    std::unordered_map<uint64_t, Asked> m_asked; // by number
    uint64_t m_nNumber = 0;                      // the last number that was used
    Repeats m_repeats;
    Metrics m_metrics;
    Figures m_figures = {};
    uint64_t m_nFigures = 0; // the number of the last request for figures
    int64_t m_nTickAt = 0;
    int64_t m_nStopping = 0; // when it was asked to stop; 0: it was not
    bool m_blAlone = false;  // the other process has ended
    // The events are last, so that they are destroyed before what they refer to.
    Event m_linkReadable;
    Event m_linkWritable;
    Event m_tick;
    Event m_callsListening;
    Event m_statusListening;
};

} // namespace gate

#endif
