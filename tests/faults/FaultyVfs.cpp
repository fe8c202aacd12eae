#include "FaultyVfs.h"

#include <map>

namespace {

typedef sqlite3_io_methods Methods;

// An open file is SQLite's own; some of its methods are replaced by others, which ask the hook.
struct File {
    std::string strPath;
    const Methods* pReal;
    Methods hooked;
};

FileHook g_hook;
sqlite3_vfs* g_pReal = nullptr;
std::map<sqlite3_file*, File> g_files;

template <auto METHOD, typename... Arguments>
int passFile(FileCall call, sqlite3_file* pFile, Arguments... arguments)
{
    const File& file = g_files.at(pFile);
    call.strPath = file.strPath;
    return g_hook(call, [&] { return (file.pReal->*METHOD)(pFile, arguments...); });
}

template <auto METHOD, typename... Arguments>
int pass(FileCall call, const char* szPath, Arguments... arguments)
{
    call.strPath = szPath ? szPath : ""; // a temporary file has no name
    return g_hook(call, [&] { return (g_pReal->*METHOD)(g_pReal, szPath, arguments...); });
}

void hook(sqlite3_file* pFile, const char* szPath)
{
    File& file = g_files[pFile];
    file = {szPath ? szPath : "", pFile->pMethods, *pFile->pMethods};
    pFile->pMethods = &file.hooked;
    Methods& methods = file.hooked;
    methods.iVersion = 2; // without mapping of the database
    methods.xClose = [](sqlite3_file* p) {
        const int nResult = passFile<&Methods::xClose>({"xClose"}, p);
        g_files.erase(p);
        return nResult;
    };
    methods.xRead = [](auto... args) { return passFile<&Methods::xRead>({"xRead"}, args...); };
    methods.xWrite = [](sqlite3_file* p, const void* pData, int cb, sqlite3_int64 nOffset) {
        const auto write = [=](int cbPart) { return g_files.at(p).pReal->xWrite(p, pData, cbPart, nOffset); };
        return passFile<&Methods::xWrite>({"xWrite", "", pData, cb, nOffset, write}, p, pData, cb, nOffset);
    };
    methods.xTruncate = [](sqlite3_file* p, sqlite3_int64 cb) {
        return passFile<&Methods::xTruncate>({"xTruncate", "", nullptr, 0, cb}, p, cb);
    };
    methods.xSync = [](auto... args) { return passFile<&Methods::xSync>({"xSync"}, args...); };
    methods.xFileSize = [](auto... args) { return passFile<&Methods::xFileSize>({"xFileSize"}, args...); };
    methods.xLock = [](auto... args) { return passFile<&Methods::xLock>({"xLock"}, args...); };
    methods.xUnlock = [](auto... args) { return passFile<&Methods::xUnlock>({"xUnlock"}, args...); };
    methods.xCheckReservedLock = [](auto... args) {
        return passFile<&Methods::xCheckReservedLock>({"xCheckReservedLock"}, args...);
    };
    methods.xFileControl = [](auto... args) {
        return passFile<&Methods::xFileControl>({"xFileControl"}, args...);
    };
}

} // namespace

FaultyVfs::FaultyVfs(FileHook hooked) : m_vfs(*sqlite3_vfs_find("unix"))
{
    g_pReal = sqlite3_vfs_find("unix");
    g_hook = std::move(hooked);
    m_vfs.zName = "faulty";
    m_vfs.xOpen = [](sqlite3_vfs*, const char* szPath, sqlite3_file* pFile, int nFlags, int* pnFlags) {
        pFile->pMethods = nullptr;
        const int nResult = pass<&sqlite3_vfs::xOpen>({"xOpen"}, szPath, pFile, nFlags, pnFlags);
        if (SQLITE_OK == nResult) {
            hook(pFile, szPath);
        }
        return nResult;
    };
    m_vfs.xDelete = [](sqlite3_vfs*, auto... args) {
        return pass<&sqlite3_vfs::xDelete>({"xDelete"}, args...);
    };
    m_vfs.xAccess = [](sqlite3_vfs*, auto... args) {
        return pass<&sqlite3_vfs::xAccess>({"xAccess"}, args...);
    };
    m_vfs.xFullPathname = [](sqlite3_vfs*, auto... args) {
        return pass<&sqlite3_vfs::xFullPathname>({"xFullPathname"}, args...);
    };
    sqlite3_vfs_register(&m_vfs, 1);
}

FaultyVfs::~FaultyVfs()
{
    sqlite3_vfs_unregister(&m_vfs);
    sqlite3_vfs_register(g_pReal, 1);
    g_hook = nullptr;
}
