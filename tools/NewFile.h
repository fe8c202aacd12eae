// A file that appears under its name only when it is complete.

#ifndef TOOLS_NEW_FILE_H
#define TOOLS_NEW_FILE_H

#include <cstdio>
#include <memory>
#include <string>

#include "Descriptor.h"

namespace tool {

// What stands behind a file's name until it is complete, where it must have one.
const char* const UNFINISHED_SUFFIX = ".part";

// What an export of such a name has left behind, open and locked; none, with errno set, where there is none
// or one is writing it, or where it is something else: EEXIST. Keep it open while it is removed.
Descriptor lockRemains(const Descriptor& directory, const std::string& strName);

// Removes it. Returns false, with errno set, where it cannot.
bool removeRemains(const Descriptor& directory, const std::string& strName);

// All members throw Failure. Only its owner can read the file. Until it is complete it has no name, and
// whatever ends the process ends it, too. On file systems that do not know files without a name it has
// another one; a signal that can be caught removes that, and so does the next file of this name. A process
// has one at a time.
class NewFile {
public:
    explicit NewFile(const std::string& strPath);
    ~NewFile();
    NewFile(const NewFile&) = delete;
    NewFile& operator=(const NewFile&) = delete;

    void write(const std::string& strText);

    // Once it returns, a power cut leaves the file.
    void complete();

private:
    [[noreturn]] void fail() const;
    void requirePlace() const;
    Descriptor makeNamed();
    bool giveName();
    bool link(const std::string& strName);

    const std::string m_strPath;
    const FilePlace m_place;
    const std::string m_strUnfinished; // its name until it is complete
    std::unique_ptr<FILE, int (*)(FILE*)> m_pStream{nullptr, fclose};
};

} // namespace tool

#endif
