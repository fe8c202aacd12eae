#include "gate/Messages.h"

#include <gtest/gtest.h>

#include <cstring>

using gate::Answer;
using gate::Ask;
using gate::decodeAnswer;
using gate::decodeRequest;
using gate::encode;
using gate::Outcome;
using gate::Request;

namespace {

// Where the numbers of one byte or two stand in a message.
enum RequestByte { ASK = 16, RECORD, TID_SIZE, API_SIZE = 20, METHOD_SIZE = 22, REQUEST_HEAD = 24 };
enum AnswerByte {
    OUTCOME = 8,
    HEALTHY,
    USER_SIZE,
    FUNCTION_SIZE = 12,
    RECORD_SIZE = 14,
    FIGURES_SIZE = 16,
    UNUSED = 18,
    ANSWER_UID = 20,
    ANSWER_HEAD = 24
};

Request grantRequest()
{
    Request request;
    request.nNumber = 0x0123456789abcdef;
    request.nDue = -5;
    request.blRecord = true;
    request.strTid = std::string(gate::TID_MAX, 't');
    request.strApi = std::string(gate::API_MAX, 'a');
    request.strMethod = std::string(gate::METHOD_MAX, 'm');
    return request;
}

Answer granted()
{
    Answer answer;
    answer.nNumber = 0xfedcba9876543210;
    answer.outcome = Outcome::Granted;
    answer.nUid = 4294967294;
    answer.strUser = std::string(gate::USER_MAX, 'u');
    answer.strFunction = std::string(gate::FUNCTION_MAX, 'f');
    answer.strRecord = std::string(gate::RECORD_MAX, '\0');
    return answer;
}

Answer told()
{
    Answer answer;
    answer.outcome = Outcome::Told;
    answer.blHealthy = true;
    for (size_t nFigure = 0; nFigure < gate::FIGURES; ++nFigure) {
        answer.figures[nFigure] = (1ULL << 63) + nFigure;
    }
    return answer;
}

// A message with another byte, or another end.
std::string changed(std::string strMessage, size_t nPlace, char c)
{
    strMessage[nPlace] = c;
    return strMessage;
}

template <typename Decode>
void expectNoShorterOrLonger(const std::string& strMessage, Decode decode)
{
    for (size_t cb = 0; cb < strMessage.size(); ++cb) {
        ASSERT_FALSE(decode(std::string_view(strMessage).substr(0, cb))) << cb;
    }
    EXPECT_FALSE(decode(strMessage + '\0'));
}

} // namespace

TEST(Messages, RequestsComeBackAsTheyWere)
{
    const Request request = grantRequest();
    const std::optional<Request> read = decodeRequest(encode(request));
    ASSERT_TRUE(read);
    EXPECT_EQ(request.nNumber, read->nNumber);
    EXPECT_EQ(request.nDue, read->nDue);
    EXPECT_EQ(request.ask, read->ask);
    EXPECT_EQ(request.blRecord, read->blRecord);
    EXPECT_EQ(request.strTid, read->strTid);
    EXPECT_EQ(request.strApi, read->strApi);
    EXPECT_EQ(request.strMethod, read->strMethod);
    for (const Ask ask : {Ask::Cancel, Ask::Health, Ask::Figures}) {
        Request bare;
        bare.ask = ask;
        bare.nNumber = 7;
        ASSERT_TRUE(decodeRequest(encode(bare)));
        EXPECT_EQ(ask, decodeRequest(encode(bare))->ask);
        EXPECT_EQ(7U, decodeRequest(encode(bare))->nNumber);
    }
}

TEST(Messages, AnswersComeBackAsTheyWere)
{
    for (const Answer& answer : {granted(), told()}) {
        const std::optional<Answer> read = decodeAnswer(encode(answer));
        ASSERT_TRUE(read);
        EXPECT_EQ(answer.nNumber, read->nNumber);
        EXPECT_EQ(answer.outcome, read->outcome);
        EXPECT_EQ(answer.blHealthy, read->blHealthy);
        EXPECT_EQ(answer.nUid, read->nUid);
        EXPECT_EQ(answer.strUser, read->strUser);
        EXPECT_EQ(answer.strFunction, read->strFunction);
        EXPECT_EQ(answer.strRecord, read->strRecord);
        EXPECT_EQ(answer.figures, read->figures);
    }
    for (const Outcome outcome : {Outcome::Refused, Outcome::Failed, Outcome::Late, Outcome::Cancelled,
                                  Outcome::Told, Outcome::Stop}) {
        Answer bare;
        bare.outcome = outcome;
        ASSERT_TRUE(decodeAnswer(encode(bare)));
        EXPECT_EQ(outcome, decodeAnswer(encode(bare))->outcome);
    }
}

