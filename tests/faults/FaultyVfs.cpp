#include "FaultyVfs.h"

#include <map>

namespace {

typedef sqlite3_io_methods Methods;

// An open file is SQLite's own, but some of its methods are replaced by ones that ask the hook.
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
    methods.iVersion = 2; // no mapping of the database
    methods.xClose = [](sqlite3_file* p) {
        const int nResult = passFile<&Methods::xClose>({"xClose"}, p);
        g_files.erase(p);
        return nResult;
    };
    methods.xRead = [](sqlite3_file* p, void* pData, int cb, sqlite3_int64 nOffset) {
        return passFile<&Methods::xRead>({"xRead", "", 0, nullptr, cb, nOffset}, p, pData, cb, nOffset);
    };
    methods.xWrite = [](sqlite3_file* p, const void* pData, int cb, sqlite3_int64 nOffset) {
        const auto write = [=](int cbPart) { return g_files.at(p).pReal->xWrite(p, pData, cbPart, nOffset); };
        return passFile<&Methods::xWrite>({"xWrite", "", 0, pData, cb, nOffset, write}, p, pData, cb,
                                          nOffset);
    };
    methods.xTruncate = [](sqlite3_file* p, sqlite3_int64 cb) {
        return passFile<&Methods::xTruncate>({"xTruncate", "", cb}, p, cb);
    };
    methods.xSync = [](sqlite3_file* p, int nFlags) {
        return passFile<&Methods::xSync>({"xSync", "", nFlags}, p, nFlags);
    };
    methods.xFileSize = [](sqlite3_file* p, sqlite3_int64* pcb) {
        return passFile<&Methods::xFileSize>({"xFileSize"}, p, pcb);
    };
    methods.xLock = [](sqlite3_file* p, int nLock) {
        return passFile<&Methods::xLock>({"xLock", "", nLock}, p, nLock);
    };
    methods.xUnlock = [](sqlite3_file* p, int nLock) {
        return passFile<&Methods::xUnlock>({"xUnlock", "", nLock}, p, nLock);
    };
    methods.xCheckReservedLock = [](sqlite3_file* p, int* pnReserved) {
        return passFile<&Methods::xCheckReservedLock>({"xCheckReservedLock"}, p, pnReserved);
    };
    methods.xFileControl = [](sqlite3_file* p, int nOperation, void* pArgument) {
        return passFile<&Methods::xFileControl>({"xFileControl", "", nOperation}, p, nOperation, pArgument);
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
        const int nResult = pass<&sqlite3_vfs::xOpen>({"xOpen", "", nFlags}, szPath, pFile, nFlags, pnFlags);
        if (SQLITE_OK == nResult) {
            hook(pFile, szPath);
        }
        return nResult;
    };
    m_vfs.xDelete = [](sqlite3_vfs*, const char* szPath, int nSync) {
        return pass<&sqlite3_vfs::xDelete>({"xDelete", "", nSync}, szPath, nSync);
    };
    m_vfs.xAccess = [](sqlite3_vfs*, const char* szPath, int nFlags, int* pnResult) {
        return pass<&sqlite3_vfs::xAccess>({"xAccess", "", nFlags}, szPath, nFlags, pnResult);
    };
    m_vfs.xFullPathname = [](sqlite3_vfs*, const char* szPath, int cbOut, char* szOut) {
        return pass<&sqlite3_vfs::xFullPathname>({"xFullPathname"}, szPath, cbOut, szOut);
    };
    sqlite3_vfs_register(&m_vfs, 1);
}

FaultyVfs::~FaultyVfs()
{
    sqlite3_vfs_unregister(&m_vfs);
    sqlite3_vfs_register(g_pReal, 1);
    g_hook = nullptr;
}
