// Restores errno at the end of a scope.

#ifndef VEMO_ACCESS_TOKEN_ERRNO_KEEPER_H
#define VEMO_ACCESS_TOKEN_ERRNO_KEEPER_H

#include <cerrno>

namespace VEMO_ACCESS_TOKEN {

class ErrnoKeeper {
public:
    ErrnoKeeper() : m_nErrno(errno) {}
    ~ErrnoKeeper() { errno = m_nErrno; }
    ErrnoKeeper(const ErrnoKeeper&) = delete;
    ErrnoKeeper& operator=(const ErrnoKeeper&) = delete;

private:
    const int m_nErrno;
};

} // namespace VEMO_ACCESS_TOKEN

#endif
