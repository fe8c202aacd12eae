// Environments that a call of the library may meet. Each lasts as long as its object.

#ifndef TESTS_ENVIRONMENTS_H
#define TESTS_ENVIRONMENTS_H

#include <sys/resource.h>
#include <sys/types.h>

#include <filesystem>
#include <stdexcept>
#include <string>
#include <vector>

#include "TokenStore.h"

// What an environment throws that cannot be had here.
struct Unavailable : std::runtime_error {
    using std::runtime_error::runtime_error;
};

// The umask; the library must not change it.
class Umask {
public:
    Umask(const TokenStore& store, mode_t mode);
    ~Umask();

private:
    const mode_t m_mode;
    const mode_t m_modeBefore;
};

// What stands at a path.
enum class Thing { Nothing, EmptyFile, Directory, Link, DanglingLink, Fifo };

// The private directory is something else. A link leads to the directory itself.
class DirectoryIs {
public:
    DirectoryIs(const TokenStore& store, Thing thing);
    ~DirectoryIs();

private:
    const TokenStore& m_store;
};

// The database is something else, and must still be so afterwards. A link leads to the database.
class DatabaseIs {
public:
    DatabaseIs(const TokenStore& store, Thing thing);
    ~DatabaseIs();

private:
    const std::string m_strPath;
    const std::string m_strAside;
    const bool m_blMissing; // there was no database
    std::filesystem::file_type m_type;
};

// The modes of the directory and of the database, which belong to the user of the process: to the one that it
// has, or to another than root.
enum class User { Same, Other };

class Modes {
public:
    Modes(const TokenStore& store, User user, mode_t modeDirectory, mode_t modeFile);
    ~Modes();

private:
    const TokenStore& m_store;
    const uid_t m_uidBefore;
};

// Some of the descriptors 0 to 2 are closed. SQLite opens /dev/null in their places.
class ClosedDescriptors {
public:
    ClosedDescriptors(const TokenStore& store, const std::vector<int>& descriptors);
    ~ClosedDescriptors();

private:
    const std::vector<int> m_descriptors;
    std::vector<int> m_kept;
};

// Only so many descriptors are free.
class FreeDescriptors {
public:
    FreeDescriptors(const TokenStore& store, size_t nFree);
    ~FreeDescriptors();

private:
    struct rlimit m_limitBefore;
    std::vector<int> m_taken;
};

// Files cannot grow beyond a size, and the signal that tells so is ignored.
class FileSizeLimit {
public:
    FileSizeLimit(const TokenStore& store, rlim_t cbMax);
    ~FileSizeLimit();

private:
    struct rlimit m_limitBefore;
};

// Another process holds a lock on the database and is stopped. Continued, it ends as it should.
class StoppedHolder {
public:
    StoppedHolder(const TokenStore& store, const char* szSql);
    ~StoppedHolder();

private:
    pid_t m_nProcess;
};

// A small file system of its own below the directory of a store, which only this process sees.
class SmallFileSystem {
public:
    explicit SmallFileSystem(const TokenStore& store);
    ~SmallFileSystem();
    SmallFileSystem(const SmallFileSystem&) = delete;
    SmallFileSystem& operator=(const SmallFileSystem&) = delete;

private:
    const TokenStore& m_store;
};

// That file system is full, but for some bytes, or read-only.
class FullFileSystem {
public:
    FullFileSystem(const TokenStore& store, size_t cbFree);
    ~FullFileSystem();

private:
    const std::string m_strFiller;
};

class ReadOnlyFileSystem {
public:
    explicit ReadOnlyFileSystem(const TokenStore& store);
    ~ReadOnlyFileSystem();

private:
    const TokenStore& m_store;
};

#endif
