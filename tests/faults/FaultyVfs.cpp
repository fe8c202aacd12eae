#include "FaultyVfs.h"

#include <new>

namespace {

FileHook g_hook;

// A file of ours; the real one stands right behind it.
struct File {
    sqlite3_file base;
    std::string* pstrPath;
    sqlite3_file* real() { return reinterpret_cast<sqlite3_file*>(this + 1); }
};

File& fileOf(sqlite3_file* pFile)
{
    return *reinterpret_cast<File*>(pFile);
}

sqlite3_vfs* realVfs(sqlite3_vfs* pVfs)
{
    return static_cast<sqlite3_vfs*>(pVfs->pAppData);
}

int told(const FileCall& call, const std::function<int()>& real)
{
    return g_hook(call, real);
}

FileCall callOn(sqlite3_file* pFile, const char* szName, sqlite3_int64 nArgument = 0)
{
    FileCall call;
    call.szName = szName;
    call.strPath = *fileOf(pFile).pstrPath;
    call.nArgument = nArgument;
    return call;
}

int fileClose(sqlite3_file* pFile)
{
    const int nResult = told(callOn(pFile, "xClose"),
                             [&] { return fileOf(pFile).real()->pMethods->xClose(fileOf(pFile).real()); });
    delete fileOf(pFile).pstrPath;
    fileOf(pFile).base.pMethods = nullptr;
    return nResult;
}

int fileRead(sqlite3_file* pFile, void* pData, int cb, sqlite3_int64 nOffset)
{
    FileCall call = callOn(pFile, "xRead");
    call.cb = cb;
    call.nOffset = nOffset;
    return told(call, [&] {
        return fileOf(pFile).real()->pMethods->xRead(fileOf(pFile).real(), pData, cb, nOffset);
    });
}

int fileWrite(sqlite3_file* pFile, const void* pData, int cb, sqlite3_int64 nOffset)
{
    FileCall call = callOn(pFile, "xWrite");
    call.pData = pData;
    call.cb = cb;
    call.nOffset = nOffset;
    call.write = [&](int cbPart) {
        return fileOf(pFile).real()->pMethods->xWrite(fileOf(pFile).real(), pData, cbPart, nOffset);
    };
    return told(call, [&] { return call.write(cb); });
}

int fileTruncate(sqlite3_file* pFile, sqlite3_int64 cb)
{
    return told(callOn(pFile, "xTruncate", cb),
                [&] { return fileOf(pFile).real()->pMethods->xTruncate(fileOf(pFile).real(), cb); });
}

int fileSync(sqlite3_file* pFile, int nFlags)
{
    return told(callOn(pFile, "xSync", nFlags),
                [&] { return fileOf(pFile).real()->pMethods->xSync(fileOf(pFile).real(), nFlags); });
}

int fileSize(sqlite3_file* pFile, sqlite3_int64* pcb)
{
    return told(callOn(pFile, "xFileSize"),
                [&] { return fileOf(pFile).real()->pMethods->xFileSize(fileOf(pFile).real(), pcb); });
}

int fileLock(sqlite3_file* pFile, int nLock)
{
    return told(callOn(pFile, "xLock", nLock),
                [&] { return fileOf(pFile).real()->pMethods->xLock(fileOf(pFile).real(), nLock); });
}

int fileUnlock(sqlite3_file* pFile, int nLock)
{
    return told(callOn(pFile, "xUnlock", nLock),
                [&] { return fileOf(pFile).real()->pMethods->xUnlock(fileOf(pFile).real(), nLock); });
}

int fileCheckReservedLock(sqlite3_file* pFile, int* pnReserved)
{
    return told(callOn(pFile, "xCheckReservedLock"), [&] {
        return fileOf(pFile).real()->pMethods->xCheckReservedLock(fileOf(pFile).real(), pnReserved);
    });
}

int fileControl(sqlite3_file* pFile, int nOperation, void* pArgument)
{
    return told(callOn(pFile, "xFileControl", nOperation), [&] {
        return fileOf(pFile).real()->pMethods->xFileControl(fileOf(pFile).real(), nOperation, pArgument);
    });
}

int fileSectorSize(sqlite3_file* pFile)
{
    return fileOf(pFile).real()->pMethods->xSectorSize(fileOf(pFile).real());
}

int fileDeviceCharacteristics(sqlite3_file* pFile)
{
    return fileOf(pFile).real()->pMethods->xDeviceCharacteristics(fileOf(pFile).real());
}

// The index of a write-ahead log: memory, which no disk and no fault concerns.
int fileShmMap(sqlite3_file* pFile, int nRegion, int cb, int nExtend, void volatile** ppRegion)
{
    return fileOf(pFile).real()->pMethods->xShmMap(fileOf(pFile).real(), nRegion, cb, nExtend, ppRegion);
}

int fileShmLock(sqlite3_file* pFile, int nOffset, int n, int nFlags)
{
    return fileOf(pFile).real()->pMethods->xShmLock(fileOf(pFile).real(), nOffset, n, nFlags);
}

void fileShmBarrier(sqlite3_file* pFile)
{
    fileOf(pFile).real()->pMethods->xShmBarrier(fileOf(pFile).real());
}

int fileShmUnmap(sqlite3_file* pFile, int nDelete)
{
    return fileOf(pFile).real()->pMethods->xShmUnmap(fileOf(pFile).real(), nDelete);
}

// Version 2: no mapping of the database.
const sqlite3_io_methods g_methods = {2,
                                      &fileClose,
                                      &fileRead,
                                      &fileWrite,
                                      &fileTruncate,
                                      &fileSync,
                                      &fileSize,
                                      &fileLock,
                                      &fileUnlock,
                                      &fileCheckReservedLock,
                                      &fileControl,
                                      &fileSectorSize,
                                      &fileDeviceCharacteristics,
                                      &fileShmMap,
                                      &fileShmLock,
                                      &fileShmBarrier,
                                      &fileShmUnmap,
                                      nullptr,
                                      nullptr};

FileCall callOf(const char* szName, const char* szPath, sqlite3_int64 nArgument)
{
    FileCall call;
    call.szName = szName;
    call.strPath = szPath ? szPath : ""; // a temporary file has no name
    call.nArgument = nArgument;
    return call;
}

int vfsOpen(sqlite3_vfs* pVfs, const char* szPath, sqlite3_file* pFile, int nFlags, int* pnFlags)
{
    File& file = fileOf(pFile);
    file.base.pMethods = nullptr;
    const int nResult = told(callOf("xOpen", szPath, nFlags), [&] {
        return realVfs(pVfs)->xOpen(realVfs(pVfs), szPath, file.real(), nFlags, pnFlags);
    });
    if (SQLITE_OK == nResult) {
        file.pstrPath = new std::string(szPath ? szPath : "");
        file.base.pMethods = &g_methods;
    }
    return nResult;
}

int vfsDelete(sqlite3_vfs* pVfs, const char* szPath, int nSync)
{
    return told(callOf("xDelete", szPath, nSync),
                [&] { return realVfs(pVfs)->xDelete(realVfs(pVfs), szPath, nSync); });
}

int vfsAccess(sqlite3_vfs* pVfs, const char* szPath, int nFlags, int* pnResult)
{
    return told(callOf("xAccess", szPath, nFlags),
                [&] { return realVfs(pVfs)->xAccess(realVfs(pVfs), szPath, nFlags, pnResult); });
}

int vfsFullPathname(sqlite3_vfs* pVfs, const char* szPath, int cbOut, char* szOut)
{
    return told(callOf("xFullPathname", szPath, 0),
                [&] { return realVfs(pVfs)->xFullPathname(realVfs(pVfs), szPath, cbOut, szOut); });
}

// These go to the real VFS, which expects itself as their first argument.
int vfsRandomness(sqlite3_vfs* pVfs, int cb, char* szOut)
{
    return realVfs(pVfs)->xRandomness(realVfs(pVfs), cb, szOut);
}

int vfsSleep(sqlite3_vfs* pVfs, int nMicroseconds)
{
    return realVfs(pVfs)->xSleep(realVfs(pVfs), nMicroseconds);
}

int vfsCurrentTime(sqlite3_vfs* pVfs, double* pdTime)
{
    return realVfs(pVfs)->xCurrentTime(realVfs(pVfs), pdTime);
}

int vfsGetLastError(sqlite3_vfs* pVfs, int cb, char* szOut)
{
    return realVfs(pVfs)->xGetLastError(realVfs(pVfs), cb, szOut);
}

int vfsCurrentTimeInt64(sqlite3_vfs* pVfs, sqlite3_int64* pnTime)
{
    return realVfs(pVfs)->xCurrentTimeInt64(realVfs(pVfs), pnTime);
}

} // namespace

