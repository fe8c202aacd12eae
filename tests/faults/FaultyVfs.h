// SQLite's own VFS with a hook, which decides the result of each call on a file. It is the default VFS, so
// the library uses it.

#ifndef TESTS_FAULTY_VFS_H
#define TESTS_FAULTY_VFS_H

#include <sqlite3.h>

#include <functional>
#include <string>

struct FileCall {
    const char* szName; // "xOpen", "xWrite", ...
    std::string strPath = "";
    const void* pData = nullptr;                // of xWrite
    int cb = 0;                                 // of xWrite
    sqlite3_int64 nOffset = 0;                  // of xWrite; of xTruncate the new size
    std::function<int(int cb)> write = nullptr; // of xWrite: writes only the first cb bytes
};

// Answers a call; real() makes the real one.
typedef std::function<int(const FileCall& call, const std::function<int()>& real)> FileHook;

// At most one at a time. It must live longer than all connections that use it.
class FaultyVfs {
public:
    explicit FaultyVfs(FileHook hook);
    ~FaultyVfs();
    FaultyVfs(const FaultyVfs&) = delete;
    FaultyVfs& operator=(const FaultyVfs&) = delete;

private:
    sqlite3_vfs m_vfs;
};

#endif
