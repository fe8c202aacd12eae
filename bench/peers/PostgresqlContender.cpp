#include <postgresql/libpq-fe.h>

#include <stdexcept>

#include "Contender.h"
#include "Store.h"

namespace {

const char* const TABLE = R"sql(
    SET client_min_messages = warning;
    DROP TABLE IF EXISTS token;
    CREATE TABLE token (
        tid text PRIMARY KEY, bind_sid text NOT NULL, uid bigint NOT NULL, deadline bigint NOT NULL,
        count bigint NOT NULL, create_time bigint NOT NULL, function text NOT NULL,
        webapi_allow jsonb NOT NULL, extra jsonb NOT NULL)
)sql";

// Parameters: the id, web API and method. The lock on the row makes overlapping grants take turns.
const char* const GRANT = R"sql(
    WITH allowed AS (
        SELECT * FROM token
        WHERE tid = $1 AND deadline > extract(epoch FROM now()) AND webapi_allow -> $2::text -> 'method' ? $3
        FOR UPDATE
    ), spent AS (
        UPDATE token SET count = token.count - 1 FROM allowed
        WHERE token.tid = allowed.tid AND allowed.count > 1
        RETURNING token.*
    ), deleted AS (
        DELETE FROM token USING allowed
        WHERE token.tid = allowed.tid AND allowed.count IN (0, 1)
        RETURNING token.*
    )
    SELECT * FROM spent
    UNION ALL SELECT * FROM deleted
    UNION ALL SELECT * FROM allowed WHERE count < 0
)sql";

const char* const CREATE = "INSERT INTO token VALUES ($1, $2, $3, $4, $5, $6, $7, $8, $9)";

struct Deleter {
    void operator()(PGconn* pSession) const { PQfinish(pSession); }
    void operator()(PGresult* pResult) const { PQclear(pResult); }
};

typedef std::unique_ptr<PGconn, Deleter> Session;
typedef std::unique_ptr<PGresult, Deleter> Result;

Session connect(const char* szServer)
{
    Session pSession(PQconnectdb(szServer));
    if (CONNECTION_OK != PQstatus(pSession.get())) {
        throw std::runtime_error(PQerrorMessage(pSession.get()));
    }
    return pSession;
}

Result checked(PGresult* pResult)
{
    Result pChecked(pResult);
    const ExecStatusType status = PQresultStatus(pResult);
    if (PGRES_COMMAND_OK != status && PGRES_TUPLES_OK != status) {
        throw std::runtime_error(std::string("PostgreSQL: ") + PQresultErrorMessage(pResult));
    }
    return pChecked;
}

class PostgresqlContender final : public Contender {
public:
    PostgresqlContender(int nTokens, const char* szServer, Connection connection)
        : m_strServer(szServer), m_connection(connection), m_pHeld(connect(szServer))
    {
        run(TABLE);
        run("BEGIN");
        for (int i = 0; i < nTokens; ++i) {
            create(tokenOf(i));
        }
        run("COMMIT");
        run("VACUUM ANALYZE token");
        checked(PQprepare(m_pHeld.get(), "grant", GRANT, 0, nullptr));
    }

    int size() override { return std::stoi(PQgetvalue(run("SELECT count(*) FROM token").get(), 0, 0)); }

    void create(const BareToken& token) override
    {
        const Texts rgstrText = textsOf(token);
        const char* rgszText[rgstrText.size()];
        for (size_t i = 0; i < rgstrText.size(); ++i) {
            rgszText[i] = rgstrText[i].c_str();
        }
        checked(PQexecParams(m_pHeld.get(), CREATE, 9, nullptr, rgszText, nullptr, nullptr, 0));
    }

    bool grant(std::string& strTid, const char* szWebapi, const char* szMethod) override
    {
        const char* const rgszText[] = {strTid.c_str(), szWebapi, szMethod};
        if (Connection::Held == m_connection) {
            m_pAnswer = checked(PQexecPrepared(m_pHeld.get(), "grant", 3, rgszText, nullptr, nullptr, 0));
        } else {
            const Session pSession = connect(m_strServer.c_str());
            m_pAnswer =
                checked(PQexecParams(pSession.get(), GRANT, 3, nullptr, rgszText, nullptr, nullptr, 0));
        }
        return 1 == PQntuples(m_pAnswer.get());
    }

    Json::Value answer() const override
    {
        Texts rgstrText;
        for (size_t i = 0; i < rgstrText.size(); ++i) {
            rgstrText[i] = PQgetvalue(m_pAnswer.get(), 0, static_cast<int>(i));
        }
        return recordOf(rgstrText);
    }

private:
    Result run(const char* szSql) { return checked(PQexec(m_pHeld.get(), szSql)); }

    std::string m_strServer;
    Connection m_connection;
    Session m_pHeld;
    Result m_pAnswer;
};

} // namespace

std::unique_ptr<Contender> makePostgresql(int nTokens, const char* szServer, Connection connection)
{
    return std::make_unique<PostgresqlContender>(nTokens, szServer, connection);
}
