#include <postgresql/libpq-fe.h>

#include <memory>
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

const int COUNT = 4; // its column

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

} // namespace

Contender makePostgresql(const char* szServer, Connection connection)
{
    const std::shared_ptr<PGconn> pHeld = connect(szServer);
    const auto run = [pHeld](const std::string& strSql) { checked(PQexec(pHeld.get(), strSql.c_str())); };
    const auto create = [run](const BareToken& token) {
        std::string strNames;
        std::string strValues;
        for (const auto& [strName, strValue] : fieldsOf(token)) {
            strNames += (strNames.empty() ? "" : ", ") + strName;
            strValues += (strValues.empty() ? "'" : ", '") + strValue + "'";
        }
        run("INSERT INTO token (" + strNames + ") VALUES (" + strValues + ")");
    };
    run(TABLE);
    run("BEGIN");
    for (int i = 0; i < TOKENS; ++i) {
        create(tokenOf(i));
    }
    run("COMMIT");
    run("VACUUM ANALYZE token");
    checked(PQprepare(pHeld.get(), "grant", GRANT, 0, nullptr));
    return {
        create, [=](std::string& strTid, const char* szWebapi, const char* szMethod) {
            const char* const rgszText[] = {strTid.c_str(), szWebapi, szMethod};
            Result pRecord;
            if (Connection::Held == connection) {
                pRecord = checked(PQexecPrepared(pHeld.get(), "grant", 3, rgszText, nullptr, nullptr, 0));
            } else {
                const Session pSession = connect(szServer);
                pRecord =
                    checked(PQexecParams(pSession.get(), GRANT, 3, nullptr, rgszText, nullptr, nullptr, 0));
            }
            return 1 == PQntuples(pRecord.get()) ? std::stoll(PQgetvalue(pRecord.get(), 0, COUNT)) : REFUSED;
        }};
}
