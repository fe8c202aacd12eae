// The stand-ins for the platform's libraries: creating files, random numbers and strings, the user database.

#include <fcntl.h>
#include <malloc.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <climits>
#include <cstring>
#include <map>

#include "Interpose.h"
#include "StoreTest.h"
#include "plibc.h"
#include "vemorandom.h"
#include "vemouser.h"

namespace {

std::vector<int> g_rgClosedFlags; // the descriptor flags of what was closed

} // namespace

extern "C" int close(int nFile)
{
    g_rgClosedFlags.push_back(fcntl(nFile, F_GETFD));
    return NEXT(close)(nFile);
}

namespace {

class Touch : public StoreTest {};

TEST_F(Touch, MakesAnEmptyPrivateFileAndLeavesNothingOpen)
{
    const std::string strPath = directory() + "/new";
    const mode_t maskBefore = umask(0);
    const int nInput = dup(STDIN_FILENO);
    close(STDIN_FILENO); // the file gets the first descriptor of all
    g_rgClosedFlags.clear();
    EXPECT_EQ(0, PLIBCFileTouch(strPath.c_str()));
    EXPECT_EQ((std::vector<int>{FD_CLOEXEC}), g_rgClosedFlags); // no child inherits it
    dup2(nInput, STDIN_FILENO);
    close(nInput);
    umask(maskBefore);
    struct stat status;
    ASSERT_EQ(0, lstat(strPath.c_str(), &status));
    EXPECT_EQ(S_IFREG | 0600u, status.st_mode);
    EXPECT_EQ(0, status.st_size);
    EXPECT_EQ(-1, PLIBCFileTouch((strPath + "/file").c_str()));
    EXPECT_EQ(ENOTDIR, errno);
}

// Random numbers and strings

class Random : public SeamTest {
protected:
    // Before each answer, the kernel is interrupted once and gives nothing once. It gives 100 bytes at most,
    // and fails when none is left.
    void serve(const std::string& strBytes)
    {
        m_strBytes = strBytes;
        seam().random = [this, nCall = 0](void* pBuffer, size_t cbBuffer,
                                          unsigned int nFlags) mutable -> ssize_t {
            const int nStep = nCall++ % 3;
            EXPECT_EQ(0u, nFlags);
            errno = 0 == nStep ? EINTR : m_strBytes.empty() ? EIO : 0;
            if (0 != errno) {
                return -1;
            }
            const size_t cbAnswer = 1 == nStep ? 0 : std::min<size_t>(cbBuffer, 100);
            const size_t cb = m_strBytes.copy(static_cast<char*>(pBuffer), cbAnswer);
            m_strBytes.erase(0, cb);
            return static_cast<ssize_t>(cb);
        };
    }
    void serve(const std::vector<uint64_t>& draws)
    {
        serve(std::string(reinterpret_cast<const char*>(draws.data()), draws.size() * sizeof(uint64_t)));
    }

