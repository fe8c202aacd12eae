// One connection of a client: the bytes that have come and those that are to go. It never blocks.

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
        Reading, // the next head
        Waiting, // for the answer to a call
        Closing, // the last response was sent; what still comes is discarded
    };

    // Takes over a socket. Calls fChanged() when bytes have come or gone, so that a head may be complete, or
    // the connection may be over.
    Connection(struct event_base* pBase, int nSocket, bool blStatus,
               std::function<void(Connection&)> fChanged);
    ~Connection();
    Connection(const Connection&) = delete;
    Connection& operator=(const Connection&) = delete;

    const bool blStatus; // for /health and /metrics, not for calls
    uid_t uid = 0;       // of the client; -1 if the socket does not show it
    uint64_t nCall = 0;  // the number of the call it waits for
    Manner manner;       // for the next response
    int64_t nSince;      // when the state began, or the head that is being read
    State state = State::Reading;

    // The bytes that have come and were not taken yet, and how many of them readHead has scanned.
    std::string strInput;
    size_t cbSeen = 0;

    // Removes bytes from the beginning of strInput.
    void take(size_t cbBytes);

    // Sends a response, and then goes on or closes, as its manner says.
    void send(const std::string& strResponse);

    // Makes isOver() true.
    void end() { m_blOver = true; }

    // The connection is over and must be destroyed: nothing more comes, and nothing can be sent.
    bool isOver() const { return m_blOver; }

    // No byte of a next head has come, and no response is being sent.
    bool isIdle() const { return State::Reading == state && strInput.empty() && m_strOutput.empty(); }

    // Whether the next head can be read.
    bool isReady() const { return State::Reading == state && m_strOutput.empty() && !m_blOver; }

    // The client has finished sending.
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
