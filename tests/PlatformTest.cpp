// The stand-ins for the platform's libraries.

#include <dlfcn.h>
#include <fcntl.h>
#include <pwd.h>
#include <sys/random.h>
#include <sys/stat.h>
#include <unistd.h>

#include <climits>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <functional>
#include <map>
#include <new>

#include "StoreTest.h"

namespace {

std::function<ssize_t(void*, size_t, unsigned int)> g_getRandom;
std::function<int(uid_t, struct passwd*, char*, size_t, struct passwd**)> g_getUser;

} // namespace

// The sources themselves, over system calls that the tests script: linked in as they are, they would
// call the seam, which only answers the shared object.
#define getrandom g_getRandom
#define getpwuid_r g_getUser
#include "vemorandom.cpp"
#include "vemouser.cpp"
#undef getrandom
#undef getpwuid_r

#include "plibc.h"

namespace {

bool g_blAllocationFails = false;
std::vector<int> g_rgClosedFlags; // the descriptor flags of what was closed

} // namespace

extern "C" int close(int nFile)
{
    g_rgClosedFlags.push_back(fcntl(nFile, F_GETFD));
    return reinterpret_cast<int (*)(int)>(dlsym(RTLD_NEXT, "close"))(nFile);
}

void* operator new[](std::size_t cbSize, const std::nothrow_t&) noexcept
{
    return g_blAllocationFails ? nullptr : ::operator new[](cbSize);
}

namespace {

using VEMO::RANDOM::VEMORandom;
using VEMO::RANDOM::VEMORandomBase;

// Touching files

class Touch : public StoreTest {
protected:
    void SetUp() override
    {
        StoreTest::SetUp();
        m_maskBefore = umask(0);
    }

    void TearDown() override
    {
        umask(m_maskBefore);
        StoreTest::TearDown();
    }

    std::string file(const std::string& strName) const { return directory() + "/" + strName; }

    static void write(const std::string& strPath, const std::string& strText)
    {
        std::ofstream(strPath) << strText;
    }

