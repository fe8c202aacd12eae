#include "PowerJudge.h"

#include <algorithm>

#include "Figures.h"

bool isJournal(const std::string& strName)
{
    return std::string::npos != strName.find("-journal");
}

namespace {

bool isStep(const DiskCall& call)
{
    return DiskCall::Kind::Unlink == call.kind ||
           (DiskCall::Kind::Create == call.kind && !isJournal(call.strName));
}

bool hasJournal(const Files& files)
{
    return std::any_of(files.begin(), files.end(), [](const auto& file) { return isJournal(file.first); });
}

size_t hashOf(const Files& files)
{
    std::string strAll;
    for (const auto& [strName, strContents] : files) {
        strAll.append(strName).append(1, '\0').append(strContents);
    }
    return std::hash<std::string>()(strAll);
}

// What the judge knows about one moment of a recording.
struct Moment {
    std::string strBefore; // the last step
    std::string strNow;
    bool blDurable = true;       // the directory was synced since the last step
    bool blAcknowledged = false; // the library returned since the last step
    bool blTruncated = false;    // the database was truncated since the last step

    void pass(const DiskCall& call, const std::string& strState)
    {
        if (isStep(call)) {
            strBefore = strNow;
            strNow = strState;
            blDurable = false;
            blAcknowledged = false;
            blTruncated = false;
        } else if (DiskCall::Kind::Truncate == call.kind) {
            blTruncated = true;
        } else if (DiskCall::Kind::SyncDirectory == call.kind) {
            blDurable = true;
        } else if (DiskCall::Kind::Return == call.kind) {
            blAcknowledged = true;
        }
    }

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

} // namespace

PowerJudge::PowerJudge(const TokenStore& store) : m_store(store), m_random(seed()) {}

const std::string& PowerJudge::stateOf(const Files& files)
{
    const std::string*& pstrState = m_stateOfImage[hashOf(files)];
    if (!pstrState) {
        m_store.setFiles(files);
        pstrState = &*m_states.insert(m_store.state()).first;
    }
    return *pstrState;
}

// Some images keep nearly everything, others nearly nothing.
Files PowerJudge::draw(const PowerDisk& disk)
{
    const uint64_t nKeptOfFour = m_random() % 4;
    return disk.afterPowerCut(
        [&](size_t n) { return m_random() % 4 < nKeptOfFour ? n - 1 : static_cast<size_t>(m_random() % n); });
}

std::vector<std::string> PowerJudge::steps(const Recording& recording)
{
    PowerDisk disk(recording.files, Order::Kept);
    std::vector<std::string> states = {stateOf(recording.files)};
    for (const DiskCall& call : recording.calls) {
        disk.take(call);
        if (isStep(call)) {
            states.push_back(stateOf(disk.files()));
        }
    }
    return states;
}

void PowerJudge::visit(const Recording& recording, Order order, int64_t nDraws,
                       const std::function<void(const DiskCall&, const PowerDisk&)>& fPassed,
                       const std::function<void(const Files&)>& fImage)
{
    PowerDisk disk(recording.files, order);
    const auto cutPower = [&] {
        fImage(disk.files());
        fImage(disk.afterPowerCut(&onlySynced));
        for (int64_t nLeft = nDraws * static_cast<int64_t>(disk.pending()); 0 < nLeft; --nLeft) {
            fImage(draw(disk));
        }
    };
    cutPower();
    for (const DiskCall& call : recording.calls) {
        disk.take(call);
        fPassed(call, disk);
        cutPower();
    }
}

void PowerTally::addWrong(const std::string& strState)
{
    strFirstWrong = 0 == nWrong++ ? "wrong: " + strState : strFirstWrong;
}

void PowerJudge::judge(const Recording& recording, Order order, int64_t nDraws, PowerTally& tally)
{
    Moment moment;
    moment.strNow = stateOf(recording.files);
    visit(
        recording, order, nDraws,
        [&](const DiskCall& call, const PowerDisk& disk) {
            moment.pass(call, isStep(call) ? stateOf(disk.files()) : "");
        },
        [&](const Files& files) { moment.judge(stateOf(files), hasJournal(files), tally); });
}

PowerTally PowerJudge::judgeReturned(const Recording& recording, int64_t nDraws)
{
    std::vector<std::string> states = {stateOf(recording.files)};
    PowerDisk whole(recording.files, Order::Kept);
    for (const DiskCall& call : recording.calls) {
        whole.take(call);
        if (DiskCall::Kind::Return == call.kind) {
            states.push_back(stateOf(whole.files()));
        }
    }
    auto itReturned = states.begin();
    PowerTally tally;
    visit(
        recording, Order::Kept, nDraws,
        [&](const DiskCall& call, const PowerDisk&) { itReturned += DiskCall::Kind::Return == call.kind; },
        [&](const Files& files) {
            const std::string& strState = stateOf(files);
            ++tally.nImages;
            if (strState != *itReturned && (itReturned + 1 == states.end() || strState != itReturned[1])) {
                tally.addWrong(strState);
            }
        });
    return tally;
}
