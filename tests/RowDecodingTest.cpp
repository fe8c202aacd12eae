// Rows of the database as records.

#include <dlfcn.h>

#include <cerrno>
#include <climits>
#include <new>

#include "AccessTokenUtil.h"
#include "StoreTest.h"
#include "internal/AccessTokenDbApi.h"

namespace {

int g_nAllocationThatFails = 0; // counted from now, 1 is the next; 0: none
bool g_blObjectsAreArrays = false;

template <typename Function>
Function* next(const char* szMangledName)
{
    return reinterpret_cast<Function*>(dlsym(RTLD_NEXT, szMangledName));
}

} // namespace

// Every allocation of this process goes through here, those of the C++ libraries too. The memory is
// the next operator's, so its operator delete stays in use.
void* operator new(std::size_t cbSize)
{
    static auto* const pNew = next<void*(std::size_t)>("_Znwm");
    if (0 < g_nAllocationThatFails && 0 == --g_nAllocationThatFails) {
        errno = ENOMEM;
        throw std::bad_alloc();
    }
    return pNew(cbSize);
}

// A fresh record is always an object; the check that it is one can only be reached by a lie.
__attribute__((visibility("default"))) Json::ValueType Json::Value::type() const
{
    static auto* const pType = next<Json::ValueType(const Json::Value*)>("_ZNK4Json5Value4typeEv");
    const Json::ValueType type = pType(this);
    return g_blObjectsAreArrays && Json::objectValue == type ? Json::arrayValue : type;
}

namespace {

typedef int (*Decoder)(void*, int, char**, char**);
typedef std::vector<std::string> Lines;

// Names and texts, as many as the row has columns.
struct Row {
    std::vector<const char*> names;
    std::vector<const char*> values;
};

const char* const FILE_NAME = "AccessTokenSqlite.cpp";
const char* const FIELD_FAILED = "0 > (iTmp = FillField(*pjToken, column_name, column_value, i))";
const char* const TOKEN_FAILED = "0 > FillToken(&jTmp, n_column, column_value, column_name)";
const char* const NULL_COLUMN = "NULL == column_name[i] || NULL == column_value[i]";
const char* const NULL_ROW = "NULL == column_name || NULL == column_value";
const char* const NO_FIELD = "!jTokenType.isMember(strName)";
const char* const NO_OBJECT = "jToken.type() != Json::objectValue && jToken.type() != Json::nullValue";
const char* const WRONG_ARRAY = "pjTokenArray->type() != Json::arrayValue && "
                                "pjTokenArray->type() != Json::nullValue";

// What is logged when a row, and when a column of it, is refused.
Lines rowLines(const std::string& strLine, int nErrno = 0)
{
    return {strLine, failed(FILE_NAME, TOKEN_FAILED, nErrno)};
}

Lines columnLines(const std::string& strLine, int nErrno = 0)
{
    return {strLine, failed(FILE_NAME, FIELD_FAILED, nErrno), failed(FILE_NAME, TOKEN_FAILED, nErrno)};
}

// The decoder, as the library hands it to SQLite.
Decoder captureDecoder()
{
    Decoder pDecoder = nullptr;
    seam().sqliteExec = [&](sqlite3*, const char*, Decoder pCallback, void*, char**) {
        pDecoder = pCallback;
        return SQLITE_OK;
    };
    AccessTokenDbApi db;
    EXPECT_EQ(SQLITE_OK, sqlite3_open(":memory:", &db.m_pDb));
    Json::Value jFilter(Json::objectValue);
    Json::Value jArray;
    EXPECT_EQ(0, db.tokenGet(jFilter, jArray));
    seam() = Seam();
    errno = 0;
    return pDecoder;
}

int decode(Decoder pDecoder, const Row& row, Json::Value* pjArray)
{
    return pDecoder(pjArray, static_cast<int>(row.names.size()), const_cast<char**>(row.values.data()),
                    const_cast<char**>(row.names.data()));
}

// A field of a type that no field has today, added while the process runs.
void addField(const char* szName, const Json::Value& jEntry)
{
    VEMO_ACCESS_TOKEN::tokenType()[szName] = jEntry;
}

class RowDecoding : public SeamTest {
protected:
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
        EXPECT_EQ(Lines{}, takeLines());
        EXPECT_EQ(1u, jArray.size());
        EXPECT_EQ((std::vector<std::string>{szName}), jArray[0].getMemberNames());
        return jArray[0][szName];
    }

    // A row that is refused leaves the array as it was, null.
    void expectRefused(const Row& row, const Lines& lines)
    {
        EXPECT_NO_THROW(EXPECT_EQ(-1, decode(row)));
        EXPECT_EQ(lines, takeLines());
        EXPECT_TRUE(m_jArray.isNull());
    }

