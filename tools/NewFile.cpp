#include "NewFile.h"

#include <fcntl.h>
#include <sys/file.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <cstring>

#include "AccessTokenDefine.h"
#include "CallLock.h"
#include "Failure.h"
#include "Masking.h"
#include "Place.h"
#include "Signals.h"

namespace {

const mode_t FILE_MODE = S_IRUSR | S_IWUSR;

// What a signal handler removes: this name in this directory.
int g_nDirectory = -1;
std::atomic<const char*> g_szUnfinished = nullptr;

void removeUnfinished()
{
    const char* szUnfinished = g_szUnfinished.exchange(nullptr);
    if (szUnfinished) {
        unlinkat(g_nDirectory, szUnfinished, 0);
    }
}

// Handles a signal. Its handler is reset when it comes, so raise() has the default effect.
void removeAndEnd(int nSignal)
{
    removeUnfinished();
    raise(nSignal);
}

tool::FilePlace placeOf(const std::string& strPath)
{
    try {
        return tool::FilePlace(strPath);
    } catch (const tool::BadValue& bad) {
        throw tool::Failure(tool::EXIT_STATUS_STORE, bad.what());
    }
}

// Locks an open file, as an export does while it writes the file. Returns whether nobody else has locked it
// and it still has its name in the directory. On failure, errno is EWOULDBLOCK if another process has locked
// it, and EEXIST if the name is now another file's.
bool lockNamed(const tool::Descriptor& file, const tool::Descriptor& directory, const std::string& strName)
{
    errno = EEXIST;
    return 0 == flock(file.get(), LOCK_EX | LOCK_NB) &&
           tool::isSame(tool::statusOf(file), tool::statusAt(directory, strName));
}

// Whether a path leads to the file of a status.
bool isAt(const struct stat& status, const std::string& strPath)
{
    struct stat other = {};
    return 0 == stat(strPath.c_str(), &other) && tool::isSame(status, other);
}

// Whether a place is that of the database, one of its journals or the lock file, whatever path leads there.
bool isOfDatabase(const tool::FilePlace& place, const struct stat& status)
{
    const struct stat directory = tool::statusOf(place.directory);
    const std::string strDatabase = tool::databaseName();
    const std::string strLock = CallLock::FILE_OF_ALL;
    const size_t nLockName = strLock.rfind('/') + 1;
    bool blSame =
        (isAt(directory, tool::databaseDirectory()) &&
         0 == place.strName.compare(0, strDatabase.size(), strDatabase)) ||
        (isAt(directory, strLock.substr(0, nLockName)) && place.strName == strLock.substr(nLockName)) ||
        isAt(status, VEMO_ATOKEN_DB_PATH) || isAt(status, strLock);
    for (const char* szSuffix : tool::JOURNAL_SUFFIXES) {
        blSame = blSame || isAt(status, std::string(VEMO_ATOKEN_DB_PATH) + szSuffix);
    }
    return blSame;
}

} // namespace

