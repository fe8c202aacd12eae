// What deletions by value refuse. The test of the model shows what is deleted.

#include "AccessTokenUtil.h"
#include "StoreTest.h"

namespace {

const std::string ARRAY_FAILED = "0 > (err = tokenDeleteByArray(strVector, szName))";
const std::string NO_STRING = "jType[szName][0].asString() != \"string\"";

std::string arraySummary(const std::string& strName, const std::string& strList)
{
    return ordinary(SERVICE, "tokenDeleteByArray failed, name=" + strName + ", strVector=" + strList);
}

std::string nameSummary(const std::string& strName, const std::string& strValue)
{
    return ordinary(SERVICE, "tokenDeleteByName failed, name=" + strName + ", strValue=" + strValue);
}

class Deletion : public TableTest {
protected:
    int byName(std::string strValue, const char* szName) { return api().tokenDeleteByName(strValue, szName); }
    int byArray(Texts values, const char* szName) { return api().tokenDeleteByArray(values, szName); }
};

TEST_F(Deletion, RefusesListsValuesAndNames)
{
    const std::string strField = "!jType.isMember(szName)";
    const std::string strNoName = "!szName || !szName[0]";
    const auto refuses = [](int nResult, const std::string& strCondition, const std::string& strSummary) {
        EXPECT_EQ(-1, nResult);
        EXPECT_LINES(failed(SERVICE, strCondition, EACCES), strSummary);
    };
    errno = EACCES;
    refuses(byArray({}, nullptr), "0 >= strVector.size()", arraySummary("(null)", ""));
    refuses(byArray({"a", "b", "c"}, nullptr), strNoName, arraySummary("(null)", "a,b,c"));
    refuses(byArray({"a", "b", "c"}, ""), strNoName, arraySummary("", "a,b,c"));
    refuses(byArray({"a"}, "x"), strField, arraySummary("x", "a"));
    refuses(byArray({"1000", "1001"}, "uid"), NO_STRING, arraySummary("uid", "1000,1001"));
    refuses(byArray({"a,b", "%s%n"}, "create_time"), NO_STRING, arraySummary("create_time", "a,b,%s%n"));
    refuses(byName("", nullptr), "strValue.empty()", nameSummary("(null)", ""));
    refuses(byName("a", nullptr), strNoName, nameSummary("(null)", "a"));
    refuses(byName("a", ""), strNoName, nameSummary("", "a"));
    refuses(byName("a", "x"), strField, nameSummary("x", "a"));
    // tokenDeleteByName leaves the check of the type to tokenDeleteByArray, and both log.
    EXPECT_FAILURE(byName("1000", "uid"), failed(SERVICE, NO_STRING, EACCES), arraySummary("uid", "1000"),
                   failed(SERVICE, ARRAY_FAILED, EACCES), nameSummary("uid", "1000"));
    EXPECT_EQ(Texts{}, seam().statements());
    // The present table of types decides.
    VEMO_ACCESS_TOKEN::tokenType()["uid"][0] = "string";
    EXPECT_EQ(0, byName("1000", "uid"));
}

} // namespace
