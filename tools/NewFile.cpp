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

// What a signal removes: a name in a directory.
int g_nDirectory = -1;
std::atomic<const char*> g_szUnfinished = nullptr;

void removeUnfinished()
{
    const char* szUnfinished = g_szUnfinished.exchange(nullptr);
    if (szUnfinished) {
        unlinkat(g_nDirectory, szUnfinished, 0);
    }
}

// Handles a signal once; its second coming does what it does by default.
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

// Locks an open file, as an export does while it writes one. Returns whether nobody else has it locked and a
// name in a directory is still its own; errno tells why not: EEXIST when that is another's by now.
bool lockNamed(const tool::Descriptor& file, const tool::Descriptor& directory, const std::string& strName)
{
    errno = EEXIST;
    return 0 == flock(file.get(), LOCK_EX | LOCK_NB) &&
           tool::isSame(tool::statusOf(file), tool::statusAt(directory, strName));
}

// Whether a path leads to a file.
bool isAt(const struct stat& status, const std::string& strPath)
{
    struct stat other = {};
    return 0 == stat(strPath.c_str(), &other) && tool::isSame(status, other);
}

// Whether a name belongs to the database: it, its journals and the lock, whatever the way to them is called.
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
        file = makeNamed(); // which fails, too, unless it is that the file system knows no such files
    }
    m_pStream.reset(file.isOpen() ? fdopen(file.get(), "w") : nullptr);
    if (!m_pStream) {
        removeUnfinished(); // no destructor runs
        fail();
    }
    file.release();
}

NewFile::~NewFile()
{
    removeUnfinished(); // before others can take it for remains
}

// Fails where no file may be put.
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

// The lock on it tells that it is being written. Until it has that, another export can take it for remains.
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

// A name that is taken already is replaced in one step, for which the file needs another one.
bool NewFile::giveName()
{
    const int nDirectory = m_place.directory.get();
    const SignalPause pause;
    if (!g_szUnfinished) {
        if (link(m_place.strName)) {
            return true;
        }
        flock(fileno(m_pStream.get()), LOCK_EX); // it is no remains
        removeRemains(m_place.directory, m_strUnfinished);
        if (!link(m_strUnfinished)) { // nor did the name above fail because it is taken
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
