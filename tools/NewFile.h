// A file that appears under its name only when it is complete.

#ifndef TOOLS_NEW_FILE_H
#define TOOLS_NEW_FILE_H

#include <cstdio>
#include <string>

namespace tool {

// All members throw Failure. Only its owner can read the file. A process has one at a time: until it is
// complete, it is removed with the object, or by a signal that ends the process and can be caught.
class NewFile {
public:
    explicit NewFile(const std::string& strName);
    ~NewFile();
    NewFile(const NewFile&) = delete;
    NewFile& operator=(const NewFile&) = delete;

    void write(const std::string& strText);
    void complete();

private:
    [[noreturn]] void fail() const;

    // Its name until it is complete.
    class TemporaryName {
    public:
        explicit TemporaryName(const std::string& strName) : m_strPath(strName + ".XXXXXX") {}
        ~TemporaryName();
        int make(); // opens the file
        bool become(const std::string& strName);

    private:
        std::string m_strPath;
    };

    const std::string m_strName;
    TemporaryName m_temporary;
    FILE* m_pStream = nullptr;
};

} // namespace tool

#endif