namespace tool {

Descriptor lockRemains(const Descriptor& directory, const std::string& strName)
{
    Descriptor remains = openRegular(directory, strName);
    if (!remains.isOpen()) {
        return remains;
    }
    const struct stat status = statusOf(remains);
    errno = EEXIST;
    const bool blOurs = geteuid() == status.st_uid && FILE_MODE == (status.st_mode & 07777);
    return blOurs && lockNamed(remains, directory, strName) ? std::move(remains) : Descriptor();
}

bool removeRemains(const Descriptor& directory, const std::string& strName)
{
    const Descriptor remains = lockRemains(directory, strName);
    return remains.isOpen() ? 0 == unlinkat(directory.get(), strName.c_str(), 0) : ENOENT == errno;
}

NewFile::NewFile(const std::string& strPath)
    : m_strPath(strPath), m_place(placeOf(strPath)), m_strUnfinished(m_place.strName + UNFINISHED_SUFFIX)
{
    requirePlace();
    const UmaskOff umaskOff;
    Descriptor file(openat(m_place.directory.get(), ".", O_WRONLY | O_TMPFILE | O_CLOEXEC, FILE_MODE));
    if (!file.isOpen()) {
        file = makeNamed(); // for file systems without O_TMPFILE; any other error comes again
    }
    m_pStream.reset(file.isOpen() ? fdopen(file.get(), "w") : nullptr);
    if (!m_pStream) {
        removeUnfinished(); // the destructor does not run
        fail();
    }
    file.release();
}

NewFile::~NewFile()
{
    removeUnfinished(); // while it is locked, so that no other export removes it as left behind
}

// Fails if no file may be put there.
void NewFile::requirePlace() const
{
    const struct stat status = statusAt(m_place.directory, m_place.strName);
    const bool blThere = 0 != status.st_mode;
    if (!blThere && ENOENT != errno) {
        fail();
    }
    if (isOfDatabase(m_place, status)) {
        throw Failure(EXIT_STATUS_USAGE,
                      shownPath(m_strPath) + " belongs to the database; choose another name");
    }
    if (blThere && !S_ISREG(status.st_mode)) {
        throw Failure(EXIT_STATUS_USAGE,
                      shownPath(m_strPath) +
                          " is not a regular file; to write to a pipe, write to standard output");
    }
}

// Makes a file with the temporary name. Its lock shows other exports that it is being written. Just before it
// is locked, another export can remove it as left behind; then this fails.
Descriptor NewFile::makeNamed()
{
    removeRemains(m_place.directory, m_strUnfinished);
    handleEndingSignals(removeAndEnd);
    const SignalPause pause;
    Descriptor file(openat(m_place.directory.get(), m_strUnfinished.c_str(),
                           O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, FILE_MODE));
    if (!file.isOpen() || !lockNamed(file, m_place.directory, m_strUnfinished)) {
        return Descriptor();
    }
    g_nDirectory = m_place.directory.get();
    g_szUnfinished = m_strUnfinished.c_str();
    return file;
}

void NewFile::write(const std::string& strText)
{
    fwrite(strText.data(), 1, strText.size(), m_pStream.get());
}

void NewFile::complete()
{
    fflush(m_pStream.get());
    if (ferror(m_pStream.get()) || 0 != fsync(fileno(m_pStream.get())) || !giveName()) {
        fail();
    }
    if (!syncNames(m_place.directory)) {
        throw Failure(EXIT_STATUS_STORE, shownPath(m_strPath) + ": " + strerror(errno),
                      "the file is there, but a power cut can undo that");
    }
}

// Gives the complete file its name. To replace another file in one step, it needs the temporary name first.
bool NewFile::giveName()
{
    const int nDirectory = m_place.directory.get();
    const SignalPause pause;
    if (!g_szUnfinished) {
        if (link(m_place.strName)) {
            return true;
        }
        flock(fileno(m_pStream.get()), LOCK_EX); // so that no other export removes it as left behind
        removeRemains(m_place.directory, m_strUnfinished);
        if (!link(m_strUnfinished)) { // fails too if the first link() failed although the name was free
            return false;
        }
        g_nDirectory = nDirectory;
        g_szUnfinished = m_strUnfinished.c_str();
    }
    if (0 != renameat(nDirectory, m_strUnfinished.c_str(), nDirectory, m_place.strName.c_str())) {
        return false;
    }
    g_szUnfinished = nullptr;
    return true;
}

// Gives a name to a file that has none.
bool NewFile::link(const std::string& strName)
{
    const std::string strFile = "/proc/self/fd/" + std::to_string(fileno(m_pStream.get()));
    return 0 ==
           linkat(AT_FDCWD, strFile.c_str(), m_place.directory.get(), strName.c_str(), AT_SYMLINK_FOLLOW);
}

void NewFile::fail() const
{
    if (EEXIST == errno || EWOULDBLOCK == errno) {
        throw Failure(EXIT_STATUS_STORE, shownPath(m_strPath + UNFINISHED_SUFFIX) +
                                             " is in the way: another export is writing it, "
                                             "or it is none's");
    }
    throw Failure(EXIT_STATUS_STORE, shownPath(m_strPath) + ": " + strerror(errno));
}

} // namespace tool
