// One connection of a client, as bytes: what has come and what is to go. It never blocks.

#ifndef GATE_HTTP_CONNECTION_H
#define GATE_HTTP_CONNECTION_H

#include <event2/event.h>
#include <sys/types.h>

#include <cstdint>
#include <functional>
#include <memory>
#include <string>

#include "Response.h"

namespace gate {

struct EventDeleter {
    void operator()(struct event* pEvent) const { event_free(pEvent); }
};
typedef std::unique_ptr<struct event, EventDeleter> Event;

class Connection {
public:
    enum class State {
        Reading, // of the next head
        Waiting, // for the answer to a call
        Closing, // the last response has gone; what still comes is thrown away
    };

    // Takes over a socket. fChanged is called when something has come or gone that needs a decision: a head
    // may be whole, or the connection is over.
    Connection(struct event_base* pBase, int nSocket, bool blStatus,
               std::function<void(Connection&)> fChanged);
    ~Connection();
    Connection(const Connection&) = delete;
    Connection& operator=(const Connection&) = delete;

    const bool blStatus; // for /health and /metrics, not for calls
    uid_t uid = 0;       // of the client; that of nobody where the socket does not tell
    uint64_t nCall = 0;  // the number of the call it waits for
    Manner manner;       // for the next response
    int64_t nSince;      // when the state began
    State state = State::Reading;

    // What has come and was not taken yet, and how much of it readHead has seen.
    std::string strInput;
    size_t cbSeen = 0;

    // Removes the beginning of what has come.
    void take(size_t cbBytes);

    // Sends a response, and goes on or closes as its manner says.
    void send(const std::string& strResponse);

    // Ends it at once.
    void end() { m_blOver = true; }

    // All is over: nothing comes, and nothing can go. The object is to be destroyed.
    bool isOver() const { return m_blOver; }

    // No byte of a next head has come, and no response is on its way.
    bool isIdle() const { return State::Reading == state && strInput.empty() && m_strOutput.empty(); }

    // Whether the next head can be read.
    bool isReady() const { return State::Reading == state && m_strOutput.empty() && !m_blOver; }

    // The client sends nothing more.
    bool hasEnded() const { return m_blEnded; }

    // The client has closed its end for both directions.
    bool hasGone() const;

    void changeTo(State stateNew);

private:
    static void onReadable(int nSocket, short, void* pConnection);
    static void onWritable(int nSocket, short, void* pConnection);
    void receive();
    void flush();
    void finish();

    const int m_nSocket;
    const std::function<void(Connection&)> m_fChanged;
    std::string m_strOutput;
    Event m_readable;
    Event m_writable;
    bool m_blEnded = false;
    bool m_blOver = false;
};

} // namespace gate

#endif
