// The order and the paging that filters ask for, as SQL.

#include <limits>

#include "FilterTest.h"

namespace {

class FilterPaging : public FilterTest {};

TEST_F(FilterPaging, SortsByATextAndInOneOfTwoDirections)
{
    const std::pair<const char*, const char*> rows[] = {
        {R"({"sort_by":"create_time"})", " order by 'create_time'"},
        {R"({"sort_by":"create_time","sort_direction":"desc"})", " order by 'create_time' DESC"},
        {R"({"sort_by":"uid","sort_direction":"DESC"})", " order by 'uid' ASC"},
        {R"({"sort_direction":"desc"})", ""},
        {R"({"limit":0,"offset":0})", " LIMIT  OFFSET "},
        {R"({"limit":1})", "LIMIT "},
        {R"({"offset":3})", ""},
        {"{}", ""},
        {R"({"tid":"a","foo":1})", ""},
        {R"({"sort_by":"uid","sort_direction":"asc"})", " order by 'uid' ASC"},
        {R"({"sort_by":"uid","sort_direction":"Desc"})", " order by 'uid' ASC"},
        {R"({"sort_by":"uid","sort_direction":"desc "})", " order by 'uid' ASC"},
        {R"({"sort_by":"uid","sort_direction":"desc\u0000"})", " order by 'uid' ASC"},
        {R"({"sort_by":"uid","sort_direction":""})", " order by 'uid' ASC"},
        {R"({"sort_by":"uid","sort_direction":null})", " order by 'uid' ASC"},
        {R"({"sort_by":"uid","sort_direction":1})", " order by 'uid' ASC"},
        {R"({"sort_by":""})", " order by ''"},
        {R"({"sort_by":"no such column"})", " order by 'no such column'"},
        {R"({"sort_by":"x'; DROP TABLE token; --"})", " order by 'x''; DROP TABLE token; --'"},
        {R"({"sort_by":"%s%n%q"})", " order by '%s%n%q'"},
        {R"({"sort_by":"a\u0000b"})", " order by 'a'"},
        {R"({"sort_by":"uid","sort_direction":"desc","limit":0,"offset":1})",
         " order by 'uid' DESC LIMIT OFFSET "},
        {R"({"sort_by":"uid","limit":7})", " order by 'uid'"},
        // What is not read does not matter.
        {R"({"sort_direction":{},"offset":"x"})", ""},
    };

    for (const auto& [szFilter, szAppended] : rows) {
        for (const std::string strBefore : {"", "held"}) {
            SCOPED_TRACE(szFilter);
            m_strOut = strBefore;
            EXPECT_EQ(0, condition(json(szFilter)));
            EXPECT_EQ(strBefore + szAppended, m_strOut);
        }
    }
    EXPECT_EQ(Texts{}, takeLines());
}

TEST_F(FilterPaging, WritesTheKeywordsTailThatTheNumberPointsTo)
{
    const Json::Int64 nMin = std::numeric_limits<Json::Int64>::min();
    const Json::Int64 nMax = std::numeric_limits<Json::Int64>::max();
    const Json::Int64 n2To32 = Json::Int64(1) << 32;
    const struct {
        Json::Value jNumber;
        const char *szLimit, *szOffset;
    } rows[] = {
        {0, " LIMIT ", " OFFSET "},
        {1, "LIMIT ", "OFFSET "},
        {2, "IMIT ", "FFSET "},
        {3, "MIT ", "FSET "},
        {4, "IT ", "SET "},
        {5, "T ", "ET "},
        {6, " ", "T "},
        {7, "", " "},
        {8, "", ""},
        {9, "", ""},
        {16, "", ""},
        {1000000, "", ""},
        {-1, "", ""},
        {-7, "", ""},
        {n2To32 / 2, "", ""},
        {n2To32 - 1, "", ""},
        {n2To32, " LIMIT ", " OFFSET "},
        {n2To32 + 1, "LIMIT ", "OFFSET "},
        {n2To32 + 7, "", " "},
        {-n2To32, " LIMIT ", " OFFSET "},
        {6 - n2To32, " ", "T "},
        {nMax, "", ""},
        {nMin, " LIMIT ", " OFFSET "},
        {nMin + 5, "T ", "ET "},
        {Json::UInt64(nMax), "", ""},
        {3U, "MIT ", "FSET "},
        // Read as a number; a fraction is cut off.
        {Json::nullValue, " LIMIT ", " OFFSET "},
        {false, " LIMIT ", " OFFSET "},
        {true, "LIMIT ", "OFFSET "},
        {1.9, "LIMIT ", "OFFSET "},
        {-0.9, " LIMIT ", " OFFSET "},
    };

    for (const auto& row : rows) {
        SCOPED_TRACE(row.jNumber.asString());
        Json::Value jFilter;
        jFilter["limit"] = row.jNumber;
        m_strOut = "held";
        EXPECT_EQ(0, condition(jFilter));
        EXPECT_EQ(std::string("held") + row.szLimit, m_strOut);

        jFilter["limit"] = 8;
        jFilter["offset"] = row.jNumber;
        m_strOut.clear();
        EXPECT_EQ(0, condition(jFilter));
        EXPECT_EQ(row.szOffset, m_strOut);
    }
    EXPECT_EQ(Texts{}, takeLines());
}

TEST_F(FilterPaging, LetsTheJsonLibraryRefuseValuesOfUnsuitableType)
{
    for (const char* szFilter :
         {R"({"sort_by":5})", R"({"sort_by":null})", R"({"sort_by":[]})", R"({"sort_by":{}})",
          R"({"sort_by":"uid","sort_direction":[]})", R"({"sort_by":"uid","sort_direction":{}})",
          R"({"limit":"5"})", R"({"limit":[]})", R"({"limit":{}})", R"({"limit":1e30})",
          R"({"limit":18446744073709551615})", R"({"limit":0,"offset":"5"})", R"({"limit":0,"offset":[]})",
          R"({"limit":9,"offset":{}})", R"({"limit":0,"offset":-1e30})"}) {
        SCOPED_TRACE(szFilter);
        EXPECT_THROW(condition(json(szFilter)), Json::Exception);
    }
    EXPECT_EQ(Texts{}, takeLines());
}

TEST_F(FilterPaging, ReportsLackOfMemoryForTheColumn)
{
    for (const int nErrno : {0, ENOMEM}) {
        m_strOut = "held";
        seam().counts.clear();
        seam().fail("sqlite3_mprintf", nErrno);
        EXPECT_EQ(-1, condition(json(R"({"sort_by":"uid","sort_direction":"desc","limit":0})")));
        EXPECT_EQ("held", m_strOut);
        EXPECT_EQ((Texts{failed(STORE, "!szSql", nErrno)}), takeLines());
    }
}

} // namespace
