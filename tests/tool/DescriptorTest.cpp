#include "tools/Descriptor.h"

#include <gtest/gtest.h>
#include <unistd.h>

namespace {

struct stat statusOfFile(dev_t nDevice, ino_t nFile)
{
    struct stat status = {};
    status.st_dev = nDevice;
    status.st_ino = nFile;
    return status;
}

struct stat statusOfDirectory(uid_t uid, mode_t mode)
{
    struct stat status = {};
    status.st_uid = uid;
    status.st_mode = S_IFDIR | mode;
    return status;
}

} // namespace

TEST(IsSame, ComparesFileSystemAndNumber)
{
    EXPECT_TRUE(tool::isSame(statusOfFile(1, 2), statusOfFile(1, 2)));
    EXPECT_FALSE(tool::isSame(statusOfFile(1, 2), statusOfFile(1, 3)));
    EXPECT_FALSE(tool::isSame(statusOfFile(1, 2), statusOfFile(3, 2)));
}

TEST(CanOthersWrite, TrustsDirectoriesOfRootAndOfTheCaller)
{
    const uid_t uidBefore = geteuid();
    if (0 == uidBefore) {
        ASSERT_EQ(0, seteuid(1));
    }
    for (const uid_t uid : {uid_t{0}, geteuid()}) {
        EXPECT_FALSE(tool::canOthersWrite(statusOfDirectory(uid, 0711)));
        EXPECT_TRUE(tool::canOthersWrite(statusOfDirectory(uid, 0720)));
        EXPECT_TRUE(tool::canOthersWrite(statusOfDirectory(uid, 0702)));
    }
    EXPECT_TRUE(tool::canOthersWrite(statusOfDirectory(geteuid() + 1, 0700)));
    EXPECT_EQ(0, seteuid(uidBefore));
}
