// What the two processes of the gate say to each other. One reads HTTP and holds no secret; the other,
// root's, holds the tokens and reads nothing but these messages, of which it trusts no byte.
//
// Each message is one packet of a SOCK_SEQPACKET pair: a head of fixed size, and behind it, without a gap,
// texts whose sizes the head tells. Numbers are in the order of this machine.

#ifndef GATE_MESSAGES_H
#define GATE_MESSAGES_H

#include <array>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace gate {

// The longest texts, in bytes. What is longer is refused before it becomes a message.
const size_t TID_MAX = 1024;
const size_t API_MAX = 512;
const size_t METHOD_MAX = 512;
const size_t USER_MAX = 256;
const size_t FUNCTION_MAX = 1024;
const size_t RECORD_MAX = 16384;

// From the one that reads HTTP.
enum class Ask : uint8_t {
    Grant,  // strTid, strApi, strMethod
    Cancel, // of the grant with the same number: whoever asked has gone
    Health, // a look at the store
    Figures // what has been counted
};

struct Request {
    uint64_t nNumber = 0; // comes back with the answer; that of a grant not answered yet is not used again
    int64_t nDue = 0;     // of the monotonic clock, in ns: a grant that has not begun then is not made
    Ask ask = Ask::Grant;
    bool blRecord = false; // the record is wanted
    std::string strTid;
    std::string strApi;
    std::string strMethod; // empty: the API alone
};

enum class Outcome : uint8_t {
    Granted,   // one use is spent; strUser, nUid and strFunction tell whose token it is
    Refused,   // nothing is spent
    Failed,    // the store failed, and nothing is spent
    Late,      // it was due, and nothing is spent
    Cancelled, // by Ask::Cancel, and nothing is spent
    Told,      // what Ask::Health and Ask::Figures asked for
    Stop       // no answer: take no more calls, and end when all are answered
};

// What the process that holds the tokens counts. All begin at 0 when it starts.
enum Figure : size_t {
    GRANTED,
    REFUSED_UNKNOWN,
    REFUSED_EXPIRED,
    REFUSED_API,
    REFUSED_METHOD,
    REFUSED_MALFORMED,
    REFUSED_OWNER, // the owner has no name
    REFUSED_LARGE, // an answer cannot carry it
    FAILED,
    LATE,
    CANCELLED,
    BATCHES,
    BATCHES_FAILED,
    WAIT_NS,   // for the locks of other programs
    COMMIT_NS, // for commits
    PURGED,    // expired tokens
    BATCH_LE_1,
    BATCH_LE_4,
    BATCH_LE_16,
    BATCH_LE_64,
    BATCH_LE_256,
    STORE_BYTES,
    FIGURES
};
typedef std::array<uint64_t, FIGURES> Figures;

struct Answer {
    uint64_t nNumber = 0;
    Outcome outcome = Outcome::Failed;
    bool blHealthy = false; // for Ask::Health
    uint32_t nUid = 0;      // this and the texts: for Outcome::Granted
    std::string strUser;
    std::string strFunction;
    std::string strRecord; // without the tid; JSON
    Figures figures = {};  // for Ask::Figures
};

// The largest message of either kind.
const size_t REQUEST_MAX = 64 + TID_MAX + API_MAX + METHOD_MAX;
const size_t ANSWER_MAX = 64 + USER_MAX + FUNCTION_MAX + RECORD_MAX;

// A message's bytes. What is written must keep the limits above.
std::string encode(const Request& request);
std::string encode(const Answer& answer);

// Nothing for what is no message: a size, a text's size or a value that cannot be. So each message has one
// form.
std::optional<Request> decodeRequest(std::string_view strMessage);
std::optional<Answer> decodeAnswer(std::string_view strMessage);

} // namespace gate

#endif
