// The fixtures that most tests share.

#ifndef TESTS_STORE_TEST_H
#define TESTS_STORE_TEST_H

#include <gtest/gtest.h>

#include "Texts.h"

// The calls whose order the design fixes around the opening of the database.
const Texts OPENING_CALLS = {"geteuid",      "seteuid",      "access",          "open",         "chmod",
                             "sqlite3_open", "sqlite3_exec", "sqlite3_changes", "sqlite3_close"};

// Tests that need no database: errno is 0, the seam is clean and the library logs to the destination.
// (Logging to standard output, once on, stays on.)
class SeamTest : public ::testing::Test {
protected:
    explicit SeamTest(Destination destination = Destination::Stdout) : m_destination(destination) {}
    void SetUp() override;

    Destination destination() const { return m_destination; }

private:
    const Destination m_destination;
};

// Tests with a database of their own in a fresh directory, which the library takes for the real one.
class StoreTest : public SeamTest {
protected:
    using SeamTest::SeamTest;
    void SetUp() override;
    void TearDown() override;

    const std::string& directory() const { return m_strDirectory; }
    std::string path() const { return m_strDirectory + "/vemo-access-token.db"; }

    // Runs SQL over a connection of the test's own and returns the rows, their columns joined by
    // '|'; NULL reads "NULL".
    Texts query(const std::string& strSql) const;

    // The count of a token in the table, "" when it is not there.
    std::string countOf(const std::string& strTid) const;

    // Makes the database with its table, as the library would have.
    void makeDatabase() const;

    // Writes a row; values in SQL, in the columns' order.
    void insert(const std::string& strTid, const std::string& strValues) const;

private:
    std::string m_strDirectory;
};

#endif