FaultyVfs::FaultyVfs(FileHook hook) : m_vfs()
{
    sqlite3_vfs* pReal = sqlite3_vfs_find("unix");
    g_hook = std::move(hook);
    m_vfs.iVersion = 2;
    m_vfs.szOsFile = static_cast<int>(sizeof(File)) + pReal->szOsFile;
    m_vfs.mxPathname = pReal->mxPathname;
    m_vfs.zName = "faulty";
    m_vfs.pAppData = pReal;
    m_vfs.xOpen = &vfsOpen;
    m_vfs.xDelete = &vfsDelete;
    m_vfs.xAccess = &vfsAccess;
    m_vfs.xFullPathname = &vfsFullPathname;
    m_vfs.xRandomness = &vfsRandomness;
    m_vfs.xSleep = &vfsSleep;
    m_vfs.xCurrentTime = &vfsCurrentTime;
    m_vfs.xGetLastError = &vfsGetLastError;
    m_vfs.xCurrentTimeInt64 = &vfsCurrentTimeInt64;
    sqlite3_vfs_register(&m_vfs, 1);
}

FaultyVfs::~FaultyVfs()
{
    sqlite3_vfs_unregister(&m_vfs);
    sqlite3_vfs_register(sqlite3_vfs_find("unix"), 1);
    g_hook = nullptr;
}
