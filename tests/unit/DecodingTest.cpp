// Rows of the database as records.

#include <climits>
#include <new>

#include "AccessTokenUtil.h"
#include "StoreTest.h"

using VEMO_ACCESS_TOKEN::tokenType;

namespace {

const std::string FIELD_FAILED = "0 > (iTmp = FillField(*pjToken, column_name, column_value, i))";
const std::string TOKEN_FAILED = "0 > FillToken(&jTmp, n_column, column_value, column_name)";
const std::string NULL_ROW = "NULL == column_name || NULL == column_value";
const std::string NULL_COLUMN = "NULL == column_name[i] || NULL == column_value[i]";
const std::string NO_FIELD = "!jTokenType.isMember(strName)";
const std::string WRONG_ARRAY = "pjTokenArray->type() != Json::arrayValue && "
                                "pjTokenArray->type() != Json::nullValue";

int g_nAllocationThatFails = 0; // 1 is the next one; 0: none
bool g_blJsoncppThrows = false; // jsoncpp throws its own exception, as it does where it calls malloc

void allocate()
{
    if (0 < g_nAllocationThatFails && 0 == --g_nAllocationThatFails) {
        errno = ENOMEM;
        if (g_blJsoncppThrows) {
            throw Json::RuntimeError("no memory");
        }
        throw std::bad_alloc();
    }
}

// What is logged when a column of a row is refused.
Texts columnLines(const std::string& strLine, int nErrno = 0)
{
    return Texts{strLine} + allFailed(STORE, {FIELD_FAILED, TOKEN_FAILED}, nErrno);
}

// Names and texts, as many as the row has columns.
struct Row {
    std::vector<const char*> names;
    std::vector<const char*> values;
};

// The decoder that the library passes to SQLite. A row that is refused leaves the array unchanged.
class Decoding : public TableTest {
protected:
    void SetUp() override
    {
        TableTest::SetUp();
        seam().sqliteExec = [&](sqlite3*, const char*, SqlCallback pCallback, void*, char**) {
            m_pDecoder = pCallback;
            return SQLITE_OK;
        };
        Json::Value jAll(Json::objectValue);
        EXPECT_EQ(0, m_db.tokenGet(jAll, m_jArray));
        reset();
    }

    int decode(const Row& row)
    {
        return m_pDecoder(&m_jArray, static_cast<int>(row.names.size()),
                          const_cast<char**>(row.values.data()), const_cast<char**>(row.names.data()));
    }

    // The member that is made from one column.
    Json::Value member(const char* szName, const std::string& strValue)
    {
        m_jArray = Json::Value();
        EXPECT_EQ(0, decode({{szName}, {strValue.c_str()}}));
        EXPECT_EQ(1u, m_jArray.size());
        EXPECT_EQ((Texts{szName}), m_jArray[0].getMemberNames());
        return m_jArray[0][szName];
    }

    void expectRefused(const Row& row, const Texts& lines)
    {
        m_jArray = Json::Value();
        EXPECT_NO_THROW(EXPECT_EQ(-1, decode(row)));
        EXPECT_LINES(lines);
        EXPECT_TRUE(m_jArray.isNull());
    }

    // Decodes the rows of a query.
    int run(const std::string& strSql)
    {
        m_db.m_strSql = strSql;
        return m_db.runSql(m_pDecoder, &m_jArray);
    }

    // The log lines of a query that ends at a refused row.
    Texts queryLines(const Texts& linesOfRow) const
    {
        return linesOfRow + failureOf(m_db.m_strSql, "query aborted");
    }

