#include "gate/Messages.h"

#include <gtest/gtest.h>

#include <utility>
#include <vector>

using gate::Ask;
using gate::decodeReply;
using gate::decodeRequest;
using gate::encode;
using gate::Outcome;
using gate::Reply;
using gate::Request;

namespace {

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

Reply withFigures()
{
    Reply answer;
    answer.outcome = Outcome::Told;
    answer.blHealthy = true;
    for (size_t nFigure = 0; nFigure < gate::FIGURES; ++nFigure) {
        answer.figures[nFigure] = (1ULL << 63) + nFigure;
    }
    return answer;
}

// Runs of bytes in a message: how many bytes, and how many other values each can have while the rest stays.
// Each message that is accepted must be encoded to the same bytes again.
typedef std::vector<std::pair<int, int>> Freedom;

template <typename Decode>
Freedom freedomOf(const std::string& strMessage, Decode decode)
{
    Freedom freedom;
    for (size_t nPlace = 0; nPlace < strMessage.size(); ++nPlace) {
        std::string strOther = strMessage;
        int nValues = -1; // its own value does not count
        for (int n = 0; n < 256; ++n) {
            strOther[nPlace] = static_cast<char>(n);
            if (const auto read = decode(strOther)) {
                EXPECT_EQ(strOther, encode(*read));
                ++nValues;
            }
        }
        if (freedom.empty() || freedom.back().second != nValues) {
            freedom.emplace_back(0, nValues);
        }
        ++freedom.back().first;
    }
    return freedom;
}

// Checks that a message is read back, and that none of another size is accepted.
template <typename Message, typename Decode>
void expectWhole(const Message& message, Decode decode, size_t cbMax)
{
    const std::string strMessage = encode(message);
    const auto read = decode(strMessage);
    ASSERT_TRUE(read);
    EXPECT_EQ(strMessage, encode(*read));
    EXPECT_GE(cbMax, strMessage.size());
    for (size_t cb = 0; cb < strMessage.size(); ++cb) {
        ASSERT_FALSE(decode(std::string_view(strMessage).substr(0, cb))) << cb;
    }
    EXPECT_FALSE(decode(strMessage + '\0'));
}

} // namespace

TEST(Requests, AreReadBackEqualIfTheyAreValid)
{
    Request cancel;
    cancel.ask = Ask::Cancel;
    for (const Request& request : {grantRequest(), grantRequest(1, 1, 0), cancel}) {
        expectWhole(request, decodeRequest, gate::REQUEST_MAX);
    }
    for (const Request& request :
         {grantRequest(0), grantRequest(gate::TID_MAX + 1), grantRequest(1, 0),
          grantRequest(1, gate::API_MAX + 1), grantRequest(1, 1, gate::METHOD_MAX + 1)}) {
        EXPECT_FALSE(decodeRequest(encode(request)));
    }
    // The number and the time; the kind of request, and whether it wants a record; the sizes of the texts,
    // and the texts.
    EXPECT_EQ((Freedom{{16, 255}, {1, 0}, {1, 1}, {6, 0}, {3, 254}}),
              freedomOf(encode(grantRequest(1, 1, 1)), decodeRequest));
    EXPECT_EQ((Freedom{{16, 255}, {1, 2}, {1, 1}, {6, 0}}), freedomOf(encode(cancel), decodeRequest));
}

TEST(Answers, AreReadBackEqualIfTheyAreValid)
{
    Reply refused;
    refused.outcome = Outcome::Refused;
    for (const Reply& answer : {granted(), granted(0, 0, 0), withFigures(), refused}) {
        expectWhole(answer, decodeReply, gate::ANSWER_MAX);
    }
    for (const Reply& answer : {granted(gate::USER_MAX + 1, 1, 0), granted(1, gate::FUNCTION_MAX + 1, 0),
                                granted(1, 1, gate::RECORD_MAX + 1)}) {
        EXPECT_FALSE(decodeReply(encode(answer)));
    }
    // The number; the outcome, and whether the store is healthy; sizes, and unused bytes; the uid; the rest.
    EXPECT_EQ((Freedom{{8, 255}, {12, 0}, {4, 255}, {2, 254}, {1, 255}}),
              freedomOf(encode(granted(1, 1, 1)), decodeReply));
    EXPECT_EQ((Freedom{{8, 255}, {1, 0}, {1, 1}, {14, 0}, {sizeof(gate::Figures), 255}}),
              freedomOf(encode(withFigures()), decodeReply));
    EXPECT_EQ((Freedom{{8, 255}, {1, 6}, {15, 0}}), freedomOf(encode(refused), decodeReply));
    EXPECT_FALSE(decodeReply(encode(withFigures()).substr(0, 24) + std::string(sizeof(gate::Figures), '\0')))
        << "figures of zeros are left out";
}
