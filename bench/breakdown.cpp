// Where the time of one grant goes, and which system calls it makes.
//
// The grant saves its token, in a store of ten. A call opens and closes the database; a held object
// keeps it open. With the write-ahead journal another process holds a connection, or the end of each
// call would write the journal back and delete it.
//
// The program replaces the functions of SQLite and of the C library that a grant calls; they count, and call
// the real ones. Each benchmark reports the medians of its grants:
//
//   open_us, close_us              sqlite3_open and sqlite3_close
//   purge_us, select_us, save_us   sqlite3_exec of the DELETE, SELECT and REPLACE, without the row callback
//   library_us                     all the rest, the row callback included
//   total_us                       the grant
//   opens, closes, reads, writes, syncs, unlinks
//                                  numbers of system calls
//   locks                          of fcntl
//   stats                          of stat, lstat, fstat and access
//   others                         of getpid, fchown, ftruncate, mmap and munmap
//
// Calls that read and set the effective uid are missing: the redirection of the database replaces them.

#undef _FORTIFY_SOURCE // with it, headers define functions that this program defines

#include <benchmark/benchmark.h>
#include <fcntl.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <chrono>
#include <cstdarg>
#include <numeric>
#include <optional>
#include <string>

#include "AccessTokenApi.h"
#include "Bystander.h"
#include "Interpose.h"
#include "Run.h"
#include "Samples.h"
#include "Store.h"
#include "Turns.h"
#include "vemo-access-token.h"

namespace {

const int TOKENS = 10;
const int GRANTS = 300;

// What is measured: microseconds of the steps of a grant, and numbers of its system calls.
enum Quantity {
    Library = LIBRARY,
    Open,
    Purge,
    Select,
    Save,
    Close,
    Total,
    Opens,
    Closes,
    Reads,
    Writes,
    Syncs,
    Locks,
    Unlinks,
    Stats,
    Others,
    QUANTITIES
};

const char* const g_rgszName[QUANTITIES] = {
    "library_us", "open_us", "purge_us", "select_us", "save_us", "close_us", "total_us", "opens",
    "closes",     "reads",   "writes",   "syncs",     "locks",   "unlinks",  "stats",    "others",
};

typedef std::array<double, QUANTITIES> Breakdown;
typedef std::chrono::steady_clock Clock;

// The grant that is being measured.
bool g_blMeasuring = false;
Breakdown g_breakdown;
Clock::time_point g_turnStart;

void count(Quantity call)
{
    if (g_blMeasuring) {
        ++g_breakdown[call];
    }
}

} // namespace

int turnOf(const char* szWhat)
{
    switch (szWhat[0]) {
    case 'o': return Open;
    case 'c': return Close;
    case 'D': return Purge;
    case 'S': return Select;
    case 'R': return Save;
    default: return Library;
    }
}

void endTurn(int nTurn)
{
    const Clock::time_point now = Clock::now();
    g_breakdown[static_cast<size_t>(nTurn)] +=
        std::chrono::duration<double, std::micro>(now - g_turnStart).count();
    g_turnStart = now;
}

// Replaces a function by one that counts its calls.
#define COUNTED(call, result, name, parameters, arguments)                                                   \
    INTERPOSED result name parameters                                                                        \
    {                                                                                                        \
        count(call);                                                                                         \
        return NEXT(name) arguments;                                                                         \
    }

