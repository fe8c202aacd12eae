// The operations of the store that take filters.

#ifndef TESTS_QUERY_TEST_H
#define TESTS_QUERY_TEST_H

#include <cerrno>

#include "StoreTest.h"
#include "internal/AccessTokenDbApi.h"

const std::string RUN_QUERY_FAILED = "0 > runSql(FillList, &jTokenArrayOut)";
const std::string RUN_DELETE_FAILED = "0 > (err = runSql())";
const std::string WHERE_FAILED = "0 > SqlWhereFromJson(jTokenParam, strSql, true)";

// A store, with three tokens when a test asks for them.
class QueryTest : public StoreTest {
protected:
    using StoreTest::StoreTest;

    // Three tokens: Ab12 and Cd34 of user 1024, Ef56 of user 7.
    void fill() const
    {
        makeDatabase();
        query("DELETE FROM token");
        insert("Ab12", "'S1',1024,4000000000,1,100,'VPN','{}','{\"a\":\"it''s\"}'");
        insert("Cd34", "'S2',1024,4000000000,-1,300,'VPN','{\"api\":{\"method\":[\"get\"]}}','{}'");
        insert("Ef56", "'S1',7,4000000000,5,200,'FTP','{}','{}'");
    }

    // The operations, given their filter as text.
    int get(const std::string& strFilter) { return get(strFilter, m_jOut = Json::Value()); }
    int get(const std::string& strFilter, Json::Value& jOut)
    {
        return keeps(strFilter, [&](Json::Value& jFilter) { return m_db.tokenGet(jFilter, jOut); });
    }
    int remove(const std::string& strFilter, bool bAll = false)
    {
        return keeps(strFilter, [&](Json::Value& jFilter) { return m_db.tokenDelete(jFilter, bAll); });
    }
    int getOne(const char* szName, std::string strValue)
    {
        const std::string strCopy = strValue;
        m_jOut = json(R"({"old":1})");
        errno = m_nErrno;
        const int nResult = m_db.tokenGetOne(szName, strValue, m_jOut);
        EXPECT_EQ(strCopy, strValue);
        return nResult;
    }

    // The ids in m_jOut, and those in the table, each followed by a blank.
    std::string found() const
    {
        std::string strIds;
        for (const Json::Value& jToken : m_jOut) {
            strIds += jToken["tid"].asString() + " ";
        }
        return strIds;
    }
    std::string left() const
    {
        std::string strIds;
        for (const std::string& strTid : query("SELECT tid FROM token ORDER BY rowid")) {
            strIds += strTid + " ";
        }
        return strIds;
    }

    // The lines of a statement that SQLite refuses.
    Texts refused(const std::string& strError, const std::string& strSql, const std::string& strCondition)
    {
        return failureOf(strSql, strError, m_nErrno) + Texts{failed(STORE, strCondition, m_nErrno)};
    }

    AccessTokenDbApi m_db;
    Json::Value m_jOut;
    int m_nErrno = 0; // what an operation finds in errno

private:
    template <typename Operation>
    int keeps(const std::string& strFilter, Operation operation)
    {
        Json::Value jFilter = json(strFilter);
        errno = m_nErrno;
        const int nResult = operation(jFilter);
        EXPECT_EQ(json(strFilter), jFilter);
        return nResult;
    }
};

#endif
