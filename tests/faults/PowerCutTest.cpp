// The power fails at each moment of an operation, and the disk keeps any part of what was not synced.

#include <gtest/gtest.h>
#include <sqlite3.h>
#include <unistd.h>

#include <algorithm>
#include <cstring>
#include <filesystem>
#include <random>
#include <set>
#include <stdexcept>
#include <unordered_map>

#include "FaultyVfs.h"
#include "Figures.h"
#include "Oracle.h"
#include "PowerDisk.h"

#ifdef VEMO_TEST_GATE
#include "gate/Batch.h"
#include "gate/Store.h"
#endif

namespace {

typedef std::vector<std::function<int()>> Calls;

// What calls of the library request from the disk.
struct Recording {
    Files files; // found by the first call
    std::vector<DiskCall> calls;
};

const TokenStore* g_pStore = nullptr; // while recording
std::vector<DiskCall> g_calls;

// In this program, a sync is recorded and does nothing else.
int recordSync(int nFile)
{
    if (g_pStore) {
        const std::filesystem::path path =
            std::filesystem::read_symlink("/proc/self/fd/" + std::to_string(nFile));
        if (path == std::filesystem::canonical(g_pStore->directory())) {
            g_calls.push_back({DiskCall::Kind::SyncDirectory});
        } else {
            g_calls.push_back({DiskCall::Kind::Sync, path.filename()});
        }
    }
    return 0;
}

// The library creates the database file before SQLite's first call; SQLite creates its journal in xOpen.
// known: the names of the files that exist.
int recordCall(std::set<std::string>& known, const FileCall& call, const std::function<int()>& real)
{
    const auto nBefore = static_cast<std::ptrdiff_t>(g_calls.size());
    const int nResult = real();
    const std::string strName = std::filesystem::path(call.strPath).filename();
    if (SQLITE_OK != nResult || strName.empty()) {
        return nResult;
    }
    if (0 == strcmp("xOpen", call.szName)) {
        if (known.insert(strName).second) {
            g_calls.push_back({DiskCall::Kind::Create, strName});
        }
    } else if (0 == strcmp("xWrite", call.szName)) {
        g_calls.push_back({DiskCall::Kind::Write, strName, static_cast<size_t>(call.nOffset),
                           std::string(static_cast<const char*>(call.pData), static_cast<size_t>(call.cb))});
    } else if (0 == strcmp("xTruncate", call.szName)) {
        g_calls.push_back({DiskCall::Kind::Truncate, strName, static_cast<size_t>(call.nOffset)});
    } else if (0 == strcmp("xDelete", call.szName)) {
        known.erase(strName);
        // Before the sync of the directory, if the call made one.
        g_calls.insert(g_calls.begin() + nBefore, {DiskCall::Kind::Unlink, strName});
    }
    return nResult;
}

bool isJournal(const std::string& strName)
{
    return std::string::npos != strName.find("-journal");
}

// A commit (the unlink of the journal) or the creation of the database.
bool isStep(const DiskCall& call)
{
    return DiskCall::Kind::Unlink == call.kind ||
           (DiskCall::Kind::Create == call.kind && !isJournal(call.strName));
}

struct PowerTally {
    int64_t nImages = 0;
    int64_t nWrong = 0;
    std::string strFirstWrong;
    // Images after a change that the library has reported, but before the directory is synced: all of them,
    // and those in which the change is undone because its journal came back.
    int64_t nExposed = 0;
    int64_t nUndone = 0;
    // Images in which the file was already truncated when the journal of that change came back: the recovery
    // cannot restore what was cut off.
    int64_t nDamaged = 0;

    void addWrong(const std::string& strState)
    {
        strFirstWrong = 0 == nWrong++ ? "wrong: " + strState : strFirstWrong;
    }
};

// What is known about one moment of a recording.
struct Moment {
    std::string strBefore; // the last step
    std::string strNow;
    bool blDurable = true;       // the directory was synced since the last step
    bool blAcknowledged = false; // the library returned since the last step
    bool blTruncated = false;    // the database was truncated since the last step

    void pass(const DiskCall& call, const std::string& strState)
    {
        if (isStep(call)) {
            *this = {strNow, strState, false};
        } else if (DiskCall::Kind::Truncate == call.kind) {
            blTruncated = true;
        } else if (DiskCall::Kind::SyncDirectory == call.kind) {
            blDurable = true;
        } else if (DiskCall::Kind::Return == call.kind) {
            blAcknowledged = true;
        }
    }

