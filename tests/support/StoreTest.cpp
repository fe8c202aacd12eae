#include "StoreTest.h"

#include <sys/wait.h>
#include <unistd.h>

#include <cstdlib>
#include <filesystem>

#include "AccessTokenUtil.h"
#include "internal/ErrnoKeeper.h"

namespace {

bool g_blStdout = true; // where the library logs to

int appendRow(void* pRows, int nColumns, char** szValues, char**)
{
    Texts columns;
    for (int i = 0; i < nColumns; ++i) {
        columns.push_back(szValues[i] ? szValues[i] : "NULL");
    }
    static_cast<Texts*>(pRows)->push_back(joined(columns, "|"));
    return 0;
}

// The switches of the library stay on for the life of a process.
class OneTestPerProcess : public ::testing::EmptyTestEventListener {
    void OnTestIterationStart(const ::testing::UnitTest& unitTest, int) override
    {
        if (1 < unitTest.test_to_run_count()) {
            fprintf(stderr, "Each test runs in a process of its own: use ctest, or --gtest_filter "
                            "with the name of one test.\n");
            exit(2);
        }
    }
};

} // namespace

// Runs a test twice: with the log in the system log, in a child, and then with the log on standard output.
int main(int nArguments, char** szArguments)
{
    ::testing::InitGoogleTest(&nArguments, szArguments);
    ::testing::UnitTest::GetInstance()->listeners().Append(new OneTestPerProcess);
    if (!::testing::GTEST_FLAG(list_tests)) {
        const pid_t pid = fork();
        int nStatus = -1;
        g_blStdout = 0 != pid;
        if (g_blStdout && (pid != waitpid(pid, &nStatus, 0) || 0 != nStatus)) {
            return EXIT_FAILURE;
        }
    }
    return RUN_ALL_TESTS();
}

void SeamTest::SetUp()
{
    VEMO_ACCESS_TOKEN::logToStdout(m_blStdout && g_blStdout);
    reset();
}

void SeamTest::TearDown()
{
    EXPECT_EQ(Texts{}, takeLines()) << "the test does not expect these lines";
}

void SeamTest::reset()
{
    seam() = Seam();
    seam().clock = NOW;
    errno = 0;
}

void StoreTest::SetUp()
{
    std::string strTemplate = (std::filesystem::temp_directory_path() / "vemo-test-XXXXXX").string();
    ASSERT_NE(nullptr, mkdtemp(strTemplate.data())) << strerror(errno);
    m_strDirectory = strTemplate;
    setenv("VEMO_REDIRECT_DIR", m_strDirectory.c_str(), 1);
    SeamTest::SetUp();
}

void StoreTest::TearDown()
{
    if (!m_strDirectory.empty()) {
        std::filesystem::remove_all(m_strDirectory);
    }
    SeamTest::TearDown();
}

Texts StoreTest::query(const std::string& strSql) const
{
    const VEMO_ACCESS_TOKEN::ErrnoKeeper keeper;
    sqlite3* pDb = nullptr;
    EXPECT_EQ(SQLITE_OK, sqlite3_open(path().c_str(), &pDb));
    Texts rows;
    char* szError = nullptr;
    EXPECT_EQ(SQLITE_OK, sqlite3_exec(pDb, strSql.c_str(), appendRow, &rows, &szError)) << szError;
    sqlite3_free(szError);
    sqlite3_close(pDb);
    return rows;
}

void TableTest::SetUp()
{
    StoreTest::SetUp();
    makeTable();
    m_api.emplace();
    reset();
}
