// The messages between the two processes of the gate. One reads HTTP and cannot read the database. The other
// runs as root, holds the tokens, and reads nothing but these messages. It trusts no byte of them.
//
// Each message is one packet of a SOCK_SEQPACKET pair: a head of fixed size, and then, without gaps, the
// texts, whose sizes are in the head. Numbers have the byte order of this machine.

#ifndef GATE_MESSAGES_H
#define GATE_MESSAGES_H

#include <array>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace gate {

// The longest texts, in bytes. Longer ones are refused before they become a message.
const size_t TID_MAX = 1024;
const size_t API_MAX = 512;
const size_t METHOD_MAX = 512;
const size_t USER_MAX = 256;
const size_t FUNCTION_MAX = 1024;
const size_t RECORD_MAX = 16384;

// What the process that reads HTTP asks for.
enum class Ask : uint8_t {
    Grant,  // of a call: strTid, strApi, strMethod
    Cancel, // the grant with the same number: its client has gone
    Health, // whether tokens can be read
    Figures // all figures
};

struct Request {
    uint64_t nNumber = 0; // comes back with the answer; unique among grants without an answer
    int64_t nDue = 0;     // monotonic, in ns: a grant that has not begun by then is not made
    Ask ask = Ask::Grant;
    bool blRecord = false; // the record is wanted
    std::string strTid;
    std::string strApi;
    std::string strMethod; // empty: the API alone
};

enum class Outcome : uint8_t {
    Granted,   // one use is spent; strUser and nUid are the token's owner, strFunction is its purpose
    Refused,   // nothing is spent
    Failed,    // the store, the lock or the user database failed; nothing is spent
    Late,      // it did not begin before nDue; nothing is spent
    Cancelled, // by Ask::Cancel; nothing is spent
    Told,      // the answer to Ask::Health and Ask::Figures
    Stop       // not an answer: take no more calls, and end when all are answered
};

// What the process that holds the tokens counts, from 0 when it starts. STORE_BYTES is a size.
enum Figure : size_t {
    GRANTED,
    REFUSED_UNKNOWN,
    REFUSED_EXPIRED,
    REFUSED_API,
    REFUSED_METHOD,
    REFUSED_MALFORMED,
    REFUSED_OWNER, // its owner is not a user, or the name is too long
    REFUSED_LARGE, // too large for an answer
    FAILED,
    LATE,
    CANCELLED,
    BATCHES,
    BATCHES_FAILED,
    WAIT_NS,   // spent waiting for the locks of other programs
    COMMIT_NS, // spent on commits
    PURGED,    // expired tokens that were deleted
    BATCH_LE_1,
    BATCH_LE_4,
    BATCH_LE_16,
    BATCH_LE_64,
    BATCH_LE_256,
    STORE_BYTES,
    FIGURES
};
typedef std::array<uint64_t, FIGURES> Figures;

struct Reply {
    uint64_t nNumber = 0;
    Outcome outcome = Outcome::Failed;
    bool blHealthy = false; // for Ask::Health
    uint32_t nUid = 0;      // this and the texts are for Outcome::Granted
    std::string strUser;
    std::string strFunction;
    std::string strRecord; // JSON, without the tid
    Figures figures = {};  // for Ask::Figures
};

// The largest message of either kind.
const size_t REQUEST_MAX = 64 + TID_MAX + API_MAX + METHOD_MAX;
const size_t ANSWER_MAX = 64 + USER_MAX + FUNCTION_MAX + RECORD_MAX;

// The bytes of a message. Its texts must keep the limits above.
std::string encode(const Request& request);
std::string encode(const Reply& answer);

// Returns nothing for a message with a wrong size or an impossible value. So each message has one form only.
std::optional<Request> decodeRequest(std::string_view strMessage);
std::optional<Reply> decodeReply(std::string_view strMessage);

} // namespace gate

#endif