    Decoder m_pDecoder = nullptr;
    Json::Value m_jArray;
};

TEST_F(RowDecoding, KeepsTextUnchanged)
{
    std::string strBytes;
    for (int nByte = 1; nByte < 256; ++nByte) {
        strBytes += static_cast<char>(nByte);
    }
    for (const std::string& strText : Lines{"", "  a\t\n", "12", "null", "{\"a\":1}", strBytes}) {
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
                      columnLines(fail(FILE_NAME, std::string("type error, strType=") + szType)));
    }
}

// What the JSON library says when the type name of such an entry is read.
std::string errorOf(const Json::Value& jEntry)
{
    try {
        return "no error: " + jEntry[0U].asString();
    } catch (const Json::LogicError& error) {
        return error.what();
    }
}

// SQLite is C and cannot be thrown through.
TEST_F(RowDecoding, TurnsExceptionsIntoFailure)
{
    for (const char* szEntry : {R"("string")", "{}", R"({"0":"string"})", "5", R"([["string"]])", "[{}]"}) {
        SCOPED_TRACE(szEntry);
        addField("odd", json(szEntry));
        expectRefused({{"count", "odd"}, {"1", "1"}},
                      {fail(FILE_NAME, "decode row failed, error=" + errorOf(json(szEntry)))});
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
        g_nAllocationThatFails = nFailures + 1;
        EXPECT_NO_THROW(nResult = decode(row));
        g_nAllocationThatFails = 0;
        if (0 > nResult) {
            ASSERT_TRUE(m_jArray.empty());
            ASSERT_EQ((Lines{fail(FILE_NAME, "decode row failed, error=std::bad_alloc", ENOMEM)}),
                      takeLines());
        }
    }

    EXPECT_LT(3, nFailures);
    EXPECT_EQ(Lines{}, takeLines());
    ASSERT_EQ(1u, m_jArray.size());
    EXPECT_EQ(json(strExtra), m_jArray[0]["extra"]);
}

TEST_F(RowDecoding, RefusesColumnThatIsNoField)
{
    for (const char* szName : {"nonsense", "", "TID", "tid ", "count(*)", "token.tid", "sort_by"}) {
        SCOPED_TRACE(szName);
        expectRefused({{"tid", szName}, {"a", "1"}}, columnLines(failed(FILE_NAME, NO_FIELD)));
    }
}

TEST_F(RowDecoding, RefusesNullArrayBeforeAllElse)
{
    EXPECT_EQ(-1, ::decode(m_pDecoder, {{"tid"}, {"a"}}, nullptr));
    EXPECT_EQ(-1, m_pDecoder(nullptr, 1, nullptr, nullptr));
    EXPECT_EQ((Lines{failed(FILE_NAME, "!pjTokenArray"), failed(FILE_NAME, "!pjTokenArray")}), takeLines());
}

TEST_F(RowDecoding, RefusesNullRow)
{
    char* pointers[] = {nullptr};
    for (const int nColumns : {1, 0, -1}) {
        EXPECT_EQ(-1, m_pDecoder(&m_jArray, nColumns, pointers, nullptr));
        EXPECT_EQ(rowLines(failed(FILE_NAME, NULL_ROW)), takeLines());
        EXPECT_EQ(-1, m_pDecoder(&m_jArray, nColumns, nullptr, pointers));
        EXPECT_EQ(rowLines(failed(FILE_NAME, NULL_ROW)), takeLines());
    }
    EXPECT_TRUE(m_jArray.isNull());
}

TEST_F(RowDecoding, RefusesNullColumn)
{
    const Lines lines = rowLines(failed(FILE_NAME, NULL_COLUMN));
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
        EXPECT_EQ((Lines{failed(FILE_NAME, WRONG_ARRAY)}), takeLines());
        EXPECT_EQ(json(szOutput), m_jArray);
    }
}

TEST_F(RowDecoding, RefusesRecordThatIsNoObject)
{
    g_blObjectsAreArrays = true;
    expectRefused({{"tid"}, {"a"}}, columnLines(failed(FILE_NAME, NO_OBJECT)));
    g_blObjectsAreArrays = false;
}

TEST_F(RowDecoding, AppendsEmptyRecordWithoutColumns)
{
    char* noColumns[] = {nullptr};
    for (const int nColumns : {0, -1, INT_MIN}) {
        EXPECT_EQ(0, m_pDecoder(&m_jArray, nColumns, noColumns, noColumns));
    }
    EXPECT_EQ(json("[{},{},{}]"), m_jArray);
    EXPECT_EQ(Lines{}, takeLines());
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
    EXPECT_EQ(json(R"([{"count":2,"extra":{}}])"), m_jArray);
}

