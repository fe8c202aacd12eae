// Cuts the power after each call of a recording, and judges what the disk may then hold.

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

    // Of the images of a disk whose last change was acknowledged but for a sync of the directory: all, and
    // those in which that change is undone because its journal came back.
    int64_t nExposed = 0;
    int64_t nUndone = 0;
    // Images in which the journal of a change that made the file smaller came back when the file had been
    // truncated already: its recovery cannot bring back what stood beyond.
    int64_t nDamaged = 0;
};

bool isJournal(const std::string& strName);

class PowerJudge {
public:
    explicit PowerJudge(const TokenStore& store);

    // Each image must hold the state that the last step led to: a commit, which is the unlink of the journal,
    // or the creation of the database. Until the directory is synced it may hold the state before instead.
    // Looks at two extremes at each moment, all done and only what was synced, and draws nDraws images for
    // each change that is not synced.
    void judge(const Recording& recording, Order order, int64_t nDraws, PowerTally& tally);

    // Each image must hold what all calls that returned have done, and of the next one all or nothing. Knows
    // of no journals, and so serves each way of journalling.
    PowerTally judgeReturned(const Recording& recording, int64_t nDraws);

    // The states that the steps led to, from the one that was found.
    std::vector<std::string> steps(const Recording& recording);

    Files draw(const PowerDisk& disk);
    const std::string& stateOf(const Files& files);

    // How many different images it has seen.
    int64_t different() const { return static_cast<int64_t>(m_stateOfImage.size()); }

private:
    // Calls the first function behind each call of the recording, and the second for the images of each
    // moment.
    void visit(const Recording& recording, Order order, int64_t nDraws,
               const std::function<void(const DiskCall&, const PowerDisk&)>& fPassed,
               const std::function<void(const Files&)>& fImage);

    const TokenStore& m_store;
    std::mt19937_64 m_random;
    std::set<std::string> m_states;
    std::unordered_map<size_t, const std::string*> m_stateOfImage; // by the hash of the image
};

#endif
