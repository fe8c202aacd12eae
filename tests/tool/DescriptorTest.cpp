#include "tools/Descriptor.h"

#include <gtest/gtest.h>
#include <unistd.h>

namespace {

struct stat statusOf(dev_t nDevice, ino_t nFile, uid_t uid = 0, mode_t mode = 0)
{
    struct stat status = {};
    status.st_dev = nDevice;
    status.st_ino = nFile;
    status.st_uid = uid;
    status.st_mode = S_IFDIR | mode;
    return status;
}

} // namespace

TEST(IsSame, ComparesFileSystemAndNumber)
{
    EXPECT_TRUE(tool::isSame(statusOf(1, 2), statusOf(1, 2)));
    EXPECT_FALSE(tool::isSame(statusOf(1, 2), statusOf(1, 3)));
    EXPECT_FALSE(tool::isSame(statusOf(1, 2), statusOf(3, 2)));
}

TEST(CanOthersWrite, TrustsDirectoriesOfRootAndOfTheCaller)
{
    const uid_t uidBefore = geteuid();
    if (0 == uidBefore) {
        ASSERT_EQ(0, seteuid(1));
    }
    for (const uid_t uid : {uid_t{0}, geteuid()}) {
        EXPECT_FALSE(tool::canOthersWrite(statusOf(1, 2, uid, 0711)));
        EXPECT_TRUE(tool::canOthersWrite(statusOf(1, 2, uid, 0720)));
        EXPECT_TRUE(tool::canOthersWrite(statusOf(1, 2, uid, 0702)));
    }
    EXPECT_TRUE(tool::canOthersWrite(statusOf(1, 2, geteuid() + 1, 0700)));
    EXPECT_EQ(0, seteuid(uidBefore));
}