    // Each image must hold the state after the last step. Until the directory is synced, the state before
    // that step is allowed too.
    void judge(const std::string& strState, bool blJournal, PowerTally& tally) const
    {
        const bool blUndone = strState != strNow;
        const bool blMayBeUndone = !blDurable && (blJournal || STATE_MISSING == strState);
        ++tally.nImages;
        if (blAcknowledged && !blDurable && strNow != strBefore) {
            ++tally.nExposed;
            tally.nUndone += blUndone ? 1 : 0;
        }
        if (blUndone && strState != strBefore && blMayBeUndone && blTruncated) {
            ++tally.nDamaged;
        } else if (blUndone && (strState != strBefore || !blMayBeUndone)) {
            tally.addWrong(strState);
        }
    }
};

PowerDisk diskAfter(const Recording& recording)
{
    PowerDisk disk(recording.files, Order::Kept);
    for (const DiskCall& call : recording.calls) {
        disk.take(call);
    }
    return disk;
}

class PowerCut : public ::testing::Test {
protected:
    Files filesBefore(const Operation& operation)
    {
        prepareStore(m_store, operation);
        return m_store.files();
    }

    Recording recordOn(const Files& files, const Calls& calls)
    {
        m_store.setFiles(files);
        std::set<std::string> known;
        for (const auto& [strName, strContents] : files) {
            known.insert(strName);
        }
        g_calls.clear();
        const FaultyVfs vfs([&](const FileCall& call, const std::function<int()>& real) {
            return recordCall(known, call, real);
        });
        g_pStore = &m_store;
        for (const std::function<int()>& run : calls) {
            EXPECT_LE(0, run());
            g_calls.push_back({DiskCall::Kind::Return});
        }
        g_pStore = nullptr;
        const Recording recording = {files, g_calls};
        // The simulated disk must agree with the real one.
        EXPECT_TRUE(m_store.files() == diskAfter(recording).files());
        return recording;
    }

    Recording recordOperation(const Operation& operation)
    {
        return recordOn(filesBefore(operation), {operation.run});
    }

    // All operations that start from an existing store, one after another.
    Recording recordOneAfterAnother(const Files& files)
    {
        Calls calls;
        for (const Operation& operation : operations()) {
            if (!operation.blCreatesStore) {
                calls.push_back(operation.run);
            }
        }
        return recordOn(files, calls);
    }

    const std::string& stateOf(const Files& files)
    {
        std::string strAll;
        for (const auto& [strName, strContents] : files) {
            strAll.append(strName).append(1, '\0').append(strContents);
        }
        const std::string*& pstrState = m_stateOfImage[std::hash<std::string>()(strAll)];
        if (!pstrState) {
            m_store.setFiles(files);
            pstrState = &*m_states.insert(m_store.state()).first;
        }
        return *pstrState;
    }

    // Some images keep nearly everything, others nearly nothing.
    Files draw(const PowerDisk& disk)
    {
        const uint64_t nKeptOfFour = m_random() % 4;
        return disk.afterPowerCut([&](size_t n) {
            return m_random() % 4 < nKeptOfFour ? n - 1 : static_cast<size_t>(m_random() % n);
        });
    }

    // Disks after a power cut between the writing of a change and its sync: their journal must be rolled
    // back.
    std::vector<Files> drawInterrupted(const Recording& recording)
    {
        std::vector<Files> interrupted;
        PowerDisk disk(recording.files, Order::Kept);
        for (const DiskCall& call : recording.calls) {
            if (DiskCall::Kind::Sync == call.kind && !isJournal(call.strName)) {
                interrupted.push_back(draw(disk));
            }
            disk.take(call);
        }
        return interrupted;
    }

    // The state at the start, and the state after each call of a kind.
    std::vector<std::string> statesAfter(const Recording& recording, bool (*isOne)(const DiskCall& call))
    {
        PowerDisk disk(recording.files, Order::Kept);
        std::vector<std::string> states = {stateOf(recording.files)};
        for (const DiskCall& call : recording.calls) {
            disk.take(call);
            if (isOne(call)) {
                states.push_back(stateOf(disk.files()));
            }
        }
        return states;
    }

    // Cuts the power at the start and after each call. Each moment has two extreme images, one that keeps
    // everything and one that keeps only synced data, and nDraws random images for each change that is not
    // synced. Calls passed() after each call, and image() for each image.
    void visit(const Recording& recording, Order order, int64_t nDraws,
               const std::function<void(const DiskCall&, const PowerDisk&)>& passed,
               const std::function<void(const Files&)>& image)
    {
        PowerDisk disk(recording.files, order);
        const auto cutPower = [&] {
            image(disk.files());
            image(disk.afterPowerCut(ONLY_SYNCED));
            for (int64_t nLeft = nDraws * static_cast<int64_t>(disk.pending()); 0 < nLeft; --nLeft) {
                image(draw(disk));
            }
        };
        cutPower();
        for (const DiskCall& call : recording.calls) {
            disk.take(call);
            passed(call, disk);
            cutPower();
        }
    }

