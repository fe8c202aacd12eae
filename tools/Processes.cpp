#include "Processes.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <sys/sysmacros.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <memory>
#include <set>
#include <sstream>

#include "AccessTokenDefine.h"
#include "Descriptor.h"
#include "Failure.h"

namespace {

const char* const PROC = "/proc/";

std::string processText(const std::string& strPid)
{
    std::string strName;
    std::getline(std::ifstream(PROC + strPid + "/comm"), strName);
    return (strName.empty() ? "a program" : strName) + " (process " + strPid + ")";
}

std::string processesText(const std::set<std::string>& strPids)
{
    std::string strText;
    for (const std::string& strPid : strPids) {
        strText += (strText.empty() ? "" : ", ") + processText(strPid);
    }
    return strText;
}

// A file's device and inode, as in /proc/locks. Those of a file that cannot be examined match no lock.
std::string lockName(const std::string& strFile)
{
    struct stat status = {};
    stat(strFile.c_str(), &status);
    char szName[64];
    snprintf(szName, sizeof(szName), "%02x:%02x:%ju", major(status.st_dev), minor(status.st_dev),
             uintmax_t{status.st_ino});
    return szName;
}

bool isNumber(const std::string& strText)
{
    return strText.find_first_not_of("0123456789") == std::string::npos;
}

// The names in a directory; none if it cannot be read, for example because its process has ended. Throws
// Failure if this process lacks memory or descriptors to read it.
std::vector<std::string> namesIn(const std::string& strDirectory)
{
    std::vector<std::string> strNames;
    const std::unique_ptr<DIR, int (*)(DIR*)> pDirectory(opendir(strDirectory.c_str()), closedir);
    if (!pDirectory) {
        if (ENOMEM == errno || EMFILE == errno || ENFILE == errno) {
            throw tool::Failure(tool::EXIT_STATUS_STORE, strDirectory + ": " + strerror(errno));
        }
        return strNames;
    }
    DIR* const pOpen = pDirectory.get();
    for (const struct dirent* pEntry = readdir(pOpen); pEntry; pEntry = readdir(pOpen)) {
        strNames.emplace_back(pEntry->d_name);
    }
    return strNames;
}

// The name of the file that a symbolic link leads to; "" if it cannot be read.
std::string nameBehind(const std::string& strLink)
{
    std::error_code error;
    return std::filesystem::read_symlink(strLink, error).filename();
}

// The name of the database file itself, because its path can be a symbolic link.
std::string realName()
{
    const tool::Descriptor database(open(VEMO_ATOKEN_DB_PATH, O_PATH | O_CLOEXEC));
    return nameBehind(std::string(PROC) + "self/fd/" + std::to_string(database.get()));
}

} // namespace

namespace tool {

std::string lockHolders(const std::string& strFile)
{
    const std::string strLock = lockName(strFile);
    std::set<std::string> strPids;
    std::ifstream locks(std::string(PROC) + "locks");
    for (std::string strLine; std::getline(locks, strLine);) {
        std::istringstream words(strLine);
        std::string strNumber, strKind, strStrength, strType, strPid, strName;
        // The line of a process that waits has "->" as one more word, so it does not match.
        words >> strNumber >> strKind >> strStrength >> strType >> strPid >> strName;
        if (strName == strLock) {
            strPids.insert(strPid);
        }
    }
    return strPids.empty() ? "another process" : processesText(strPids);
}

bool canSeeProcesses()
{
    return 0 == access((std::string(PROC) + "self").c_str(), F_OK) || ENOENT != errno;
}

std::vector<std::string> databaseDescriptors()
{
    std::vector<std::string> strDescriptors;
    for (const std::string& strPid : namesIn(PROC)) {
        if (!isNumber(strPid) || strPid == std::to_string(getpid())) {
            continue;
        }
        // Each thread can have descriptors of its own, and the first thread may have ended.
        const std::string strTasks = PROC + strPid + "/task/";
        for (const std::string& strTask : namesIn(strTasks)) {
            const std::string strDirectory = strTasks + strTask + "/fd/";
            for (const std::string& strDescriptor : namesIn(strDirectory)) {
                if (isOfDatabase(strDirectory + strDescriptor)) {
                    strDescriptors.push_back(strDirectory + strDescriptor);
                }
            }
        }
    }
    return strDescriptors;
}

bool isOfDatabase(const std::string& strDescriptor)
{
    // Compares the name first: a status of a file on a network can take forever.
    static const std::string strName = realName();
    std::error_code error;
    return nameBehind(strDescriptor) == strName &&
           std::filesystem::equivalent(strDescriptor, VEMO_ATOKEN_DB_PATH, error);
}

std::string ownersText(const std::vector<std::string>& strDescriptors)
{
    std::set<std::string> strPids;
    for (const std::string& strDescriptor : strDescriptors) {
        const size_t nPid = strlen(PROC);
        strPids.insert(strDescriptor.substr(nPid, strDescriptor.find('/', nPid) - nPid));
    }
    return processesText(strPids);
}

} // namespace tool