TEST_F(RowDecoding, StopsAtFirstBadColumn)
{
    expectRefused({{"tid", "nonsense", "uid"}, {"a", "1", nullptr}},
                  columnLines(failed(FILE_NAME, NO_FIELD)));
    expectRefused({{"tid", "uid", "nonsense"}, {"a", nullptr, "1"}},
                  rowLines(failed(FILE_NAME, NULL_COLUMN)));
}

TEST_F(RowDecoding, LinesTellErrno)
{
    errno = EACCES;
    expectRefused({{"nonsense"}, {"1"}}, columnLines(failed(FILE_NAME, NO_FIELD, EACCES), EACCES));
    expectRefused({{"extra", "tid"}, {"{", nullptr}},
                  rowLines(failed(FILE_NAME, NULL_COLUMN, EACCES), EACCES));
    addField("odd", json("[\"bool\"]"));
    expectRefused({{"odd"}, {"1"}}, columnLines(fail(FILE_NAME, "type error, strType=bool", EACCES), EACCES));
}

TEST(RowDecodingSystemLog, TellsErrnoInFrontOfEachLine)
{
    const Decoder pDecoder = captureDecoder();
    Json::Value jArray;

    EXPECT_EQ(-1, decode(pDecoder, {{"nonsense"}, {"1"}}, &jArray));
    EXPECT_EQ(columnLines(failed(FILE_NAME, NO_FIELD)), takeLines(Destination::Syslog));

    errno = EACCES;
    EXPECT_EQ(-1, decode(pDecoder, {{"nonsense"}, {"1"}}, &jArray));
    Lines lines = columnLines(failed(FILE_NAME, NO_FIELD, EACCES), EACCES);
    for (std::string& strLine : lines) {
        strLine.insert(strLine.find(' ') + 1, "(Permission denied)");
    }
    EXPECT_EQ(lines, takeLines(Destination::Syslog));
}

// SQLite leaves some errno of its own; the lines of these tests are to read the same anywhere.
int execWithoutErrno(sqlite3* pDb, const char* szSql, Decoder pDecoder, void* pArgument, char** pszError)
{
    struct Target {
        Decoder pDecoder;
        void* pArgument;
    } target = {pDecoder, pArgument};
    const auto pStep = [](void* pTarget, int nColumns, char** szValues, char** szNames) {
        errno = 0;
        const Target& rowTarget = *static_cast<Target*>(pTarget);
        return rowTarget.pDecoder(rowTarget.pArgument, nColumns, szValues, szNames);
    };
    const int nResult = sqlite3_exec(pDb, szSql, pDecoder ? +pStep : nullptr, &target, pszError);
    errno = 0;
    return nResult;
}

const char* const VALUES = "'',1,2,3,4,'f','{}','{}'";

class QueryDecoding : public StoreTest {
protected:
    void SetUp() override
    {
        StoreTest::SetUp();
        makeDatabase();
        m_pDecoder = captureDecoder();
        seam().sqliteExec = execWithoutErrno;
    }

    int run(const std::string& strSql)
    {
        m_db.m_strSql = strSql;
        return m_db.runSql(m_pDecoder, &m_jArray);
    }

    // The lines of a query that ends at a refused row.
    Lines queryLines(Lines lines) const
    {
        EXPECT_EQ("query aborted", m_db.m_strErr);
        lines.push_back(ordinary(FILE_NAME, "i=0,run sql failed, error=query aborted, sql=" + m_db.m_strSql));
        lines.push_back(fail(FILE_NAME, "run sql failed, sql=" + m_db.m_strSql));
        return lines;
    }

    AccessTokenDbApi m_db;
    Decoder m_pDecoder = nullptr;
    Json::Value m_jArray;
};

TEST_F(QueryDecoding, LeavesArrayUntouchedWithoutRows)
{
    EXPECT_EQ(0, run("SELECT * FROM token"));
    EXPECT_TRUE(m_jArray.isNull());
    m_jArray = json("[1]");
    EXPECT_EQ(0, run("SELECT * FROM token"));
    EXPECT_EQ(json("[1]"), m_jArray);
    m_jArray = json("{}");
    EXPECT_EQ(0, run("SELECT * FROM token")) << "nobody looks before the first row";
    EXPECT_EQ(Lines{}, takeLines());
}

