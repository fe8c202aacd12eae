#include "Place.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "AccessTokenDefine.h"
#include "Descriptor.h"
#include "Failure.h"
#include "Masking.h"

namespace {

const mode_t PRIVATE_MODE = 0700;
const mode_t PARENT_MODE = 0755;

[[noreturn]] void failOn(const std::string& strPath, const std::string& strHint = "")
{
    throw tool::Failure(tool::EXIT_STATUS_STORE, tool::shownPath(strPath) + ": " + strerror(errno), strHint);
}

// Walks to the private directory, and makes what is missing of the path. Fails at a symbolic link.
tool::Walk walkMaking()
{
    tool::Walk walk(tool::databaseDirectory());
    while (!walk.isDone()) {
        if (!walk.step() && (ENOENT != errno || !walk.make(walk.isDone() ? PRIVATE_MODE : PARENT_MODE))) {
            throw tool::Failure(tool::EXIT_STATUS_STORE, tool::badPath(walk.path(), walk.path()).what(),
                                walk.hasMade() ? "the change was made, but a power cut can undo it" : "");
        }
    }
    return walk;
}

// The byte that SQLite locks while a transaction writes; a part of SQLite's file format.
const off_t RESERVED_BYTE = 0x40000001;

// Opens the database, or the journal with this suffix, if it is a regular file.
tool::Descriptor openBeside(const std::string& strSuffix)
{
    return tool::openRegular(tool::openDirectory(), tool::databaseName() + strSuffix);
}

// Bytes that cannot be read are zeros.
std::string bytesAt(const tool::Descriptor& file, off_t nOffset, size_t cbWanted)
{
    std::string strBytes(cbWanted, '\0');
    [[maybe_unused]] const ssize_t cbRead = pread(file.get(), strBytes.data(), cbWanted, nOffset);
    return strBytes;
}

} // namespace

namespace tool {

std::string databaseDirectory()
{
    const std::string strPath = VEMO_ATOKEN_DB_PATH;
    return strPath.substr(0, strPath.rfind('/'));
}

std::string databaseName()
{
    return std::string(VEMO_ATOKEN_DB_PATH).substr(databaseDirectory().size() + 1);
}

std::optional<struct stat> statusOf(const std::string& strPath)
{
    struct stat status = {};
    if (0 != lstat(strPath.c_str(), &status)) {
        if (ENOENT != errno) {
            failOn(strPath);
        }
        return std::nullopt;
    }
    return status;
}

std::string firstBytes(const std::string& strSuffix, size_t cbWanted)
{
    return bytesAt(openBeside(strSuffix), 0, cbWanted);
}

std::string lastBytes(const std::string& strSuffix, size_t cbWanted)
{
    const Descriptor file = openBeside(strSuffix);
    return bytesAt(file, lseek(file.get(), 0, SEEK_END) - static_cast<off_t>(cbWanted), cbWanted);
}

bool isBeingChanged()
{
    const Descriptor file = openBeside("");
    struct flock lock = {};
    lock.l_type = F_RDLCK;
    lock.l_whence = SEEK_SET;
    lock.l_start = RESERVED_BYTE;
    lock.l_len = 1;
    return 0 == fcntl(file.get(), F_GETLK, &lock) && F_UNLCK != lock.l_type;
}

void requireDatabase(bool blCreate)
{
    struct stat status = {};
    if (0 == stat(VEMO_ATOKEN_DB_PATH, &status)) {
        if (!S_ISREG(status.st_mode)) {
            throw Failure(EXIT_STATUS_STORE, VEMO_ATOKEN_DB_PATH " is not a regular file");
        }
        return;
    }
    if (ENOENT != errno) {
        failOn(VEMO_ATOKEN_DB_PATH);
    }
    if (statusOf(VEMO_ATOKEN_DB_PATH)) {
        throw Failure(EXIT_STATUS_STORE,
                      VEMO_ATOKEN_DB_PATH " is a symbolic link to a file that is not there");
    }
    if (!statusOf(databaseDirectory())) {
        throw Failure(EXIT_STATUS_STORE, "there is no directory " + databaseDirectory(),
                      "\"vemo-access-token init\" makes it");
    }
    if (!blCreate) {
        throw Failure(EXIT_STATUS_STORE, "there is no database " VEMO_ATOKEN_DB_PATH,
                      "\"vemo-access-token init\" makes it");
    }
}

bool makeDirectory()
{
    return walkMaking().hasMade();
}

bool makeFile()
{
    Walk walk = walkMaking();
    const UmaskOff umaskOff;
    const Descriptor file(openat(walk.directory().get(), databaseName().c_str(),
                                 O_RDONLY | O_CREAT | O_EXCL | O_CLOEXEC, PRIVATE_MODE));
    if (!file.isOpen() && EEXIST != errno) {
        failOn(VEMO_ATOKEN_DB_PATH);
    }
    return file.isOpen();
}

Descriptor openDirectory()
{
    char szDirectory[] = VEMO_ATOKEN_DB_PATH;
    *strrchr(szDirectory, '/') = '\0';
    return Descriptor(open(szDirectory, O_RDONLY | O_DIRECTORY | O_CLOEXEC));
}

void syncDirectory(const char* szMeaning)
{
    const Descriptor directory = openDirectory();
    if (!directory.isOpen() || 0 != fsync(directory.get())) {
        failOn(databaseDirectory(), szMeaning);
    }
}

void requireRoot()
{
    if (0 != geteuid()) {
        throw Failure(EXIT_STATUS_STORE, "only root may do this: the token database belongs to root, and "
                                         "the effective uid is " +
                                             std::to_string(geteuid()));
    }
}

} // namespace tool
