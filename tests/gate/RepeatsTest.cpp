#include "gate/http/Repeats.h"

#include <gtest/gtest.h>

TEST(Repeats, HoldABoundedAmountOfMemory)
{
    gate::Repeats repeats;
    gate::Reply answer;
    answer.outcome = gate::Outcome::Granted;
    answer.strRecord.resize(gate::RECORD_MAX);
    const uint64_t nNumber = (64 << 20) / gate::RECORD_MAX; // twice as much as there is room for
    while (++answer.nNumber <= nNumber) {
        repeats.find(std::to_string(answer.nNumber), answer.nNumber, 0);
        repeats.answer(std::to_string(answer.nNumber), answer);
    }
    uint64_t nHeld = 0;
    for (uint64_t nCall = nNumber; nCall > 0 && repeats.find(std::to_string(nCall), nCall, 0); --nCall) {
        ++nHeld;
    }
    EXPECT_LT(nNumber / 3, nHeld);
    EXPECT_GT(nNumber / 2, nHeld);
}