extern "C" {

INTERPOSED int open64(const char* szPath, int nFlags, ...)
{
    va_list args;
    va_start(args, nFlags);
    const mode_t mode = (nFlags & O_CREAT) ? va_arg(args, mode_t) : 0;
    va_end(args);
    count(Opens);
    return NEXT(open64)(szPath, nFlags, mode);
}

INTERPOSED int fcntl64(int nFile, int nCommand, ...)
{
    va_list args;
    va_start(args, nCommand);
    void* pArgument = va_arg(args, void*);
    va_end(args);
    count(Locks);
    return NEXT(fcntl64)(nFile, nCommand, pArgument);
}

COUNTED(Closes, int, close, (int nFile), (nFile))
COUNTED(Reads, ssize_t, read, (int nFile, void* pData, size_t cbData), (nFile, pData, cbData))
COUNTED(Reads, ssize_t, pread64, (int nFile, void* pData, size_t cbData, off64_t nOffset),
        (nFile, pData, cbData, nOffset))
COUNTED(Writes, ssize_t, write, (int nFile, const void* pData, size_t cbData), (nFile, pData, cbData))
COUNTED(Writes, ssize_t, pwrite64, (int nFile, const void* pData, size_t cbData, off64_t nOffset),
        (nFile, pData, cbData, nOffset))
COUNTED(Syncs, int, fsync, (int nFile), (nFile))
COUNTED(Syncs, int, fdatasync, (int nFile), (nFile))
COUNTED(Unlinks, int, unlink, (const char* szPath) noexcept, (szPath))
COUNTED(Stats, int, stat64, (const char* szPath, struct stat64* pStatus) noexcept, (szPath, pStatus))
COUNTED(Stats, int, lstat64, (const char* szPath, struct stat64* pStatus) noexcept, (szPath, pStatus))
COUNTED(Stats, int, fstat64, (int nFile, struct stat64* pStatus) noexcept, (nFile, pStatus))
COUNTED(Stats, int, access, (const char* szPath, int nMode) noexcept, (szPath, nMode))
COUNTED(Others, pid_t, getpid, () noexcept, ())
COUNTED(Others, int, fchown, (int nFile, uid_t uid, gid_t gid) noexcept, (nFile, uid, gid))
COUNTED(Others, int, ftruncate64, (int nFile, off64_t cbFile) noexcept, (nFile, cbFile))
COUNTED(Others, void*, mmap64,
        (void* pMemory, size_t cbMemory, int nProtection, int nFlags, int nFile, off64_t nOffset) noexcept,
        (pMemory, cbMemory, nProtection, nFlags, nFile, nOffset))
COUNTED(Others, int, munmap, (void* pMemory, size_t cbMemory) noexcept, (pMemory, cbMemory))

} // extern "C"

namespace {

struct Cell {
    bool blHeld;
    Place place;
    bool blWriteAheadLog;
};

std::string nameOf(const Cell& cell)
{
    return std::string("Breakdown/") + (cell.blHeld ? "held/" : "call/") + nameOf(cell.place) +
           (cell.blWriteAheadLog ? "/wal" : "/rollback");
}

bool grant(AccessTokenApi* pHeld, std::string& strTid)
{
    Json::Value jToken;
    if (pHeld) {
        pHeld->cleanExpireToken(false);
        return 0 == pHeld->tokenGrant(strTid, webapi(), method(), jToken);
    }
    return 0 == VemoAccessTokenGrantEx(strTid, webapi(), method(), jToken);
}

// Returns whether the token was granted and saved. The measurements are in g_breakdown.
bool measuredGrant(AccessTokenApi* pHeld, std::string& strTid)
{
    g_breakdown.fill(0);
    g_turnStart = Clock::now();
    g_blMeasuring = true;
    const bool blGranted = grant(pHeld, strTid);
    g_blMeasuring = false;
    endTurn(Library);
    g_breakdown[Total] = std::accumulate(g_breakdown.begin(), g_breakdown.begin() + Total, 0.0);
    return blGranted && 0 < g_breakdown[Save];
}

void measure(benchmark::State& state, AccessTokenApi* pHeld)
{
    std::array<Samples, QUANTITIES> rgSamples;
    std::string strTid = tokenOf(0).strTid;
    grant(pHeld, strTid); // reads the schema and begins the journal, as no other will have to
    for (auto _ : state) {
        if (!measuredGrant(pHeld, strTid)) {
            state.SkipWithError("a grant saved nothing");
            return;
        }
        for (size_t i = 0; i < QUANTITIES; ++i) {
            rgSamples[i].add(g_breakdown[i]);
        }
        state.SetIterationTime(g_breakdown[Total] * 1e-6);
    }
    for (size_t i = 0; i < QUANTITIES; ++i) {
        state.counters[g_rgszName[i]] = rgSamples[i].percentile(50);
    }
}

void breakdown(benchmark::State& state, const Cell& cell)
{
    Store store(cell.place);
    store.grow(TOKENS);
    std::optional<Bystander> bystander;
    if (cell.blWriteAheadLog) {
        store.useWriteAheadLog();
        bystander.emplace();
    }
    std::optional<AccessTokenApi> held;
    if (cell.blHeld) {
        held.emplace();
    }
    measure(state, held ? &*held : nullptr);
}

const Cell g_rgCell[] = {
    {false, Place::Memory, false}, {false, Place::Disk, false}, {false, Place::Disk, true},
    {true, Place::Disk, false},    {true, Place::Disk, true},
};

} // namespace

void registerBenchmarks()
{
    for (const Cell& cell : g_rgCell) {
        benchmark::RegisterBenchmark(nameOf(cell).c_str(), breakdown, cell)
            ->UseManualTime()
            ->Iterations(GRANTS);
    }
}
