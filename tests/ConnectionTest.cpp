// Opening and closing the database, running statements, waiting for locks, purging.

#include <sys/stat.h>

#include "AccessTokenUtil.h"
#include "StoreTest.h"
#include "internal/AccessTokenDbApi.h"

namespace {

const char* const FILE_NAME = "AccessTokenSqlite.cpp";
const std::string SCHEMA =
    "PRAGMA auto_vacuum = FULL; CREATE TABLE if not exists token (tid TEXT primary key NOT NULL,"
    "bind_sid TEXT,uid INTEGER,deadline INTEGER default -1,count INTEGER default 1,"
    "create_time INTEGER default CURRENT_TIMESTAMP,function TEXT NOT NULL,webapi_allow TEXT,extra TEXT);";

class Connection : public StoreTest {};

TEST_F(Connection, CreatesFileAndTableOnFirstUse)
{
    AccessTokenDbApi db;

    EXPECT_EQ(0, db.initDb());

    EXPECT_EQ((std::vector<std::string>{"geteuid", "seteuid 0", "access " VEMO_ATOKEN_DB_PATH,
                                        "open " VEMO_ATOKEN_DB_PATH, "chmod " VEMO_ATOKEN_DB_PATH " 0700",
                                        "sqlite3_open " VEMO_ATOKEN_DB_PATH, "sqlite3_exec " + SCHEMA,
                                        "sqlite3_changes", "seteuid 0"}),
              seam().callsOf(OPENING_CALLS));
    struct stat status;
    ASSERT_EQ(0, stat(path().c_str(), &status));
    EXPECT_EQ(0700u, status.st_mode & 07777);
    EXPECT_EQ((std::vector<std::string>{"1"}), query("PRAGMA auto_vacuum"));
    EXPECT_EQ((std::vector<std::string>{}), takeLines());
}

TEST_F(Connection, RefusedUidIsLoggedAndPutBack)
{
    seam().fail("seteuid", EPERM);
    AccessTokenDbApi db;

    EXPECT_EQ(-1, db.initDb());

    EXPECT_EQ((std::vector<std::string>{"geteuid", "seteuid 0", "seteuid 0"}), seam().callsOf(OPENING_CALLS));
    EXPECT_EQ((std::vector<std::string>{failed(FILE_NAME, "0 > seteuid(0)", EPERM)}), takeLines());
}

} // namespace
