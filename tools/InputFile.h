// A stream that reads a regular file.

#ifndef TOOLS_INPUT_FILE_H
#define TOOLS_INPUT_FILE_H

#include <ext/stdio_filebuf.h>

#include <istream>
#include <string>

#include "Descriptor.h"

namespace tool {

class InputFile : public std::istream {
public:
    // Throws BadValue, which names the path.
    explicit InputFile(const std::string& strPath)
        : std::istream(nullptr),
          m_buffer(openToRead(strPath).release(), std::ios_base::in | std::ios_base::binary)
    {
        rdbuf(&m_buffer);
        exceptions(std::ios_base::badbit); // else lack of memory would go unnoticed and shorten a text
    }

private:
    __gnu_cxx::stdio_filebuf<char> m_buffer;
};

} // namespace tool

#endif
