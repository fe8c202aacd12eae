#include "gate/Batch.h"

#include "TokenTable.h"

using gate::Outcome;
using gate::Owners;
using gate::Reply;
using gate::Request;

namespace {

class Batch : public TokenTable {
protected:
    Batch()
    {
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

    std::optional<Reply> call(const std::string& strTid, const std::string& strApi = "Api",
                              const std::string& strMethod = "get", bool blRecord = false)
    {
        Request request;
        request.nNumber = ++m_nNumber;
        request.strTid = strTid;
        request.strApi = strApi;
        request.strMethod = strMethod;
        request.blRecord = blRecord;
        std::optional<Reply> answer = m_batch->call(request);
        EXPECT_EQ(m_nNumber, answer ? answer->nNumber : m_nNumber);
        if (answer && Outcome::Granted == answer->outcome) {
            EXPECT_EQ("user" + std::to_string(answer->nUid), answer->strUser);
        }
        return answer;
    }

    gate::Figures figures() const { return m_batch->figures(); }

    std::optional<grant::Tokens> m_tokens;
    std::optional<gate::Batch> m_batch;

private:
    // The look-up of the name of user 1 has begun, that of user 2 fails, and user 3 has none.
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
        const char* szChange;    // of the token, whose other fields are the same in each row
        std::string strOutcomes; // of its calls one after the other: granted, refused or failed
        const char* szUses;      // afterwards
        gate::Figure figure;     // that counts the last of them
        const char* szApi = "Api";
        const char* szMethod = "get";
        bool blRecord = false;
    } TOKENS[] = {
        {"count = 3", "GGGR", "gone", gate::REFUSED_UNKNOWN},
        {"count = 1", "GR", "gone", gate::REFUSED_UNKNOWN},
        {"count = 0", "GR", "gone", gate::REFUSED_UNKNOWN},
        {"count = -1", "GGGG", "-1", gate::GRANTED},
        {"tid = 'another'", "R", "gone", gate::REFUSED_UNKNOWN},
        {"count = 2", "R", "2", gate::REFUSED_API, "Other"},
        {"count = 2", "R", "2", gate::REFUSED_METHOD, "Api", "put"},
        {"deadline = 1", "R", "2", gate::REFUSED_EXPIRED},
        {"webapi_allow = '[]'", "R", "2", gate::REFUSED_MALFORMED},
        {"function = NULL", "R", "2", gate::REFUSED_MALFORMED},
        {"function = printf('%.*c', 1024, 'f')", "G", "1", gate::GRANTED},
        {"function = printf('%.*c', 1025, 'f')", "R", "2", gate::REFUSED_LARGE},
        {"bind_sid = printf('%.*c', 16384, 's')", "R", "2", gate::REFUSED_LARGE, "Api", "get", true},
        {"bind_sid = printf('%.*c', 16384, 's')", "G", "1", gate::GRANTED},
        {"uid = -1", "R", "2", gate::REFUSED_OWNER},
        {"uid = 4294967295", "R", "2", gate::REFUSED_OWNER},
        {"uid = 4294967294", "G", "1", gate::GRANTED},
        {"uid = 3", "R", "2", gate::REFUSED_OWNER}, // who has no name
        {"uid = 2", "F", "2", gate::FAILED},
    };
    const auto tidOf = [&TOKENS](const auto& row) { return std::to_string(&row - TOKENS); };
    for (const auto& row : TOKENS) {
        SCOPED_TRACE(row.szChange);
        const std::string strTid = tidOf(row);
        add(strTid, row.szChange);
        const std::string strBefore = uses(strTid);
        gate::Figures counted = {};
        for (const char cOutcome : row.strOutcomes) {
            counted = figures();
            const Reply answer = call(strTid, row.szApi, row.szMethod, row.blRecord).value();
            EXPECT_EQ(cOutcome, "GRF"[static_cast<size_t>(answer.outcome)]);
        }
        ++counted[row.figure];
        EXPECT_EQ(counted, figures());
        EXPECT_EQ(strBefore, uses(strTid)) << "nothing is written before it is saved";
    }
    m_batch->save();
    for (const auto& row : TOKENS) {
        EXPECT_EQ(row.szUses, uses(tidOf(row))) << row.szChange;
    }
}

TEST_F(Batch, WaitsForTheNameOfTheOwner)
{
    add("token", "uid = 1");
    EXPECT_FALSE(call("token"));
    m_batch->save();
    EXPECT_EQ("2", uses("token"));
}