    static std::string read(const std::string& strPath)
    {
        std::ifstream stream(strPath);
        return std::string(std::istreambuf_iterator<char>(stream), {});
    }

private:
    mode_t m_maskBefore = 0;
};

TEST_F(Touch, CreatesAnEmptyFileForItsOwnerWhateverTheUmask)
{
    const struct {
        mode_t mask;
        mode_t mode;
    } rows[] = {{0, 0600}, {022, 0600}, {077, 0600}, {0277, 0400}};
    for (const auto& row : rows) {
        SCOPED_TRACE(row.mask);
        const std::string strPath = file(std::to_string(row.mask));
        umask(row.mask);

        EXPECT_EQ(0, PLIBCFileTouch(strPath.c_str()));

        struct stat status;
        ASSERT_EQ(0, lstat(strPath.c_str(), &status));
        EXPECT_TRUE(S_ISREG(status.st_mode));
        EXPECT_EQ(row.mode, status.st_mode & 07777);
        EXPECT_EQ(0, status.st_size);
    }
}

TEST_F(Touch, ClosesItsDescriptorWhichNoChildInherits)
{
    const std::string strPath = file("new");
    g_rgClosedFlags.clear();

    EXPECT_EQ(0, PLIBCFileTouch(strPath.c_str()));
    EXPECT_EQ(0, PLIBCFileTouch(strPath.c_str()));

    EXPECT_EQ((std::vector<int>{FD_CLOEXEC}), g_rgClosedFlags);
}

TEST_F(Touch, LeavesAFileAlone)
{
    const std::string strPath = file("old");
    write(strPath, "content");
    const struct timespec rgTime[2] = {{1000, 0}, {2000, 0}};
    ASSERT_EQ(0, utimensat(AT_FDCWD, strPath.c_str(), rgTime, 0));
    ASSERT_EQ(0, chmod(strPath.c_str(), 0444));
    struct stat before;
    ASSERT_EQ(0, stat(strPath.c_str(), &before));

    EXPECT_EQ(0, PLIBCFileTouch(strPath.c_str()));

    struct stat after;
    ASSERT_EQ(0, stat(strPath.c_str(), &after));
    EXPECT_EQ(before.st_ino, after.st_ino);
    EXPECT_EQ(before.st_mode, after.st_mode);
    EXPECT_EQ(2000, after.st_mtime);
    EXPECT_EQ(before.st_ctime, after.st_ctime);
    EXPECT_EQ("content", read(strPath));
}

TEST_F(Touch, AcceptsALinkToAFile)
{
    write(file("target"), "content");
    ASSERT_EQ(0, symlink(file("target").c_str(), file("link").c_str()));

    EXPECT_EQ(0, PLIBCFileTouch(file("link").c_str()));

    EXPECT_TRUE(std::filesystem::is_symlink(file("link")));
    EXPECT_EQ("content", read(file("target")));
}

TEST_F(Touch, CreatesNothingThroughADanglingLink)
{
    ASSERT_EQ(0, symlink(file("target").c_str(), file("link").c_str()));

    EXPECT_EQ(-1, PLIBCFileTouch(file("link").c_str()));

    EXPECT_EQ(ENOENT, errno);
    EXPECT_FALSE(std::filesystem::exists(file("target")));
    EXPECT_TRUE(std::filesystem::is_symlink(file("link")));
}

TEST_F(Touch, FailsWhereNoFileCanBe)
{
    write(file("plain"), "");
    ASSERT_EQ(0, symlink("loop", file("loop").c_str()));
    const std::pair<std::string, int> rows[] = {
        {file("missing/new"), ENOENT},
        {"", ENOENT},
        {file("plain/new"), ENOTDIR},
        {file("loop"), ELOOP},
        {file(std::string(NAME_MAX + 1, 'x')), ENAMETOOLONG},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(row.first);
        errno = 0;
        EXPECT_EQ(-1, PLIBCFileTouch(row.first.c_str()));
        EXPECT_EQ(row.second, errno);
    }
    EXPECT_FALSE(std::filesystem::exists(file("missing")));
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
    int fill(void* pBuffer, size_t cbBuffer) override
    {
        if (m_strBytes.size() < cbBuffer) {
            errno = EIO;
            return -1;
        }
        memcpy(pBuffer, m_strBytes.data(), cbBuffer);
        m_strBytes.erase(0, cbBuffer);
        return 0;
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

// What one call of getrandom does: a positive number of bytes, or an errno when it fails.
struct Answer {
    ssize_t cbGot;
    int nErrno;
};

class KernelRandom : public ::testing::Test {
protected:
    // Answers in turn, and never after the last; the bytes served count up from 0.
    static void script(const std::vector<Answer>& answers)
    {
        g_getRandom = [answers, nCall = size_t(0), nByte = 0](void* pBuffer, size_t cbBuffer,
                                                              unsigned int nFlags) mutable -> ssize_t {
            EXPECT_EQ(0u, nFlags);
            EXPECT_GT(answers.size(), nCall) << "one call too many";
            const Answer answer = nCall < answers.size() ? answers[nCall] : Answer{-1, ENOTSUP};
            ++nCall;
            if (0 > answer.cbGot) {
                errno = answer.nErrno;
                return -1;
            }
            EXPECT_GE(cbBuffer, static_cast<size_t>(answer.cbGot));
            for (ssize_t i = 0; i < answer.cbGot; ++i) {
                static_cast<unsigned char*>(pBuffer)[i] = static_cast<unsigned char>(nByte++);
            }
            return answer.cbGot;
        };
    }
};

TEST_F(KernelRandom, GathersShortReadsAndPassesInterruptions)
{
    const std::vector<std::vector<Answer>> rows = {
        {{8, 0}},
        {{1, 0}, {7, 0}},
        {{3, 0}, {-1, EINTR}, {1, 0}, {4, 0}},
        {{-1, EINTR}, {-1, EINTR}, {8, 0}},
        {{1, 0}, {1, 0}, {1, 0}, {1, 0}, {1, 0}, {1, 0}, {1, 0}, {1, 0}},
    };
    for (const std::vector<Answer>& answers : rows) {
        SCOPED_TRACE(answers.size());
        script(answers);
        std::string strOut;
        EXPECT_EQ(0, VEMORandom().getString("abcdefgh", 8, strOut));
        EXPECT_EQ("abcdefgh", strOut);
    }
}

TEST_F(KernelRandom, FailureEndsIt)
{
    const std::vector<std::vector<Answer>> rows = {
        {{-1, ENOSYS}},
        {{-1, EINTR}, {-1, ENOSYS}},
        {{7, 0}, {-1, ENOSYS}},
    };
    for (const std::vector<Answer>& answers : rows) {
        SCOPED_TRACE(answers.size());
        std::string strOut = "before";

        script(answers);
        errno = 0;
        EXPECT_EQ(-1, VEMORandom().getString("abcdefgh", 8, strOut));
        EXPECT_EQ(ENOSYS, errno);
        EXPECT_EQ("before", strOut);

        script(answers);
        errno = 0;
        EXPECT_EQ(-1, VEMORandom().random(127, 255));
        EXPECT_EQ(ENOSYS, errno);
    }
}

TEST_F(KernelRandom, IsTheRealOne)
{
    g_getRandom = getrandom;
    VEMORandom source;
    std::string strFirst;
    std::string strSecond;

    EXPECT_EQ(0, source.getString("0123456789abcdef", 64, strFirst));
    EXPECT_EQ(0, source.getString("0123456789abcdef", 64, strSecond));

    EXPECT_EQ(64u, strFirst.size());
    EXPECT_EQ(64u, strSecond.size());
    EXPECT_NE(strFirst, strSecond);
}

// Users

class User : public ::testing::Test {
protected:
    void TearDown() override { VEMOUserFree(m_pUser); }

    // Answers without a user.
    static void script(int nError)
    {
        g_getUser = [nError](uid_t, struct passwd*, char*, size_t, struct passwd** ppEntry) {
            *ppEntry = nullptr;
            return nError;
        };
    }

    VEMOUser* m_pUser = nullptr;
};

TEST_F(User, IsFoundWithANameOfItsOwn)
{
    static char szName[] = "alice";
    g_getUser = [](uid_t uid, struct passwd* pEntry, char*, size_t, struct passwd** ppEntry) {
        EXPECT_EQ(4294967294u, uid);
        pEntry->pw_name = szName;
        *ppEntry = pEntry;
        return 0;
    };

    EXPECT_EQ(0, VEMOUserGetByUID(4294967294u, &m_pUser));

    szName[0] = 'A';
    ASSERT_NE(nullptr, m_pUser);
    EXPECT_STREQ("alice", m_pUser->szName);
}

TEST_F(User, IsFoundInTheRealDatabase)
{
    const struct passwd* const pRoot = getpwuid(0);
    if (!pRoot) {
        GTEST_SKIP() << "this system has no user with uid 0";
    }
    const std::string strRoot = pRoot->pw_name;
    g_getUser = getpwuid_r;

    EXPECT_EQ(0, VEMOUserGetByUID(0, &m_pUser));

    ASSERT_NE(nullptr, m_pUser);
    EXPECT_EQ(strRoot, m_pUser->szName);
}

TEST_F(User, WhoDoesNotExistIsNoFailure)
{
    for (const int nError : {0, ENOENT, ESRCH}) {
        SCOPED_TRACE(nError);
        script(nError);
        EXPECT_EQ(0, VEMOUserGetByUID(1026, &m_pUser));
        EXPECT_EQ(nullptr, m_pUser);
    }
}

TEST_F(User, UnreadableDatabaseIsAFailure)
{
    for (const int nError : {EIO, EMFILE, ENFILE, ENOMEM}) {
        SCOPED_TRACE(nError);
        script(nError);
        errno = 0;
        EXPECT_EQ(-1, VEMOUserGetByUID(1026, &m_pUser));
        EXPECT_EQ(nError, errno);
        EXPECT_EQ(nullptr, m_pUser);
    }
}

TEST_F(User, WithALongEntryIsAskedForWithALargerBuffer)
{
    std::vector<size_t> sizes;
    g_getUser = [&sizes](uid_t, struct passwd* pEntry, char* szBuffer, size_t cbBuffer,
                         struct passwd** ppEntry) {
        sizes.push_back(cbBuffer);
        *ppEntry = nullptr;
        if (100000 > cbBuffer) {
            return ERANGE;
        }
        memset(szBuffer, 'n', 99999);
        szBuffer[99999] = '\0';
        pEntry->pw_name = szBuffer;
        *ppEntry = pEntry;
        return 0;
    };

    EXPECT_EQ(0, VEMOUserGetByUID(1026, &m_pUser));

    ASSERT_NE(nullptr, m_pUser);
    EXPECT_EQ(std::string(99999, 'n'), m_pUser->szName);
    EXPECT_EQ((std::vector<size_t>{1024, 2048, 4096, 8192, 16384, 32768, 65536, 131072}), sizes);
}

TEST_F(User, LookupFailsWithoutMemory)
{
    script(ERANGE);
    g_blAllocationFails = true;
    errno = 0;

    EXPECT_EQ(-1, VEMOUserGetByUID(1026, &m_pUser));

    g_blAllocationFails = false;
    EXPECT_EQ(ENOMEM, errno);
    EXPECT_EQ(nullptr, m_pUser);
}

TEST_F(User, NoneIsReleasedAsWell)
{
    VEMOUserFree(nullptr);
}

} // namespace
