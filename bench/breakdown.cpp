// Where the time of one grant goes.
//
// The grant saves its token, in a store of ten. A call opens and closes the database; a held object
// keeps it open. With the write-ahead journal another process holds a connection, or the end of each
// call would write the journal back and delete it.
//
// Each benchmark reports the medians of its grants:
//
//   open_us, close_us              sqlite3_open and sqlite3_close
//   purge_us, select_us, save_us   sqlite3_exec of the DELETE, SELECT and REPLACE, without the row callback
//   library_us                     all the rest, including the row callback
//   total_us                       the grant
//
// There are so many grants that the system calls of a run, divided by their number, are those of one grant:
// the calls before and after the grants hardly count. Calls that read and set the effective uid are not among
// them: the redirection of the database replaces these.

#include <array>
#include <chrono>
#include <memory>
#include <numeric>
#include <optional>
#include <stdexcept>
#include <string>

#include "AccessTokenApi.h"
#include "Process.h"
#include "Run.h"
#include "Samples.h"
#include "Store.h"
#include "Turns.h"
#include "vemo-access-token.h"

namespace {

const int TOKENS = 10;
const int GRANTS = 2000;

enum Step { Library = LIBRARY, Open, Purge, Select, Save, Close, Total, STEPS };

const char* const g_rgszCounter[STEPS] = {"library_us", "open_us",  "purge_us", "select_us",
                                          "save_us",    "close_us", "total_us"};

typedef std::chrono::steady_clock Clock;

// Microseconds of the steps of the grant that is being measured.
std::array<double, STEPS> g_rgdStep;
Clock::time_point g_turnStart;

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
    g_rgdStep[static_cast<size_t>(nTurn)] +=
        std::chrono::duration<double, std::micro>(now - g_turnStart).count();
    g_turnStart = now;
}

namespace {

bool grant(std::optional<AccessTokenApi>& held, std::string& strTid)
{
    Json::Value jToken;
    if (held) {
        held->cleanExpireToken(false);
        return 0 == held->tokenGrant(strTid, WEBAPI, METHOD, jToken);
    }
    return 0 == VemoAccessTokenGrantEx(strTid, WEBAPI, METHOD, jToken);
}

void breakdown(benchmark::State& state, bool blHeld, Place place, const std::string& strTuning)
{
    const Store store(place, TOKENS, strTuning);
    std::unique_ptr<Process> pBystander;
    if (WRITE_AHEAD == strTuning) {
        pBystander = startBystander();
    }
    std::optional<AccessTokenApi> held;
    if (blHeld) {
        held.emplace();
    }
    std::array<Samples, STEPS> rgSamples;
    std::string strTid = tokenOf(0).strTid;
    grant(held, strTid); // only this first grant reads the schema and begins the journal
    for (auto _ : state) {
        g_rgdStep.fill(0);
        g_turnStart = Clock::now();
        const bool blGranted = grant(held, strTid);
        endTurn(Library);
        if (!blGranted || 0 == g_rgdStep[Save]) {
            throw std::runtime_error("a grant saved nothing");
        }
        g_rgdStep[Total] = std::accumulate(g_rgdStep.begin(), g_rgdStep.end(), 0.0);
        for (size_t i = 0; i < STEPS; ++i) {
            rgSamples[i].add(g_rgdStep[i]);
        }
    }
    for (size_t i = 0; i < STEPS; ++i) {
        state.counters[g_rgszCounter[i]] = rgSamples[i].median();
    }
}

} // namespace

void registerBenchmarks()
{
    add("Breakdown/call/memory/rollback", GRANTS, breakdown, false, Place::Memory, "");
    add("Breakdown/call/disk/rollback", GRANTS, breakdown, false, Place::Disk, "");
    add("Breakdown/call/disk/wal", GRANTS, breakdown, false, Place::Disk, WRITE_AHEAD);
    add("Breakdown/held/disk/rollback", GRANTS, breakdown, true, Place::Disk, "");
    add("Breakdown/held/disk/wal", GRANTS, breakdown, true, Place::Disk, WRITE_AHEAD);
}
