// Rows of the database as records, as the decoder makes them.

#include <climits>
#include <cstring>
#include <new>

#include "Decoding.h"
#include "StandIns.h"

namespace {

int g_nAllocationThatFails = 0;  // counted from now, 1 is the next; 0: none
bool g_blJsoncppTellsIt = false; // by an exception of its own, as it does where it calls malloc
Json::ValueType g_typeOfObjects = Json::objectValue;
int g_nLies = 0; // how many calls are told so, from now on

void allocate()
{
    if (0 < g_nAllocationThatFails && 0 == --g_nAllocationThatFails) {
        errno = ENOMEM;
        if (g_blJsoncppTellsIt) {
            throw Json::RuntimeError("no memory");
        }
        throw std::bad_alloc();
    }
}

} // namespace

// A fresh record is always an object; the check that it is one can only be reached by a lie.
__attribute__((visibility("default"))) Json::ValueType Json::Value::type() const
{
    static auto* const pType = next<Json::ValueType(const Json::Value*)>("_ZNK4Json5Value4typeEv");
    const Json::ValueType type = pType(this);
    if (Json::objectValue == type && 0 < g_nLies) {
        --g_nLies;
        return g_typeOfObjects;
    }
    return type;
}

namespace {

// Names and texts, as many as the row has columns.
struct Row {
    std::vector<const char*> names;
    std::vector<const char*> values;
};

const char* const NULL_ROW = "NULL == column_name || NULL == column_value";
const char* const NO_OBJECT = "jToken.type() != Json::objectValue && jToken.type() != Json::nullValue";

int decode(SqlCallback pDecoder, const Row& row, Json::Value* pjArray)
{
    return pDecoder(pjArray, static_cast<int>(row.names.size()), const_cast<char**>(row.values.data()),
                    const_cast<char**>(row.names.data()));
}

class RowDecoding : public SeamTest {
protected:
    using SeamTest::SeamTest;

    void SetUp() override
    {
        SeamTest::SetUp();
        m_pDecoder = captureDecoder();
    }

    int decode(const Row& row) { return ::decode(m_pDecoder, row, &m_jArray); }

    // The member that one column becomes.
    Json::Value member(const char* szName, const std::string& strValue)
    {
        Json::Value jArray;
        EXPECT_EQ(0, ::decode(m_pDecoder, {{szName}, {strValue.c_str()}}, &jArray));
        EXPECT_EQ(Texts{}, takeLines());
        EXPECT_EQ(1u, jArray.size());
        EXPECT_EQ((Texts{szName}), jArray[0].getMemberNames());
        return jArray[0][szName];
    }

    // A row that is refused leaves the array as it was, null.
    void expectRefused(const Row& row, const Texts& lines)
    {
        EXPECT_NO_THROW(EXPECT_EQ(-1, decode(row)));
        EXPECT_EQ(lines, takeLines());
        EXPECT_TRUE(m_jArray.isNull());
    }

