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

// Whether a name in a directory is that of an open file. errno tells why not: EEXIST when it is another's.
bool isNamed(const tool::Descriptor& file, const tool::Descriptor& directory, const std::string& strName)
{
    const struct stat status = tool::statusOf(file);
    struct stat named = {};
    if (0 != fstatat(directory.get(), strName.c_str(), &named, AT_SYMLINK_NOFOLLOW)) {
        return false;
    }
    const bool blSame = named.st_dev == status.st_dev && named.st_ino == status.st_ino;
    errno = blSame ? errno : EEXIST;
    return blSame;
}

// Whether a file that one export writes, as its lock tells, is free; errno tells why not.
bool lockUnfinished(int nFile)
{
    if (0 == flock(nFile, LOCK_EX | LOCK_NB)) {
        return true;
    }
    errno = EWOULDBLOCK == errno ? EEXIST : errno;
    return false;
}

bool isSame(const struct stat& status, const std::string& strPath)
{
    struct stat other = {};
    return 0 == stat(strPath.c_str(), &other) && other.st_dev == status.st_dev &&
           other.st_ino == status.st_ino;
}

// Whether a place is that of a path, whatever the way to it is called.
bool isPlaceOf(const tool::FilePlace& place, const std::string& strPath)
{
    const size_t nSlash = strPath.rfind('/');
    return place.strName == strPath.substr(nSlash + 1) &&
           isSame(tool::statusOf(place.directory), strPath.substr(0, nSlash));
}

// Whether a name belongs to the database: it, its journals and the lock, whatever the way to them is called.
bool isOfDatabase(const tool::FilePlace& place, const struct stat* pStatus)
{
    const std::string strDatabase = tool::databaseName();
    bool blSame = isSame(tool::statusOf(place.directory), tool::databaseDirectory()) &&
                  0 == place.strName.compare(0, strDatabase.size(), strDatabase);
    blSame = blSame || isPlaceOf(place, CallLock::FILE_OF_ALL);
    if (pStatus) {
        blSame = blSame || isSame(*pStatus, VEMO_ATOKEN_DB_PATH) || isSame(*pStatus, CallLock::FILE_OF_ALL);
        for (const char* szSuffix : tool::JOURNAL_SUFFIXES) {
            blSame = blSame || isSame(*pStatus, std::string(VEMO_ATOKEN_DB_PATH) + szSuffix);
        }
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
    const bool blOurs = geteuid() == status.st_uid && FILE_MODE == (status.st_mode & 07777);
    // While somebody waited for the lock, the name can have gone to another file.
    errno = EEXIST;
    return blOurs && lockUnfinished(remains.get()) && isNamed(remains, directory, strName)
               ? std::move(remains)
               : Descriptor();
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
    if (!file.isOpen() && (EOPNOTSUPP == errno || EISDIR == errno)) {
        file = makeNamed();
    }
    m_pStream = file.isOpen() ? fdopen(file.get(), "w") : nullptr;
    if (!m_pStream) {
        fail();
    }
    file.release();
}

NewFile::~NewFile()
{
    removeUnfinished();
    fclose(m_pStream);
}

// Fails where no file may be put.
void NewFile::requirePlace() const
{
    struct stat status = {};
    const bool blThere =
        0 == fstatat(m_place.directory.get(), m_place.strName.c_str(), &status, AT_SYMLINK_NOFOLLOW);
    if (!blThere && ENOENT != errno) {
        fail();
    }
    if (isOfDatabase(m_place, blThere ? &status : nullptr)) {
        throw Failure(EXIT_STATUS_USAGE,
                      shownPath(m_strPath) + " belongs to the database; choose another name");
    }
    if (blThere && !S_ISREG(status.st_mode)) {
        throw Failure(EXIT_STATUS_USAGE,
                      shownPath(m_strPath) +
                          " is no regular file; to write to a pipe, write to standard output");
    }
}

// The lock on it tells that it is being written. Until it has that, another export can take it for remains.
Descriptor NewFile::makeNamed()
{
    if (!removeRemains(m_place.directory, m_strUnfinished)) {
        return Descriptor();
    }
    handleEndingSignals(removeAndEnd);
    const SignalPause pause;
    Descriptor file(openat(m_place.directory.get(), m_strUnfinished.c_str(),
                           O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, FILE_MODE));
    if (file.isOpen()) {
        if (!lockUnfinished(file.get()) || !isNamed(file, m_place.directory, m_strUnfinished)) {
            return Descriptor();
        }
        g_nDirectory = m_place.directory.get();
        g_szUnfinished = m_strUnfinished.c_str();
    }
    return file;
}

void NewFile::write(const std::string& strText)
{
    fwrite(strText.data(), 1, strText.size(), m_pStream);
}

void NewFile::complete()
{
    fflush(m_pStream);
    if (ferror(m_pStream) || 0 != fsync(fileno(m_pStream)) || !giveName()) {
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
        if (EEXIST != errno || !lockUnfinished(fileno(m_pStream)) ||
            !removeRemains(m_place.directory, m_strUnfinished) || !link(m_strUnfinished)) {
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
    const std::string strFile = "/proc/self/fd/" + std::to_string(fileno(m_pStream));
    return 0 ==
           linkat(AT_FDCWD, strFile.c_str(), m_place.directory.get(), strName.c_str(), AT_SYMLINK_FOLLOW);
}

void NewFile::fail() const
{
    if (EEXIST == errno) {
        throw Failure(EXIT_STATUS_STORE, shownPath(m_strPath + UNFINISHED_SUFFIX) +
                                             " is in the way: another export is writing it, "
                                             "or it is none's");
    }
    throw Failure(EXIT_STATUS_STORE, shownPath(m_strPath) + ": " + strerror(errno));
}

} // namespace tool
