// A VFS in front of SQLite's own, which it stands in for as the default one, so that it is the one the
// library gets: each call on a file goes past a hook.

#ifndef TESTS_FAULTY_VFS_H
#define TESTS_FAULTY_VFS_H

#include <sqlite3.h>

#include <functional>
#include <string>

// One call. For xOpen, nArgument holds the flags; for xSync, xLock and xFileControl their second argument;
// for xDelete whether to sync the directory; for xTruncate the new size.
struct FileCall {
    const char* szName; // "xOpen", "xWrite", ...
    std::string strPath;
    sqlite3_int64 nArgument = 0;
    const void* pData = nullptr;      // of xWrite
    int cb = 0;                       // of xWrite and xRead
    sqlite3_int64 nOffset = 0;        // of xWrite and xRead
    std::function<int(int cb)> write; // of xWrite: writes only the first cb bytes
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