    SqlCallback m_pDecoder = nullptr;
    Json::Value m_jArray;
};

TEST_F(RowDecoding, KeepsTextUnchanged)
{
    std::string strBytes;
    for (int nByte = 1; nByte < 256; ++nByte) {
        strBytes += static_cast<char>(nByte);
    }
    for (const std::string& strText : Texts{"", "  a\t\n", "12", "null", "{\"a\":1}", strBytes}) {
        SCOPED_TRACE(strText);
        for (const char* szField : {"tid", "bind_sid", "function"}) {
            EXPECT_EQ(Json::Value(strText), member(szField, strText));
        }
    }
}

TEST_F(RowDecoding, ReadsNumbersLeniently)
{
    // An int is the low half of what strtol reads.
    const struct {
        const char* szText;
        Json::Int64 nLongLong;
        Json::Int nInt;
    } cases[] = {{"0", 0, 0},
                 {"-1", -1, -1},
                 {"1026", 1026, 1026},
                 {"+7", 7, 7},
                 {" \t\n -5", -5, -5},
                 {"", 0, 0},
                 {"abc", 0, 0},
                 {"-", 0, 0},
                 {"12abc", 12, 12},
                 {"3.9", 3, 3},
                 {"1e3", 1, 1},
                 {"010", 10, 10},
                 {"0x10", 0, 0},
                 {"2026-01-02 13:00:00", 2026, 2026},
                 {"2147483647", INT_MAX, INT_MAX},
                 {"-2147483648", INT_MIN, INT_MIN},
                 {"2147483648", 2147483648LL, INT_MIN},
                 {"4294967295", 4294967295LL, -1},
                 {"9223372036854775807", INT64_MAX, -1},
                 {"-9223372036854775808", INT64_MIN, 0},
                 {"9223372036854775808", INT64_MAX, -1},
                 {"-99999999999999999999", INT64_MIN, 0}};
    addField("small", json("[\"int\",0]"));
    for (const auto& [szText, nLongLong, nInt] : cases) {
        SCOPED_TRACE(szText);
        for (const char* szField : {"uid", "deadline", "count", "create_time"}) {
            EXPECT_EQ(Json::Value(nLongLong), member(szField, szText));
        }
        EXPECT_EQ(Json::Value(nInt), member("small", szText));
    }
}

TEST_F(RowDecoding, ReadsTypeTableForEachRow)
{
    EXPECT_EQ(Json::Value(Json::Int64(4294967296LL)), member("deadline", "4294967296"));
    VEMO_ACCESS_TOKEN::tokenType()["deadline"][0] = "int";
    EXPECT_EQ(Json::Value(0), member("deadline", "4294967296"));
    EXPECT_EQ(Json::Value(-1), member("deadline", "-1"));
    VEMO_ACCESS_TOKEN::tokenType()["deadline"][0] = "string";
    EXPECT_EQ(Json::Value("-1"), member("deadline", "-1"));
}

// The text decides what the member becomes, the type name does not.
TEST_F(RowDecoding, ParsesJsonOfAnyKind)
{
    addField("any", json(R"(["Json::Value",0])"));
    addField("list", json(R"(["Json::arrayValue",0])"));
    for (const char* szText :
         {"{}", "[]", "null", "true", "-1", "9223372036854775807", "18446744073709551615", "0.1", R"("")",
          R"("a\"\u0001")", " {\"Example.Api\" : {\"method\" : [\"get\", \"list\"]}}\n",
          R"([1,[2,{"a":{}}]])"}) {
        SCOPED_TRACE(szText);
        for (const char* szField : {"any", "list", "webapi_allow", "extra"}) {
            EXPECT_EQ(json(szText), member(szField, szText));
        }
    }
}

TEST_F(RowDecoding, LeavesCommentsBehind)
{
    const Json::Value jExtra = member("extra", "// a comment\n{\"a\":1}");

    EXPECT_EQ(json(R"({"a":1})"), jExtra);
    EXPECT_FALSE(jExtra.hasComment(Json::commentBefore));
}

TEST_F(RowDecoding, KeepsWhatBadJsonLeft)
{
    const struct {
        const char* szText;
        const char* szLeft;
    } cases[] = {{"", "null"},
                 {" ", "null"},
                 {"nonsense", "null"},
                 {"'single'", "null"},
                 {"\"open", "null"},
                 {"{", "{}"},
                 {R"({"a":1)", R"({"a":1})"},
                 {R"({"a":1,"b":x})", R"({"a":1,"b":null})"},
                 {"[1,2", "[1,2]"},
                 {R"({"a":1} and more)", R"({"a":1})"},
                 {"2026-01-02", "2026"}};
    for (const auto& [szText, szLeft] : cases) {
        SCOPED_TRACE(szText);
        EXPECT_EQ(json(szLeft), member("extra", szText));
    }
}

TEST_F(RowDecoding, NeverThrowsOnDeepNesting)
{
    const auto nested = [](size_t nLevels, const char* szInnermost) {
        return std::string(nLevels, '[') + szInnermost + std::string(nLevels, ']');
    };
    EXPECT_TRUE(json(nested(1000, "")) == member("extra", nested(1000, "")));

    // What was read down to the limit stands.
    Json::Value jLeft;
    for (int nLevel = 0; nLevel < 1000; ++nLevel) {
        Json::Value jOuter;
        jOuter.append(jLeft);
        jLeft.swap(jOuter);
    }
    for (const std::string& strText : {nested(1001, ""), nested(100000, "1"), std::string(100000, '[')}) {
        EXPECT_TRUE(jLeft == member("extra", strText)) << strText.size();
    }
    EXPECT_EQ(json("{\"a\":1}"), member("extra", "{\"a\":1}")) << "the reader is as before";
}

TEST_F(RowDecoding, RefusesUnknownTypeName)
{
    const struct {
        const char* szEntry;
        const char* szType;
    } cases[] = {{R"(["bool",false])", "bool"},
                 {R"(["uid_t",0])", "uid_t"},
                 {R"(["time_t",0])", "time_t"},
                 {R"(["double"])", "double"},
                 {R"(["String"])", "String"},
                 {R"(["string "])", "string "},
                 {R"(["json::value"])", "json::value"},
                 {R"(["%s%n"])", "%s%n"},
                 {R"([""])", ""},
                 {"null", ""},
                 {"[]", ""},
                 {"[null]", ""},
                 {"[5]", "5"},
                 {"[true,\"string\"]", "true"}};
    for (const auto& [szEntry, szType] : cases) {
        SCOPED_TRACE(szEntry);
        addField("odd", json(szEntry));
        expectRefused({{"odd"}, {"1"}},
                      columnLines(fail(STORE, std::string("type error, strType=") + szType)));
    }
}

// SQLite is C and cannot be thrown through.
TEST_F(RowDecoding, TurnsExceptionsIntoFailure)
{
    for (const char* szEntry : {R"("string")", "{}", R"({"0":"string"})", "5", R"([["string"]])", "[{}]"}) {
        SCOPED_TRACE(szEntry);
        addField("odd", json(szEntry));
        expectRefused({{"count", "odd"}, {"1", "1"}},
                      {fail(STORE, "decode row failed, error=" + errorOf(json(szEntry)))});
    }
}

TEST_F(RowDecoding, TurnsEachFailedAllocationIntoFailure)
{
    const std::string strLong(1000, 'x');
    const std::string strExtra = R"({"a":[1,{"b":2.5,"c":")" + strLong + R"("}]})";
    const Row row = {{"tid", "deadline", "extra"}, {strLong.c_str(), "-1", strExtra.c_str()}};
    int nResult = -1;
    int nFailures = -1;

    while (0 > nResult) {
        SCOPED_TRACE(++nFailures);
        errno = 0;
        g_pAllocation = allocate;
        g_nAllocationThatFails = nFailures + 1;
        EXPECT_NO_THROW(nResult = decode(row));
        g_nAllocationThatFails = 0;
        if (0 > nResult) {
            ASSERT_TRUE(m_jArray.empty());
            ASSERT_EQ((Texts{fail(STORE, "decode row failed, error=std::bad_alloc", ENOMEM)}), takeLines());
        }
    }

    EXPECT_LT(3, nFailures);
    EXPECT_EQ(Texts{}, takeLines());
    ASSERT_EQ(1u, m_jArray.size());
    EXPECT_EQ(json(strExtra), m_jArray[0]["extra"]);
}

// The reader takes a long number for none when the allocation in it fails, and is asked again.
TEST_F(RowDecoding, YieldsTheWholeRecordOrNoneWhenAnAllocationFails)
{
    const std::string strExtra =
        R"({"a":[1,{"b":0.12345678901234567,"c":")" + std::string(100, 'x') + "\"}]}";
    const Row row = {{"extra"}, {strExtra.c_str()}};
    EXPECT_EQ(0, decode(row)); // makes the reader, which is kept
    for (const char* szError : {"std::bad_alloc", "no memory"}) {
        SCOPED_TRACE(szError);
        int nWhole = 0;
        int nNone = 0;
        bool blFailed = true;
        while (blFailed) {
            m_jArray = Json::Value();
            errno = 0;
            g_blJsoncppTellsIt = 0 == strcmp(szError, "no memory");
            g_pAllocation = allocate;
            g_nAllocationThatFails = nWhole + nNone + 1;
            const int nResult = decode(row);
            blFailed = 0 == g_nAllocationThatFails;
            g_nAllocationThatFails = 0;
            if (0 == nResult) {
                ++nWhole;
                ASSERT_EQ(json(strExtra), m_jArray[0]["extra"]);
            } else {
                ++nNone;
                ASSERT_TRUE(m_jArray.empty());
                ASSERT_EQ((Texts{fail(STORE, std::string("decode row failed, error=") + szError, ENOMEM)}),
                          takeLines());
            }
        }
        EXPECT_LT(1, nWhole); // one of them without a failure
        EXPECT_LT(3, nNone);
    }
}

