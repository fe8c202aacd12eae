#include "Place.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "AccessTokenDefine.h"
#include "Failure.h"
#include "Masking.h"

namespace {

const mode_t PRIVATE_MODE = 0700;
const mode_t PARENT_MODE = 0755;

[[noreturn]] void failOn(const std::string& strPath, const std::string& strHint = "")
{
    throw tool::Failure(tool::EXIT_STATUS_STORE, tool::shownPath(strPath) + ": " + strerror(errno), strHint);
}

void makeParents(const std::string& strPath)
{
    for (size_t nEnd = strPath.find('/', 1); nEnd != std::string::npos; nEnd = strPath.find('/', nEnd + 1)) {
        const std::string strParent = strPath.substr(0, nEnd);
        if (0 == mkdir(strParent.c_str(), PARENT_MODE)) {
            // The umask may have taken bits away that are needed.
            if (0 != chmod(strParent.c_str(), PARENT_MODE)) {
                failOn(strParent);
            }
        } else if (EEXIST != errno) {
            failOn(strParent);
        }
    }
}

} // namespace

namespace tool {

std::string databaseDirectory()
{
    const std::string strPath = VEMO_ATOKEN_DB_PATH;
    return strPath.substr(0, strPath.rfind('/'));
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

std::string firstBytes(const std::string& strPath, size_t cbWanted)
{
    std::string strBytes(cbWanted, '\0');
    const int nFile = open(strPath.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK);
    const ssize_t cbRead = 0 > nFile ? 0 : read(nFile, strBytes.data(), cbWanted);
    if (0 <= nFile) {
        close(nFile);
    }
    strBytes.resize(cbRead > 0 ? static_cast<size_t>(cbRead) : 0);
    return strBytes;
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
    const auto linkStatus = statusOf(VEMO_ATOKEN_DB_PATH);
    if (linkStatus && S_ISLNK(linkStatus->st_mode)) {
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
    const std::string strDirectory = databaseDirectory();
    if (statusOf(strDirectory)) {
        return false;
    }
    int nMade = mkdir(strDirectory.c_str(), PRIVATE_MODE);
    if (0 != nMade && ENOENT == errno) {
        makeParents(strDirectory);
        nMade = mkdir(strDirectory.c_str(), PRIVATE_MODE);
    }
    if (0 != nMade || 0 != chmod(strDirectory.c_str(), PRIVATE_MODE)) {
        failOn(strDirectory);
    }
    return true;
}

void syncDirectory()
{
    const std::string strDirectory = databaseDirectory();
    const int nDirectory = open(strDirectory.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
    const bool blSynced = 0 <= nDirectory && 0 == fsync(nDirectory);
    const int nError = errno;
    if (0 <= nDirectory) {
        close(nDirectory);
    }
    if (!blSynced) {
        errno = nError;
        failOn(strDirectory, "the change was made, but a power cut can undo it");
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
