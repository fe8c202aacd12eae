#include <algorithm>

#include "Model.h"
#include "ModelFilter.h"
#include "World.h"

namespace {

// Removes rows and tells how many.
template <typename Predicate>
int removeIf(std::vector<Row>& rows, Predicate predicate)
{
    const auto end = std::remove_if(rows.begin(), rows.end(), predicate);
    const int nRemoved = static_cast<int>(rows.end() - end);
    rows.erase(end, rows.end());
    return nRemoved;
}

} // namespace

int ModelStore::tokenSave(Json::Value& jRecord, bool blCreate)
{
    if (0 > ModelRules().fillDefaultValue(jRecord, true)) {
        return -1;
    }
    const Row row = rowOf(jRecord);
    const auto isSame = [&](const Row& other) { return other.columns[0] == row.columns[0]; };
    if (blCreate && std::any_of(m_rows.begin(), m_rows.end(), isSame)) {
        return -1;
    }
    removeIf(m_rows, isSame);
    m_rows.push_back(row);
    return 0;
}

int ModelStore::tokenGet(Json::Value& jFilter, Json::Value& jTokenArrayOut)
{
    if (!jFilter.isObject() || (!jTokenArrayOut.isNull() && !jTokenArrayOut.isArray())) {
        return -1;
    }
    const Where where(jFilter);
    if (where.blRefused || isSpoiledByPaging(jFilter, where.blEmpty) || where.blBroken) {
        return -1;
    }
    for (const Row& row : m_rows) {
        if (where.matches(row)) {
            jTokenArrayOut.append(row.jRecord);
        }
    }
    return 0;
}

int ModelStore::tokenGetOne(const char* szName, std::string& strValue, Json::Value& jTokenOut)
{
    if (!szName || !szName[0] || strValue.empty()) {
        return -1;
    }
    jTokenOut = Json::Value(Json::objectValue);
    Json::Value jFilter;
    Json::Value jFound;
    jFilter[szName] = strValue;
    if (0 > tokenGet(jFilter, jFound)) {
        return -1;
    }
    if (jFound.empty()) {
        return 0;
    }
    jTokenOut = jFound[0];
    return 1;
}

int ModelStore::tokenDelete(Json::Value& jFilter, bool blAll)
{
    if (!jFilter.isObject()) {
        return -1;
    }
    const Where where(jFilter);
    if (where.blRefused || where.blBroken || (where.blEmpty && !blAll)) {
        return -1;
    }
    return removeIf(m_rows, [&](const Row& row) { return where.matches(row); });
}

int ModelStore::cleanExpireToken(bool)
{
    if (worldClock() < YEAR_10000) { // then there is no date to compare with
        removeIf(m_rows, [](const Row& row) { return row.jRecord["deadline"].asInt64() < worldClock(); });
    }
    return 0;
}
