// Another process that holds a connection to the store in use, as long as the object or this process lives.
// A connection of this process would not do: SQLite shares descriptors and locks within a process.

#ifndef VEMO_ACCESS_TOKEN_BENCH_BYSTANDER_H
#define VEMO_ACCESS_TOKEN_BENCH_BYSTANDER_H

#include <sys/types.h>

class Bystander {
public:
    Bystander();
    ~Bystander();
    Bystander(const Bystander&) = delete;
    Bystander& operator=(const Bystander&) = delete;

private:
    int m_rgnEnd[2];
    pid_t m_pid;
};

#endif