    SqlCallback m_pDecoder = nullptr;
    Json::Value m_jArray;
};

TEST_F(Decoding, ReadsNumbersLeniently)
{
    tokenType()["small"] = json("[\"int\",0]");
    // An int is the low half of what strtol reads.
    const auto reads = [&](const Texts& texts, Json::Int64 nLongLong, Json::Int nInt) {
        for (const std::string& strText : texts) {
            SCOPED_TRACE(strText);
            for (const char* szField : {"uid", "deadline", "count", "create_time"}) {
                EXPECT_EQ(Json::Value(nLongLong), member(szField, strText));
            }
            EXPECT_EQ(Json::Value(nInt), member("small", strText));
        }
    };
    reads({"0", "", "abc", "-", "0x10"}, 0, 0);
    reads({"1", "1e3", "1.9", "01"}, 1, 1);
    reads({"1026", "+1026", "1026abc"}, 1026, 1026);
    reads({"-5", " \t\n -5"}, -5, -5);
    reads({"2026-01-02 13:00:00"}, 2026, 2026);
    reads({"2147483647"}, INT_MAX, INT_MAX);
    reads({"2147483648"}, 2147483648LL, INT_MIN);
    reads({"4294967295"}, 4294967295LL, -1);
    reads({"9223372036854775807", "9223372036854775808"}, INT64_MAX, -1);
    reads({"-9223372036854775808", "-99999999999999999999"}, INT64_MIN, 0);
    // The table of types is read for each row.
    tokenType()["deadline"][0] = "int";
    EXPECT_EQ(Json::Value(0), member("deadline", "4294967296"));
    tokenType()["deadline"][0] = "string";
    EXPECT_EQ(Json::Value("-1"), member("deadline", "-1"));
}

// The text decides the type of the member, not the type name. Of bad JSON, the part before the error is kept.
TEST_F(Decoding, ParsesJsonOfAnyKind)
{
    tokenType()["any"] = json(R"(["Json::Value",0])");
    tokenType()["list"] = json(R"(["Json::arrayValue",0])");
    const auto reads = [&](const char* szText, const char* szRead) {
        SCOPED_TRACE(szText);
        for (const char* szField : {"any", "list", "webapi_allow", "extra"}) {
            EXPECT_EQ(json(szRead), member(szField, szText));
        }
    };
    for (const char* szText :
         {"{}", "[]", "null", "true", "-1", "9223372036854775807", "18446744073709551615", "0.1", R"("")",
          R"("a\"\u0001")", R"([1,[2,{"a":{}}]])", " {\"Api\" : [ ] }\n"}) {
        reads(szText, szText);
    }
    for (const char* szText : {"", " ", "nonsense", "'single'", "\"open"}) {
        reads(szText, "null");
    }
    reads("{", "{}");
    reads(R"({"a":1)", R"({"a":1})");
    reads(R"({"a":1,"b":x})", R"({"a":1,"b":null})");
    reads("[1,2", "[1,2]");
    reads(R"({"a":1} and more)", R"({"a":1})");
    reads("2026-01-02", "2026");
    const Json::Value jExtra = member("extra", "// a comment\n{\"a\":1}");
    EXPECT_EQ(json(R"({"a":1})"), jExtra);
    EXPECT_FALSE(jExtra.hasComment(Json::commentBefore));
}

TEST_F(Decoding, NeverThrowsOnDeepNesting)
{
    const auto nested = [](size_t nLevels) { return std::string(nLevels, '[') + std::string(nLevels, ']'); };
    EXPECT_TRUE(json(nested(1000)) == member("extra", nested(1000)));
    const std::string strLeft = std::string(1000, '[') + "null" + std::string(1000, ']'); // what was read
    EXPECT_EQ(strLeft, text(member("extra", nested(1001))));
    EXPECT_EQ(strLeft, text(member("extra", std::string(100000, '['))));
    EXPECT_EQ(json("{\"a\":1}"), member("extra", "{\"a\":1}")) << "the reader works as before";
}

TEST_F(Decoding, RefusesUnknownTypeNames)
{
    for (const Json::Value& jType : json(R"(["bool", "string ", "%s%n", "", "json::value", 5, null])")) {
        const std::string strType = jType.asString();
        SCOPED_TRACE(strType);
        tokenType()["odd"][0] = jType;
        errno = EACCES;
        expectRefused({{"odd"}, {"1"}},
                      columnLines(fail(STORE, "type error, strType=" + strType, EACCES), EACCES));
    }
}

// SQLite is written in C: no exception may pass through it. And when an allocation fails, the reader may call
// a long number invalid; so the library reads it twice.
TEST_F(Decoding, YieldsTheWholeRecordOrNoneWhenAnAllocationFails)
{
    const std::string strExtra =
        R"({"a":[1,{"b":0.12345678901234567,"c":")" + std::string(100, 'x') + "\"}]}";
    const Row row = {{"deadline", "extra"}, {"-1", strExtra.c_str()}};
    for (const std::string strError : {"std::bad_alloc", "no memory"}) {
        g_blJsoncppThrows = "no memory" == strError;
        bool blFailed = true;
        for (int nAllocation = 1; blFailed; ++nAllocation) {
            SCOPED_TRACE(nAllocation);
            m_jArray = Json::Value();
            g_nAllocationThatFails = nAllocation;
            g_pAllocation = allocate;
            errno = 0;
            const int nResult = decode(row);
            g_pAllocation = nullptr;
            blFailed = 0 == g_nAllocationThatFails;
            const bool blWhole = 0 == nResult;
            ASSERT_EQ(blWhole ? 0 : -1, nResult);
            ASSERT_EQ(blWhole ? json(strExtra) : Json::Value(), m_jArray.get(0U, Json::Value())["extra"]);
            ASSERT_EQ(blWhole ? Texts{} : Texts{fail(STORE, "decode row failed, error=" + strError, ENOMEM)},
                      takeLines());
        }
    }
}

TEST_F(Decoding, RefusesColumnsThatAreNotFields)
{
    for (const char* szName : {"nonsense", "", "TID"}) {
        SCOPED_TRACE(szName);
        expectRefused({{"tid", szName}, {"a", "1"}}, columnLines(failed(STORE, NO_FIELD)));
    }
    insert();
    EXPECT_FAILURE(run("SELECT count(*) FROM token"), queryLines(columnLines(failed(STORE, NO_FIELD))));
    EXPECT_EQ(0, run("SELECT tid, uid + 1 AS uid, bind_sid AS count FROM token"));
    EXPECT_EQ(json(R"([{"tid":"t","uid":1001,"count":0}])"), m_jArray);
}