    std::string m_strBytes; // that are left
    VEMO::RANDOM::VEMORandom m_source;
};

TEST_F(Random, NumbersHaveBothBoundsAndNoBias)
{
    // This many times, 129 numbers fit into 64 bits. Greater draws would favour some, and are drawn again.
    const uint64_t nLimit = UINT64_MAX / 129 * 129;
    const auto gives = [&](int nMin, int nMax, const std::vector<uint64_t>& draws, int nExpected) {
        SCOPED_TRACE(draws.front());
        serve(draws);
        EXPECT_EQ(nExpected, m_source.random(nMin, nMax));
        EXPECT_EQ("", m_strBytes);
    };
    gives(127, 255, {0}, 127);
    gives(127, 255, {128}, 255);
    gives(127, 255, {129}, 127);
    gives(127, 255, {nLimit - 129}, 127);
    gives(127, 255, {nLimit - 1}, 255);
    gives(127, 255, {nLimit, 5}, 132);
    gives(127, 255, {UINT64_MAX, nLimit, nLimit + 1, 128}, 255);
    gives(0, 0, {12345}, 0);
    gives(INT_MAX, INT_MAX, {12345}, INT_MAX);
    gives(0, INT_MAX, {0x7fffffff}, INT_MAX);
    gives(0, INT_MAX, {0x80000000}, 0);
}

TEST_F(Random, NumbersNeedBoundsInOrderAndASource)
{
    const auto fails = [&](int nMin, int nMax, const std::vector<uint64_t>& draws, int nErrno) {
        SCOPED_TRACE(nMin);
        serve(draws);
        EXPECT_EQ(-1, m_source.random(nMin, nMax));
        EXPECT_EQ(nErrno, errno);
        EXPECT_EQ(EINVAL == nErrno, !m_strBytes.empty());
    };
    for (const auto& [nMin, nMax] :
         {std::pair<int, int>{-1, 5}, {6, 5}, {-2, -1}, {INT_MIN, INT_MAX}, {INT_MAX, 0}}) {
        fails(nMin, nMax, {1}, EINVAL);
    }
    fails(127, 255, {}, EIO);
    fails(127, 255, {UINT64_MAX}, EIO);
}

TEST_F(Random, CharactersAreEquallyLikely)
{
    std::string strAll; // all bytes, the greatest first: those without a character come before the others
    for (int i = 255; 0 <= i; --i) {
        strAll += static_cast<char>(i);
    }
    for (const size_t nChoices : {1u, 2u, 3u, 62u, 127u, 128u, 129u, 255u, 256u}) {
        SCOPED_TRACE(nChoices);
        const size_t nTimes = 256 / nChoices;
        serve(strAll);
        std::string strOut = "replaced";
        EXPECT_EQ(0, m_source.getString(strAll.substr(0, nChoices),
                                        static_cast<unsigned int>(nTimes * nChoices), strOut));
        EXPECT_EQ("", m_strBytes);
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

TEST_F(Random, StringsAreWholeOrUnchanged)
{
    const struct {
        size_t nChoices, cbServed;
        unsigned int cchLength;
        int nErrno; // of the failure
        size_t cbLeft;
    } rows[] = {{0, 256, 1000, EINVAL, 256},
                {257, 256, 1000, EINVAL, 256},
                {10000, 256, 1000, EINVAL, 256},
                {2, 0, 1000, EIO, 0},
                {2, 999, 1000, EIO, 0},
                {2, 1000, 1000, 0, 0},
                {2, 512, 512, 0, 0},
                {2, 9, 0, 0, 9}};
    for (const auto& row : rows) {
        SCOPED_TRACE(::testing::Message() << row.nChoices << " " << row.cbServed);
        serve(std::string(row.cbServed, '\1'));
        std::string strOut = "before";
        const std::string strExpected = row.nErrno ? strOut : std::string(row.cchLength, 'x');
        const int nResult = m_source.getString(std::string(row.nChoices, 'x'), row.cchLength, strOut);
        EXPECT_EQ(row.nErrno ? -1 : 0, nResult);
        EXPECT_EQ(row.nErrno, nResult ? errno : 0);
        EXPECT_EQ(strExpected, strOut);
        EXPECT_EQ(row.cbLeft, m_strBytes.size());
    }
}

// The user database

// A name at the end of a page; the memory after it cannot be read.
char* nameAtTheEndOfMemory()
{
    const size_t cbPage = static_cast<size_t>(sysconf(_SC_PAGESIZE));
    void* const pPages =
        mmap(nullptr, 2 * cbPage, PROT_READ | PROT_WRITE, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0);
    char* const pEnd = static_cast<char*>(pPages) + cbPage;
    mprotect(pEnd, cbPage, PROT_NONE);
    return strcpy(pEnd - sizeof("alice"), "alice");
}

class User : public SeamTest {
protected:
    void TearDown() override { VEMOUserFree(m_pUser); } // null where none was found

    VEMOUser* m_pUser = nullptr;
};

TEST_F(User, IsFoundWithACopyOfTheName)
{
    char* const szName = nameAtTheEndOfMemory();
    seam().getUser = [=](uid_t, struct passwd* pEntry, char*, size_t, struct passwd** ppEntry) {
        pEntry->pw_name = szName;
        *ppEntry = pEntry;
        return 0;
    };
    EXPECT_EQ(0, VEMOUserGetByUID(4294967294u, &m_pUser));
    EXPECT_EQ((Texts{"getpwuid_r 4294967294"}), seam().callsOf({"getpwuid_r"}));
    szName[0] = 'A';
    ASSERT_NE(nullptr, m_pUser);
    EXPECT_STREQ("alice", m_pUser->szName);
}

TEST_F(User, FailsForAnUnknownUser)
{
    for (const int nError : {0, ENOENT, ESRCH, EIO, EMFILE}) {
        SCOPED_TRACE(nError);
        seam().getUser = [nError](uid_t, struct passwd*, char*, size_t, struct passwd** ppEntry) {
            *ppEntry = nullptr;
            return nError;
        };
        errno = 0;
        EXPECT_EQ(-1, VEMOUserGetByUID(1026, &m_pUser));
        EXPECT_EQ(0 == nError ? ENOENT : nError, errno);
        EXPECT_EQ(nullptr, m_pUser);
    }
}

TEST_F(User, WithALongEntryNeedsALargerBuffer)
{
    mallopt(M_PERTURB, 1); // memory is not 0 at first
    std::vector<size_t> sizes;
    seam().getUser = [&](uid_t, struct passwd* pEntry, char* szBuffer, size_t cbBuffer,
                         struct passwd** ppEntry) {
        sizes.push_back(cbBuffer);
        *ppEntry = nullptr;
        if (100000 > cbBuffer) {
            return ERANGE;
        }
        pEntry->pw_name = strcpy(szBuffer, std::string(99999, 'n').c_str());
        *ppEntry = pEntry;
        return 0;
    };
    for (const int nAllocation : {1, 2, 9}) { // two of the eight for buffers, and that for the copy
        seam().counts.clear();
        seam().fail("operator new[]", 0, nAllocation, nAllocation);
        EXPECT_EQ(-1, VEMOUserGetByUID(1026, &m_pUser));
        EXPECT_EQ(ENOMEM, errno);
        EXPECT_EQ(nullptr, m_pUser);
    }
    seam().failures.clear();
    sizes.clear();
    EXPECT_EQ(0, VEMOUserGetByUID(1026, &m_pUser));
    ASSERT_NE(nullptr, m_pUser);
    EXPECT_EQ(std::string(99999, 'n'), m_pUser->szName);
    EXPECT_EQ((std::vector<size_t>{1024, 2048, 4096, 8192, 16384, 32768, 65536, 131072}), sizes);
}

} // namespace