TEST_F(RowDecoding, RefusesColumnThatIsNoField)
{
    for (const char* szName : {"nonsense", "", "TID", "tid ", "count(*)", "token.tid", "sort_by"}) {
        SCOPED_TRACE(szName);
        expectRefused({{"tid", szName}, {"a", "1"}}, columnLines(failed(STORE, NO_FIELD)));
    }
}

TEST_F(RowDecoding, RefusesNullArrayBeforeAllElse)
{
    EXPECT_EQ(-1, ::decode(m_pDecoder, {{"tid"}, {"a"}}, nullptr));
    EXPECT_EQ(-1, m_pDecoder(nullptr, 1, nullptr, nullptr));
    EXPECT_EQ((Texts{failed(STORE, "!pjTokenArray"), failed(STORE, "!pjTokenArray")}), takeLines());
}

TEST_F(RowDecoding, RefusesNullRow)
{
    char* pointers[] = {nullptr};
    for (const int nColumns : {1, 0, -1}) {
        EXPECT_EQ(-1, m_pDecoder(&m_jArray, nColumns, pointers, nullptr));
        EXPECT_EQ(rowLines(failed(STORE, NULL_ROW)), takeLines());
        EXPECT_EQ(-1, m_pDecoder(&m_jArray, nColumns, nullptr, pointers));
        EXPECT_EQ(rowLines(failed(STORE, NULL_ROW)), takeLines());
    }
    EXPECT_TRUE(m_jArray.isNull());
}

