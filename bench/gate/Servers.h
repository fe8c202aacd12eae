// The servers that are compared with each other.

#ifndef VEMO_ACCESS_TOKEN_BENCH_SERVERS_H
#define VEMO_ACCESS_TOKEN_BENCH_SERVERS_H

#include <sys/types.h>

#include <string>
#include <vector>

#include "Store.h"

// A program that runs as long as the object.
class Program {
public:
    // Starts the program, and waits until something listens at the path.
    Program(const std::vector<std::string>& strArguments, const std::string& strPath);
    ~Program();
    Program(const Program&) = delete;
    Program& operator=(const Program&) = delete;

    // The memory of the program and its children, in bytes.
    double memory() const;

private:
    pid_t m_pid;
};

// A gate on a store.
class Gate {
public:
    explicit Gate(const Store& store);
    const std::string& path() const { return m_strPath; }
    double memory() const { return m_program.memory(); }

private:
    const std::string m_strPath;
    const Program m_program;
};

// nginx, which asks the server at strGate about each request. If strGate is empty, it asks a server that
// allows everything at once.
class Nginx {
public:
    Nginx(const Store& store, const std::string& strGate);
    const std::string& path() const { return m_strPath; }

private:
    const std::string m_strPath;
    const Program m_program;
};

// Puts the tokens 0 to nTokens - 1 into Redis. Returns the digest of the script that grants them.
std::string fillRedis(const std::string& strPath, int nTokens);

#endif
