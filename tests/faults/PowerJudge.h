// Cuts the power after each call of a recording, and judges what the disk may hold then.

#ifndef TESTS_POWER_JUDGE_H
#define TESTS_POWER_JUDGE_H

#include <cstdint>
#include <functional>
#include <random>
#include <set>
#include <string>
#include <unordered_map>
#include <vector>

#include "PowerRecorder.h"
#include "TokenStore.h"

struct PowerTally {
    int64_t nImages = 0;
    int64_t nWrong = 0;
    std::string strFirstWrong;
    void addWrong(const std::string& strState);

    // Images after a change that the library has reported, but before the directory is synced: all of them,
    // and those in which the change is undone because its journal came back.
    int64_t nExposed = 0;
    int64_t nUndone = 0;
    // Images in which the file was already truncated when the journal of that change came back: the recovery
    // cannot restore what was cut off.
    int64_t nDamaged = 0;
};

bool isJournal(const std::string& strName);

class PowerJudge {
public:
    explicit PowerJudge(const TokenStore& store);

    // Each image must hold the state after the last step. A step is a commit (the unlink of the journal) or
    // the creation of the database. Until the directory is synced, the state before that step is allowed too.
    // At each moment it looks at the two extremes, everything kept and only what was synced kept, and at
    // nDraws random images for each change that is not synced.
    void judge(const Recording& recording, Order order, int64_t nDraws, PowerTally& tally);

    // Each image must hold everything that the returned calls have done, and all or nothing of the next call.
    // This holds for every kind of journal.
    PowerTally judgeReturned(const Recording& recording, int64_t nDraws);

    // The state at the start, and the state after each step.
    std::vector<std::string> steps(const Recording& recording);

    Files draw(const PowerDisk& disk);
    const std::string& stateOf(const Files& files);

    // The number of different images so far.
    int64_t different() const { return static_cast<int64_t>(m_stateOfImage.size()); }

private:
    // Calls fPassed after each call of the recording, and fImage for each image of each moment.
    void visit(const Recording& recording, Order order, int64_t nDraws,
               const std::function<void(const DiskCall&, const PowerDisk&)>& fPassed,
               const std::function<void(const Files&)>& fImage);

    const TokenStore& m_store;
    std::mt19937_64 m_random;
    std::set<std::string> m_states;
    std::unordered_map<size_t, const std::string*> m_stateOfImage; // by the hash of the image
};

#endif
