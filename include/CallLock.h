// Lets one call of the token library run at a time on this machine:
//
//     CallLock lock;
//     const int nResult = VemoAccessTokenGrantEx(strTid, "Example.File", "get", jToken);
//
// When all programs that share tokens do so, with the same file, a token of N uses is granted exactly N
// times, no call fails because of another, and no deletion is undone. The administrator's tool and the gate
// take this lock too. doc/concurrency.md has the rules for threads, fork() and log lines.

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
    // The lock file for all programs of the machine that use tokens.
    static constexpr const char* FILE_OF_ALL = "/run/vemo-access-token.lock";

    // Takes the lock, and waits while any other object holds it, in this process or another: a thread that
    // takes it twice waits for ever. Throws std::system_error on failure; then the call must not be made.
    //
    // A missing file is created. Its directory must be one that only root may write. The file must not be
    // the database, and must not be deleted while a program may use it. A file that the effective user does
    // not own, or that anybody else may open, is refused with EPERM: others could hold the lock for ever.
    explicit CallLock(const char* szFile = FILE_OF_ALL) : m_nFile(openFile(szFile))
    {
        while (0 != flock(m_nFile, LOCK_EX)) {
            if (EINTR != errno) {
                closeAndThrow(m_nFile, szFile);
            }
        }
    }

    // Does the same, but throws ETIMEDOUT after waiting as long as wait says. Signals shorten the wait.
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

    // Frees the lock. Closing the file is not enough: a child that was forked meanwhile would keep the lock.
    ~CallLock()
    {
        flock(m_nFile, LOCK_UN);
        close(m_nFile);
    }

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
        close(nFile); // -1, of a file that could not be opened, does no harm
        throw error;
    }

    const int m_nFile;
};

#endif
