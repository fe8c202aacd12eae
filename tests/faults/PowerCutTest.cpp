// The power fails at each moment of an operation, and the disk keeps any part of what was not synced.

#include <fcntl.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <algorithm>

#include "Figures.h"
#include "Oracle.h"
#include "PowerJudge.h"

#ifdef VEMO_TEST_GATE
#include <sqlite3.h>

#include "gate/Batch.h"
#include "gate/Store.h"
#endif

namespace {

typedef std::vector<std::function<int()>> Calls;

const Operation& FIRST_CREATION = operations()[0];
const Operation& CREATION = operations()[1];
const Operation& LISTING = operations()[9];
const Operation& DELETION_OF_ALL = operations()[11];

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
        const Recording recording = record(m_store, files, calls);
        // The simulated disk must agree with the real one.
        EXPECT_TRUE(m_store.files() == diskAfter(recording).files());
        return recording;
    }

    Recording recordOperation(const Operation& operation)
    {
        return recordOn(filesBefore(operation), {operation.run});
    }

    // All operations that start from a store, one after another.
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

    // The call, followed by what its caller can do to make the change durable.
    std::function<int()> thenSync(const Operation& operation)
    {
        return [this, &operation] {
            const int nResult = operation.run();
            const int nDirectory = open(m_store.directory().c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
            fsync(nDirectory);
            close(nDirectory);
            return nResult;
        };
    }

    // Disks after a power cut between the writing of a change and its sync: they have a journal to recover
    // from.
    std::vector<Files> drawInterrupted(const Recording& recording)
    {
        std::vector<Files> interrupted;
        PowerDisk disk(recording.files, Order::Kept);
        for (const DiskCall& call : recording.calls) {
            if (DiskCall::Kind::Sync == call.kind && !isJournal(call.strName)) {
                interrupted.push_back(m_judge.draw(disk));
            }
            disk.take(call);
        }
        return interrupted;
    }

    PowerTally judgeAll(const std::vector<Recording>& recordings, Order order, int64_t nDraws)
    {
        PowerTally sum;
        for (const Recording& recording : recordings) {
            m_judge.judge(recording, order, nDraws, sum);
        }
        EXPECT_EQ(0, sum.nWrong) << sum.strFirstWrong;
        return sum;
    }

    void report(const std::string& strName, const PowerTally& tally)
    {
        figure("power cut, " + strName,
               std::to_string(tally.nImages) + " images, " + std::to_string(m_judge.different()) +
                   " different; third states " + std::to_string(tally.nWrong) + ", damaged tokens " +
                   std::to_string(tally.nDamaged) + "; changes undone although acknowledged " +
                   std::to_string(tally.nUndone) + " of " + std::to_string(tally.nExposed) + " (" +
                   share(tally.nUndone, tally.nExposed) + ") before the directory is synced, 0 after");
    }

    TokenStore m_store;
    PowerJudge m_judge{m_store};
};

} // namespace

TEST_F(PowerCut, LeavesTheStateBeforeOrAfterACommit)
{
    std::vector<Recording> recordings;
    for (const Operation& operation : operations()) {
        SCOPED_TRACE(operation.szName);
        const Oracle oracle(m_store, operation);
        recordings.push_back(recordOperation(operation));
        for (const std::string& strState : m_judge.steps(recordings.back())) {
            EXPECT_TRUE(oracle.allows(strState)) << strState;
        }
    }
    const PowerTally tally = judgeAll(recordings, Order::Kept, scaled(4));
    EXPECT_EQ(0, tally.nDamaged);
    report("one call", tally);
}

TEST_F(PowerCut, UndoesNoAcknowledgedChangeButTheLast)
{
    const std::vector<Recording> recordings = {
        recordOn({}, {FIRST_CREATION.run, CREATION.run, DELETION_OF_ALL.run}),
        recordOneAfterAnother(filesBefore(CREATION))};
    const PowerTally tally = judgeAll(recordings, Order::Kept, scaled(4));
    EXPECT_EQ(0, tally.nDamaged);
    EXPECT_LT(0, tally.nUndone);
    report("one call after another", tally);
}

// A first call that only reads makes the table; that is the last change then, and may be undone.
TEST_F(PowerCut, CanTakeBackTheTable)
{
    const PowerDisk disk = diskAfter(recordOn({}, {LISTING.run}));
    EXPECT_EQ("", m_judge.stateOf(disk.files()));
    EXPECT_EQ(STATE_NO_TABLE, m_judge.stateOf(disk.afterPowerCut(&onlySynced)));
}

TEST_F(PowerCut, CanMeetTheRecoveryFromAnother)
{
    std::vector<Recording> recordings;
    for (const Operation& operation : operations()) {
        for (const Files& files : drawInterrupted(recordOperation(operation))) {
            recordings.push_back(recordOn(files, {[] {
                                              CREATION.run(); // there may be no table yet
                                              return 0;
                                          }}));
        }
    }
    const PowerTally tally = judgeAll(recordings, Order::Kept, scaled(2));
    EXPECT_EQ(0, tally.nDamaged);
    report("during the recovery", tally);
}

TEST_F(PowerCut, UndoesNothingOnceTheCallerHasSyncedTheDirectory)
{
    std::vector<Recording> recordings;
    for (const Operation& operation : operations()) {
        recordings.push_back(recordOn(filesBefore(operation), {thenSync(operation)}));
    }
    const PowerTally tally = judgeAll(recordings, Order::Kept, scaled(1));
    EXPECT_EQ(0, tally.nExposed);
    report("directory synced after the call", tally);
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
                                                               checkpoint, // the log begins anew then
                                                               [&] { return batch({"large"}); }, close});
        const PowerTally tally = m_judge.judgeReturned(recording, scaled(4));
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
    const PowerTally tally = judgeAll({recordOneAfterAnother(filesBefore(CREATION))}, Order::Lost, scaled(1));
    EXPECT_LT(0, tally.nDamaged);
    report("order of unlink and truncation lost", tally);
}

TEST_F(PowerCut, DamagesNoTokenWhereTheDatabaseDoesNotShrink)
{
    m_store.setFiles(filesBefore(CREATION));
    m_store.run("PRAGMA auto_vacuum = NONE; VACUUM;");
    const PowerTally tally = judgeAll({recordOneAfterAnother(m_store.files())}, Order::Lost, scaled(1));
    EXPECT_EQ(0, tally.nDamaged);
    report("order lost, without auto_vacuum", tally);
}

// The judge must notice when a sync is missing.
TEST_F(PowerCut, WouldDamageAStoreThatIsNotSynced)
{
    for (const DiskCall::Kind kind : {DiskCall::Kind::Sync, DiskCall::Kind::SyncDirectory}) {
        Recording recording = recordOperation(DELETION_OF_ALL);
        std::vector<DiskCall>& calls = recording.calls;
        calls.erase(std::remove_if(calls.begin(), calls.end(),
                                   [&](const DiskCall& call) { return call.kind == kind; }),
                    calls.end());
        PowerTally tally;
        m_judge.judge(recording, Order::Kept, 1, tally);
        EXPECT_LT(0, tally.nWrong);
    }
}
