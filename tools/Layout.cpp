#include "Layout.h"

#include <algorithm>
#include <sstream>

#include "Arguments.h"
#include "Console.h"
#include "Json.h"
#include "Masking.h"
#include "Store.h"
#include "Values.h"

namespace {

using tool::Layout;
typedef tool::Table::Kind Kind;

std::string timeIn(const Json::Value& jTime, const Layout& layout)
{
    return layout.blEpoch ? jTime.asString() : tool::timeText(jTime.asInt64(), layout.blUtc);
}

std::string usesText(const Json::Value& jCount)
{
    return jCount.asInt64() < 0 ? "unlimited" : jCount.asString();
}

std::string userText(const Json::Value& jUid)
{
    return tool::userNameIfKnown(jUid.asInt64()).value_or(jUid.asString());
}

// Such as "Example.File:get,list Example.User"; an entry that is not of this kind is shown as JSON.
std::string allowText(const Json::Value& jAllow)
{
    if (!jAllow.isObject()) {
        return tool::compactJson(jAllow);
    }
    std::string strText;
    for (const std::string& strApi : jAllow.getMemberNames()) {
        const Json::Value& jEntry = jAllow[strApi];
        strText += (strText.empty() ? "" : " ") + strApi;
        const bool blMethods = jEntry.isObject() && jEntry["method"].isArray();
        for (Json::ArrayIndex i = 0; blMethods && i < jEntry["method"].size(); ++i) {
            const Json::Value& jMethod = jEntry["method"][i];
            strText +=
                (i ? "," : ":") + (jMethod.isString() ? jMethod.asString() : tool::compactJson(jMethod));
        }
        strText += blMethods ? "" : ":" + tool::compactJson(jEntry);
    }
    return strText;
}

bool isExpired(const Json::Value& jToken, time_t nNow)
{
    return jToken["deadline"].asInt64() < nNow;
}

// The administrator's note on a token.
std::string noteOf(const Json::Value& jToken)
{
    const Json::Value& jExtra = jToken["extra"];
    const Json::Value& jNote = jExtra.isObject() ? jExtra["note"] : Json::Value::nullSingleton();
    return jNote.isString() ? jNote.asString() : jNote.isNull() ? "" : tool::compactJson(jNote);
}

// A column of the table of tokens.
struct Column {
    const char* szName; // in --columns
    tool::Table::Column title;
    std::string (*text)(const Json::Value& jToken, const Layout& layout, time_t nNow);
};

const Column COLUMNS[] = {
    {"tid",
     {"TID", Kind::Short},
     [](const Json::Value& j, const Layout&, time_t) { return j["tid"].asString(); }},
    {"user",
     {"USER", Kind::Short},
     [](const Json::Value& j, const Layout&, time_t) { return userText(j["uid"]); }},
    {"function",
     {"FUNCTION", Kind::Long},
     [](const Json::Value& j, const Layout&, time_t) { return j["function"].asString(); }},
    {"uses",
     {"USES", Kind::Right},
     [](const Json::Value& j, const Layout&, time_t) { return usesText(j["count"]); }},
    {"deadline",
     {"DEADLINE", Kind::Short},
     [](const Json::Value& j, const Layout& layout, time_t) { return timeIn(j["deadline"], layout); }},
    {"expires",
     {"EXPIRES", Kind::Short, true},
     [](const Json::Value& j, const Layout&, time_t nNow) {
         return tool::relativeText(j["deadline"].asInt64(), nNow);
     }},
    {"session",
     {"SESSION", Kind::Long, true},
     [](const Json::Value& j, const Layout&, time_t) { return j["bind_sid"].asString(); }},
    {"allows",
     {"ALLOWS", Kind::Long},
     [](const Json::Value& j, const Layout&, time_t) { return allowText(j["webapi_allow"]); }},
    {"uid",
     {"UID", Kind::Right},
     [](const Json::Value& j, const Layout&, time_t) { return j["uid"].asString(); }},
    {"created",
     {"CREATED", Kind::Short},
     [](const Json::Value& j, const Layout& layout, time_t) { return timeIn(j["create_time"], layout); }},
    {"note", {"NOTE", Kind::Long}, [](const Json::Value& j, const Layout&, time_t) { return noteOf(j); }},
    {"extra",
     {"EXTRA", Kind::Long},
     [](const Json::Value& j, const Layout&, time_t) { return tool::compactJson(j["extra"]); }},
};
const size_t USUAL_COLUMNS = 8; // the first ones of COLUMNS

std::vector<size_t> parseColumns(const std::string& strText)
{
    std::vector<size_t> nColumns;
    std::istringstream names(strText + ",");
    for (std::string strName; std::getline(names, strName, ',');) {
        const auto pColumn =
            std::find_if(std::begin(COLUMNS), std::end(COLUMNS),
                         [&strName](const Column& column) { return strName == column.szName; });
        if (std::end(COLUMNS) == pColumn) {
            std::string strNames;
            for (const Column& column : COLUMNS) {
                strNames += (strNames.empty() ? "" : ", ") + std::string(column.szName);
            }
            throw tool::BadValue(tool::quoted(strName) + " is not a column: " + strNames);
        }
        nColumns.push_back(static_cast<size_t>(pColumn - std::begin(COLUMNS)));
    }
    return nColumns;
}

std::vector<size_t> columnsOf(const Layout& layout)
{
    std::vector<size_t> nColumns = layout.nColumns;
    for (size_t n = 0; layout.nColumns.empty() && n < USUAL_COLUMNS; ++n) {
        nColumns.push_back(n);
    }
    return nColumns;
}

// The columns of the table. A column that the user has chosen is never spare.
std::vector<tool::Table::Column> titlesOf(const Layout& layout)
{
    std::vector<tool::Table::Column> titles;
    for (const size_t n : columnsOf(layout)) {
        titles.push_back(COLUMNS[n].title);
        titles.back().blSpare = titles.back().blSpare && layout.nColumns.empty();
    }
    return titles;
}

void requireTableForColumns(const Layout& layout)
{
    if (!layout.nColumns.empty() && (Layout::Form::Table != layout.form || !layout.strField.empty())) {
        throw tool::Failure(tool::EXIT_STATUS_USAGE, "--columns is for tables and CSV");
    }
}

// A line of CSV as in RFC 4180, but it ends with a line feed only.
std::string csvLine(const std::vector<std::string>& strCells)
{
    std::string strLine;
    for (const std::string& strCell : strCells) {
        strLine += strLine.empty() ? "" : ",";
        const bool blPlain = !strCell.empty() && strCell.find_first_of("\",\r\n") == std::string::npos;
        if (blPlain) {
            strLine += strCell;
            continue;
        }
        strLine += '"';
        for (const char c : strCell) {
            strLine += c == '"' ? "\"\"" : std::string(1, c);
        }
        strLine += '"';
    }
    return strLine;
}

// Prints a field as it is stored, for scripts.
void printField(const Json::Value& jToken, const std::string& strField)
{
    const Json::Value& jValue = jToken[strField];
    const std::string strValue = jValue.isString() ? jValue.asString() : tool::compactJson(jValue);
    tool::printLine(strValue);
}

void printSheet(const Json::Value& jToken, const Layout& layout)
{
    const time_t nNow = time(nullptr);
    const bool blExpired = isExpired(jToken, nNow);
    tool::Table table({{"FIELD", Kind::Short}, {"VALUE", Kind::Long}}, !layout.blNoHeader);
    for (const std::string& strField : tool::fieldNames()) {
        const Json::Value& jValue = jToken[strField];
        if (strField == "uid") {
            const auto strName = tool::userNameIfKnown(jValue.asInt64());
            table.add({strField, jValue.asString() + (strName ? " (" + *strName + ")" : "")});
        } else if (strField == "deadline") {
            table.add(
                {strField, timeIn(jValue, layout) + " (" + tool::relativeText(jValue.asInt64(), nNow) + ")"},
                blExpired);
        } else if (strField == "create_time") {
            table.add({strField, timeIn(jValue, layout)});
        } else if (strField == "count") {
            table.add({strField, usesText(jValue)});
        } else {
            table.add({strField, jValue.isString() ? jValue.asString() : tool::compactJson(jValue)});
        }
    }
    table.print();
}

} // namespace

