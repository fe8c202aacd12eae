// The gate as a test runs it: both of its programs, on a store of the test's own.

#ifndef TESTS_RUNNING_GATE_H
#define TESTS_RUNNING_GATE_H

#include <sys/types.h>

#include <string>

#include "TokenStore.h"

class RunningGate {
public:
    // Starts it with a socket beside the database, and waits until it serves.
    explicit RunningGate(const TokenStore& store);
    // Kills what is left of it.
    ~RunningGate();
    RunningGate(const RunningGate&) = delete;
    RunningGate& operator=(const RunningGate&) = delete;

    static std::string path(const TokenStore& store) { return store.directory() + "/calls"; }

    pid_t parent() const { return m_pid; }
    pid_t child() const { return m_pidChild; } // the process that reads HTTP

    // Asks it to stop; the status of waitpid().
    int stop();

    // Waits until both processes have ended.
    int wait();

private:
    pid_t m_pid = 0;
    pid_t m_pidChild = 0;
};

// A connection of a client to the gate.
class GateClient {
public:
    explicit GateClient(const TokenStore& store) : m_strPath(RunningGate::path(store)) {}
    ~GateClient() { close(); }
    GateClient(const GateClient&) = delete;
    GateClient& operator=(const GateClient&) = delete;

    // The status that answers a call: "200" and so on; "" where the connection ended without an answer, and
    // REFUSED where there was none to be had.
    std::string call(const std::string& strTid, const std::string& strTarget);
    void close();

    static constexpr const char* REFUSED = "no connection";

private:
    bool open();

    const std::string m_strPath;
    int m_nSocket = -1;
};

#endif
