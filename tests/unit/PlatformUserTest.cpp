// The stand-in for the platform's user database.

#include <sys/mman.h>
#include <unistd.h>

#include <cstring>

#include "StoreTest.h"
#include "vemouser.h"

namespace {

// Nothing can be read behind its end.
char* const g_szName = [] {
    const size_t cbPage = static_cast<size_t>(sysconf(_SC_PAGESIZE));
    char* const pPages = static_cast<char*>(
        mmap(nullptr, 2 * cbPage, PROT_READ | PROT_WRITE, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0));
    mprotect(pPages + cbPage, cbPage, PROT_NONE);
    return strcpy(pPages + cbPage - sizeof("alice"), "alice");
}();

int findAlice(uid_t, struct passwd* pEntry, char*, size_t, struct passwd** ppEntry)
{
    pEntry->pw_name = g_szName;
    *ppEntry = pEntry;
    return 0;
}

class User : public SeamTest {
protected:
    void TearDown() override { VEMOUserFree(m_pUser); }

    // Answers without a user.
    static void script(int nError)
    {
        seam().getUser = [nError](uid_t, struct passwd*, char*, size_t, struct passwd** ppEntry) {
            *ppEntry = nullptr;
            return nError;
        };
    }

    VEMOUser* m_pUser = nullptr;
};

TEST_F(User, IsFoundWithANameOfItsOwn)
{
    seam().getUser = findAlice;

    EXPECT_EQ(0, VEMOUserGetByUID(4294967294u, &m_pUser));

    g_szName[0] = 'A';
    EXPECT_EQ((Texts{"getpwuid_r 4294967294"}), seam().callsOf({"getpwuid_r"}));
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

    EXPECT_EQ(0, VEMOUserGetByUID(0, &m_pUser));

    ASSERT_NE(nullptr, m_pUser);
    EXPECT_EQ(strRoot, m_pUser->szName);
}

TEST_F(User, WhoIsNotFoundIsAFailure)
{
    for (const int nError : {0, ENOENT, ESRCH, EIO, EMFILE}) {
        SCOPED_TRACE(nError);
        script(nError);
        errno = 0;
        EXPECT_EQ(-1, VEMOUserGetByUID(1026, &m_pUser));
        EXPECT_EQ(0 == nError ? ENOENT : nError, errno);
        EXPECT_EQ(nullptr, m_pUser);
    }
}

TEST_F(User, WithALongEntryIsAskedForWithALargerBuffer)
{
    std::vector<size_t> sizes;
    seam().getUser = [&sizes](uid_t, struct passwd* pEntry, char* szBuffer, size_t cbBuffer,
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
    for (const int nAllocation : {1, 2}) {
        SCOPED_TRACE(nAllocation);
        seam().counts.clear();
        seam().fail("operator new[]", 0, nAllocation, nAllocation);

        EXPECT_EQ(-1, VEMOUserGetByUID(1026, &m_pUser));

        EXPECT_EQ(ENOMEM, errno);
        EXPECT_EQ(nullptr, m_pUser);
    }
}

TEST_F(User, FoundUserNeedsMemoryToo)
{
    seam().getUser = findAlice;
    seam().fail("operator new[]", 0, 2, 2);

    EXPECT_EQ(-1, VEMOUserGetByUID(1026, &m_pUser));

    EXPECT_EQ(ENOMEM, errno);
    EXPECT_EQ(nullptr, m_pUser);
}

TEST_F(User, NoneIsReleasedAsWell)
{
    VEMOUserFree(nullptr);
}

} // namespace
