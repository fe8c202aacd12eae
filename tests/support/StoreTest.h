// Fixtures and helpers that the tests share.

#ifndef TESTS_STORE_TEST_H
#define TESTS_STORE_TEST_H

#include <gtest/gtest.h>
#include <json/json.h>

#include <string>
#include <vector>

#include "Seam.h"

// The calls whose order the design fixes around the opening of the database.
const std::vector<std::string> OPENING_CALLS = {"geteuid",      "seteuid",         "access",
                                                "open",         "chmod",           "sqlite3_open",
                                                "sqlite3_exec", "sqlite3_changes", "sqlite3_close"};

const char* const FIELD_LIST = "include/internal/vemo-access-token-data-member";
const char* const COLUMNS = "tid,bind_sid,uid,deadline,count,create_time,function,webapi_allow,extra";

// JSON text as a value; the text is well-formed.
Json::Value json(const std::string& strText);

// A token id of 127 characters that starts with strStart.
std::string tid(const std::string& strStart = "");

// The texts of log lines, location prefix included, as LogLine holds them. szFile is a source file
// ("util.cpp"), for which the line reads '#', or the field list with its line ("FIELD_LIST:14").
// An ordinary line as it reaches standard output:
std::string ordinary(const std::string& strFile, const std::string& strMessage);
// and the system log while errno is nErrno:
std::string ordinary(const std::string& strFile, const std::string& strMessage, int nErrno);
// A failure line with a message of its own, on standard output while errno is nErrno,
std::string fail(const std::string& strFile, const std::string& strMessage, int nErrno = 0);
// and the failure line of a condition.
std::string failed(const std::string& strFile, const std::string& strCondition, int nErrno = 0);

// The texts logged since the last call, and the same with their destinations checked.
std::vector<std::string> takeLines();
std::vector<std::string> takeLines(Destination destination);

// Tests that need no database: errno is 0 and the clean seam logs to standard output.
class SeamTest : public ::testing::Test {
protected:
    void SetUp() override;
};

// Tests with a database of their own in a fresh directory, which the library takes for the real one.
class StoreTest : public SeamTest {
protected:
    void SetUp() override;
    void TearDown() override;

    const std::string& directory() const { return m_strDirectory; }
    std::string path() const { return m_strDirectory + "/vemo-access-token.db"; }

    // Runs SQL over a connection of the test's own and returns the rows, their columns joined by
    // '|'; NULL reads "NULL".
    std::vector<std::string> query(const std::string& strSql) const;

    // Makes the database with its table, as the library would have.
    void makeDatabase() const;

    // Writes a row; values in SQL, in the columns' order.
    void insert(const std::string& strTid, const std::string& strValues) const;

private:
    std::string m_strDirectory;
};

#endif