    PowerTally judge(const std::vector<Recording>& recordings, Order order, int64_t nDraws)
    {
        PowerTally tally;
        for (const Recording& recording : recordings) {
            Moment moment;
            moment.strNow = stateOf(recording.files);
            visit(
                recording, order, nDraws,
                [&](const DiskCall& call, const PowerDisk& disk) {
                    moment.pass(call, isStep(call) ? stateOf(disk.files()) : "");
                },
                [&](const Files& files) {
                    const bool blJournal = std::any_of(
                        files.begin(), files.end(), [](const auto& file) { return isJournal(file.first); });
                    moment.judge(stateOf(files), blJournal, tally);
                });
        }
        return tally;
    }

    // Each image must hold everything that the returned calls have done, and all or nothing of the next call.
    // This holds for every kind of journal.
    PowerTally judgeReturned(const Recording& recording, int64_t nDraws)
    {
        const auto isReturn = [](const DiskCall& call) { return DiskCall::Kind::Return == call.kind; };
        const std::vector<std::string> states = statesAfter(recording, isReturn);
        auto itReturned = states.begin();
        PowerTally tally;
        visit(
            recording, Order::Kept, nDraws,
            [&](const DiskCall& call, const PowerDisk&) { itReturned += isReturn(call); },
            [&](const Files& files) {
                const std::string& strState = stateOf(files);
                ++tally.nImages;
                if (strState != *itReturned &&
                    (itReturned + 1 == states.end() || strState != itReturned[1])) {
                    tally.addWrong(strState);
                }
            });
        return tally;
    }

    // The same, but fails if anything is wrong; prints the figures.
    PowerTally judgeSound(const std::string& strName, const std::vector<Recording>& recordings, Order order,
                          int64_t nDraws)
    {
        const PowerTally tally = judge(recordings, order, nDraws);
        EXPECT_EQ(0, tally.nWrong) << tally.strFirstWrong;
        EXPECT_TRUE(Order::Lost == order || 0 == tally.nDamaged) << tally.nDamaged;
        figure("power cut, " + strName,
               std::to_string(tally.nImages) + " images, " + std::to_string(m_stateOfImage.size()) +
                   " different; third states " + std::to_string(tally.nWrong) + ", damaged tokens " +
                   std::to_string(tally.nDamaged) + "; changes undone although acknowledged " +
                   std::to_string(tally.nUndone) + " of " + std::to_string(tally.nExposed) + " (" +
                   share(tally.nUndone, tally.nExposed) + ") before the directory is synced, 0 after");
        return tally;
    }

    TokenStore m_store;

private:
    std::mt19937_64 m_random{seed()};
    std::set<std::string> m_states;
    std::unordered_map<size_t, const std::string*> m_stateOfImage; // by the hash of the image
};

} // namespace

extern "C" int fsync(int nFile)
{
    return recordSync(nFile);
}

extern "C" int fdatasync(int nFile)
{
    return recordSync(nFile);
}

TEST_F(PowerCut, LeavesTheStateBeforeOrAfterACommit)
{
    std::vector<Recording> recordings;
    for (const Operation& operation : operations()) {
        SCOPED_TRACE(operation.szName);
        const Oracle oracle(m_store, operation);
        recordings.push_back(recordOperation(operation));
        for (const std::string& strState : statesAfter(recordings.back(), &isStep)) {
            EXPECT_TRUE(oracle.allows(strState)) << strState;
        }
    }
    judgeSound("one call", recordings, Order::Kept, scaled(4));
}

TEST_F(PowerCut, UndoesNoAcknowledgedChangeButTheLast)
{
    const std::vector<Recording> recordings = {
        recordOn({}, {FIRST_CREATION.run, CREATION.run, DELETION_OF_ALL.run}),
        recordOneAfterAnother(filesBefore(CREATION))};
    EXPECT_LT(0, judgeSound("one call after another", recordings, Order::Kept, scaled(4)).nUndone);
}

// A first call that only reads makes the table; that is the last change then, and may be undone.
TEST_F(PowerCut, CanTakeBackTheTable)
{
    const PowerDisk disk = diskAfter(recordOn({}, {LISTING.run}));
    EXPECT_EQ("", stateOf(disk.files()));
    EXPECT_EQ(STATE_NO_TABLE, stateOf(disk.afterPowerCut(ONLY_SYNCED)));
}

