// The stand-in for the platform's core library: creating files.

#include <fcntl.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <unistd.h>

#include <climits>
#include <filesystem>
#include <fstream>

#include "StandIns.h"
#include "StoreTest.h"
#include "plibc.h"

namespace {

std::vector<int> g_rgClosedFlags; // the descriptor flags of what was closed

} // namespace

extern "C" int close(int nFile)
{
    g_rgClosedFlags.push_back(fcntl(nFile, F_GETFD));
    return next<int(int)>("close")(nFile);
}

namespace {

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

    // Nor when that is the first one of all.
    const int nInput = dup(STDIN_FILENO);
    close(STDIN_FILENO);
    g_rgClosedFlags.clear();
    EXPECT_EQ(0, PLIBCFileTouch(file("first").c_str()));
    EXPECT_EQ((std::vector<int>{FD_CLOEXEC}), g_rgClosedFlags);
    dup2(nInput, STDIN_FILENO);
    close(nInput);
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

TEST_F(Touch, FailsWithoutADescriptorThoughTheFileIsThere)
{
    write(file("old"), "");
    struct rlimit before = {};
    ASSERT_EQ(0, getrlimit(RLIMIT_NOFILE, &before));
    const struct rlimit none = {0, before.rlim_max};
    ASSERT_EQ(0, setrlimit(RLIMIT_NOFILE, &none));

    EXPECT_EQ(-1, PLIBCFileTouch(file("old").c_str()));

    EXPECT_EQ(EMFILE, errno);
    EXPECT_EQ(0, setrlimit(RLIMIT_NOFILE, &before));
}

} // namespace
