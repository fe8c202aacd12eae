#include "Store.h"

#include <cstdlib>

#include "AccessTokenUtil.h"
#include "Failure.h"
#include "Masking.h"
#include "Memo.h"
#include "internal/JsonText.h"

namespace {

// The first value, as SQL, that sorts after all texts that begin with a prefix of any bytes.
std::string sqlBehind(std::string strPrefix)
{
    strPrefix.resize(strPrefix.find_last_not_of('\xff') + 1);
    if (strPrefix.empty()) {
        return "x''"; // a blob sorts after all texts
    }
    ++strPrefix.back();
    return tool::sqlText("%Q", strPrefix.c_str());
}

} // namespace

namespace tool {

void Store::select(const std::string& strExpressions, const std::string& strWhere,
                   const std::function<void(Row)>& take)
{
    eachRow("SELECT " + strExpressions + " FROM token WHERE " + strWhere, take);
}

void Store::eachToken(const std::string& strWhere, const std::string& strColumns, const TakeToken& take)
{
    const std::vector<std::string> strNames = fieldNames();
    std::vector<Json::ValueType> types;
    for (const std::string& strName : strNames) {
        types.push_back(VEMO_ACCESS_TOKEN::tokenType()[strName][1].type());
    }
    Memo<Json::Value> objects([](const std::string& strText) {
        Json::Value jValue;
        VEMO_ACCESS_TOKEN::fromString(strText, jValue);
        return jValue;
    });
    std::string strFields;
    db().SqlExpandMemberName(strFields);
    select(strFields + strColumns, strWhere, [&](Row row) {
        Json::Value jToken;
        for (size_t i = 0; i < strNames.size(); ++i) {
            if (!row[i]) {
                fail("query aborted"); // the library fails in the same way
            }
            Json::Value& jValue = jToken[strNames[i]];
            switch (types[i]) {
            case Json::stringValue: jValue = *row[i]; break;
            case Json::objectValue: jValue = objects.of(*row[i]); break;
            default: jValue = Json::Int64{strtoll(row[i]->c_str(), nullptr, 10)};
            }
        }
        row.erase(row.begin(), row.begin() + static_cast<std::ptrdiff_t>(strNames.size()));
        take(std::move(jToken), row);
    });
}

uint64_t Store::count(const std::string& strWhere)
{
    return number("SELECT count(*) FROM token WHERE " + strWhere);
}

void Store::eachTid(const std::string& strWhere,
                    const std::function<void(const std::optional<std::string>& strTid)>& take)
{
    select("tid", strWhere, [&take](const Row& row) { take(row[0]); });
}

bool Store::hasRowIds()
{
    return 0 == number("SELECT wr OR type <> 'table' OR EXISTS (SELECT 1 FROM pragma_table_xinfo('token') "
                       "WHERE name = 'rowid' COLLATE NOCASE) FROM pragma_table_list('token')");
}

bool Store::has(const std::string& strTid)
{
    return !query(sqlText("SELECT 1 FROM token WHERE tid = %Q LIMIT 1", strTid.c_str())).empty();
}

std::optional<Json::Value> Store::find(const std::string& strTid)
{
    std::string strTidCopy = strTid;
    Json::Value jToken;
    const int nFound = db().tokenGetOne("tid", strTidCopy, jToken);
    require(nFound);
    return nFound ? std::optional<Json::Value>(jToken) : std::nullopt;
}

std::optional<Json::Value> Store::findByPrefix(const std::string& strTid)
{
    std::optional<Json::Value> jToken = find(strTid);
    if (jToken) {
        return jToken;
    }
    if (strTid.size() < PREFIX_MIN) {
        throw Failure(EXIT_STATUS_USAGE,
                      "TID: \"" + strTid + "\" is too short: give the id or its first 8 characters, or more");
    }
    const Rows rows = query(sqlText("SELECT tid FROM token WHERE tid >= %Q AND tid < %s LIMIT 2",
                                    strTid.c_str(), sqlBehind(strTid).c_str()));
    if (rows.size() > 1) {
        throw Failure(EXIT_STATUS_USAGE,
                      "TID: several tokens begin with \"" + shortened(strTid) + "\"; give more of the id");
    }
    return rows.empty() ? std::nullopt : find(rows[0][0].value_or(""));
}

template <typename Use>
auto Store::withTokens(Use use)
{
    try {
        grant::Tokens tokens(db().m_pDb);
        return use(tokens);
    } catch (const grant::Error& error) {
        fail(error.what());
    }
}

std::optional<grant::Token> Store::token(const std::string& strTid)
{
    const auto token = withTokens([&strTid](grant::Tokens& tokens) { return tokens.find(strTid); });
    if (token && !token->blReadable) {
        fail("query aborted");
    }
    return token;
}

void Store::spend(const grant::Token& token)
{
    withTokens([&token](grant::Tokens& tokens) { tokens.spend(token); });
    audit::note("granted", token.strTid);
}

void Store::create(const Json::Value& jToken)
{
    Json::Value jTokenCopy = jToken;
    require(db().tokenCreate(jTokenCopy));
    audit::note("created", jToken["tid"].asString());
}

void Store::change(const std::string& strAssignments, const std::string& strWhere)
{
    query("UPDATE token SET " + strAssignments + " WHERE " + strWhere);
    audit::note("updated", {}, number("SELECT changes()"));
}

void Store::update(const std::string& strTid, const Json::Value& jChange)
{
    std::string strChanges;
    for (const std::string& strName : jChange.getMemberNames()) {
        strChanges += (strChanges.empty() ? "" : ", ") + equation(strName, jChange[strName]);
    }
    query("UPDATE token SET " + strChanges + " WHERE " + equation("tid", strTid));
    audit::note("updated", strTid);
}

// Such as "name='value'", with the value written and quoted as the library does.
std::string Store::equation(std::string strName, Json::Value jValue)
{
    std::string strEquation;
    require(db().SqlMakeByMatchField(strName, jValue, strEquation));
    return strEquation;
}

void Store::copy(const std::string& strTid, const std::string& strNewTid, int64_t nCreateTime)
{
    std::string strFields;
    std::string strValues;
    for (const std::string& strName : fieldNames()) {
        strFields += (strFields.empty() ? "" : ", ") + strName;
        strValues += strValues.empty() ? "" : ", ";
        strValues += strName == "tid"           ? sqlText("%Q", strNewTid.c_str())
                     : strName == "create_time" ? std::to_string(nCreateTime)
                                                : strName;
    }
    query("INSERT INTO token (" + strFields + ") SELECT " + strValues + " FROM token WHERE " +
          equation("tid", strTid));
    audit::note("created", strNewTid);
}

uint64_t Store::remove(const std::string& strWhere)
{
    std::vector<std::string> strTids;
    eachTid(strWhere + " ORDER BY tid LIMIT " + std::to_string(audit::PREFIXES_MAX),
            [&strTids](const auto& strTid) { strTids.push_back(strTid.value_or("")); });
    query("DELETE FROM token WHERE " + strWhere);
    const uint64_t nRemoved = number("SELECT changes()");
    audit::note("deleted", strTids, nRemoved);
    return nRemoved;
}

uint64_t Store::removeTid(const std::string& strTid)
{
    return remove(sqlText("tid = %Q", strTid.c_str()));
}

uint64_t Store::removeTids(const std::vector<std::string>& strTids)
{
    uint64_t nRemoved = 0;
    for (const std::string& strTid : strTids) {
        nRemoved += removeTid(strTid);
    }
    return nRemoved;
}

std::string Store::damageOfRows(const std::string& strWhere)
{
    std::string strRead = "SELECT 0";
    for (const std::string& strName : fieldNames()) {
        strRead += " + total(length(" + strName + "))";
    }
    Rows rows;
    return queryPartially(strRead + " FROM token WHERE " + strWhere, rows);
}

std::string Store::damageOfIndex(const std::string& strWhere)
{
    const std::string strIndex = text("SELECT name FROM pragma_index_list('token') WHERE origin = 'pk'");
    if (strIndex.empty() || !hasRowIds()) { // without row numbers, the index is the table
        return "";
    }
    Rows rows;
    const std::string strErr =
        queryPartially("SELECT count(*) FROM token NOT INDEXED WHERE " + strWhere +
                           sqlText(" AND NOT EXISTS (SELECT 1 FROM token AS other INDEXED BY \"%w\" "
                                   "WHERE other.tid = token.tid AND other.rowid = token.rowid)",
                                   strIndex.c_str()),
                       rows);
    for (const Row& row : rows) {
        if (row[0] != "0") {
            return "rows missing in the index of the ids: " + row[0].value_or("");
        }
    }
    return strErr;
}

uint64_t Store::purge()
{
    require(db().cleanExpireToken(true));
    const uint64_t nPurged = number("SELECT changes()");
    audit::note("purged", {}, nPurged);
    return nPurged;
}

} // namespace tool
