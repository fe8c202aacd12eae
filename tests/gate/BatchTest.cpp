#include "gate/Batch.h"

#include "TokenTable.h"

using gate::Outcome;
using gate::Owners;
using gate::Reply;
using gate::Request;

namespace {

// A batch over tokens whose ids tell what they are.
class Batch : public TokenTable {
protected:
    Batch()
    {
        for (const auto& [szTid, szChange] : {
                 std::pair("three", "count = 3"),
                 std::pair("two", "count = 2"),
                 std::pair("one", "count = 1"),
                 std::pair("none", "count = 0"),
                 std::pair("unlimited", "count = -1"),
                 std::pair("expired", "deadline = 1"),
                 std::pair("malformed", "webapi_allow = '[]'"),
                 std::pair("null", "function = NULL"),
                 std::pair("nobody", "uid = -1"),
                 std::pair("no uid", "uid = 4294967295"),
                 std::pair("last uid", "uid = 4294967294"),
                 std::pair("slow", "uid = 1"),
                 std::pair("failing", "uid = 2"),
                 std::pair("unnamed", "uid = 3"),
                 std::pair("long", "function = printf('%.*c', 1024, 'f')"),
                 std::pair("too long", "function = printf('%.*c', 1025, 'f')"),
                 std::pair("large", "bind_sid = printf('%.*c', 16384, 's')"),
             }) {
            add(szTid, szChange);
        }
        m_tokens.emplace(m_pDb);
        m_batch.emplace(*m_tokens, m_fOwner);
    }

    void TearDown() override
    {
        m_batch.reset();
        m_tokens.reset();
        TokenTable::TearDown();
    }

    // How many uses a token has, or "gone".
    std::string uses(const std::string& strTid)
    {
        grant::Statement select(m_pDb, "SELECT count FROM token WHERE tid = ?1");
        return select.bind(1, strTid).step() ? select.text(0) : "gone";
    }

    std::optional<Reply> call(const std::string& strTid, const std::string& strMethod = "get",
                              const std::string& strApi = "Api", bool blRecord = false)
    {
        Request request;
        request.nNumber = ++m_nNumber;
        request.strTid = strTid;
        request.strApi = strApi;
        request.strMethod = strMethod;
        request.blRecord = blRecord;
        std::optional<Reply> answer = m_batch->call(request);
        EXPECT_EQ(m_nNumber, answer ? answer->nNumber : m_nNumber);
        return answer;
    }

    gate::Figures figures() const { return m_batch->figures(); }

    std::optional<grant::Tokens> m_tokens;
    std::optional<gate::Batch> m_batch;

private:
    static Owners::Owner owner(uid_t uid)
    {
        const Owners::State STATES[] = {Owners::State::Known, Owners::State::Asked, Owners::State::Failing,
                                        Owners::State::Nobody};
        return {STATES[uid < 4 ? uid : 0], "user" + std::to_string(uid), 0};
    }

    const std::function<Owners::Owner(uid_t)> m_fOwner = owner;
    uint64_t m_nNumber = 0;
};

} // namespace

TEST_F(Batch, SpendsOnlyTheUsesThatItsEarlierCallsHaveLeft)
{
    const struct {
        const char* szTid;
        std::string strOutcomes; // of calls one after the other: granted, refused or failed
        const char* szUses;      // afterwards
        gate::Figure figure;     // that counts the last of them
        const char* szApi = "Api";
        const char* szMethod = "get";
    } TOKENS[] = {
        {"three", "GGGR", "gone", gate::REFUSED_UNKNOWN},
        {"one", "GR", "gone", gate::REFUSED_UNKNOWN},
        {"none", "GR", "gone", gate::REFUSED_UNKNOWN},
        {"unlimited", "GGGG", "-1", gate::GRANTED},
        {"last uid", "G", "1", gate::GRANTED},
        {"long", "G", "1", gate::GRANTED},
        {"unknown", "R", "gone", gate::REFUSED_UNKNOWN},
        {"two", "R", "2", gate::REFUSED_API, "Other"},
        {"two", "R", "2", gate::REFUSED_METHOD, "Api", "put"},
        {"expired", "R", "2", gate::REFUSED_EXPIRED},
        {"malformed", "R", "2", gate::REFUSED_MALFORMED},
        {"null", "R", "2", gate::REFUSED_MALFORMED},
        {"nobody", "R", "2", gate::REFUSED_OWNER},
        {"no uid", "R", "2", gate::REFUSED_OWNER},
        {"unnamed", "R", "2", gate::REFUSED_OWNER},
        {"too long", "R", "2", gate::REFUSED_LARGE},
        {"failing", "F", "2", gate::FAILED},
    };
    for (const auto& row : TOKENS) {
        SCOPED_TRACE(row.szTid);
        const std::string strBefore = uses(row.szTid);
        gate::Figures counted = {};
        for (const char cOutcome : row.strOutcomes) {
            counted = figures();
            EXPECT_EQ(cOutcome,
                      "GRF"[static_cast<size_t>(call(row.szTid, row.szMethod, row.szApi)->outcome)]);
        }
        ++counted[row.figure];
        EXPECT_EQ(counted, figures());
        EXPECT_EQ(strBefore, uses(row.szTid)) << "nothing is written before it is saved";
    }
    m_batch->save();
    for (const auto& row : TOKENS) {
        EXPECT_EQ(row.szUses, uses(row.szTid)) << row.szTid;
    }
}

TEST_F(Batch, RefusesALargeRecordButGrantsTheCallWithoutIt)
{
    EXPECT_EQ(Outcome::Refused, call("large", "get", "Api", true)->outcome);
    EXPECT_EQ(1U, figures()[gate::REFUSED_LARGE]);
    EXPECT_EQ(Outcome::Granted, call("large")->outcome);
    m_batch->save();
    EXPECT_EQ("1", uses("large"));
}

TEST_F(Batch, WaitsForTheNameOfTheOwner)
{
    EXPECT_FALSE(call("slow"));
    m_batch->save();
    EXPECT_EQ("2", uses("slow"));
}

TEST_F(Batch, AnswersWithTheRecordAfterTheCallOrAtTheLastUse)
{
    const std::string strBegin = R"({"bind_sid":"s","count":)";
    const std::string strEnd =
        R"(,"create_time":5,"deadline":9999999999,"extra":{},"function":"VPN","uid":1000,)"
        R"("webapi_allow":{"Api":{"method":["get"]}}})";
    for (const char* szCount : {"2", "1", "1"}) {
        const Reply answer = call("three", "get", "Api", true).value();
        EXPECT_EQ("user1000", answer.strUser);
        EXPECT_EQ(1000U, answer.nUid);
        EXPECT_EQ("VPN", answer.strFunction);
        const std::string strWanted = strBegin + szCount + strEnd;
        EXPECT_EQ(strWanted, answer.strRecord.substr(0, strWanted.size()));
        EXPECT_GE(strWanted.size() + 1, answer.strRecord.size());
    }
    EXPECT_EQ("", call("one", "")->strRecord) << "of the API alone, and without the record";
}
