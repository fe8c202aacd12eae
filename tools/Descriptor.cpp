#include "Descriptor.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <utility>

#include "Masking.h"

namespace {

const int DIRECTORY_FLAGS = O_PATH | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC;
const mode_t OTHERS_WRITE_MODE = 0022;

// Whether an open file has a name and no other. named is the status by that name. One call must return both:
// those who gave the file the name could remove it between two calls, and the link count would be 1 again.
bool hasThisNameOnly(const tool::Descriptor& file, const struct stat& named)
{
    return tool::isSame(named, tool::statusOf(file)) && 1 == named.st_nlink;
}

} // namespace

namespace tool {

Descriptor::~Descriptor()
{
    if (isOpen()) {
        close(m_nFile);
    }
}

Descriptor& Descriptor::operator=(Descriptor&& other) noexcept
{
    std::swap(m_nFile, other.m_nFile); // the destructor of other closes the old one
    return *this;
}

Walk::Walk(const std::string& strPath)
    : m_strWhole(strPath),
      m_nNext(strPath.find_first_not_of('/')),
      m_strPath(strPath.substr(0, 1) == "/" ? "/" : "."),
      m_directory(open(m_strPath.c_str(), DIRECTORY_FLAGS))
{
    if (!m_directory.isOpen()) {
        throw Failure(EXIT_STATUS_STORE, m_strPath + ": " + strerror(errno));
    }
}

bool Walk::step()
{
    m_blMade = false;
    const size_t nEnd = m_strWhole.find('/', m_nNext);
    m_strName = m_strWhole.substr(m_nNext, nEnd - m_nNext);
    m_strPath = m_strWhole.substr(0, nEnd);
    m_nNext = m_strWhole.find_first_not_of('/', nEnd);
    return openNamed();
}

bool Walk::make(mode_t mode)
{
    const UmaskOff umaskOff;
    m_blMade = 0 == mkdirat(m_directory.get(), m_strName.c_str(), mode);
    return (m_blMade ? syncNames(m_directory) : EEXIST == errno) && openNamed();
}

bool Walk::openNamed()
{
    Descriptor next(openat(m_directory.get(), m_strName.c_str(), DIRECTORY_FLAGS));
    if (!next.isOpen()) {
        const int nError = errno; // the kernel says ENOTDIR for a symbolic link, too
        errno = S_ISLNK(statusAt(m_directory, m_strName).st_mode) ? ELOOP : nError;
        return false;
    }
    m_directory = std::move(next);
    return true;
}

BadValue badPath(const std::string& strPath, const std::string& strReached)
{
    switch (errno) {
    case ELOOP:
        return BadValue(shownPath(strReached) + " is a symbolic link; name the place that it leads to");
    case EINVAL: return BadValue(shownPath(strPath) + " is not a regular file");
    default: return BadValue(shownPath(strPath) + ": " + strerror(errno));
    }
}

FilePlace::FilePlace(const std::string& strPath)
{
    const size_t nName = strPath.rfind('/') + 1; // 0 if there is no slash, because npos + 1 is 0
    Walk walk(strPath.substr(0, nName));
    while (!walk.isDone()) {
        if (!walk.step()) {
            throw badPath(strPath, walk.path());
        }
    }
    directory = std::move(walk.directory());
    strName = strPath.substr(nName);
}

struct stat statusAt(const Descriptor& directory, const std::string& strName)
{
    struct stat status = {};
    fstatat(directory.get(), strName.c_str(), &status, AT_SYMLINK_NOFOLLOW);
    return status;
}

bool isSame(const struct stat& one, const struct stat& other)
{
    return one.st_dev == other.st_dev && one.st_ino == other.st_ino;
}

Descriptor openRegular(const Descriptor& directory, const std::string& strName)
{
    const mode_t mode = statusAt(directory, strName).st_mode;
    if (!S_ISREG(mode)) {
        errno = S_ISLNK(mode) ? ELOOP : S_ISDIR(mode) ? EISDIR : mode ? EINVAL : errno;
        return Descriptor();
    }
    // The file can have been replaced since.
    Descriptor file(openat(directory.get(), strName.c_str(), O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC));
    if (file.isOpen() && !S_ISREG(statusOf(file).st_mode)) {
        errno = EINVAL;
        return Descriptor();
    }
    return file;
}

Descriptor openToRead(const std::string& strPath)
{
    const FilePlace place(strPath);
    Descriptor file = openRegular(place.directory, place.strName);
    if (!file.isOpen()) {
        throw badPath(strPath, strPath);
    }
    if (canOthersWrite(statusOf(place.directory))) {
        const struct stat named = statusAt(place.directory, place.strName);
        if (0 == named.st_mode && ENOENT != errno) { // a name that is gone counts as one of several
            throw badPath(strPath, strPath);
        }
        if (!hasThisNameOnly(file, named)) {
            throw BadValue(shownPath(strPath) +
                           " has other names besides, and others can change its directory; "
                           "copy it to a place of yours");
        }
    }
    return file;
}

bool syncNames(const Descriptor& directory)
{
    const Descriptor readable(openat(directory.get(), ".", O_RDONLY | O_CLOEXEC));
    return readable.isOpen() && 0 == fsync(readable.get());
}

bool canOthersWrite(const struct stat& directory)
{
    return (0 != directory.st_uid && geteuid() != directory.st_uid) ||
           (directory.st_mode & OTHERS_WRITE_MODE);
}

struct stat statusOf(const Descriptor& file)
{
    struct stat status = {};
    if (0 != fstat(file.get(), &status)) {
        throw Failure(EXIT_STATUS_STORE, std::string("fstat: ") + strerror(errno));
    }
    return status;
}

} // namespace tool
