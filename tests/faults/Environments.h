// Environments that a call of the library may meet.

#ifndef TESTS_ENVIRONMENTS_H
#define TESTS_ENVIRONMENTS_H

#include <fcntl.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/mount.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <functional>
#include <stdexcept>
#include <string>
#include <vector>

#include "Processes.h"
#include "TokenStore.h"

// Enters an environment, and returns how to leave it.
typedef std::function<void()> Leave;
typedef std::function<Leave(const TokenStore&)> Environment;

// Thrown when this machine or user cannot provide an environment.
struct Unavailable : std::runtime_error {
    using std::runtime_error::runtime_error;
};

namespace fs = std::filesystem;

const uid_t UID_NOBODY = 65534;

inline void provide(bool blSucceeded, const char* szWhat)
{
    if (!blSucceeded) {
        throw Unavailable(std::string("cannot ") + szWhat + ": " + strerror(errno));
    }
}

// By the system call: the redirection has replaced seteuid().
inline void becomeReally(uid_t uid)
{
    provide(0 == syscall(SYS_setresuid, -1, uid, -1), "change the user");
}

inline void setMode(const std::string& strPath, uid_t uid, mode_t mode)
{
    provide(0 == chmod(strPath.c_str(), mode) && 0 == chown(strPath.c_str(), uid, static_cast<gid_t>(-1)),
            "give a file away");
}

// Makes something in a wrong place: the command gets the path as its last argument.
inline void make(const std::string& strCommand, const std::string& strPath)
{
    EXPECT_EQ(0, system((strCommand + " '" + strPath + "'").c_str()));
}

// Sets a limit, and returns how to restore it.
inline Leave limit(__rlimit_resource resource, rlim_t nLimit)
{
    struct rlimit before = {};
    getrlimit(resource, &before);
    const struct rlimit limit = {nLimit, before.rlim_max};
    EXPECT_EQ(0, setrlimit(resource, &limit));
    return [=] { setrlimit(resource, &before); };
}

// A umask, which the library must leave as it is.
inline Environment umaskOf(mode_t mode)
{
    return [=](const TokenStore&) -> Leave {
        const mode_t before = umask(mode);
        return [=] { EXPECT_EQ(mode, umask(before)); };
    };
}

// Something else is in the place of the private directory.
inline Environment directoryIs(const char* szCommand)
{
    return [=](const TokenStore& store) -> Leave {
        const std::string strPath = store.directory() + "/directory";
        make(szCommand, strPath);
        setenv("VEMO_REDIRECT_DIR", strPath.c_str(), 1);
        return [&store] { setenv("VEMO_REDIRECT_DIR", store.directory().c_str(), 1); };
    };
}

// Something else is in the place of the database, and must still be there afterwards. The database, if there
// was one, is renamed to "aside".
inline Environment databaseIs(const char* szCommand)
{
    return [=](const TokenStore& store) -> Leave {
        const std::string strPath = store.path();
        const std::string strAside = store.directory() + "/aside";
        const bool blMissing = !fs::exists(strPath);
        if (!blMissing) {
            fs::rename(strPath, strAside);
        }
        make(szCommand, strPath);
        const fs::file_type type = fs::symlink_status(strPath).type();
        return [=] {
            EXPECT_EQ(type, fs::symlink_status(strPath).type());
            fs::remove(strPath);
            if (!blMissing) {
                fs::rename(strAside, strPath);
            }
        };
    };
}

// The modes of the directory and the database. Both belong to the process's user, which is the present one or
// a user other than root.
enum class User { Same, Other };
inline Environment modes(User user, mode_t modeDirectory, mode_t modeFile)
{
    return [=](const TokenStore& store) -> Leave {
        const auto uidBefore = static_cast<uid_t>(syscall(SYS_geteuid));
        const uid_t uid = User::Other == user && 0 == uidBefore ? UID_NOBODY : uidBefore;
        if (fs::exists(store.path())) {
            setMode(store.path(), uid, modeFile);
        }
        setMode(store.directory(), uid, modeDirectory);
        becomeReally(uid);
        if (std::error_code ignored; !fs::exists(store.directory(), ignored)) {
            becomeReally(uidBefore);
            throw Unavailable("another user cannot reach " + store.directory());
        }
        return [=, &store] {
            becomeReally(uidBefore);
            setMode(store.directory(), uidBefore, 0700);
            if (fs::exists(store.path())) {
                setMode(store.path(), uidBefore, 0600); // can be read again, also by other users than root
            }
        };
    };
}

