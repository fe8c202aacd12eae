// Lets one call of the token library run at a time on this machine:
//
//     CallLock lock;
//     const int nResult = VemoAccessTokenGrantEx(strTid, "Example.File", "get", jToken);
//
// All programs that share tokens must do so, with the same file. Then a token of N uses is granted exactly
// N times, no call fails because of a lock, none fails and yet takes effect, and no deletion is undone.
// vemo-access-token, the administrator's tool, does.

#ifndef CALL_LOCK_H
#define CALL_LOCK_H

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <system_error>

class CallLock {
public:
    // The one lock file. Every program of the machine that uses tokens takes this lock.
    static constexpr const char* FILE_OF_ALL = "/run/vemo-access-token.lock";

    // Waits until no other object holds the lock, in this process or another: never hold two. Throws
    // std::system_error when the lock cannot be had; then the call must not be made.
    //
    // The file stands in a directory that only root may write. It is made where it is missing. It must never
    // be the database, and must never be deleted. A file that others than its owner may open, or that belongs
    // to another than the effective user, is refused (EPERM): others could hold the lock for ever.
    explicit CallLock(const char* szFile = FILE_OF_ALL) : m_nFile(openFile(szFile))
    {
        while (0 != flock(m_nFile, LOCK_EX)) {
            if (EINTR != errno) {
                closeAndThrow(m_nFile, szFile);
            }
        }
    }

    // The same, but waits so long at most, and then throws ETIMEDOUT. Signals shorten the wait.
    CallLock(const char* szFile, std::chrono::milliseconds wait) : m_nFile(openFile(szFile))
    {
        for (auto left = wait; 0 != flock(m_nFile, LOCK_EX | LOCK_NB); left -= TRY_AGAIN_AFTER) {
            if (EWOULDBLOCK == errno && left.count() <= 0) {
                errno = ETIMEDOUT;
            }
            if (EWOULDBLOCK != errno && EINTR != errno) {
                closeAndThrow(m_nFile, szFile);
            }
            usleep(static_cast<useconds_t>(std::chrono::microseconds(TRY_AGAIN_AFTER).count()));
        }
    }

    // Lets the next one have it. Unlocks by name: closing would leave the lock to a child that was forked
    // meanwhile.
    ~CallLock()
    {
        flock(m_nFile, LOCK_UN);
        close(m_nFile);
    }

    // The lock has one owner.
    CallLock(const CallLock&) = delete;
    CallLock& operator=(const CallLock&) = delete;

private:
    static constexpr std::chrono::milliseconds TRY_AGAIN_AFTER{10};

    static int openFile(const char* szFile)
    {
        const int nFile =
            open(szFile, O_RDWR | O_CREAT | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK, S_IRUSR | S_IWUSR);
        struct stat status = {};
        if (0 > nFile || 0 != fstat(nFile, &status)) {
            closeAndThrow(nFile, szFile);
        }
        const bool blPrivate = S_ISREG(status.st_mode) && 0 == (status.st_mode & (S_IRWXG | S_IRWXO));
        if (!blPrivate || geteuid() != status.st_uid) {
            errno = EPERM;
            closeAndThrow(nFile, szFile);
        }
        return nFile;
    }

    [[noreturn]] static void closeAndThrow(int nFile, const char* szFile)
    {
        const std::system_error error(errno, std::generic_category(), szFile);
        close(nFile); // or nothing, of -1
        throw error;
    }

    const int m_nFile;
};

#endif