TEST_F(RowDecoding, RefusesNullColumn)
{
    const Texts lines = rowLines(failed(STORE, NULL_COLUMN));
    expectRefused({{"tid"}, {nullptr}}, lines);
    expectRefused({{nullptr}, {"a"}}, lines);
    expectRefused({{"tid", "uid"}, {"a", nullptr}}, lines);
    expectRefused({{"tid", nullptr}, {"a", nullptr}}, lines);
}

TEST_F(RowDecoding, RefusesOutputThatIsNoArray)
{
    for (const char* szOutput : {"{}", R"({"a":1})", R"("text")", "0", "1.5", "true"}) {
        SCOPED_TRACE(szOutput);
        m_jArray = json(szOutput);
        EXPECT_EQ(-1, decode({{"tid"}, {"a"}}));
        EXPECT_EQ((Texts{failed(STORE, WRONG_ARRAY)}), takeLines());
        EXPECT_EQ(json(szOutput), m_jArray);
    }
}

// The check asks up to twice.
TEST_F(RowDecoding, RefusesRecordThatIsNeitherObjectNorNull)
{
    g_typeOfObjects = Json::arrayValue;
    g_nLies = 2;
    expectRefused({{"tid"}, {"a"}}, columnLines(failed(STORE, NO_OBJECT)));
}