TEST_F(Decoding, RefusesNullPointers)
{
    char* pointers[] = {nullptr};
    for (const int nColumns : {1, 0, -1}) {
        EXPECT_FAILURE(m_pDecoder(&m_jArray, nColumns, pointers, nullptr),
                       allFailed(STORE, {NULL_ROW, TOKEN_FAILED}));
        EXPECT_FAILURE(m_pDecoder(&m_jArray, nColumns, nullptr, pointers),
                       allFailed(STORE, {NULL_ROW, TOKEN_FAILED}));
        EXPECT_FAILURE(m_pDecoder(nullptr, nColumns, nullptr, nullptr), failed(STORE, "!pjTokenArray"));
    }
    for (const Row& row :
         {Row{{"tid"}, {nullptr}},
          {{nullptr}, {"a"}},
          {{"tid", "uid"}, {"a", nullptr}},
          {{"extra", "uid", "nonsense"}, {"{", nullptr, "1"}}}) { // the first bad column decides
        errno = EACCES;
        expectRefused(row, allFailed(STORE, {NULL_COLUMN, TOKEN_FAILED}, EACCES));
    }
    errno = EACCES;
    expectRefused({{"tid", "nonsense", "uid"}, {"a", "1", nullptr}},
                  columnLines(failed(STORE, NO_FIELD, EACCES), EACCES));
}

TEST_F(Decoding, RefusesOutputThatIsNotAnArray)
{
    insert();
    for (const char* szOutput : {"{}", "0"}) {
        SCOPED_TRACE(szOutput);
        m_jArray = json(szOutput);
        EXPECT_FAILURE(decode({{"tid"}, {"a"}}), failed(STORE, WRONG_ARRAY));
        EXPECT_EQ(0, run("SELECT * FROM token WHERE tid = 'u'")) << "no check before the first row";
        EXPECT_FAILURE(run("SELECT * FROM token"), queryLines({failed(STORE, WRONG_ARRAY)}));
        EXPECT_EQ(json(szOutput), m_jArray);
    }
}

TEST_F(Decoding, AppendsEachRowAsAFreshRecord)
{
    char* noColumns[] = {nullptr};
    m_jArray.append("first");
    EXPECT_EQ(0, decode({{"tid", "count"}, {"a", "2"}}));
    EXPECT_EQ(0, decode({{"uid"}, {"3"}}));
    EXPECT_EQ(-1, decode({{"bind_sid", "uid"}, {"b", nullptr}}));
    EXPECT_EQ(2u, takeLines().size());
    for (const int nColumns : {0, -1, INT_MIN}) {
        EXPECT_EQ(0, m_pDecoder(&m_jArray, nColumns, noColumns, noColumns));
    }
    // A later column replaces an earlier one of the same name.
    EXPECT_EQ(0, decode({{"count", "extra", "count", "extra"}, {"1", R"({"a":[1]})", "2", "{"}}));
    EXPECT_EQ(0, decode({{"extra", "extra"}, {"{}", ""}}));
    EXPECT_EQ(
        json(R"(["first",{"tid":"a","count":2},{"uid":3},{},{},{},{"count":2,"extra":{}},{"extra":null}])"),
        m_jArray);
}

// The library decodes a row of all fields in a faster way. The result must be the same.
TEST_F(Decoding, TreatsARowOfAllFieldsLikeAnyOther)
{
    Row row;
    for (const Field& field : fields()) {
        row.names.push_back(field.szName);
    }
    row.values = {"1", "2", "3", "4", "5", "6", "7", "8", "9"};
    const Row reversed = {{row.names.rbegin(), row.names.rend()}, {row.values.rbegin(), row.values.rend()}};
    Row more = row;
    more.names.push_back("count");
    more.values.push_back("0");
    Row unnamed = row;
    unnamed.names.back() = nullptr;

    const Json::Value jRecord = json(R"({"tid":"1","bind_sid":"2","uid":3,"deadline":4,"count":5,
                                         "create_time":6,"function":"7","webapi_allow":8,"extra":9})");
    Json::Value jExpected;
    for (int i = 0; i < 4; ++i) {
        jExpected.append(jRecord);
    }
    jExpected[2]["count"] = 0;
    jExpected[3]["extra"] = "9";
    EXPECT_EQ(0, decode(row));
    EXPECT_EQ(0, decode(reversed));
    EXPECT_EQ(0, decode(more));
    tokenType()["extra"][0] = "string";
    EXPECT_EQ(0, decode(row));
    EXPECT_EQ(jExpected, m_jArray);

    expectRefused(unnamed, allFailed(STORE, {NULL_COLUMN, TOKEN_FAILED}));
    tokenType().removeMember("extra");
    expectRefused(row, columnLines(failed(STORE, NO_FIELD)));
}

} // namespace
