// Files and directories by descriptors: what was looked at is what is worked on, whatever others rename or
// link meanwhile.

#ifndef TOOLS_DESCRIPTOR_H
#define TOOLS_DESCRIPTOR_H

#include <sys/stat.h>

#include <string>
#include <utility>

#include "Failure.h"

namespace tool {

// Closes what it has opened.
class Descriptor {
public:
    explicit Descriptor(int nFile = -1) : m_nFile(nFile) {}
    ~Descriptor();
    Descriptor(Descriptor&& other) noexcept : m_nFile(other.release()) {}
    Descriptor& operator=(Descriptor&& other) noexcept;

    bool isOpen() const { return 0 <= m_nFile; }
    int get() const { return m_nFile; }
    int release() { return std::exchange(m_nFile, -1); } // hands it on

private:
    int m_nFile;
};

// While it lives, files and directories get the mode that they are made with.
class UmaskOff {
public:
    UmaskOff() : m_before(umask(0)) {}
    ~UmaskOff() { umask(m_before); }
    UmaskOff(const UmaskOff&) = delete;
    UmaskOff& operator=(const UmaskOff&) = delete;

private:
    const mode_t m_before;
};

// A way down a path, from "/" or the current directory. Each directory is opened in the one above it, and
// none through a symbolic link.
class Walk {
public:
    // Throws Failure where not even the first of them can be opened.
    explicit Walk(const std::string& strPath);

    // Whether all directories of the path have been stepped to.
    bool isDone() const { return std::string::npos == m_nNext; }

    // Opens the next one. Returns false, with errno set, where that is not possible: ENOENT there is none,
    // ELOOP it is a symbolic link, ENOTDIR it is something else.
    bool step();

    // Makes the one that a step found missing, with this mode whatever the umask, and opens it. Returns
    // false, with errno set, where that is not possible.
    bool make(mode_t mode);

    // Whether it was that, and not another process, that made the last one. Once make() has succeeded, no
    // power cut undoes it.
    bool hasMade() const { return m_blMade; }

    // The last one that was opened or, when a step failed, that was not.
    const std::string& path() const { return m_strPath; }

    // The last one that was opened, to be worked in and looked at, no more.
    Descriptor& directory() { return m_directory; }

private:
    bool openNamed();

    const std::string m_strWhole;
    size_t m_nNext; // where the next name begins; npos behind the last
    std::string m_strPath;
    std::string m_strName; // of the directory that path() ends with
    Descriptor m_directory;
    bool m_blMade = false;
};

// What is said of a path when errno tells why it, or the directory of it that a walk reached, cannot be
// opened.
BadValue badPath(const std::string& strPath, const std::string& strReached);

// The place of a file: its directory, to be worked in, and its name there. Throws BadValue, which names the
// path.
struct FilePlace {
    explicit FilePlace(const std::string& strPath);

    Descriptor directory;
    std::string strName;
};

// What lstat tells of a name in a directory; zeros, with errno set, where it tells nothing.
struct stat statusAt(const Descriptor& directory, const std::string& strName);

// Whether two descriptions are those of one file.
bool isSame(const struct stat& one, const struct stat& other);

// Opens a file of a directory for reading, without waiting, if it is a regular one. Returns none, with errno
// set, where it is not: EINVAL for what is no regular file. Nothing else is opened.
Descriptor openRegular(const Descriptor& directory, const std::string& strName);

// The same by its path, for data of the caller's. Throws BadValue, which names the path; also of a file with
// several names in a directory of others, who can have put another's secret there.
Descriptor openToRead(const std::string& strPath);

// Waits until the disk has the names that stand in a directory. Returns false, with errno set, where it
// cannot.
bool syncNames(const Descriptor& directory);

// Whether others than root and the caller can put something else in the place of what stands in a directory.
bool canOthersWrite(const struct stat& directory);

// What fstat tells. Throws Failure.
struct stat statusOf(const Descriptor& file);

} // namespace tool

#endif
