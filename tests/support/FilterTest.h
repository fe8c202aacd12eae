// The builders that make SQL of filters.

#ifndef TESTS_FILTER_TEST_H
#define TESTS_FILTER_TEST_H

#include <cerrno>

#include "AccessTokenUtil.h"
#include "StoreTest.h"
#include "internal/AccessTokenDbApi.h"

// The builders of WHERE clauses, whose text is appended to m_strOut. A builder changes nothing else.
class FilterTest : public SeamTest {
protected:
    using SeamTest::SeamTest;

    int where(const std::string& strFilter, bool bAnd = true)
    {
        return builds(json(strFilter),
                      [&](Json::Value& jFilter) { return m_db.SqlWhereFromJson(jFilter, m_strOut, bAnd); });
    }
    int match(const std::string& strName, const Json::Value& jParam)
    {
        return builds(jParam, [&](Json::Value& jCopy) {
            std::string strField = strName;
            const int nResult = m_db.SqlMakeByMatchField(strField, jCopy, m_strOut);
            EXPECT_EQ(strName, strField);
            return nResult;
        });
    }
    int list(const char* szField, const Json::Value& jList)
    {
        return builds(jList,
                      [&](Json::Value& jCopy) { return m_db.SqlMakeByListField(szField, jCopy, m_strOut); });
    }
    int condition(const Json::Value& jFilter)
    {
        return builds(jFilter,
                      [&](Json::Value& jCopy) { return m_db.SqlFilterConditionFromJson(jCopy, m_strOut); });
    }

    AccessTokenDbApi m_db;
    std::string m_strOut;
    int m_nErrno = 0; // what a builder finds in errno

private:
    template <typename Builder>
    int builds(const Json::Value& jInput, Builder builder)
    {
        const Json::Value jTypes = VEMO_ACCESS_TOKEN::tokenType();
        Json::Value jCopy = jInput;
        errno = m_nErrno;
        const int nResult = builder(jCopy);
        EXPECT_EQ(jInput, jCopy);
        EXPECT_EQ(jTypes, VEMO_ACCESS_TOKEN::tokenType());
        EXPECT_EQ("", m_db.m_strSql);
        return nResult;
    }
};

#endif