// Some of the descriptors 0 to 2 are closed. SQLite opens /dev/null in their places.
inline Environment closedDescriptors(const std::vector<int>& descriptors)
{
    return [=](const TokenStore&) -> Leave {
        std::vector<int> kept;
        for (const int nDescriptor : descriptors) {
            kept.push_back(fcntl(nDescriptor, F_DUPFD_CLOEXEC, 3));
            close(nDescriptor);
        }
        return [=] {
            std::vector<std::string> targets;
            for (size_t i = 0; i < descriptors.size(); ++i) {
                targets.push_back(fs::read_symlink("/proc/self/fd/" + std::to_string(descriptors[i])));
                dup2(kept[i], descriptors[i]);
                close(kept[i]);
            }
            EXPECT_EQ(std::vector<std::string>(descriptors.size(), "/dev/null"), targets);
        };
    };
}

// Only nFree descriptors are free.
inline Environment freeDescriptors(size_t nFree)
{
    return [=](const TokenStore&) -> Leave {
        const Leave restoreLimit = limit(RLIMIT_NOFILE, 64);
        std::vector<int> taken;
        for (int n = 0; 0 <= (n = open("/dev/null", O_RDONLY | O_CLOEXEC));) {
            taken.push_back(n);
        }
        for (size_t nLeft = nFree; 0 < nLeft; --nLeft) {
            close(taken.back());
            taken.pop_back();
        }
        return [=] {
            for (const int nDescriptor : taken) {
                close(nDescriptor);
            }
            restoreLimit();
        };
    };
}

// Files cannot grow beyond cbMax, and the signal for that is ignored.
inline Environment fileSizeLimit(size_t cbMax)
{
    return [=](const TokenStore&) -> Leave {
        const Leave restoreLimit = limit(RLIMIT_FSIZE, cbMax);
        signal(SIGXFSZ, SIG_IGN);
        return [=] {
            restoreLimit();
            signal(SIGXFSZ, SIG_DFL);
        };
    };
}

// Another process holds a lock on the database and is stopped (SIGSTOP). Once continued, it succeeds.
inline Environment stoppedHolder(const char* szSql)
{
    return [=](const TokenStore& store) -> Leave {
        const pid_t pid = startProcess([&] {
            const Database pDb = store.open();
            run(pDb, szSql);
            raise(SIGSTOP);
            run(pDb, "COMMIT");
        });
        int nStatus = 0;
        EXPECT_EQ(pid, waitpid(pid, &nStatus, WUNTRACED));
        EXPECT_TRUE(WIFSTOPPED(nStatus));
        return [=] {
            kill(pid, SIGCONT);
            EXPECT_TRUE(endsWell(pid));
        };
    };
}

// A small file system is mounted on the directory of the store. Only this process sees it.
inline Environment smallFileSystem()
{
    return [=](const TokenStore& store) -> Leave {
        const char* const szDirectory = store.directory().c_str();
        provide(0 == unshare(CLONE_NEWNS) && 0 == mount(nullptr, "/", "", MS_REC | MS_PRIVATE, nullptr) &&
                    0 == mount("tmpfs", szDirectory, "tmpfs", 0, "size=256k,mode=0700"),
                "mount a file system that nobody else sees");
        return [=] { umount2(szDirectory, MNT_DETACH); };
    };
}

// The file system has only cbFree bytes left.
inline Environment fullFileSystem(size_t cbFree)
{
    return [=](const TokenStore& store) -> Leave {
        const std::string strFiller = store.directory() + "/filler";
        const int nFile = open(strFiller.c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0600);
        const std::string strBlock(4096, 'f');
        size_t cbFiller = 0;
        while (0 < write(nFile, strBlock.data(), strBlock.size())) {
            cbFiller += strBlock.size();
        }
        EXPECT_EQ(0, ftruncate(nFile, static_cast<off_t>(cbFiller - cbFree)));
        close(nFile);
        return [=] { fs::remove(strFiller); };
    };
}

inline Environment readOnlyFileSystem()
{
    return [=](const TokenStore& store) -> Leave {
        const auto remount = [&store](unsigned long nFlags) {
            EXPECT_EQ(0, mount(nullptr, store.directory().c_str(), "", MS_REMOUNT | nFlags, nullptr));
        };
        remount(MS_RDONLY);
        return [=] { remount(0); };
    };
}

#endif
