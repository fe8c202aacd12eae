// The stand-ins for the platform's libraries: creating files, random numbers and strings, the user database.

#include <fcntl.h>
#include <malloc.h>
#include <sys/mman.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <unistd.h>

#include <climits>
#include <cstring>
#include <filesystem>
#include <fstream>
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

using VEMO::RANDOM::VEMORandom;
using VEMO::RANDOM::VEMORandomBase;

// Creating files

class Touch : public StoreTest {
protected:
    std::string file(const std::string& strName) const { return directory() + "/" + strName; }
};

TEST_F(Touch, CreatesAnEmptyFileForItsOwnerWhateverTheUmask)
{
    for (const auto& [mask, mode] :
         {std::pair<mode_t, mode_t>{0, 0600}, {022, 0600}, {077, 0600}, {0277, 0400}}) {
        SCOPED_TRACE(mask);
        const std::string strPath = file(std::to_string(mask));
        const mode_t maskBefore = umask(mask);
        EXPECT_EQ(0, PLIBCFileTouch(strPath.c_str()));
        umask(maskBefore);
        struct stat status;
        ASSERT_EQ(0, lstat(strPath.c_str(), &status));
        EXPECT_EQ(S_IFREG | mode, status.st_mode);
        EXPECT_EQ(0, status.st_size);
    }
}

TEST_F(Touch, ClosesItsDescriptorWhichNoChildInherits)
{
    // Also when it is the first descriptor of all.
    const int nInput = dup(STDIN_FILENO);
    close(STDIN_FILENO);
    g_rgClosedFlags.clear();
    EXPECT_EQ(0, PLIBCFileTouch(file("first").c_str()));
    EXPECT_EQ((std::vector<int>{FD_CLOEXEC}), g_rgClosedFlags);
    dup2(nInput, STDIN_FILENO);
    close(nInput);
}

TEST_F(Touch, LeavesAnExistingFileUnchanged)
{
    const std::string strPath = file("old");
    std::ofstream(strPath) << "content";
    const struct timespec rgTime[2] = {{1000, 0}, {2000, 0}};
    ASSERT_EQ(0, utimensat(AT_FDCWD, strPath.c_str(), rgTime, 0));
    ASSERT_EQ(0, chmod(strPath.c_str(), 0444));
    ASSERT_EQ(0, symlink(strPath.c_str(), file("link").c_str()));
    EXPECT_EQ(0, PLIBCFileTouch(strPath.c_str()));
    EXPECT_EQ(0, PLIBCFileTouch(file("link").c_str()));
    EXPECT_TRUE(std::filesystem::is_symlink(file("link")));
    struct stat after;
    ASSERT_EQ(0, stat(strPath.c_str(), &after));
    EXPECT_EQ(S_IFREG | 0444u, after.st_mode);
    EXPECT_EQ(2000, after.st_mtime);
    std::string strContent;
    std::ifstream(strPath) >> strContent;
    EXPECT_EQ("content", strContent);
}

TEST_F(Touch, FailsWhereNoFileCanBeMade)
{
    std::ofstream{file("plain")};
    ASSERT_EQ(0, symlink("loop", file("loop").c_str()));
    ASSERT_EQ(0, symlink(file("target").c_str(), file("dangling").c_str()));
    const std::pair<std::string, int> rows[] = {
        {file("missing/new"), ENOENT}, {"", ENOENT},
        {file("dangling"), ENOENT},    {file("plain/new"), ENOTDIR},
        {file("loop"), ELOOP},         {file(std::string(NAME_MAX + 1, 'x')), ENAMETOOLONG},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(row.first);
        EXPECT_EQ(-1, PLIBCFileTouch(row.first.c_str()));
        EXPECT_EQ(row.second, errno);
    }
    EXPECT_FALSE(std::filesystem::exists(file("missing")) || std::filesystem::exists(file("target")));

    // Without a free descriptor it fails although the file exists.
    struct rlimit before = {};
    ASSERT_EQ(0, getrlimit(RLIMIT_NOFILE, &before));
    const struct rlimit none = {0, before.rlim_max};
    ASSERT_EQ(0, setrlimit(RLIMIT_NOFILE, &none));
    EXPECT_EQ(-1, PLIBCFileTouch(file("plain").c_str()));
    EXPECT_EQ(EMFILE, errno);
    EXPECT_EQ(0, setrlimit(RLIMIT_NOFILE, &before));
}

