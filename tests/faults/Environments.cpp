#include "Environments.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <sqlite3.h>
#include <sys/mount.h>
#include <sys/prctl.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>

namespace {

const uid_t UID_NOBODY = 65534;

void provide(bool blSucceeded, const char* szWhat)
{
    if (!blSucceeded) {
        throw Unavailable(std::string("cannot ") + szWhat + ": " + strerror(errno));
    }
}

// The real effective uid, whatever the library is made to believe.
uid_t realEffectiveUid()
{
    return static_cast<uid_t>(syscall(SYS_geteuid));
}

void becomeReally(uid_t uid)
{
    provide(0 == syscall(SYS_setresuid, -1, uid, -1), "change the user");
}

void setMode(const std::string& strPath, uid_t uid, mode_t mode)
{
    provide(0 == chmod(strPath.c_str(), mode) && 0 == chown(strPath.c_str(), uid, static_cast<gid_t>(-1)),
            "give a file away");
}

void make(Thing thing, const std::string& strPath, const std::string& strTarget)
{
    switch (thing) {
    case Thing::Nothing: break;
    case Thing::EmptyFile: std::ofstream{strPath}; break;
    case Thing::Directory: std::filesystem::create_directory(strPath); break;
    case Thing::Link: std::filesystem::create_symlink(strTarget, strPath); break;
    case Thing::DanglingLink: std::filesystem::create_symlink("nowhere", strPath); break;
    case Thing::Fifo: EXPECT_EQ(0, mkfifo(strPath.c_str(), 0600)); break;
    }
}

int openNull()
{
    return open("/dev/null", O_RDONLY | O_CLOEXEC);
}

// Holds a lock, stops, and lets go when it is continued. The exit status tells whether all went well.
[[noreturn]] void holdLock(const std::string& strPath, const char* szSql)
{
    prctl(PR_SET_PDEATHSIG, SIGKILL); // or it would stay stopped if the test were killed
    sqlite3* pDb = nullptr;
    const bool blHeld = SQLITE_OK == sqlite3_open_v2(strPath.c_str(), &pDb, SQLITE_OPEN_READWRITE, "unix") &&
                        SQLITE_OK == sqlite3_exec(pDb, szSql, nullptr, nullptr, nullptr);
    raise(SIGSTOP);
    _exit(blHeld && SQLITE_OK == sqlite3_exec(pDb, "COMMIT", nullptr, nullptr, nullptr) ? 0 : 1);
}

} // namespace

Umask::Umask(const TokenStore&, mode_t mode) : m_mode(mode), m_modeBefore(umask(mode)) {}

Umask::~Umask()
{
    EXPECT_EQ(m_mode, umask(m_modeBefore));
}

DirectoryIs::DirectoryIs(const TokenStore& store, Thing thing) : m_store(store)
{
    const std::string strPath = store.directory() + "/directory";
    make(thing, strPath, ".");
    setenv("VEMO_REDIRECT_DIR", strPath.c_str(), 1);
}

DirectoryIs::~DirectoryIs()
{
    setenv("VEMO_REDIRECT_DIR", m_store.directory().c_str(), 1);
}

DatabaseIs::DatabaseIs(const TokenStore& store, Thing thing)
    : m_strPath(store.path()),
      m_strAside(store.directory() + "/aside"),
      m_blMissing(!std::filesystem::exists(m_strPath))
{
    if (!m_blMissing) {
        std::filesystem::rename(m_strPath, m_strAside);
    }
    make(thing, m_strPath, "aside");
    m_type = std::filesystem::symlink_status(m_strPath).type();
}

DatabaseIs::~DatabaseIs()
{
    EXPECT_EQ(m_type, std::filesystem::symlink_status(m_strPath).type());
    std::filesystem::remove(m_strPath);
    if (!m_blMissing) {
        std::filesystem::rename(m_strAside, m_strPath);
    }
}

Modes::Modes(const TokenStore& store, User user, mode_t modeDirectory, mode_t modeFile)
    : m_store(store), m_uidBefore(realEffectiveUid())
{
    const uid_t uid = User::Other == user && 0 == m_uidBefore ? UID_NOBODY : m_uidBefore;
    if (std::filesystem::exists(store.path())) {
        setMode(store.path(), uid, modeFile);
    }
    setMode(store.directory(), uid, modeDirectory);
    becomeReally(uid);
    std::error_code ignored;
    if (!std::filesystem::exists(store.directory(), ignored)) {
        becomeReally(m_uidBefore);
        throw Unavailable("another user cannot reach " + store.directory());
    }
}

Modes::~Modes()
{
    becomeReally(m_uidBefore);
    setMode(m_store.directory(), m_uidBefore, 0700);
    if (std::filesystem::exists(m_store.path())) {
        setMode(m_store.path(), m_uidBefore, 0600); // can be read again, by others than root too
    }
}

