// The parts of the process that reads HTTP, as far as requests.py cannot tell.

#include <gtest/gtest.h>

#include "gate/Clock.h"
#include "gate/http/Repeats.h"
#include "gate/http/Response.h"

using gate::Outcome;
using gate::Repeats;
using gate::Reply;

namespace {

Reply answerOf(uint64_t nNumber, Outcome outcome, const std::string& strRecord = "")
{
    Reply answer;
    answer.nNumber = nNumber;
    answer.outcome = outcome;
    answer.strRecord = strRecord;
    return answer;
}

} // namespace

TEST(Response, EscapesNamesThatNoHeaderCanCarry)
{
    Reply answer;
    answer.nUid = 4294967294;
    answer.strUser = "a b%\r\n\x7f\xc3\xa4";
    answer.strFunction = "~!";
    const std::string strResponse = gate::grantedResponse(answer, {true, false, false});
    EXPECT_NE(std::string::npos,
              strResponse.find("GMT\r\nX-Token-User: a%20b%25%0D%0A%7F%C3%A4\r\n"
                               "X-Token-Uid: 4294967294\r\nX-Token-Function: ~!\r\nCache"));
}

TEST(Repeats, HaveTheAnswerOfTheFirstForFiveSeconds)
{
    for (const Outcome outcome : {Outcome::Granted, Outcome::Refused}) {
        Repeats repeats;
        EXPECT_FALSE(repeats.find("key", 1, 0));
        ASSERT_TRUE(repeats.find("key", 2, 1));
        EXPECT_EQ(1U, repeats.find("key", 2, 1)->nCall);
        EXPECT_FALSE(repeats.find("key", 2, 1)->blAnswered);
        EXPECT_FALSE(repeats.find("other", 2, 1));
        repeats.answer("key", answerOf(1, outcome, "{}"));
        const Repeats::Remembered* pRemembered = repeats.find("key", 3, 5 * gate::SECOND - 1);
        ASSERT_TRUE(pRemembered);
        EXPECT_TRUE(pRemembered->blAnswered);
        EXPECT_EQ(outcome, pRemembered->answer.outcome);
        EXPECT_EQ("{}", pRemembered->answer.strRecord);
        EXPECT_FALSE(repeats.find("key", 3, 5 * gate::SECOND));
    }
}

TEST(Repeats, AreAskedAnewAfterAnAnswerThatSpentNothing)
{
    for (const Outcome outcome : {Outcome::Failed, Outcome::Late, Outcome::Cancelled}) {
        Repeats repeats;
        repeats.find("key", 1, 0);
        repeats.answer("key", answerOf(1, outcome));
        EXPECT_FALSE(repeats.find("key", 2, 0));
    }
    Repeats repeats;
    repeats.find("key", 1, 0);
    repeats.forget("key", 1);
    EXPECT_FALSE(repeats.find("key", 2, 0));
    EXPECT_TRUE(repeats.find("key", 3, 5 * gate::SECOND - 1)) << "the time of the first is over, not its own";
}

TEST(Repeats, TakeNothingFromACallThatCameLaterWithTheSameKey)
{
    Repeats repeats;
    repeats.find("key", 1, 0);
    repeats.find("key", 2, 5 * gate::SECOND);
    repeats.answer("key", answerOf(1, Outcome::Granted));
    repeats.answer("key", answerOf(1, Outcome::Late));
    repeats.forget("key", 1);
    const Repeats::Remembered* pRemembered = repeats.find("key", 3, 5 * gate::SECOND);
    ASSERT_TRUE(pRemembered);
    EXPECT_EQ(2U, pRemembered->nCall);
    EXPECT_FALSE(pRemembered->blAnswered);
}

TEST(Repeats, HoldABoundedAmountOfMemory)
{
    Repeats repeats;
    const std::string strRecord(gate::RECORD_MAX, 'r');
    const uint64_t nNumber = (64 << 20) / strRecord.size(); // twice as much as there is room for
    for (uint64_t nCall = 1; nCall <= nNumber; ++nCall) {
        repeats.find(std::to_string(nCall), nCall, 0);
        repeats.answer(std::to_string(nCall), answerOf(nCall, Outcome::Granted, strRecord));
    }
    uint64_t nHeld = 0;
    for (uint64_t nCall = nNumber; nCall > 0 && repeats.find(std::to_string(nCall), nCall, 0); --nCall) {
        ++nHeld;
    }
    EXPECT_LT(nNumber / 3, nHeld);
    EXPECT_GT(nNumber / 2, nHeld);
}
