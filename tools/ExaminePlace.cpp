// What can be wrong with the directory and the file.

#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "AccessTokenDefine.h"
#include "Examination.h"
#include "Failure.h"
#include "Place.h"
#include "Store.h"

namespace {

using tool::Finding;
using tool::Findings;
using tool::Store;

const mode_t PRIVATE_MODE = 0700;
const mode_t OTHERS_MODE = 0077;
const mode_t OTHERS_WRITE_MODE = 0022;

void requireCall(int nResult, const std::string& strPath)
{
    if (0 != nResult) {
        throw tool::Failure(tool::EXIT_STATUS_STORE, strPath + ": " + strerror(errno));
    }
    Store::settleChange();
}

std::string octal(mode_t mode)
{
    char szMode[8];
    snprintf(szMode, sizeof(szMode), "%04o", static_cast<unsigned int>(mode & 07777));
    return szMode;
}

// Owner and mode of what should be root's alone.
void examinePrivacy(const std::string& strPath, const struct stat& status, Findings& findings)
{
    if (0 != status.st_uid) {
        findings.push_back(
            {Finding::Severity::Error, strPath + " belongs to uid " + std::to_string(status.st_uid),
             "its owner can read and change every token", "chown root " + strPath,
             [strPath] { requireCall(chown(strPath.c_str(), 0, static_cast<gid_t>(-1)), strPath); }});
    }
    const mode_t mode = status.st_mode & 07777;
    if (mode & OTHERS_MODE) {
        findings.push_back({Finding::Severity::Error, strPath + " has mode " + octal(mode),
                            "others than root can use it, and ids are credentials", "chmod 0700 " + strPath,
                            [strPath] { requireCall(chmod(strPath.c_str(), PRIVATE_MODE), strPath); }});
    }
}

// Whoever can write to a directory above can put another in the place of the private one.
void examineParents(Findings& findings)
{
    std::string strPath = tool::databaseDirectory();
    for (size_t nEnd = strPath.rfind('/'); nEnd != 0; nEnd = strPath.rfind('/')) {
        strPath.resize(nEnd);
        const auto status = tool::statusOf(strPath);
        if (status && (0 != status->st_uid || (status->st_mode & OTHERS_WRITE_MODE))) {
            findings.push_back({Finding::Severity::Warning,
                                strPath + " belongs to uid " + std::to_string(status->st_uid) +
                                    " and has mode " + octal(status->st_mode),
                                "others than root can replace the private directory below it",
                                "chown root " + strPath + " && chmod go-w " + strPath,
                                {}});
        }
    }
}

// Returns whether the directory is one.
bool examineDirectory(Findings& findings)
{
    const std::string strPath = tool::databaseDirectory();
    const auto status = tool::statusOf(strPath);
    if (!status) {
        findings.push_back({Finding::Severity::Error, "there is no directory " + strPath,
                            "no token can be created, and every call fails", "vemo-access-token init",
                            [] { tool::makeDirectory(); }});
        return false;
    }
    if (!S_ISDIR(status->st_mode)) {
        findings.push_back({Finding::Severity::Error,
                            strPath + (S_ISLNK(status->st_mode) ? " is a symbolic link" : " is no directory"),
                            "the tokens stand elsewhere, or nowhere",
                            "find out who made it; move the database to a directory of that name",
                            {}});
        return S_ISLNK(status->st_mode);
    }
    examinePrivacy(strPath, *status, findings);
    examineParents(findings);
    if (0 != access(strPath.c_str(), W_OK)) {
        findings.push_back({Finding::Severity::Error,
                            strPath + " cannot be written to: " + strerror(errno),
                            "no token can be created, changed or granted",
                            "make the file system writable, or the directory",
                            {}});
    }
    return true;
}

// Returns whether the file can be opened.
bool examineFile(Findings& findings)
{
    const std::string strPath = VEMO_ATOKEN_DB_PATH;
    const auto status = tool::statusOf(strPath);
    if (!status) {
        findings.push_back({Finding::Severity::Error, "there is no database " + strPath,
                            "there are no tokens; the first call that needs it makes it",
                            "vemo-access-token init",
                            [] { Store(Store::Access::Plain, Store::Missing::Make).makeTable(); }});
        return false;
    }
    if (!S_ISREG(status->st_mode)) {
        findings.push_back(
            {Finding::Severity::Error,
             strPath + (S_ISLNK(status->st_mode) ? " is a symbolic link" : " is no regular file"),
             "programs work on another file than this one, or on none",
             "find out who made it; move the database to this name",
             {}});
        return S_ISLNK(status->st_mode);
    }
    if (1 != status->st_nlink) {
        findings.push_back(
            {Finding::Severity::Warning,
             strPath + " has " + std::to_string(status->st_nlink) + " hard links",
             "the tokens can be reached under another name, and a journal of that name is not found",
             "find -samefile tells the other names; remove those",
             {}});
    }
    examinePrivacy(strPath, *status, findings);
    return true;
}

// Returns whether the database can be opened without harm. Whoever opens it takes the changes in a
// write-ahead journal for its own.
bool examineForeignJournal(Findings& findings)
{
    const std::string strPath = VEMO_ATOKEN_DB_PATH "-wal";
    const size_t READ_VERSION = 19; // where the database says what its readers must know: 2 is this journal
    const std::string strHeader = tool::firstBytes(VEMO_ATOKEN_DB_PATH, READ_VERSION + 1);
    if (strHeader.size() <= READ_VERSION || strHeader[READ_VERSION] != 1 || !tool::statusOf(strPath)) {
        return true;
    }
    findings.push_back({Finding::Severity::Warning,
                        strPath + " does not belong to the database",
                        "the database was copied or replaced without it, and may lack changes",
                        "if the database is complete, remove it while no program runs",
                        {}});
    return false;
}

} // namespace

namespace tool {

bool examinePlace(Findings& findings)
{
    return examineDirectory(findings) && examineFile(findings) && examineForeignJournal(findings);
}

} // namespace tool