ClosedDescriptors::ClosedDescriptors(const TokenStore&, const std::vector<int>& descriptors)
    : m_descriptors(descriptors)
{
    for (const int nDescriptor : m_descriptors) {
        m_kept.push_back(fcntl(nDescriptor, F_DUPFD_CLOEXEC, 3));
        close(nDescriptor);
    }
}

ClosedDescriptors::~ClosedDescriptors()
{
    std::vector<std::string> targets;
    for (size_t i = 0; i < m_descriptors.size(); ++i) {
        targets.push_back(std::filesystem::read_symlink("/proc/self/fd/" + std::to_string(m_descriptors[i])));
        dup2(m_kept[i], m_descriptors[i]);
        close(m_kept[i]);
    }
    EXPECT_EQ(std::vector<std::string>(m_descriptors.size(), "/dev/null"), targets);
}

FreeDescriptors::FreeDescriptors(const TokenStore&, size_t nFree)
{
    getrlimit(RLIMIT_NOFILE, &m_limitBefore);
    struct rlimit limit = m_limitBefore;
    limit.rlim_cur = 64;
    EXPECT_EQ(0, setrlimit(RLIMIT_NOFILE, &limit));
    for (int n = openNull(); 0 <= n; n = openNull()) {
        m_taken.push_back(n);
    }
    for (; 0 < nFree; --nFree) {
        close(m_taken.back());
        m_taken.pop_back();
    }
}

FreeDescriptors::~FreeDescriptors()
{
    for (const int nDescriptor : m_taken) {
        close(nDescriptor);
    }
    setrlimit(RLIMIT_NOFILE, &m_limitBefore);
}

FileSizeLimit::FileSizeLimit(const TokenStore&, rlim_t cbMax)
{
    getrlimit(RLIMIT_FSIZE, &m_limitBefore);
    struct rlimit limit = m_limitBefore;
    limit.rlim_cur = cbMax;
    signal(SIGXFSZ, SIG_IGN);
    EXPECT_EQ(0, setrlimit(RLIMIT_FSIZE, &limit));
}

FileSizeLimit::~FileSizeLimit()
{
    setrlimit(RLIMIT_FSIZE, &m_limitBefore);
    signal(SIGXFSZ, SIG_DFL);
}

StoppedHolder::StoppedHolder(const TokenStore& store, const char* szSql) : m_nProcess(fork())
{
    if (0 == m_nProcess) {
        holdLock(store.path(), szSql);
    }
    int nStatus = 0;
    EXPECT_EQ(m_nProcess, waitpid(m_nProcess, &nStatus, WUNTRACED));
    EXPECT_TRUE(WIFSTOPPED(nStatus));
}

StoppedHolder::~StoppedHolder()
{
    int nStatus = 0;
    kill(m_nProcess, SIGCONT);
    EXPECT_EQ(m_nProcess, waitpid(m_nProcess, &nStatus, 0));
    EXPECT_EQ(0, nStatus);
}

SmallFileSystem::SmallFileSystem(const TokenStore& store) : m_store(store)
{
    provide(0 == unshare(CLONE_NEWNS) && 0 == mount(nullptr, "/", "", MS_REC | MS_PRIVATE, nullptr) &&
                0 == mount("tmpfs", store.directory().c_str(), "tmpfs", 0, "size=256k,mode=0700"),
            "mount a file system that nobody else sees");
}

SmallFileSystem::~SmallFileSystem()
{
    umount2(m_store.directory().c_str(), MNT_DETACH);
}

FullFileSystem::FullFileSystem(const TokenStore& store, size_t cbFree)
    : m_strFiller(store.directory() + "/filler")
{
    const int nFile = open(m_strFiller.c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0600);
    const std::string strBlock(4096, 'f');
    off_t cbFiller = 0;
    while (0 < write(nFile, strBlock.data(), strBlock.size())) {
        cbFiller += static_cast<off_t>(strBlock.size());
    }
    EXPECT_EQ(0, ftruncate(nFile, cbFiller - static_cast<off_t>(cbFree)));
    close(nFile);
}

FullFileSystem::~FullFileSystem()
{
    std::filesystem::remove(m_strFiller);
}

ReadOnlyFileSystem::ReadOnlyFileSystem(const TokenStore& store) : m_store(store)
{
    EXPECT_EQ(0, mount(nullptr, store.directory().c_str(), "", MS_REMOUNT | MS_RDONLY, nullptr));
}

ReadOnlyFileSystem::~ReadOnlyFileSystem()
{
    EXPECT_EQ(0, mount(nullptr, m_store.directory().c_str(), "", MS_REMOUNT, nullptr));
}
