#include "gate/http/Repeats.h"

#include <gtest/gtest.h>

#include "gate/Clock.h"

using gate::Outcome;
using gate::Repeats;
using gate::Reply;

namespace {

Reply replyOf(uint64_t nNumber, Outcome outcome)
{
    Reply reply;
    reply.nNumber = nNumber;
    reply.outcome = outcome;
    return reply;
}

} // namespace

TEST(Repeats, KeepTheEntryOfALaterCallWithTheSameKey)
{
    Repeats repeats;
    repeats.find("key", 1, 0);
    repeats.find("key", 2, 5 * gate::SECOND);
    repeats.answer("key", replyOf(1, Outcome::Granted));
    repeats.answer("key", replyOf(1, Outcome::Late));
    repeats.forget("key", 1);
    const Repeats::Remembered* pRemembered = repeats.find("key", 3, 5 * gate::SECOND);
    ASSERT_TRUE(pRemembered);
    EXPECT_EQ(2U, pRemembered->nCall);
    EXPECT_FALSE(pRemembered->blAnswered);
}

TEST(Repeats, HoldABoundedAmountOfMemory)
{
    Repeats repeats;
    Reply answer = replyOf(1, Outcome::Granted);
    answer.strRecord.resize(gate::RECORD_MAX);
    const uint64_t nNumber = (64 << 20) / gate::RECORD_MAX; // twice as much as there is room for
    for (; answer.nNumber <= nNumber; ++answer.nNumber) {
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
