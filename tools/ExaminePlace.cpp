// What can be wrong with the directory and the file.

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <filesystem>
#include <iterator>

#include "AccessTokenDefine.h"
#include "Change.h"
#include "Descriptor.h"
#include "Examination.h"
#include "Failure.h"
#include "Masking.h"
#include "NewFile.h"
#include "Place.h"
#include "Store.h"

namespace {

using tool::Descriptor;
using tool::Finding;
using tool::Findings;
using tool::Store;

const mode_t PRIVATE_MODE = 0700;
const mode_t OTHERS_MODE = 0077;
const size_t WRITE_VERSION = 18; // offset of the file format version for writing: SQLite knows up to 2
const size_t READ_VERSION = 19;  // offset of the version for reading: 2 is the write-ahead journal
const size_t HEADER_BYTES = READ_VERSION + 1;

std::string octal(mode_t mode)
{
    char szMode[8];
    snprintf(szMode, sizeof(szMode), "%04o", static_cast<unsigned int>(mode & 07777));
    return szMode;
}

bool isPrivate(const struct stat& status)
{
    return 0 == status.st_uid && !(status.st_mode & OTHERS_MODE);
}

[[noreturn]] void fail(const std::string& strReason)
{
    throw tool::Failure(tool::EXIT_STATUS_STORE, strReason);
}

// Opens the private directory. Fails unless only root can replace anything on the way to it.
Descriptor openTrustedDirectory()
{
    tool::Walk walk(tool::databaseDirectory());
    while (!walk.isDone()) {
        if (!walk.step()) {
            fail(tool::badPath(walk.path(), walk.path()).what());
        }
        if (!walk.isDone() && tool::canOthersWrite(tool::statusOf(walk.directory()))) {
            fail("others than root can change " + walk.path());
        }
    }
    Descriptor directory(openat(walk.directory().get(), ".", O_RDONLY | O_CLOEXEC));
    if (!directory.isOpen()) {
        fail(walk.path() + ": " + strerror(errno));
    }
    return directory;
}

// Opens a file of that directory, which must be root's alone by now: nobody can have put a link in its place.
Descriptor openTrustedFile(const std::string& strSuffix)
{
    const Descriptor directory = openTrustedDirectory();
    if (!isPrivate(tool::statusOf(directory))) {
        fail(tool::databaseDirectory() + " is not root's alone");
    }
    Descriptor file = tool::openRegular(directory, tool::databaseName() + strSuffix);
    const std::string strPath = VEMO_ATOKEN_DB_PATH + strSuffix;
    if (!file.isOpen()) {
        fail(tool::badPath(strPath, strPath).what());
    }
    if (1 != tool::statusOf(file).st_nlink) {
        fail(strPath + " has several hard links");
    }
    return file;
}

void requireCall(bool blDone, const std::string& strPath)
{
    if (!blDone) {
        fail(tool::shownPath(strPath) + ": " + strerror(errno));
    }
}

// Makes a file or directory, which open() opens, root's alone.
template <typename Open>
void makePrivate(const std::string& strPath, const Open& open)
{
    const Descriptor file = open();
    requireCall(0 == fchown(file.get(), 0, static_cast<gid_t>(-1)), strPath);
    requireCall(0 == fchmod(file.get(), PRIVATE_MODE), strPath);
    tool::settleChange();
}

// The repair of owner and mode of the database, or of the journal with this suffix. Only in a directory that
// is root's alone is it certain that this is the right file, so the directory is repaired first.
std::function<void()> repairOf(const std::string& strSuffix, const struct stat& status)
{
    const auto directory = tool::statusOf(tool::databaseDirectory());
    if (1 != status.st_nlink || !directory || !isPrivate(*directory)) {
        return {};
    }
    return [strSuffix] {
        makePrivate(VEMO_ATOKEN_DB_PATH + strSuffix, [&strSuffix] { return openTrustedFile(strSuffix); });
    };
}

// Examines owner and mode of a path that should be root's alone. The repair is for both.
void examinePrivacy(const std::string& strPath, const struct stat& status,
                    const std::function<void()>& repair, Findings& findings)
{
    if (0 != status.st_uid) {
        findings.push_back({Finding::Severity::Error,
                            strPath + " belongs to uid " + std::to_string(status.st_uid),
                            "its owner can read and change every token, and may have done so",
                            "chown root " + strPath + ", and look at the tokens", repair});
    }
    const mode_t mode = status.st_mode & 07777;
    if (mode & OTHERS_MODE) {
        findings.push_back({Finding::Severity::Error, strPath + " has mode " + octal(mode),
                            "others than root can use it, and ids are credentials", "chmod 0700 " + strPath,
                            repair});
    }
}

// Reports a path that cannot be opened as a directory, for the reason in errno. Returns whether there may
// still be files.
bool examineObstacle(const std::string& strPath, bool blLast, Findings& findings)
{
    const std::function<void()> none;
    switch (errno) {
    case ENOENT:
        findings.push_back({Finding::Severity::Note, "there is no directory " + tool::databaseDirectory(),
                            "there is no store yet: no token can be created, and every call fails",
                            "vemo-access-token init", [] { tool::makeDirectory(); }});
        return false;
    case ELOOP:
        findings.push_back({Finding::Severity::Error, strPath + " is a symbolic link",
                            "the tokens stand elsewhere, or nowhere",
                            "find out who made it; move the " +
                                std::string(blLast ? "database" : "directory") +
                                " to a directory of that name",
                            none});
        return true;
    case ENOTDIR:
        findings.push_back({Finding::Severity::Error, strPath + " is not a directory",
                            "the tokens stand elsewhere, or nowhere",
                            "find out who made it; move the database to a directory of that name", none});
        return false;
    default: fail(strPath + ": " + strerror(errno));
    }
}

struct Directory {
    bool blFiles;   // it may hold files
    bool blTrusted; // only root can replace them
};

Directory examineDirectory(Findings& findings)
{
    tool::Walk walk(tool::databaseDirectory());
    bool blTrusted = true; // so far
    while (!walk.isDone()) {
        if (!walk.step()) {
            return {examineObstacle(walk.path(), walk.isDone(), findings), false};
        }
        const struct stat status = tool::statusOf(walk.directory());
        if (walk.isDone()) {
            // The database is opened only if nobody else can write to this directory.
            const auto repair = [] { makePrivate(tool::databaseDirectory(), openTrustedDirectory); };
            examinePrivacy(walk.path(), status, blTrusted ? repair : std::function<void()>(), findings);
            blTrusted = blTrusted && !tool::canOthersWrite(status);
        } else if (tool::canOthersWrite(status)) {
            blTrusted = false;
            findings.push_back({Finding::Severity::Warning,
                                walk.path() + " belongs to uid " + std::to_string(status.st_uid) +
                                    " and has mode " + octal(status.st_mode),
                                "others than root can replace the private directory below it",
                                "chown root " + walk.path() + " && chmod go-w " + walk.path(),
                                {}});
        }
    }
    tool::examineWritability(walk.path(), findings);
    return {true, blTrusted};
}

// Whether a journal names a super-journal at its end, which belongs to a change to several databases. Whoever
// opens the database opens and deletes the named file. No program that uses tokens makes such a change.
bool isOfSeveral(const std::string& strSuffix)
{
    const std::string strMark = "\xd9\xd5\x05\xf9\x20\xa1\x63\xd7";
    return tool::lastBytes(strSuffix, strMark.size()) == strMark;
}

// Examines the journals. Returns whether the database can be opened, which also opens the journals.
bool examineBeside(Findings& findings)
{
    bool blHarmless = true;
    for (const std::string strSuffix : tool::JOURNAL_SUFFIXES) {
        const std::string strPath = VEMO_ATOKEN_DB_PATH + strSuffix;
        const auto status = tool::statusOf(strPath);
        if (!status) {
            continue;
        }
        const std::string strRemedy = "find out who made it; remove it while no program runs";
        if (!S_ISREG(status->st_mode)) {
            findings.push_back(
                {Finding::Severity::Error,
                 strPath + (S_ISLNK(status->st_mode) ? " is a symbolic link" : " is not a regular file"),
                 "the database takes it for a journal of its own: calls can fail, or never end",
                 strRemedy,
                 {}});
            blHarmless = false;
        } else if (0 != status->st_uid) {
            findings.push_back({Finding::Severity::Error,
                                strPath + " belongs to uid " + std::to_string(status->st_uid),
                                "the next program to open the database may take its contents for changes",
                                strRemedy,
                                {}});
            blHarmless = false;
        } else if (1 != status->st_nlink || isOfSeveral(strSuffix)) {
            findings.push_back({Finding::Severity::Error,
                                strPath + (1 != status->st_nlink ? " has several hard links"
                                                                 : " is one of several that belong together"),
                                "the next program to open the database changes other files, too",
                                strRemedy,
                                {}});
            blHarmless = false;
        } else {
            examinePrivacy(strPath, *status, repairOf(strSuffix, *status), findings);
        }
    }
    return blHarmless;
}

// Examines the database file. Returns whether it can be opened. The repair makes a missing file, if blMake.
bool examineFile(bool blMake, Findings& findings)
{
    const std::string strPath = VEMO_ATOKEN_DB_PATH;
    const auto status = tool::statusOf(strPath);
    if (!status) {
        // A journal without a database is left from a database that was there.
        const bool blFirst = std::none_of(
            std::begin(tool::JOURNAL_SUFFIXES), std::end(tool::JOURNAL_SUFFIXES),
            [&strPath](const char* szSuffix) { return tool::statusOf(strPath + szSuffix).has_value(); });
        findings.push_back({blFirst ? Finding::Severity::Note : Finding::Severity::Error,
                            "there is no database " + strPath,
                            "there are no tokens; the first call that needs it makes it",
                            "vemo-access-token init",
                            {}});
        if (blMake) {
            findings.back().repair = [] { Store(Store::Access::Locked, Store::Missing::Make).makeTable(); };
        }
        return false;
    }
    if (!S_ISREG(status->st_mode)) {
        findings.push_back(
            {Finding::Severity::Error,
             strPath + (S_ISLNK(status->st_mode) ? " is a symbolic link" : " is not a regular file"),
             "programs work on another file than this one, or on none",
             "find out who made it; move the database to this name",
             {}});
        return false;
    }
    if (1 != status->st_nlink) {
        findings.push_back(
            {Finding::Severity::Warning,
             strPath + " has " + std::to_string(status->st_nlink) + " hard links",
             "the tokens can be reached under another name, and a journal of that name is not found",
             "find -samefile tells the other names; remove those",
             {}});
    }
    examinePrivacy(strPath, *status, repairOf("", *status), findings);
    return true;
}

void examineVersion(const std::string& strHeader, Findings& findings)
{
    if (0 != strHeader.compare(0, 6, "SQLite") || 2 >= static_cast<unsigned char>(strHeader[WRITE_VERSION])) {
        return;
    }
    findings.push_back(
        {Finding::Severity::Error,
         "the database says that only a later SQLite can write to it",
         "no token can be created, changed or granted",
         std::string("save the tokens with \"vemo-access-token export\"; ") + tool::REMEDY_REPLACE,
         {}});
}

// Returns whether the database can be opened without harm: SQLite applies the changes in a write-ahead
// journal to the database beside it, even if the journal does not belong to it.
bool examineForeignJournal(const std::string& strHeader, Findings& findings)
{
    const std::string strPath = VEMO_ATOKEN_DB_PATH "-wal";
    if (strHeader[READ_VERSION] != 1 || !tool::statusOf(strPath)) {
        return true;
    }
    findings.push_back({Finding::Severity::Warning,
                        strPath + " does not belong to the database",
                        "the database was copied or replaced without it, and may lack changes",
                        "if the database is complete, remove it while no program runs",
                        {}});
    return false;
}

// Looks for temporary files of exports that a power cut ended.
void examineRemains(Findings& findings)
{
    typedef std::filesystem::directory_iterator Entry;
    std::error_code error;
    for (Entry entry(tool::databaseDirectory(), error); entry != Entry(); entry.increment(error)) {
        const std::string strName = entry->path().filename();
        if (entry->path().extension() == tool::UNFINISHED_SUFFIX &&
            tool::lockRemains(tool::openDirectory(), strName).isOpen()) {
            findings.push_back(
                {Finding::Severity::Warning,
                 tool::databaseDirectory() + "/" + tool::shownPath(strName) + " was left behind",
                 "an export was cut off; the file can hold whole ids", "remove it", [strName] {
                     requireCall(tool::removeRemains(openTrustedDirectory(), strName), strName);
                     tool::settleChange();
                 }});
        }
    }
    if (error && error != std::errc::no_such_file_or_directory) { // it may be a link to nowhere
        fail(tool::databaseDirectory() + ": " + error.message());
    }
}

// Whoever can open the lock file can stop all programs that take the lock.
void examineLock(Findings& findings)
{
    const std::string strPath = CallLock::FILE_OF_ALL;
    const auto status = tool::statusOf(strPath);
    if (status && (!S_ISREG(status->st_mode) || !isPrivate(*status))) {
        findings.push_back({Finding::Severity::Error,
                            strPath + " is not root's alone: it belongs to uid " +
                                std::to_string(status->st_uid) + " and has mode " + octal(status->st_mode),
                            "others can hold the lock for ever; programs that take it refuse this file",
                            "remove it while no program that uses tokens runs",
                            {}});
    }
}

} // namespace

namespace tool {

bool examinePlace(Findings& findings)
{
    examineLock(findings);
    const auto [blFiles, blTrusted] = examineDirectory(findings);
    if (!blFiles) {
        return false;
    }
    examineRemains(findings);
    // Elsewhere, others could add a journal just before the database is opened or made.
    const bool blOpens = examineBeside(findings) && blTrusted;
    const bool blFile = examineFile(blOpens, findings);
    examineFileSystem(findings);
    if (!blOpens || !blFile) {
        return false;
    }
    const std::string strHeader = tool::firstBytes("", HEADER_BYTES);
    examineVersion(strHeader, findings);
    return examineForeignJournal(strHeader, findings);
}

} // namespace tool