TEST(Messages, OfAnotherSizeAreNone)
{
    expectNoShorterOrLonger(encode(grantRequest()), decodeRequest);
    expectNoShorterOrLonger(encode(granted()), decodeAnswer);
    expectNoShorterOrLonger(encode(told()), decodeAnswer);
    EXPECT_LE(encode(grantRequest()).size(), gate::REQUEST_MAX);
    EXPECT_LE(encode(granted()).size(), gate::ANSWER_MAX);
}

TEST(Messages, RequestsWithWhatCannotBeAreNone)
{
    Request small;
    small.strTid = "t";
    small.strApi = "a";
    small.strMethod = "m";
    const std::string strSmall = encode(small);
    ASSERT_TRUE(decodeRequest(strSmall));
    EXPECT_FALSE(decodeRequest(changed(strSmall, ASK, 4)));
    EXPECT_FALSE(decodeRequest(changed(strSmall, RECORD, 2)));
    for (size_t nText = 0; nText < 3; ++nText) {
        EXPECT_FALSE(decodeRequest(changed(strSmall, REQUEST_HEAD + nText, '\0'))) << nText;
    }
    for (const char cAsk : {'\1', '\2', '\3'}) { // none of them has a text
        EXPECT_FALSE(decodeRequest(changed(strSmall, ASK, cAsk)));
    }
    struct Text {
        std::string Request::*pText;
        size_t cbMax;
        bool blNeeded;
    };
    for (const Text& text :
         {Text{&Request::strTid, gate::TID_MAX, true}, Text{&Request::strApi, gate::API_MAX, true},
          Text{&Request::strMethod, gate::METHOD_MAX, false}}) {
        Request request = small;
        request.*text.pText = "";
        EXPECT_EQ(!text.blNeeded, decodeRequest(encode(request)).has_value());
        request.*text.pText = std::string(text.cbMax, 'x');
        EXPECT_TRUE(decodeRequest(encode(request)));
        request.*text.pText += 'x';
        EXPECT_FALSE(decodeRequest(encode(request)));
    }
}

TEST(Messages, AnswersWithWhatCannotBeAreNone)
{
    Answer small;
    small.outcome = Outcome::Granted;
    small.strUser = "u";
    small.strFunction = "f";
    const std::string strSmall = encode(small);
    ASSERT_TRUE(decodeAnswer(strSmall));
    EXPECT_FALSE(decodeAnswer(changed(strSmall, OUTCOME, 7)));
    EXPECT_FALSE(decodeAnswer(changed(strSmall, HEALTHY, 1))) << "of a grant";
    EXPECT_FALSE(decodeAnswer(changed(strSmall, UNUSED, 1)));
    EXPECT_FALSE(decodeAnswer(changed(strSmall, ANSWER_HEAD, '\0')));
    EXPECT_FALSE(decodeAnswer(changed(strSmall, ANSWER_HEAD + 1, '\0')));
    const std::string strTold = encode(told());
    EXPECT_FALSE(decodeAnswer(changed(strTold, HEALTHY, 2)));
    EXPECT_FALSE(decodeAnswer(changed(strTold, ANSWER_UID, 1))) << "of no token";
    EXPECT_FALSE(decodeAnswer(changed(strTold, FIGURES_SIZE, 0)));
    EXPECT_FALSE(decodeAnswer(strTold.substr(0, ANSWER_HEAD) + std::string(sizeof(gate::Figures), '\0')))
        << "figures of zeros are left out";
    for (char cOutcome = 1; cOutcome <= 6; ++cOutcome) { // but for a grant, there is no token
        EXPECT_FALSE(decodeAnswer(changed(strSmall, OUTCOME, cOutcome)));
        EXPECT_EQ(5 == cOutcome, decodeAnswer(changed(strTold, OUTCOME, cOutcome)).has_value());
    }
    struct Text {
        std::string Answer::*pText;
        size_t cbMax;
    };
    for (const Text& text :
         {Text{&Answer::strUser, gate::USER_MAX}, Text{&Answer::strFunction, gate::FUNCTION_MAX},
          Text{&Answer::strRecord, gate::RECORD_MAX}}) {
        Answer answer = small;
        answer.*text.pText = std::string(text.cbMax, 'x');
        EXPECT_TRUE(decodeAnswer(encode(answer)));
        answer.*text.pText += 'x';
        EXPECT_FALSE(decodeAnswer(encode(answer)));
    }
}
