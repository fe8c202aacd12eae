// The stand-in for the platform's random library: numbers and strings.

#include <climits>
#include <cstring>
#include <map>

#include "StoreTest.h"
#include "vemorandom.h"

namespace {

using VEMO::RANDOM::VEMORandom;
using VEMO::RANDOM::VEMORandomBase;

// Serves the given bytes, then fails with EIO.
class ScriptedSource : public VEMORandomBase {
public:
    explicit ScriptedSource(const std::string& strBytes) : m_strBytes(strBytes) {}

    explicit ScriptedSource(const std::vector<uint64_t>& draws)
        : m_strBytes(reinterpret_cast<const char*>(draws.data()), draws.size() * sizeof(uint64_t))
    {
    }

    size_t left() const { return m_strBytes.size(); }

protected:
    bool fill(void* pBuffer, size_t cbBuffer) override
    {
        if (m_strBytes.size() < cbBuffer) {
            errno = EIO;
            return false;
        }
        memcpy(pBuffer, m_strBytes.data(), cbBuffer);
        m_strBytes.erase(0, cbBuffer);
        return true;
    }

private:
    std::string m_strBytes;
};

TEST(RandomNumber, HasBothBoundsAndNoBias)
{
    // How often 129 numbers fit into 64 bits; the draws above are one incomplete run more.
    const uint64_t nLimit = UINT64_MAX / 129 * 129;
    const struct {
        std::vector<uint64_t> draws;
        int nExpected;
    } rows[] = {
        {{0}, 127},
        {{1}, 128},
        {{128}, 255},
        {{129}, 127},
        {{nLimit - 129}, 127},
        {{nLimit - 1}, 255},
        {{nLimit, 5}, 132},
        {{UINT64_MAX, nLimit, nLimit + 1, 128}, 255},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(row.draws.front());
        ScriptedSource source(row.draws);
        EXPECT_EQ(row.nExpected, source.random(127, 255));
        EXPECT_EQ(0u, source.left());
    }
}

TEST(RandomNumber, EveryNumberIsEquallyLikely)
{
    std::vector<uint64_t> draws;
    for (uint64_t i = 0; i < 129 * 3; ++i) {
        draws.push_back(i);
    }
    ScriptedSource source(draws);
    std::map<int, int> counts;
    while (0 < source.left()) {
        ++counts[source.random(127, 255)];
    }
    EXPECT_EQ(129u, counts.size());
    for (const auto& count : counts) {
        EXPECT_LE(127, count.first);
        EXPECT_GE(255, count.first);
        EXPECT_EQ(3, count.second) << count.first;
    }
}

TEST(RandomNumber, AcceptsTheWidestAndNarrowestBounds)
{
    const struct {
        int nMin;
        int nMax;
        uint64_t nDraw;
        int nExpected;
    } rows[] = {
        {0, 0, 12345, 0},
        {255, 255, 12345, 255},
        {INT_MAX, INT_MAX, 12345, INT_MAX},
        {0, INT_MAX, 0x7fffffff, INT_MAX},
        {0, INT_MAX, 0x80000000, 0},
        {0, 1, 7, 1},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(row.nExpected);
        ScriptedSource source(std::vector<uint64_t>{row.nDraw});
        EXPECT_EQ(row.nExpected, source.random(row.nMin, row.nMax));
    }
}

TEST(RandomNumber, RefusesWrongBounds)
{
    const std::pair<int, int> rows[] = {{-1, 5}, {6, 5}, {-2, -1}, {INT_MIN, INT_MAX}, {INT_MAX, 0}};
    for (const auto& row : rows) {
        SCOPED_TRACE(row.first);
        ScriptedSource source(std::vector<uint64_t>{1});
        errno = 0;
        EXPECT_EQ(-1, source.random(row.first, row.second));
        EXPECT_EQ(EINVAL, errno);
        EXPECT_EQ(sizeof(uint64_t), source.left());
    }
}

TEST(RandomNumber, FailsWithItsSource)
{
    for (const std::vector<uint64_t>& draws : {std::vector<uint64_t>{}, std::vector<uint64_t>{UINT64_MAX}}) {
        SCOPED_TRACE(draws.size());
        ScriptedSource source(draws);
        errno = 0;
        EXPECT_EQ(-1, source.random(127, 255));
        EXPECT_EQ(EIO, errno);
    }
}

// All 256 bytes, the greatest first, so that those without a character come before the others.
std::string allBytes()
{
    std::string strBytes;
    for (int i = 255; 0 <= i; --i) {
        strBytes += static_cast<char>(i);
    }
    return strBytes;
}

TEST(RandomString, EveryCharacterIsEquallyLikely)
{
    for (const size_t nChoices : {1u, 2u, 3u, 62u, 127u, 128u, 129u, 255u, 256u}) {
        SCOPED_TRACE(nChoices);
        const size_t nTimes = 256 / nChoices;
        ScriptedSource source(allBytes());
        std::string strOut = "replaced";

        EXPECT_EQ(0, source.getString(allBytes().substr(0, nChoices),
                                      static_cast<unsigned int>(nTimes * nChoices), strOut));

        EXPECT_EQ(0u, source.left());
        ASSERT_EQ(nTimes * nChoices, strOut.size());
        std::map<char, size_t> counts;
        for (const char c : strOut) {
            ++counts[c];
        }
        EXPECT_EQ(nChoices, counts.size());
        for (const auto& count : counts) {
            EXPECT_EQ(nTimes, count.second);
        }
    }
}

TEST(RandomString, RefusesAlphabetsOfNoneAndTooMany)
{
    for (const size_t nChoices : {0u, 257u, 10000u}) {
        SCOPED_TRACE(nChoices);
        ScriptedSource source(allBytes());
        std::string strOut = "before";
        errno = 0;
        EXPECT_EQ(-1, source.getString(std::string(nChoices, 'x'), 10, strOut));
        EXPECT_EQ(EINVAL, errno);
        EXPECT_EQ("before", strOut);
        EXPECT_EQ(256u, source.left());
    }
}

TEST(RandomString, MayBeOfAnyLength)
{
    for (const unsigned int nLength : {0u, 1u, 255u, 256u, 257u, 512u, 1000u}) {
        SCOPED_TRACE(nLength);
        ScriptedSource source(std::string(nLength, '\1'));
        std::string strOut = "replaced";
        EXPECT_EQ(0, source.getString("ab", nLength, strOut));
        EXPECT_EQ(std::string(nLength, 'b'), strOut);
    }
}

TEST(RandomString, IsUnchangedWhenItsSourceFails)
{
    for (const size_t cbServed : {0u, 256u, 999u}) {
        SCOPED_TRACE(cbServed);
        ScriptedSource source(std::string(cbServed, '\1'));
        std::string strOut = "before";
        errno = 0;
        EXPECT_EQ(-1, source.getString("ab", 1000, strOut));
        EXPECT_EQ(EIO, errno);
        EXPECT_EQ("before", strOut);
    }
}

// The kernel's random source

// What one call of getrandom does: a number of bytes, or an errno when it fails.
struct Read {
    ssize_t cbGot;
    int nErrno;
};

class KernelRandom : public SeamTest {
protected:
    // Answers in turn, and never after the last; the bytes served count up from 0.
    static void script(const std::vector<Read>& reads)
    {
        seam().random = [reads, nCall = size_t(0), nByte = 0](void* pBuffer, size_t cbBuffer,
                                                              unsigned int nFlags) mutable -> ssize_t {
            EXPECT_EQ(0u, nFlags);
            EXPECT_GT(reads.size(), nCall) << "one call too many";
            const Read read = nCall < reads.size() ? reads[nCall] : Read{-1, ENOTSUP};
            ++nCall;
            if (0 > read.cbGot) {
                errno = read.nErrno;
                return -1;
            }
            EXPECT_GE(cbBuffer, static_cast<size_t>(read.cbGot));
            for (ssize_t i = 0; i < read.cbGot; ++i) {
                static_cast<unsigned char*>(pBuffer)[i] = static_cast<unsigned char>(nByte++);
            }
            return read.cbGot;
        };
    }
};

TEST_F(KernelRandom, GathersShortReadsAndPassesInterruptions)
{
    const std::vector<std::vector<Read>> rows = {
        {{8, 0}},
        {{1, 0}, {7, 0}},
        {{3, 0}, {-1, EINTR}, {1, 0}, {4, 0}},
        {{-1, EINTR}, {-1, EINTR}, {8, 0}},
        {{0, 0}, {8, 0}},
        {{1, 0}, {1, 0}, {1, 0}, {1, 0}, {1, 0}, {1, 0}, {1, 0}, {1, 0}},
    };
    for (const std::vector<Read>& reads : rows) {
        SCOPED_TRACE(reads.size());
        script(reads);
        std::string strOut;
        errno = 0;
        EXPECT_EQ(0, VEMORandom().getString("abcdefgh", 8, strOut));
        EXPECT_EQ("abcdefgh", strOut);
    }
}

TEST_F(KernelRandom, FailureEndsIt)
{
    const std::vector<std::vector<Read>> rows = {
        {{-1, ENOSYS}},
        {{-1, EINTR}, {-1, ENOSYS}},
        {{7, 0}, {-1, ENOSYS}},
    };
    for (const std::vector<Read>& reads : rows) {
        SCOPED_TRACE(reads.size());
        std::string strOut = "before";

        script(reads);
        errno = 0;
        EXPECT_EQ(-1, VEMORandom().getString("abcdefgh", 8, strOut));
        EXPECT_EQ(ENOSYS, errno);
        EXPECT_EQ("before", strOut);

        script(reads);
        errno = 0;
        EXPECT_EQ(-1, VEMORandom().random(127, 255));
        EXPECT_EQ(ENOSYS, errno);
    }
}

TEST_F(KernelRandom, IsTheRealOne)
{
    VEMORandom source;
    std::string strFirst;
    std::string strSecond;

    EXPECT_EQ(0, source.getString("0123456789abcdef", 64, strFirst));
    EXPECT_EQ(0, source.getString("0123456789abcdef", 64, strSecond));

    EXPECT_EQ(64u, strFirst.size());
    EXPECT_EQ(64u, strSecond.size());
    EXPECT_NE(strFirst, strSecond);
}

} // namespace