TEST_F(PowerCut, CanMeetTheRecoveryFromAnother)
{
    std::vector<Recording> recordings;
    for (const Operation& operation : operations()) {
        for (const Files& files : drawInterrupted(recordOperation(operation))) {
            recordings.push_back(recordOn(files, {[] {
                                              CREATION.run(); // there may not be a table yet
                                              return 0;
                                          }}));
        }
    }
    judgeSound("during the recovery", recordings, Order::Kept, scaled(2));
}

TEST_F(PowerCut, UndoesNothingOnceTheCallerHasSyncedTheDirectory)
{
    std::vector<Recording> recordings;
    for (const Operation& operation : operations()) {
        recordings.push_back(recordOn(filesBefore(operation), {[&] {
                                          const int nResult = operation.run();
                                          g_calls.push_back({DiskCall::Kind::SyncDirectory});
                                          return nResult;
                                      }}));
    }
    EXPECT_EQ(0, judgeSound("directory synced after the call", recordings, Order::Kept, scaled(1)).nExposed);
}

#ifdef VEMO_TEST_GATE
TEST_F(PowerCut, UndoesNothingThatTheGateHasAnswered)
{
    gate::Store store;
    const auto batch = [&store](const std::vector<std::string>& strNames) {
        const std::function<gate::Owners::Owner(uid_t)> fOwner = [](uid_t) {
            return gate::Owners::Owner{gate::Owners::State::Known, "anybody"};
        };
        EXPECT_TRUE(store.begin());
        store.purge();
        gate::Batch calls(store.tokens(), fOwner);
        for (const std::string& strName : strNames) {
            gate::Request request;
            request.strTid = idOf(strName);
            request.strApi = "Example.Api";
            EXPECT_EQ(gate::Outcome::Granted, calls.call(request).value().outcome) << strName;
        }
        calls.save();
        EXPECT_TRUE(store.commit());
        return 0;
    };
    const auto checkpoint = [] {
        AccessTokenDbApi db;
        db.initDb();
        return sqlite3_wal_checkpoint(db.m_pDb, nullptr);
    };
    const auto close = [&store] {
        store.close();
        return 0;
    };
    for (const char* szMode : {"DELETE", "WAL"}) {
        m_store.setFiles(filesBefore(CREATION));
        m_store.run(std::string("PRAGMA journal_mode = ") + szMode);
        const Recording recording = recordOn(m_store.files(), {[&] { return batch({"three"}); },
                                                               [&] {
                                                                   return batch({"one", "large", "three"});
                                                               },
                                                               checkpoint, // the journal begins anew then
                                                               [&] { return batch({"large"}); }, close});
        const PowerTally tally = judgeReturned(recording, scaled(4));
        EXPECT_EQ(0, tally.nWrong) << szMode << ": " << tally.strFirstWrong;
        figure("power cut, grants of the gate", std::string(szMode) + ": " + std::to_string(tally.nImages) +
                                                    " images; nothing answered undone");
    }
}
#endif

// When a database has shrunk, SQLite first unlinks the journal and then truncates the file; the journal does
// not hold what is cut off. If a disk keeps the truncation but loses the unlink, the recovery cannot restore
// that part.
TEST_F(PowerCut, DamagesATokenWhereTheDiskLosesTheOrder)
{
    const Recording recording = recordOneAfterAnother(filesBefore(CREATION));
    EXPECT_LT(
        0, judgeSound("order of unlink and truncation lost", {recording}, Order::Lost, scaled(1)).nDamaged);
}

TEST_F(PowerCut, DamagesNoTokenWhereTheDatabaseDoesNotShrink)
{
    m_store.setFiles(filesBefore(CREATION));
    m_store.run("PRAGMA auto_vacuum = NONE; VACUUM;");
    const Recording recording = recordOneAfterAnother(m_store.files());
    EXPECT_EQ(0, judgeSound("order lost, without auto_vacuum", {recording}, Order::Lost, scaled(1)).nDamaged);
}

// The oracle must notice when a sync is missing.
TEST_F(PowerCut, WouldDamageAStoreThatIsNotSynced)
{
    for (const DiskCall::Kind kind : {DiskCall::Kind::Sync, DiskCall::Kind::SyncDirectory}) {
        Recording recording = recordOperation(DELETION_OF_ALL);
        std::vector<DiskCall>& calls = recording.calls;
        calls.erase(std::remove_if(calls.begin(), calls.end(),
                                   [&](const DiskCall& call) { return call.kind == kind; }),
                    calls.end());
        EXPECT_LT(0, judge({recording}, Order::Kept, 1).nWrong);
    }
}
