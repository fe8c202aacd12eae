// Each byte of a database is damaged, and the database is cut off after each byte. The calls must still
// return.

#include <gtest/gtest.h>
#include <sqlite3.h>
#include <unistd.h>

#include <algorithm>

#include "Figures.h"
#include "Operations.h"
#include "ProcessState.h"
#include "ShortWaits.h"

namespace {

const unsigned int HANG_SEC = 60;
const uid_t UID_CALLER = 1234;
const Operation* const CALLS[] = {&LISTING, &GRANT, &GIVEN_CREATION, &DELETION};

class DamagedByte : public ::testing::Test {
protected:
    DamagedByte()
    {
        static_cast<void>(seteuid(UID_CALLER));
        for (const Operation* pCall : CALLS) {
            m_soundAnswers.push_back(answerOf(*pCall));
        }
    }

    // Runs the first nFirst calls on a database. They may fail, or succeed with what they can still read.
    void use(const std::string& strContents, size_t nFirst = std::size(CALLS))
    {
        alarm(HANG_SEC); // ends a test that hangs
        m_store.setFiles({{DATABASE, strContents}});
        for (size_t i = 0; i < nFirst; ++i) {
            judge(*CALLS[i], answerOf(*CALLS[i]), m_soundAnswers[i]);
        }
        EXPECT_EQ(0, sqlite3_memory_used());
        ++m_nDatabases;
    }

    void judge(const Operation& operation, const std::string& strAnswer, const std::string& strSound)
    {
        const bool blThrown = 0 == strAnswer.find("throws: ");
        const int nResult = blThrown ? -1 : std::stoi(strAnswer);
        EXPECT_LE(-1, nResult) << operation.szName;
        if (&GRANT == &operation || &GIVEN_CREATION == &operation) {
            EXPECT_GE(0, nResult) << operation.szName;
        }
        if (&GRANT != &operation) { // which does not log why it refuses
            EXPECT_NE("-1: ", strAnswer) << operation.szName;
            EXPECT_FALSE(blThrown) << operation.szName << strAnswer;
        }
        ++m_nCalls;
        m_nThrown += blThrown;
        m_nFailed += !blThrown && 0 > nResult;
        m_nAsSound += strAnswer == strSound;
    }

    // Checks at the end that the calls left nothing behind in the process, and prints the counts.
    void print(const std::string& strWhat) const
    {
        EXPECT_EQ(UID_CALLER, geteuid());
        EXPECT_EQ(m_strProcess, processState());
        EXPECT_EQ(1U, m_store.files().size());
        figure("damage", strWhat + ": " + std::to_string(m_nDatabases) + " databases, " +
                             std::to_string(m_nCalls) + " calls: " + share(m_nAsSound, m_nCalls) +
                             " answer as if nothing were, " + share(m_nFailed, m_nCalls) + " fail, " +
                             share(m_nThrown, m_nCalls) + " throw, " +
                             share(m_nCalls - m_nAsSound - m_nFailed - m_nThrown, m_nCalls) +
                             " succeed with another answer");
    }

    const TokenStore m_store;
    const std::string m_strSound = makeSmallStore(m_store);
    const std::string m_strProcess = processState();

private:
    std::vector<std::string> m_soundAnswers;
    int64_t m_nDatabases = 0;
    int64_t m_nCalls = 0;
    int64_t m_nAsSound = 0;
    int64_t m_nFailed = 0;
    int64_t m_nThrown = 0;
};

} // namespace

TEST_F(DamagedByte, InvertedHarmsNobody)
{
    for (size_t i = 0; i < m_strSound.size(); ++i) {
        SCOPED_TRACE(i);
        std::string strDamaged = m_strSound;
        strDamaged[i] = static_cast<char>(~strDamaged[i]);
        use(strDamaged);
    }
    print("each byte inverted");
}

// SQLite reads the file; the library only decodes the rows. A usual run flips the bit that turns a zero into
// NULL; longer runs flip the other bits too.
TEST_F(DamagedByte, WithOneBitFlippedIsReadWithoutHarm)
{
    for (int64_t nBit = 3; nBit < 3 + std::min<int64_t>(8, scaled(1)); ++nBit) {
        for (size_t i = 0; i < m_strSound.size(); ++i) {
            SCOPED_TRACE(std::to_string(i) + ", bit " + std::to_string(nBit % 8));
            std::string strDamaged = m_strSound;
            strDamaged[i] = static_cast<char>(strDamaged[i] ^ (1 << nBit % 8));
            use(strDamaged, 1);
        }
    }
    print("a bit of each byte flipped");
}

TEST_F(DamagedByte, MissingWithAllAfterItHarmsNobody)
{
    const size_t nStride = scaled(1) > 1 ? 1 : 4; // longer runs try each byte
    for (size_t cb = seed() % nStride; cb < m_strSound.size(); cb += nStride) {
        SCOPED_TRACE(cb);
        use(m_strSound.substr(0, cb));
    }
    print("truncations");
}
