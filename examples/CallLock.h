// Lets one call of the token library run at a time on this machine:
//
//     CallLock lock;
//     const int nResult = VemoAccessTokenGrantEx(strTid, "Example.File", "get", jToken);
//
// All programs that share tokens must do so, with the same file. Then a token of N uses is granted exactly
// N times, no call fails because of a lock, none fails and yet takes effect, and no deletion is undone.

#ifndef CALL_LOCK_H
#define CALL_LOCK_H

#include <fcntl.h>
#include <sys/file.h>
#include <unistd.h>

#include <cerrno>
#include <system_error>

class CallLock {
public:
    // Waits until no other object holds the lock, in this process or another: never hold two. Throws
    // std::system_error when the lock cannot be had; then the call must not be made.
    //
    // The file stands in a directory that only root may write: where others may, they could make the file
    // first and hold the lock for ever. It must never be the database, and must never be deleted.
    explicit CallLock(const char* szFile = "/run/vemo-access-token.lock")
        : m_nFile(open(szFile, O_RDWR | O_CREAT | O_CLOEXEC | O_NOFOLLOW, 0600))
    {
        if (0 > m_nFile) {
            throw std::system_error(errno, std::generic_category(), szFile);
        }
        while (0 != flock(m_nFile, LOCK_EX)) {
            if (EINTR != errno) {
                const std::system_error error(errno, std::generic_category(), szFile);
                close(m_nFile);
                throw error;
            }
        }
    }

    // Unlocks by name: closing would leave the lock to a child that was forked meanwhile.
    ~CallLock()
    {
        flock(m_nFile, LOCK_UN);
        close(m_nFile);
    }

    CallLock(const CallLock&) = delete;
    CallLock& operator=(const CallLock&) = delete;

private:
    const int m_nFile;
};

#endif
