// What only root can test: the real path, owner and mode, and the real effective uid.

#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <stdexcept>

#include "Processes.h"
#include "StoreTest.h"

namespace {

const char* const TREE = "/usr/vemo";
const uid_t UID_NOBODY = 65534;

class System : public SeamTest {
protected:
    void SetUp() override
    {
        SeamTest::SetUp();
        unsetenv("VEMO_REDIRECT_DIR");
        if (0 != getuid() || 0 != geteuid()) {
            GTEST_SKIP() << "needs root";
        }
        if (std::filesystem::exists(TREE)) {
            GTEST_SKIP() << TREE << " exists: this machine's own tokens are left alone";
        }
        const std::filesystem::path directory = std::filesystem::path(VEMO_ATOKEN_DB_PATH).parent_path();
        std::filesystem::create_directories(directory);
        m_blMade = true;
        ASSERT_EQ(0, chmod(directory.c_str(), 0700));
    }

    void TearDown() override
    {
        if (m_blMade) {
            EXPECT_EQ(0, seteuid(0));
            std::filesystem::remove_all(TREE);
        }
        SeamTest::TearDown();
    }

private:
    bool m_blMade = false;
};

// This is why a process should stay at effective uid 0: SQLite opens the journal anew for each change.
TEST_F(System, OpensAsRootButCannotWriteAtAnotherEffectiveUid)
{
    Json::Value jTokens;
    Json::Value jAll(Json::objectValue);
    ASSERT_EQ(0, seteuid(UID_NOBODY));
    AccessTokenDbApi db;
    EXPECT_EQ(0, db.initDb());
    EXPECT_EQ(UID_NOBODY, geteuid());
    EXPECT_EQ(0, db.tokenGet(jAll, jTokens));
    EXPECT_EQ(-1, db.tokenDelete(jAll, true));
    EXPECT_EQ("attempt to write a readonly database", db.m_strErr);
    EXPECT_EQ(3u, takeLines().size());
    struct stat status;
    ASSERT_EQ(0, seteuid(0));
    ASSERT_EQ(0, stat(VEMO_ATOKEN_DB_PATH, &status));
    EXPECT_EQ(S_IFREG | 0700u, status.st_mode);
    EXPECT_EQ(0u, status.st_uid);
}

TEST_F(System, NeedsTheRightToBecomeRoot)
{
    EXPECT_TRUE(endsWell(startProcess([] {
        if (0 != setresuid(UID_NOBODY, UID_NOBODY, UID_NOBODY) || -1 != AccessTokenDbApi().initDb() ||
            Texts{NOT_ROOT} != takeLines()) {
            throw std::runtime_error("not refused");
        }
    })));
    EXPECT_FALSE(std::filesystem::exists(VEMO_ATOKEN_DB_PATH));
}

} // namespace
