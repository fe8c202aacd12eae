#include "PowerRecorder.h"

#include <sqlite3.h>
#include <unistd.h>

#include <cstddef>
#include <cstring>
#include <filesystem>
#include <set>
#include <stdexcept>

#include "FaultyVfs.h"

namespace {

const TokenStore* g_pStore = nullptr; // while recording
std::vector<DiskCall> g_calls;

void recordSync(int nFile)
{
    if (!g_pStore) {
        return;
    }
    const std::filesystem::path path =
        std::filesystem::read_symlink("/proc/self/fd/" + std::to_string(nFile));
    if (path == std::filesystem::canonical(g_pStore->directory())) {
        g_calls.push_back({DiskCall::Kind::SyncDirectory});
    } else {
        g_calls.push_back({DiskCall::Kind::Sync, path.filename()});
    }
}

// The library creates the database file before SQLite's first call; SQLite creates its journal in xOpen.
void recordOpening(std::set<std::string>& known, const std::string& strName)
{
    if (known.insert(strName).second) {
        g_calls.push_back({DiskCall::Kind::Create, strName});
    }
}

int recordCall(std::set<std::string>& known, const FileCall& call, const std::function<int()>& real)
{
    const auto nBefore = static_cast<std::ptrdiff_t>(g_calls.size());
    const int nResult = real();
    const std::string strName = std::filesystem::path(call.strPath).filename();
    if (SQLITE_OK != nResult || strName.empty()) {
        return nResult;
    }
    if (0 == strcmp("xOpen", call.szName)) {
        recordOpening(known, strName);
    } else if (0 == strcmp("xWrite", call.szName)) {
        g_calls.push_back({DiskCall::Kind::Write, strName, static_cast<size_t>(call.nOffset),
                           std::string(static_cast<const char*>(call.pData), static_cast<size_t>(call.cb))});
    } else if (0 == strcmp("xTruncate", call.szName)) {
        g_calls.push_back({DiskCall::Kind::Truncate, strName, static_cast<size_t>(call.nArgument)});
    } else if (0 == strcmp("xDelete", call.szName)) {
        known.erase(strName);
        // Before the sync of the directory, if the call made one.
        g_calls.insert(g_calls.begin() + nBefore, {DiskCall::Kind::Unlink, strName});
    }
    return nResult;
}

} // namespace

extern "C" int fsync(int nFile)
{
    recordSync(nFile);
    return 0;
}

extern "C" int fdatasync(int nFile)
{
    recordSync(nFile);
    return 0;
}

Recording record(const TokenStore& store, const Files& files, const std::vector<std::function<int()>>& calls)
{
    store.setFiles(files);
    std::set<std::string> known;
    for (const auto& [strName, strContents] : files) {
        known.insert(strName);
    }
    g_calls.clear();
    const FaultyVfs vfs([&](const FileCall& call, const std::function<int()>& real) {
        return recordCall(known, call, real);
    });
    g_pStore = &store;
    bool blFailed = false;
    for (const std::function<int()>& run : calls) {
        blFailed = 0 > run() || blFailed;
        g_calls.push_back({DiskCall::Kind::Return});
    }
    g_pStore = nullptr;
    if (blFailed) {
        throw std::logic_error("a recorded call failed");
    }
    return {files, g_calls};
}
