// What keeps programs from writing: to the directory, the database and its journals.

#include <fcntl.h>
#include <sys/statvfs.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "AccessTokenDefine.h"
#include "Descriptor.h"
#include "Examination.h"
#include "Failure.h"
#include "Place.h"

namespace {

using tool::Finding;
using tool::Findings;

const uint64_t ROOM_MIN = 65536; // bytes for the journal of a small change and the pages that it adds

const char* const UNCHANGEABLE = "no token can be created, changed or granted";

// Attributes, set by chattr(1), that forbid changes.
const struct {
    uint64_t nBit; // in stx_attributes
    const char* szName;
    const char* szRemedy;
} FORBIDDING[] = {
    {STATX_ATTR_IMMUTABLE, "immutable", "chattr -i "},
    {STATX_ATTR_APPEND, "append-only", "chattr -a "},
};

// The status that look() fills in for a path, whatever kind of file it is. Opens the file with O_PATH, so it
// cannot wait for the other end of a pipe.
template <typename Status, typename Look>
Status lookAt(const std::string& strPath, Look look)
{
    const tool::Descriptor file(open(strPath.c_str(), O_PATH | O_NOFOLLOW | O_CLOEXEC));
    Status status = {};
    if (!file.isOpen() || 0 != look(file.get(), &status)) {
        throw tool::Failure(tool::EXIT_STATUS_STORE, strPath + ": " + strerror(errno));
    }
    return status;
}

uint64_t attributesOf(const std::string& strPath)
{
    const auto look = [](int nFile, struct statx* pStatus) {
        return statx(nFile, "", AT_EMPTY_PATH, 0, pStatus);
    };
    return lookAt<struct statx>(strPath, look).stx_attributes;
}

void examineRoom(const struct statvfs& status, Findings& findings)
{
    const std::string strPath = tool::databaseDirectory();
    // Programs run as root, which may also use the reserve of the file system, so f_bfree counts. Some file
    // systems have no limit on files: they report 0 of them.
    const bool blRoom = uint64_t{status.f_bfree} * status.f_frsize >= ROOM_MIN;
    const bool blFiles = 0 == status.f_files || 0 != status.f_ffree;
    if (!blRoom || !blFiles) {
        findings.push_back(
            {Finding::Severity::Error,
             "the file system of " + strPath + " has no room for " + (blRoom ? "another file" : "a change"),
             UNCHANGEABLE,
             "remove what is not needed there: \"df " + std::string(blRoom ? "-i " : "") + strPath +
                 "\" tells how full it is",
             {}});
    }
}

} // namespace

namespace tool {

void examineWritability(const std::string& strPath, Findings& findings)
{
    const uint64_t nAttributes = attributesOf(strPath);
    for (const auto& attribute : FORBIDDING) {
        if (nAttributes & attribute.nBit) {
            findings.push_back({Finding::Severity::Error,
                                strPath + " is " + attribute.szName,
                                UNCHANGEABLE,
                                attribute.szRemedy + strPath,
                                {}});
        }
    }
    if (0 == (nAttributes & STATX_ATTR_IMMUTABLE) && 0 != access(strPath.c_str(), W_OK)) {
        findings.push_back({Finding::Severity::Error,
                            strPath + " cannot be written to: " + strerror(errno),
                            UNCHANGEABLE,
                            std::string("make the file system writable, or the ") +
                                (strPath == databaseDirectory() ? "directory" : "file"),
                            {}});
    }
}

void examineFileSystem(Findings& findings)
{
    const auto fileSystem = lookAt<struct statvfs>(databaseDirectory(), fstatvfs);
    if (fileSystem.f_flag & ST_RDONLY) {
        return; // reported by examineWritability() for the directory
    }
    const auto status = statusOf(VEMO_ATOKEN_DB_PATH);
    if (status && S_ISREG(status->st_mode)) {
        examineWritability(VEMO_ATOKEN_DB_PATH, findings);
    }
    examineRoom(fileSystem, findings);
}

} // namespace tool