namespace tool {

std::string parseField(const std::string& strText)
{
    const std::vector<std::string> strNames = fieldNames();
    if (strNames.end() == std::find(strNames.begin(), strNames.end(), strText)) {
        throw BadValue(quoted(strText) + " is not a field of a token");
    }
    return strText;
}

Layout::Form parseForm(const std::string& strText, const char* szForms)
{
    if (strText == "table") {
        return Layout::Form::Table;
    }
    if (strText == "json") {
        return Layout::Form::Json;
    }
    if (strText == "jsonl") {
        return Layout::Form::JsonLines;
    }
    throw BadValue(quoted(strText) + " is not a form: " + szForms);
}

void addForm(Command& command, Layout& layout)
{
    const auto parse = [](const std::string& strText) { return parseForm(strText, "table, json or jsonl"); };
    addParsed(command, "-o,--output", "FORM", layout.form, parse, "table (the default), json or jsonl");
}

void addNoHeader(Command& command, Layout& layout)
{
    command.flag("--no-header", layout.blNoHeader, "no line of titles above a table");
}

void addTokenOptions(Command& command, Layout& layout)
{
    const auto take = [&layout](const std::string& strText) {
        layout.blCsv = strText == "csv";
        layout.form = layout.blCsv ? Layout::Form::Table : parseForm(strText, "table, json, jsonl or csv");
    };
    command.option("-o,--output", "FORM", take, "table (the default), json, jsonl or csv");
    command.flag("--no-header", layout.blNoHeader, "no line of titles");
    addParsed(command, "--columns", "NAME,...", layout.nColumns, parseColumns,
              "these columns of a table or CSV: tid, user, function, uses, deadline, expires, session, "
              "allows, uid, created, note, extra");
    addParsed(command, "--field", "NAME", layout.strField, parseField, "this field only, as it is stored");
    command.flag("--utc", layout.blUtc, "times in UTC instead of local time");
    command.flag("--epoch", layout.blEpoch, "times in seconds since the epoch");
    command.exclude("--epoch", "--utc");
}

TokenPrinter::TokenPrinter(const Layout& layout)
    : m_layout(layout),
      m_nNow(time(nullptr)),
      m_nColumns(columnsOf(layout)),
      m_table(titlesOf(layout), !layout.blNoHeader)
{
    requireTableForColumns(layout);
}

bool TokenPrinter::measures() const
{
    return m_layout.strField.empty() && Layout::Form::Table == m_layout.form && !m_layout.blCsv;
}

void TokenPrinter::mask(Json::Value& jToken) const
{
    if (!m_layout.blShowIds) {
        jToken["tid"] = masked(jToken["tid"].asString());
    }
}

void TokenPrinter::measure(Json::Value& jToken)
{
    mask(jToken);
    m_table.measure(cellsOf(jToken));
}

std::vector<std::string> TokenPrinter::cellsOf(const Json::Value& jToken) const
{
    std::vector<std::string> strCells;
    for (const size_t n : m_nColumns) {
        strCells.push_back(COLUMNS[n].text(jToken, m_layout, m_nNow));
    }
    return strCells;
}

void TokenPrinter::print(Json::Value& jToken)
{
    mask(jToken);
    if (!m_layout.strField.empty()) {
        printField(jToken, m_layout.strField);
        return;
    }
    switch (m_layout.form) {
    case Layout::Form::Table:
        if (m_layout.blCsv) {
            printCsv(jToken);
        } else {
            m_table.print(cellsOf(jToken), isExpired(jToken, m_nNow));
        }
        break;
    case Layout::Form::JsonLines: tool::print(compactJson(jToken) + "\n"); break;
    case Layout::Form::Json: {
        // Written as a list of one token, without the brackets of the list.
        Json::Value jTokens;
        jTokens.append(jToken);
        const std::string strList = styledJson(jTokens);
        tool::print((m_blFirst ? "[" : ",") + strList.substr(1, strList.size() - 3));
        break;
    }
    }
    m_blFirst = false;
}

void TokenPrinter::printCsv(const Json::Value& jToken)
{
    if (m_blFirst && !m_layout.blNoHeader) {
        std::vector<std::string> strNames;
        for (const size_t n : m_nColumns) {
            strNames.emplace_back(COLUMNS[n].szName);
        }
        printLine(csvLine(strNames));
    }
    printLine(csvLine(cellsOf(jToken)));
}

void TokenPrinter::end()
{
    if (m_layout.strField.empty() && Layout::Form::Json == m_layout.form) {
        tool::print(m_blFirst ? "[]\n" : "\n]\n");
    }
}

namespace {

// Prints a token as a list of one.
void printAsOnly(Json::Value jToken, Layout layout)
{
    layout.blShowIds = true;
    TokenPrinter printer(layout);
    if (printer.measures()) {
        printer.measure(jToken);
    }
    printer.print(jToken);
}

} // namespace

std::string recordText(const Json::Value& jToken, Layout::Form form)
{
    return (Layout::Form::Json == form ? styledJson(jToken) : compactJson(jToken)) + "\n";
}

void printToken(const Json::Value& jToken, const Layout& layout)
{
    requireTableForColumns(layout);
    if (!layout.strField.empty()) {
        printField(jToken, layout.strField);
    } else if (Layout::Form::Table == layout.form && (layout.blCsv || !layout.nColumns.empty())) {
        printAsOnly(jToken, layout);
    } else if (Layout::Form::Table == layout.form) {
        printSheet(jToken, layout);
    } else {
        print(recordText(jToken, layout.form));
    }
}

} // namespace tool
