// Rows of the database as records, as SQLite hands them to the decoder.

#include "Decoding.h"

namespace {

const char* const VALUES = "'',1,2,3,4,'f','{}','{}'";

class QueryDecoding : public StoreTest {
protected:
    void SetUp() override
    {
        StoreTest::SetUp();
        makeDatabase();
        m_pDecoder = captureDecoder();
    }

    int run(const std::string& strSql)
    {
        m_db.m_strSql = strSql;
        return m_db.runSql(m_pDecoder, &m_jArray);
    }

    // The lines of a query that ends at a refused row.
    Texts queryLines(const Texts& linesOfRow) const
    {
        EXPECT_EQ("query aborted", m_db.m_strErr);
        return linesOfRow + failureOf(m_db.m_strSql, "query aborted");
    }

    AccessTokenDbApi m_db;
    SqlCallback m_pDecoder = nullptr;
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
    EXPECT_EQ(Texts{}, takeLines());
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
    EXPECT_EQ(Texts{}, takeLines());
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

        EXPECT_EQ(queryLines(rowLines(failed(STORE, NULL_COLUMN))) +
                      Texts{failed(STORE, "0 > runSql(FillList, &jTokenArrayOut)")},
                  takeLines());
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
        EXPECT_EQ(queryLines(columnLines(failed(STORE, NO_FIELD))), takeLines());
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
    EXPECT_EQ(queryLines({failed(STORE, WRONG_ARRAY)}), takeLines());
    EXPECT_EQ(json("{\"a\":1}"), m_jArray);
}

TEST_F(QueryDecoding, ConnectionOutlivesExceptionInDecoder)
{
    insert("a", VALUES);
    const Json::Value jEntry = VEMO_ACCESS_TOKEN::tokenType()["extra"];
    addField("extra", "no array");
    EXPECT_NO_THROW(EXPECT_EQ(-1, run("SELECT * FROM token")));
    EXPECT_EQ(queryLines({fail(STORE, "decode row failed, error=" + errorOf("no array"))}), takeLines());

    addField("extra", jEntry);
    VEMO_ACCESS_TOKEN::debugInfo(true);
    EXPECT_EQ(0, run("SELECT tid FROM token"));
    EXPECT_EQ(json(R"([{"tid":"a"}])"), m_jArray);
    EXPECT_EQ("", m_db.m_strErr);
    EXPECT_EQ((Texts{ordinary(STORE, "run sql=SELECT tid FROM token")}), takeLines());
    EXPECT_EQ(0, m_db.freeDb());
    EXPECT_EQ(nullptr, m_db.m_pDb) << "no statement is left open";
}

} // namespace