TEST_F(RowDecoding, TakesRecordThatIsNull)
{
    g_typeOfObjects = Json::nullValue;
    g_nLies = 2;
    EXPECT_EQ(0, decode({{"tid"}, {"a"}}));
    EXPECT_EQ(json(R"([{"tid":"a"}])"), m_jArray);
    EXPECT_EQ(Texts{}, takeLines());
}

TEST_F(RowDecoding, AppendsEmptyRecordWithoutColumns)
{
    char* noColumns[] = {nullptr};
    for (const int nColumns : {0, -1, INT_MIN}) {
        EXPECT_EQ(0, m_pDecoder(&m_jArray, nColumns, noColumns, noColumns));
    }
    EXPECT_EQ(json("[{},{},{}]"), m_jArray);
    EXPECT_EQ(Texts{}, takeLines());
}

TEST_F(RowDecoding, AppendsEachRowAsFreshRecord)
{
    m_jArray.append("first");
    EXPECT_EQ(0, decode({{"tid", "count"}, {"a", "2"}}));
    EXPECT_EQ(0, decode({{"uid"}, {"3"}}));
    EXPECT_EQ(-1, decode({{"bind_sid", "uid"}, {"b", nullptr}}));
    EXPECT_EQ(0, decode({{"function"}, {"f"}}));
    EXPECT_EQ(json(R"(["first",{"tid":"a","count":2},{"uid":3},{"function":"f"}])"), m_jArray);
}

TEST_F(RowDecoding, LaterColumnReplacesEarlierOfSameName)
{
    EXPECT_EQ(0, decode({{"count", "extra", "count", "extra"}, {"1", R"({"a":[1]})", "2", "{"}}));
    EXPECT_EQ(0, decode({{"extra", "extra"}, {"{}", ""}}));
    EXPECT_EQ(json(R"([{"count":2,"extra":{}},{"extra":null}])"), m_jArray);
}

TEST_F(RowDecoding, StopsAtFirstBadColumn)
{
    expectRefused({{"tid", "nonsense", "uid"}, {"a", "1", nullptr}}, columnLines(failed(STORE, NO_FIELD)));
    expectRefused({{"tid", "uid", "nonsense"}, {"a", nullptr, "1"}}, rowLines(failed(STORE, NULL_COLUMN)));
}

TEST_F(RowDecoding, LinesTellErrno)
{
    errno = EACCES;
    expectRefused({{"nonsense"}, {"1"}}, columnLines(failed(STORE, NO_FIELD, EACCES), EACCES));
    expectRefused({{"extra", "tid"}, {"{", nullptr}}, rowLines(failed(STORE, NULL_COLUMN, EACCES), EACCES));
    addField("odd", json("[\"bool\"]"));
    expectRefused({{"odd"}, {"1"}}, columnLines(fail(STORE, "type error, strType=bool", EACCES), EACCES));
}

class RowDecodingSystemLog : public RowDecoding {
protected:
    RowDecodingSystemLog() : RowDecoding(Destination::Syslog) {}
};

TEST_F(RowDecodingSystemLog, TellsErrnoInFrontOfEachLine)
{
    addField("odd", "no array");
    const std::string strError = "decode row failed, error=" + errorOf("no array");
    for (const int nErrno : {0, EACCES}) {
        errno = nErrno;
        EXPECT_EQ(-1, decode({{"nonsense"}, {"1"}}));
        EXPECT_EQ(-1, decode({{"odd"}, {"1"}}));
        EXPECT_EQ(inSystemLog(columnLines(failed(STORE, NO_FIELD, nErrno), nErrno) +
                                  Texts{fail(STORE, strError, nErrno)},
                              nErrno),
                  takeLines(Destination::Syslog));
    }
}

} // namespace
