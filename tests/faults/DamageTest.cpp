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
    void SetUp() override { static_cast<void>(seteuid(UID_CALLER)); }

    // The calls have left nothing behind in the process.
    void TearDown() override
    {
        EXPECT_EQ(UID_CALLER, geteuid());
        EXPECT_EQ(m_strProcess, processState());
        EXPECT_EQ(1U, m_store.files().size());
    }

    // Runs the first nFirst calls on a database. They may fail, or succeed with what they can still read.
    void use(const std::string& strContents, size_t nFirst = std::size(CALLS)) const
    {
        alarm(HANG_SEC); // ends a test that hangs
        m_store.setFiles({{DATABASE, strContents}});
        for (size_t i = 0; i < nFirst; ++i) {
            const Operation& operation = *CALLS[i];
            SCOPED_TRACE(operation.szName);
            const std::string strAnswer = answerOf(operation);
            const bool blThrown = 0 == strAnswer.find("throws: ");
            const int nResult = blThrown ? -1 : std::stoi(strAnswer);
            EXPECT_LE(-1, nResult);
            if (&GRANT == &operation || &GIVEN_CREATION == &operation) {
                EXPECT_GE(0, nResult);
            }
            if (&GRANT != &operation) { // which does not log why it refuses
                EXPECT_NE("-1: ", strAnswer);
                EXPECT_FALSE(blThrown) << strAnswer;
            }
        }
        EXPECT_EQ(0, sqlite3_memory_used());
    }

    const TokenStore m_store;
    const std::string m_strSound = makeSmallStore(m_store);
    const std::string m_strProcess = processState();
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
}

TEST_F(DamagedByte, MissingWithAllAfterItHarmsNobody)
{
    const size_t nStride = scaled(1) > 1 ? 1 : 4; // longer runs try each byte
    for (size_t cb = seed() % nStride; cb < m_strSound.size(); cb += nStride) {
        SCOPED_TRACE(cb);
        use(m_strSound.substr(0, cb));
    }
}