TEST_F(QueryDecoding, ReadsWholeRecord)
{
    insert("a",
           R"('it''s',1026,-1,1,1700000000,'f','{"Example.Api":{"method":["get","list"]}}','{"b":[1]}')");
    EXPECT_EQ(0, run("SELECT * FROM token"));
    EXPECT_EQ(json(R"([{"tid":"a","bind_sid":"it's","uid":1026,"deadline":-1,"count":1,
                        "create_time":1700000000,"function":"f",
                        "webapi_allow":{"Example.Api":{"method":["get","list"]}},"extra":{"b":[1]}}])"),
              m_jArray);
    EXPECT_TRUE(m_jArray[0]["webapi_allow"].isObject());
    EXPECT_EQ(Lines{}, takeLines());
}

// A row of another maker: any value in any column, and the column's own default time, which is text.
TEST_F(QueryDecoding, ReadsForeignRowsLeniently)
{
    query("INSERT INTO token (tid,bind_sid,uid,deadline,function,webapi_allow,extra) "
          "VALUES (x'610062', 2.5, 'nobody', 1.9, 7, 5, 'none')");
    query("UPDATE token SET create_time = '2026-01-02 13:00:00'");
    EXPECT_EQ(0, run("SELECT * FROM token"));
    EXPECT_EQ(json(R"([{"tid":"a","bind_sid":"2.5","uid":0,"deadline":1,"count":1,"create_time":2026,
                        "function":"7","webapi_allow":5,"extra":null}])"),
              m_jArray);
}

TEST_F(QueryDecoding, RefusesNullAndKeepsRowsBefore)
{
    for (const char* szColumn :
         {"bind_sid", "uid", "deadline", "count", "create_time", "webapi_allow", "extra"}) {
        SCOPED_TRACE(szColumn);
        query("DELETE FROM token");
        for (const char* szTid : {"a", "b", "c"}) {
            insert(szTid, VALUES);
        }
        query(std::string("UPDATE token SET ") + szColumn + " = NULL WHERE tid = 'b'");
        Json::Value jFilter(Json::objectValue);
        Json::Value jArray;

        EXPECT_EQ(-1, m_db.tokenGet(jFilter, jArray));

        Lines lines = queryLines(rowLines(failed(FILE_NAME, NULL_COLUMN)));
        lines.push_back(failed(FILE_NAME, "0 > runSql(FillList, &jTokenArrayOut)"));
        EXPECT_EQ(lines, takeLines());
        ASSERT_EQ(1u, jArray.size());
        EXPECT_EQ(Json::Value("a"), jArray[0]["tid"]);
    }
}

TEST_F(QueryDecoding, RefusesExpressionColumn)
{
    insert("a", VALUES);
    for (const char* szSql : {"SELECT count(*) FROM token", "SELECT tid, uid + 1 FROM token",
                              "SELECT tid AS name FROM token", "SELECT rowid FROM token"}) {
        SCOPED_TRACE(szSql);
        EXPECT_EQ(-1, run(szSql));
        EXPECT_EQ(queryLines(columnLines(failed(FILE_NAME, NO_FIELD))), takeLines());
    }
    EXPECT_TRUE(m_jArray.isNull());
    EXPECT_EQ(0, run("SELECT tid, uid + 1 AS uid, 'x' AS function, bind_sid AS count FROM token"));
    EXPECT_EQ(json(R"([{"tid":"a","uid":2,"function":"x","count":0}])"), m_jArray);
}

TEST_F(QueryDecoding, RefusesObjectAsOutput)
{
    insert("a", VALUES);
    m_jArray = json("{\"a\":1}");
    EXPECT_EQ(-1, run("SELECT * FROM token"));
    EXPECT_EQ(queryLines({failed(FILE_NAME, WRONG_ARRAY)}), takeLines());
    EXPECT_EQ(json("{\"a\":1}"), m_jArray);
}

TEST_F(QueryDecoding, ConnectionOutlivesExceptionInDecoder)
{
    insert("a", VALUES);
    const Json::Value jEntry = VEMO_ACCESS_TOKEN::tokenType()["extra"];
    addField("extra", "no array");
    EXPECT_NO_THROW(EXPECT_EQ(-1, run("SELECT * FROM token")));
    EXPECT_EQ(queryLines({fail(FILE_NAME, "decode row failed, error=" + errorOf("no array"))}), takeLines());

    addField("extra", jEntry);
    VEMO_ACCESS_TOKEN::debugInfo(true);
    EXPECT_EQ(0, run("SELECT tid FROM token"));
    EXPECT_EQ(json(R"([{"tid":"a"}])"), m_jArray);
    EXPECT_EQ("", m_db.m_strErr);
    EXPECT_EQ((Lines{ordinary(FILE_NAME, "run sql=SELECT tid FROM token")}), takeLines());
    EXPECT_EQ(0, m_db.freeDb());
    EXPECT_EQ(nullptr, m_db.m_pDb) << "no statement is left open";
}

} // namespace
