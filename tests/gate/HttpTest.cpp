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