// Random numbers and strings

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
    // This many times, 129 numbers fit into 64 bits. Greater draws would favour some, and are drawn again.
    const uint64_t nLimit = UINT64_MAX / 129 * 129;
    const auto gives = [&](int nMin, int nMax, const std::vector<uint64_t>& draws, int nExpected) {
        SCOPED_TRACE(draws.front());
        ScriptedSource source(draws);
        EXPECT_EQ(nExpected, source.random(nMin, nMax));
        EXPECT_EQ(0u, source.left());
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

TEST(RandomNumber, FailsForWrongBoundsAndWhenItsSourceFails)
{
    for (const auto& [nMin, nMax] :
         {std::pair<int, int>{-1, 5}, {6, 5}, {-2, -1}, {INT_MIN, INT_MAX}, {INT_MAX, 0}}) {
        SCOPED_TRACE(nMin);
        ScriptedSource source(std::vector<uint64_t>{1});
        errno = 0;
        EXPECT_EQ(-1, source.random(nMin, nMax));
        EXPECT_EQ(EINVAL, errno);
        EXPECT_EQ(sizeof(uint64_t), source.left());
    }
    for (const std::vector<uint64_t>& draws : {std::vector<uint64_t>{}, std::vector<uint64_t>{UINT64_MAX}}) {
        errno = 0;
        EXPECT_EQ(-1, ScriptedSource(draws).random(127, 255));
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

TEST(RandomString, MayBeOfAnyLength)
{
    for (const unsigned int nLength : {0u, 1u, 255u, 256u, 257u, 512u, 1000u}) {
        SCOPED_TRACE(nLength);
        std::string strOut = "replaced";
        EXPECT_EQ(0, ScriptedSource(std::string(nLength, '\1')).getString("ab", nLength, strOut));
        EXPECT_EQ(std::string(nLength, 'b'), strOut);
    }
}

TEST(RandomString, FailsForWrongAlphabetsAndWhenItsSourceFails)
{
    const struct {
        size_t nChoices, cbServed;
        int nErrno;
        size_t cbLeft;
    } rows[] = {{0, 256, EINVAL, 256}, {257, 256, EINVAL, 256}, {10000, 256, EINVAL, 256},
                {2, 0, EIO, 0},        {2, 256, EIO, 0},        {2, 999, EIO, 231}};
    for (const auto& row : rows) {
        SCOPED_TRACE(::testing::Message() << row.nChoices << " " << row.cbServed);
        ScriptedSource source(std::string(row.cbServed, '\1'));
        std::string strOut = "before";
        errno = 0;
        EXPECT_EQ(-1, source.getString(std::string(row.nChoices, 'x'), 1000, strOut));
        EXPECT_EQ(row.nErrno, errno);
        EXPECT_EQ("before", strOut);
        EXPECT_EQ(row.cbLeft, source.left());
    }
}

class KernelRandom : public SeamTest {};

TEST_F(KernelRandom, JoinsShortReadsAndStopsAtAFailure)
{
    // What the calls of getrandom give: numbers of bytes, which count up from 0, or -errno.
    const struct {
        std::vector<int> reads;
        int nErrno; // of the failure; 0: there are eight bytes in the end
    } rows[] = {
        {{8}, 0},    {{1, 7}, 0},         {{3, -EINTR, 1, 4}, 0},      {{-EINTR, -EINTR, 8}, 0},
        {{0, 8}, 0}, {{-ENOSYS}, ENOSYS}, {{-EINTR, -ENOSYS}, ENOSYS}, {{7, -ENOSYS}, ENOSYS},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(::testing::PrintToString(row.reads));
        seam().random = [&, nCall = size_t(0), nByte = 0](void* pBuffer, size_t cbBuffer,
                                                          unsigned int nFlags) mutable {
            const int nRead = row.reads.at(nCall++); // throws at one call too many
            EXPECT_EQ(0u, nFlags);
            EXPECT_LE(nRead, static_cast<int>(cbBuffer));
            for (int i = 0; i < nRead; ++i) {
                static_cast<unsigned char*>(pBuffer)[i] = static_cast<unsigned char>(nByte++);
            }
            errno = 0 > nRead ? -nRead : 0;
            return static_cast<ssize_t>(0 > nRead ? -1 : nRead);
        };
        std::string strOut = "before";
        EXPECT_EQ(row.nErrno ? -1 : 0, VEMORandom().getString("abcdefgh", 8, strOut));
        EXPECT_EQ(row.nErrno ? "before" : "abcdefgh", strOut);
        EXPECT_EQ(row.nErrno, errno);
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
    seam().fail("operator new[]", 0, 2, 2);
    EXPECT_EQ(-1, VEMOUserGetByUID(1026, &m_pUser)); // there is no memory for the copy
    EXPECT_EQ(ENOMEM, errno);
    EXPECT_EQ(nullptr, m_pUser);
    seam().calls.clear();
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
    for (const int nAllocation : {1, 2}) {
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
