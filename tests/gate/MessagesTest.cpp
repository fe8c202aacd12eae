#include "gate/Messages.h"

#include <gtest/gtest.h>

#include <tuple>

using gate::Ask;
using gate::decodeReply;
using gate::decodeRequest;
using gate::encode;
using gate::Outcome;
using gate::Reply;
using gate::Request;

namespace {

// Where the numbers of one byte or two stand in a message.
enum RequestByte { ASK = 16, RECORD, REQUEST_HEAD = 24 };
enum AnswerByte { OUTCOME = 8, HEALTHY, FIGURES_SIZE = 16, UNUSED = 18, ANSWER_UID = 20, ANSWER_HEAD = 24 };

auto fields(const Request& request)
{
    return std::tie(request.nNumber, request.nDue, request.ask, request.blRecord, request.strTid,
                    request.strApi, request.strMethod);
}

auto fields(const Reply& answer)
{
    return std::tie(answer.nNumber, answer.outcome, answer.blHealthy, answer.nUid, answer.strUser,
                    answer.strFunction, answer.strRecord, answer.figures);
}

Request grantRequest(size_t cbTid = gate::TID_MAX, size_t cbApi = gate::API_MAX,
                     size_t cbMethod = gate::METHOD_MAX)
{
    Request request;
    request.nNumber = 0x0123456789abcdef;
    request.nDue = -5;
    request.blRecord = true;
    request.strTid = std::string(cbTid, 't');
    request.strApi = std::string(cbApi, 'a');
    request.strMethod = std::string(cbMethod, 'm');
    return request;
}

Reply granted(size_t cbUser = gate::USER_MAX, size_t cbFunction = gate::FUNCTION_MAX,
              size_t cbRecord = gate::RECORD_MAX)
{
    Reply answer;
    answer.nNumber = 0xfedcba9876543210;
    answer.outcome = Outcome::Granted;
    answer.nUid = 4294967294;
    answer.strUser = std::string(cbUser, 'u');
    answer.strFunction = std::string(cbFunction, 'f');
    answer.strRecord = std::string(cbRecord, '\0');
    return answer;
}

Reply told()
{
    Reply answer;
    answer.outcome = Outcome::Told;
    answer.blHealthy = true;
    for (size_t nFigure = 0; nFigure < gate::FIGURES; ++nFigure) {
        answer.figures[nFigure] = (1ULL << 63) + nFigure;
    }
    return answer;
}

// A message with another byte.
std::string changed(std::string strMessage, size_t nPlace, char c)
{
    strMessage[nPlace] = c;
    return strMessage;
}

// That a message comes back as it was, and that none of another size comes.
template <typename Message, typename Decode>
void expectWhole(const Message& message, Decode decode, size_t cbMax)
{
    const std::string strMessage = encode(message);
    const auto read = decode(strMessage);
    ASSERT_TRUE(read);
    EXPECT_EQ(fields(message), fields(*read));
    EXPECT_GE(cbMax, strMessage.size());
    for (size_t cb = 0; cb < strMessage.size(); ++cb) {
        ASSERT_FALSE(decode(std::string_view(strMessage).substr(0, cb))) << cb;
    }
    EXPECT_FALSE(decode(strMessage + '\0'));
}

} // namespace

TEST(Requests, ComeBackAsTheyWereIfTheyCanBe)
{
    expectWhole(grantRequest(), decodeRequest, gate::REQUEST_MAX);
    expectWhole(grantRequest(1, 1, 0), decodeRequest, gate::REQUEST_MAX);
    for (const Ask ask : {Ask::Cancel, Ask::Health, Ask::Figures}) {
        Request bare;
        bare.ask = ask;
        expectWhole(bare, decodeRequest, gate::REQUEST_MAX);
        Request named = grantRequest(1, 1, 1); // none of them has a text
        named.ask = ask;
        EXPECT_FALSE(decodeRequest(encode(named)));
    }
    for (const Request& request :
         {grantRequest(0), grantRequest(gate::TID_MAX + 1), grantRequest(1, 0),
          grantRequest(1, gate::API_MAX + 1), grantRequest(1, 1, gate::METHOD_MAX + 1)}) {
        EXPECT_FALSE(decodeRequest(encode(request)));
    }
    const std::string strSmall = encode(grantRequest(1, 1, 1));
    EXPECT_FALSE(decodeRequest(changed(strSmall, ASK, 4)));
    EXPECT_FALSE(decodeRequest(changed(strSmall, RECORD, 2)));
    for (size_t nText = 0; nText < 3; ++nText) {
        EXPECT_FALSE(decodeRequest(changed(strSmall, REQUEST_HEAD + nText, '\0'))) << nText;
    }
}

TEST(Answers, ComeBackAsTheyWereIfTheyCanBe)
{
    for (const Reply& answer : {granted(), granted(0, 0, 0), told()}) {
        expectWhole(answer, decodeReply, gate::ANSWER_MAX);
    }
    const std::string strSmall = encode(granted(1, 1, 0));
    const std::string strTold = encode(told());
    for (char cOutcome = 1; cOutcome <= 6; ++cOutcome) {
        Reply bare;
        bare.outcome = static_cast<Outcome>(cOutcome);
        expectWhole(bare, decodeReply, gate::ANSWER_MAX);
        EXPECT_FALSE(decodeReply(changed(strSmall, OUTCOME, cOutcome))) << "a token of what is no grant";
        EXPECT_EQ(5 == cOutcome, decodeReply(changed(strTold, OUTCOME, cOutcome)).has_value());
    }
    for (const Reply& answer : {granted(gate::USER_MAX + 1, 1, 0), granted(1, gate::FUNCTION_MAX + 1, 0),
                                granted(1, 1, gate::RECORD_MAX + 1)}) {
        EXPECT_FALSE(decodeReply(encode(answer)));
    }
    const std::pair<size_t, char> IN_GRANT[] = {
        {OUTCOME, 7}, {HEALTHY, 1}, {UNUSED, 1}, {ANSWER_HEAD, '\0'}, {ANSWER_HEAD + 1, '\0'}};
    for (const auto& [nPlace, c] : IN_GRANT) {
        EXPECT_FALSE(decodeReply(changed(strSmall, nPlace, c))) << nPlace;
    }
    const std::pair<size_t, char> IN_TOLD[] = {{HEALTHY, 2}, {ANSWER_UID, 1}, {FIGURES_SIZE, 0}};
    for (const auto& [nPlace, c] : IN_TOLD) {
        EXPECT_FALSE(decodeReply(changed(strTold, nPlace, c))) << nPlace;
    }
    EXPECT_FALSE(decodeReply(strTold.substr(0, ANSWER_HEAD) + std::string(sizeof(gate::Figures), '\0')))
        << "figures of zeros are left out";
}
