// Work on files and directories by descriptors: a check and the work after it are about the same file, even
// if others rename or link files meanwhile.

#ifndef TOOLS_DESCRIPTOR_H
#define TOOLS_DESCRIPTOR_H

#include <sys/stat.h>

#include <string>
#include <utility>

#include "Failure.h"

namespace tool {

// Owns a descriptor, and closes it.
class Descriptor {
public:
    explicit Descriptor(int nFile = -1) : m_nFile(nFile) {}
    ~Descriptor();
    Descriptor(Descriptor&& other) noexcept : m_nFile(other.release()) {}
    Descriptor& operator=(Descriptor&& other) noexcept;

    bool isOpen() const { return 0 <= m_nFile; }
    int get() const { return m_nFile; }
    int release() { return std::exchange(m_nFile, -1); } // the caller now owns it

private:
    int m_nFile;
};

// While this object lives, files and directories get exactly the mode that they are made with.
class UmaskOff {
public:
    UmaskOff() : m_before(umask(0)) {}
    ~UmaskOff() { umask(m_before); }
    UmaskOff(const UmaskOff&) = delete;
    UmaskOff& operator=(const UmaskOff&) = delete;

private:
    const mode_t m_before;
};

// Walks down a path from "/" or the current directory, step by step. Opens each directory in the one above
// it, and follows no symbolic link.
class Walk {
public:
    // Throws Failure if the first directory cannot be opened.
    explicit Walk(const std::string& strPath);

    // Whether step() was called for all directories of the path.
    bool isDone() const { return std::string::npos == m_nNext; }

    // Opens the next directory. Returns false if that is not possible, with errno set: ENOENT if there is
    // none, ELOOP if it is a symbolic link, ENOTDIR if it is something else.
    bool step();

    // Makes the directory that step() found missing, with this mode whatever the umask is, and opens it.
    // Returns false, with errno set, if that is not possible. When it returns true, a power cut does not undo
    // it.
    bool make(mode_t mode);

    // Whether the last directory was made by make(), and not by another process.
    bool hasMade() const { return m_blMade; }

    // The path of the last directory that was opened; after a failed step, of the one that could not be
    // opened.
    const std::string& path() const { return m_strPath; }

    // The last directory that was opened, by O_PATH: good for calls such as openat() and fstat(), but not to
    // read or sync it.
    Descriptor& directory() { return m_directory; }

private:
    bool openNamed();

    const std::string m_strWhole;
    size_t m_nNext; // where the next name begins; npos after the last name
    std::string m_strPath;
    std::string m_strName; // the last name in path()
    Descriptor m_directory;
    bool m_blMade = false;
};

// The message for a path that cannot be opened: errno says why, and strReached is how far a walk came.
BadValue badPath(const std::string& strPath, const std::string& strReached);

// The place of a file: its directory, open for calls such as openat(), and its name there. Throws BadValue,
// which names the path.
struct FilePlace {
    explicit FilePlace(const std::string& strPath);

    Descriptor directory;
    std::string strName;
};

// The status of a name in a directory, as by lstat; all zeros, with errno set, if that fails.
struct stat statusAt(const Descriptor& directory, const std::string& strName);

// Whether two statuses are of the same file.
bool isSame(const struct stat& one, const struct stat& other);

// Opens a regular file of a directory for reading, without waiting. Returns a closed Descriptor, with errno
// set, if that fails: ELOOP for a symbolic link, EISDIR for a directory, EINVAL for any other file that is
// not regular.
Descriptor openRegular(const Descriptor& directory, const std::string& strName);

// Opens a regular file that the caller names, for reading. Throws BadValue, which names the path. Also
// refuses a file with several hard links in a directory that others can write: they could have linked a file
// that they may not read.
Descriptor openToRead(const std::string& strPath);

// Syncs the names in a directory to the disk. Returns false, with errno set, on failure.
bool syncNames(const Descriptor& directory);

// Whether anybody but root and the caller can replace the files in a directory.
bool canOthersWrite(const struct stat& directory);

// The status of an open file. Throws Failure.
struct stat statusOf(const Descriptor& file);

} // namespace tool

#endif
