// SQLite's own VFS, with a hook that each call on a file goes past. It is the default one, which the library
// gets.

#ifndef TESTS_FAULTY_VFS_H
#define TESTS_FAULTY_VFS_H

#include <sqlite3.h>

#include <functional>
#include <string>

struct FileCall {
    const char* szName; // "xOpen", "xWrite", ...
    std::string strPath = "";
    sqlite3_int64 nArgument =
        0; // the flags, the lock, the operation, or the new size; of xDelete: whether to sync
    const void* pData = nullptr;                // of xWrite
    int cb = 0;                                 // of xWrite and xRead
    sqlite3_int64 nOffset = 0;                  // of xWrite and xRead
    std::function<int(int cb)> write = nullptr; // of xWrite: writes only the first cb bytes
};

// Answers a call in the place of the real one, which is `real`.
typedef std::function<int(const FileCall& call, const std::function<int()>& real)> FileHook;

// At most one at a time; it must outlive all connections over it.
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
