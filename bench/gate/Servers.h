// The servers that are measured beside each other.

#ifndef VEMO_ACCESS_TOKEN_BENCH_SERVERS_H
#define VEMO_ACCESS_TOKEN_BENCH_SERVERS_H

#include <sys/types.h>

#include <string>
#include <vector>

#include "Store.h"

// A program that runs as long as the object.
class Program {
public:
    // Waits until something listens at the path.
    Program(const std::vector<std::string>& strArguments, const std::string& strPath);
    ~Program();
    Program(const Program&) = delete;
    Program& operator=(const Program&) = delete;

    // Of the program and those that it has started, in bytes.
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

// nginx, which asks the server at strGate about each request of its own, or with an empty path one that
// answers all at once.
class Nginx {
public:
    Nginx(const Store& store, const std::string& strGate);
    const std::string& path() const { return m_strPath; }

private:
    const std::string m_strPath;
    const Program m_program;
};

// Has Redis hold the tokens from 0 to nTokens - 1, and returns the digest of the script that grants them.
std::string fillRedis(const std::string& strPath, int nTokens);

#endif
