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

// The private directory, which must not be reached through a symbolic link. Makes what is missing of it;
// blMade tells whether that was the directory itself.
tool::Descriptor makePrivateDirectory(bool& blMade)
{
    tool::Walk walk(tool::databaseDirectory());
    while (!walk.isDone()) {
        blMade = false;
        if (!walk.step() &&
            (ENOENT != errno || !walk.make(walk.isDone() ? PRIVATE_MODE : PARENT_MODE, blMade))) {
            throw tool::Failure(tool::EXIT_STATUS_STORE, tool::badPath(walk.path(), walk.path()).what(),
                                blMade ? "the change was made, but a power cut can undo it" : "");
        }
    }
    return std::move(walk.directory());
}

// The database, or the journal with this suffix, if it is a regular file.
tool::Descriptor openBeside(const std::string& strSuffix)
{
    const tool::Descriptor directory(
        open(tool::databaseDirectory().c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
    return tool::openRegular(directory, tool::databaseName() + strSuffix);
}

// Zeros where there are none.
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
    if (0 == lstat(strPath.c_str(), &status)) {
        return status;
    }
    if (ENOENT != errno) {
        failOn(strPath);
    }
    return std::nullopt;
}

std::string firstBytes(const std::string& strSuffix, size_t cbWanted)
{
    return bytesAt(openBeside(strSuffix), 0, cbWanted);
}

std::string lastBytes(const std::string& strSuffix, size_t cbWanted)
{
    const Descriptor file = openBeside(strSuffix);
    const off_t cbFile = file.isOpen() ? statusOf(file).st_size : 0;
    return bytesAt(file, cbFile - static_cast<off_t>(cbWanted), cbWanted);
}

void requireDatabase(bool blCreate)
{
    struct stat status = {};
    if (0 == stat(VEMO_ATOKEN_DB_PATH, &status)) {
        if (!S_ISREG(status.st_mode)) {
            throw Failure(EXIT_STATUS_STORE, VEMO_ATOKEN_DB_PATH " is no regular file");
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
    bool blMade = false;
    makePrivateDirectory(blMade);
    return blMade;
}

bool makeFile()
{
    bool blDirectory = false;
    const Descriptor directory = makePrivateDirectory(blDirectory);
    const UmaskOff umaskOff;
    const Descriptor file(openat(directory.get(), databaseName().c_str(),
                                 O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, PRIVATE_MODE));
    if (!file.isOpen() && EEXIST != errno) {
        failOn(VEMO_ATOKEN_DB_PATH);
    }
    return file.isOpen();
}

void syncDirectory(const char* szMeaning)
{
    char szDirectory[] = VEMO_ATOKEN_DB_PATH;
    *strrchr(szDirectory, '/') = '\0';
    const Descriptor directory(open(szDirectory, O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    if (!directory.isOpen() || 0 != fsync(directory.get())) {
        failOn(szDirectory, szMeaning);
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
