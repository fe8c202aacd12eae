// A file that appears under its name only when it is complete.

#ifndef TOOLS_NEW_FILE_H
#define TOOLS_NEW_FILE_H

#include <cstdio>
#include <memory>
#include <string>

#include "Descriptor.h"

namespace tool {

// The suffix of the temporary name, where a file needs one until it is complete.
const char* const UNFINISHED_SUFFIX = ".part";

// Opens and locks a temporary file that an earlier export left behind under this name. Returns a closed
// Descriptor, with errno set, if there is none, if an export is writing it (EWOULDBLOCK), or if it is
// something else (EEXIST, or the error of openRegular()). The caller keeps it open until it has removed the
// file.
Descriptor lockRemains(const Descriptor& directory, const std::string& strName);

// Removes such a file. Returns true if none is left; otherwise false, with errno set.
bool removeRemains(const Descriptor& directory, const std::string& strName);

// Only the file's owner can read it. Until it is complete it has no name, so it ends with the process. Where
// the file system needs a name, it has a temporary one, which is removed by signals that can be caught, or by
// the next NewFile of the same name. A process has one NewFile at a time. All members throw Failure.
class NewFile {
public:
    explicit NewFile(const std::string& strPath);
    ~NewFile();
    NewFile(const NewFile&) = delete;
    NewFile& operator=(const NewFile&) = delete;

    void write(const std::string& strText);

    // Gives the file its name. When this returns, the file outlasts a power cut.
    void complete();

private:
    [[noreturn]] void fail() const;
    void requirePlace() const;
    Descriptor makeNamed();
    bool giveName();
    bool link(const std::string& strName);

    const std::string m_strPath;
    const FilePlace m_place;
    const std::string m_strUnfinished; // the temporary name
    std::unique_ptr<FILE, int (*)(FILE*)> m_pStream{nullptr, fclose};
};

} // namespace tool

#endif
