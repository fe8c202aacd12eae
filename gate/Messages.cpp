#include "Messages.h"

#include <cstring>
#include <type_traits>

namespace {

struct RequestHead {
    uint64_t nNumber;
    int64_t nDue;
    uint8_t nAsk;
    uint8_t nRecord;
    uint16_t cbTid;
    uint16_t cbApi;
    uint16_t cbMethod;
};
static_assert(24 == sizeof(RequestHead) && std::has_unique_object_representations_v<RequestHead>);

struct ReplyHead {
    uint64_t nNumber;
    uint8_t nOutcome;
    uint8_t nHealthy;
    uint16_t cbUser;
    uint16_t cbFunction;
    uint16_t cbRecord;
    uint16_t cbFigures; // 0 or all
    uint16_t nUnused;
    uint32_t nUid;
};
static_assert(24 == sizeof(ReplyHead) && std::has_unique_object_representations_v<ReplyHead>);

static_assert(sizeof(RequestHead) + gate::TID_MAX + gate::API_MAX + gate::METHOD_MAX <= gate::REQUEST_MAX);
static_assert(sizeof(ReplyHead) + gate::USER_MAX + gate::FUNCTION_MAX + gate::RECORD_MAX <= gate::ANSWER_MAX);
static_assert(sizeof(gate::Figures) <= gate::RECORD_MAX);

template <typename Head>
std::string begin(const Head& head, size_t cbTexts)
{
    std::string strMessage;
    strMessage.reserve(sizeof(head) + cbTexts);
    strMessage.append(reinterpret_cast<const char*>(&head), sizeof(head));
    return strMessage;
}

// Reads a message: its head, and then the texts after it, one by one.
template <typename Head>
class Reader {
public:
    explicit Reader(std::string_view strMessage)
    {
        m_blGood = strMessage.size() >= sizeof(head);
        if (m_blGood) {
            memcpy(&head, strMessage.data(), sizeof(head));
            m_strRest = strMessage.substr(sizeof(head));
        }
    }
    std::string_view take(size_t cbText, size_t cbMax)
    {
        m_blGood = m_blGood && cbText <= cbMax && cbText <= m_strRest.size();
        if (!m_blGood) {
            return {};
        }
        const std::string_view strText = m_strRest.substr(0, cbText);
        m_strRest.remove_prefix(cbText);
        return strText;
    }
    // take() for a text that must not hold a NUL.
    std::string_view takeText(size_t cbText, size_t cbMax)
    {
        const std::string_view strText = take(cbText, cbMax);
        m_blGood = m_blGood && std::string_view::npos == strText.find('\0');
        return strText;
    }
    // Whether all texts were valid and nothing is left over.
    bool isWhole() const { return m_blGood && m_strRest.empty(); }

    Head head = {};

private:
    std::string_view m_strRest;
    bool m_blGood;
};

} // namespace

namespace gate {

std::string encode(const Request& request)
{
    RequestHead head = {};
    head.nNumber = request.nNumber;
    head.nDue = request.nDue;
    head.nAsk = static_cast<uint8_t>(request.ask);
    head.nRecord = request.blRecord;
    head.cbTid = static_cast<uint16_t>(request.strTid.size());
    head.cbApi = static_cast<uint16_t>(request.strApi.size());
    head.cbMethod = static_cast<uint16_t>(request.strMethod.size());
    return begin(head, request.strTid.size() + request.strApi.size() + request.strMethod.size())
        .append(request.strTid)
        .append(request.strApi)
        .append(request.strMethod);
}

std::optional<Request> decodeRequest(std::string_view strMessage)
{
    Reader<RequestHead> reader(strMessage);
    const RequestHead& head = reader.head;
    Request request;
    request.strTid = reader.takeText(head.cbTid, TID_MAX);
    request.strApi = reader.takeText(head.cbApi, API_MAX);
    request.strMethod = reader.takeText(head.cbMethod, METHOD_MAX);
    if (!reader.isWhole() || head.nAsk > static_cast<uint8_t>(Ask::Figures) || head.nRecord > 1) {
        return std::nullopt;
    }
    request.nNumber = head.nNumber;
    request.nDue = head.nDue;
    request.ask = static_cast<Ask>(head.nAsk);
    request.blRecord = head.nRecord;
    const bool blNamed = !request.strTid.empty() && !request.strApi.empty();
    const bool blBare = request.strTid.empty() && request.strApi.empty() && request.strMethod.empty();
    if (Ask::Grant == request.ask ? !blNamed : !blBare) {
        return std::nullopt;
    }
    return request;
}

std::string encode(const Reply& answer)
{
    const bool blFigures = answer.figures != Figures();
    ReplyHead head = {};
    head.nNumber = answer.nNumber;
    head.nOutcome = static_cast<uint8_t>(answer.outcome);
    head.nHealthy = answer.blHealthy;
    head.nUid = answer.nUid;
    head.cbUser = static_cast<uint16_t>(answer.strUser.size());
    head.cbFunction = static_cast<uint16_t>(answer.strFunction.size());
    head.cbRecord = static_cast<uint16_t>(answer.strRecord.size());
    head.cbFigures = blFigures ? sizeof(Figures) : 0;
    return begin(head,
                 answer.strUser.size() + answer.strFunction.size() + answer.strRecord.size() + head.cbFigures)
        .append(answer.strUser)
        .append(answer.strFunction)
        .append(answer.strRecord)
        .append(reinterpret_cast<const char*>(answer.figures.data()), head.cbFigures);
}

std::optional<Reply> decodeReply(std::string_view strMessage)
{
    Reader<ReplyHead> reader(strMessage);
    const ReplyHead& head = reader.head;
    Reply answer;
    answer.strUser = reader.takeText(head.cbUser, USER_MAX);
    answer.strFunction = reader.takeText(head.cbFunction, FUNCTION_MAX);
    answer.strRecord = reader.take(head.cbRecord, RECORD_MAX);
    const std::string_view strFigures = reader.take(head.cbFigures, sizeof(Figures));
    if (!reader.isWhole() || head.nOutcome > static_cast<uint8_t>(Outcome::Stop) || head.nHealthy > 1 ||
        head.nUnused || (!strFigures.empty() && strFigures.size() != sizeof(Figures))) {
        return std::nullopt;
    }
    answer.nNumber = head.nNumber;
    answer.outcome = static_cast<Outcome>(head.nOutcome);
    answer.blHealthy = head.nHealthy;
    answer.nUid = head.nUid;
    if (!strFigures.empty()) {
        memcpy(answer.figures.data(), strFigures.data(), strFigures.size());
    }
    const bool blToken = head.nUid || head.cbUser || head.cbFunction || head.cbRecord;
    const bool blTold = head.nHealthy || head.cbFigures;
    if ((blToken && Outcome::Granted != answer.outcome) || (blTold && Outcome::Told != answer.outcome) ||
        (head.cbFigures && answer.figures == Figures())) {
        return std::nullopt;
    }
    return answer;
}

} // namespace gate
