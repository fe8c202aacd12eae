#include "StoreTest.h"

#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <memory>

#include "AccessTokenUtil.h"

namespace {

// "util.cpp" stands for all its lines; the field list's are told.
std::string location(const std::string& strFile)
{
    return std::string::npos == strFile.find(':') ? strFile + ":#" : strFile;
}

std::string failureMessage(const std::string& strFile, const std::string& strMessage, int nErrno)
{
    return "(" + location(strFile) + ")(" + strerror(nErrno) + ")" + strMessage + "\n";
}

int appendRow(void* pRows, int nColumns, char** szValues, char**)
{
    std::string strRow;
    for (int i = 0; i < nColumns; ++i) {
        strRow.append(0 == i ? "" : "|").append(szValues[i] ? szValues[i] : "NULL");
    }
    static_cast<std::vector<std::string>*>(pRows)->push_back(strRow);
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

int main(int nArguments, char** szArguments)
{
    ::testing::InitGoogleTest(&nArguments, szArguments);
    ::testing::UnitTest::GetInstance()->listeners().Append(new OneTestPerProcess);
    return RUN_ALL_TESTS();
}

Json::Value json(const std::string& strText)
{
    const std::unique_ptr<Json::CharReader> pReader(Json::CharReaderBuilder().newCharReader());
    Json::Value jValue;
    std::string strErrors;
    EXPECT_TRUE(pReader->parse(strText.data(), strText.data() + strText.size(), &jValue, &strErrors))
        << strErrors;
    return jValue;
}

std::string tid(const std::string& strStart)
{
    std::string strTid = strStart;
    strTid.resize(127, 'x');
    return strTid;
}

std::string ordinary(const std::string& strFile, const std::string& strMessage)
{
    return location(strFile) + " " + strMessage + "\n";
}

std::string ordinary(const std::string& strFile, const std::string& strMessage, int nErrno)
{
    const std::string strPrefix = 0 == nErrno ? "" : std::string("(") + strerror(nErrno) + ")";
    return ordinary(strFile, strPrefix + strMessage);
}

std::string fail(const std::string& strFile, const std::string& strMessage, int nErrno)
{
    return ordinary(strFile, failureMessage(strFile, strMessage, nErrno));
}

std::string failed(const std::string& strFile, const std::string& strCondition, int nErrno)
{
    return fail(strFile, "Failed [" + strCondition + "], err=" + strerror(nErrno), nErrno);
}

std::vector<std::string> takeLines()
{
    std::vector<std::string> texts;
    for (const LogLine& line : seam().lines) {
        texts.push_back(line.strText);
    }
    seam().lines.clear();
    return texts;
}

std::vector<std::string> takeLines(Destination destination)
{
    for (const LogLine& line : seam().lines) {
        EXPECT_EQ(destination, line.destination) << line.strText;
    }
    return takeLines();
}

void SeamTest::SetUp()
{
    VEMO_ACCESS_TOKEN::logToStdout(true);
    seam() = Seam();
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
}

std::vector<std::string> StoreTest::query(const std::string& strSql) const
{
    sqlite3* pDb = nullptr;
    EXPECT_EQ(SQLITE_OK, sqlite3_open(path().c_str(), &pDb));
    std::vector<std::string> rows;
    char* szError = nullptr;
    EXPECT_EQ(SQLITE_OK, sqlite3_exec(pDb, strSql.c_str(), appendRow, &rows, &szError)) << szError;
    sqlite3_free(szError);
    sqlite3_close(pDb);
    return rows;
}

void StoreTest::makeDatabase() const
{
    query("PRAGMA auto_vacuum = FULL; CREATE TABLE if not exists token (tid TEXT primary key NOT NULL,"
          "bind_sid TEXT,uid INTEGER,deadline INTEGER default -1,count INTEGER default 1,"
          "create_time INTEGER default CURRENT_TIMESTAMP,function TEXT NOT NULL,webapi_allow TEXT,"
          "extra TEXT);");
}

void StoreTest::insert(const std::string& strTid, const std::string& strValues) const
{
    query("INSERT INTO token VALUES ('" + strTid + "'," + strValues + ")");
}
