// export: writes all tokens as JSON lines and an end, for backups and for moving to another machine.

#include <memory>

#include "AccessTokenDefine.h"
#include "AccessTokenUtil.h"
#include "Arguments.h"
#include "Commands.h"
#include "Console.h"
#include "ExportEnd.h"
#include "Json.h"
#include "Masking.h"
#include "Memo.h"
#include "NewFile.h"
#include "Progress.h"
#include "Steps.h"
#include "Values.h"

namespace {

struct Options {
    tool::Selection selection;
    std::string strFile = "-";
};

// An expression in SQL: why a token cannot be exported, because an import would change it; '' if it can.
std::string flawInSql()
{
    std::string strSql = "CASE";
    for (const std::string& strName : tool::fieldNames()) {
        const auto add = [&](const std::string& strCondition, const std::string& strFlaw) {
            strSql += " WHEN " + strCondition + " THEN '\"" + strName + "\" " + strFlaw + "'";
        };
        const Json::Value& jDefault = VEMO_ACCESS_TOKEN::tokenType()[strName][1];
        if (jDefault.isIntegral()) {
            add("typeof(" + strName + ") <> 'integer'", "is not a whole number");
            continue;
        }
        add("instr(" + strName + ", char(0))", "holds a NUL character");
        if (jDefault.isString()) {
            add("typeof(" + strName + ") <> 'text'", "is not a text");
        }
    }
    return strSql + " ELSE '' END";
}

// The fields that hold JSON.
std::vector<std::string> objectNames()
{
    std::vector<std::string> strNames;
    for (const std::string& strName : tool::fieldNames()) {
        if (VEMO_ACCESS_TOKEN::tokenType()[strName][1].isObject()) {
            strNames.push_back(strName);
        }
    }
    return strNames;
}

struct Token {
    std::string strLine; // the line of the export, or why the token is left out
    bool blFlawed;
};

struct Exported {
    uint64_t nTokens = 0;
    uint64_t nLeftOut = 0;
};

// Writes a line for each token, and after them the end line if none was left out.
template <typename Write>
Exported writeLines(const tool::Selection& selection, bool blProgress, Write write)
{
    tool::Progress progress(
        "Exporting", [&selection] { return tool::countSelected(selection); }, blProgress);
    const std::string strSelected = selection.sql();
    const std::vector<std::string> strObjects = objectNames();
    std::string strColumns = ", " + flawInSql();
    for (const std::string& strObject : strObjects) {
        strColumns += ", " + strObject;
    }
    tool::ExportEnd end;
    Exported exported;
    std::vector<Token> tokens;
    tool::Memo<std::string> flaws(tool::flawOfStored);
    const auto take = [&](const Json::Value& jToken, const tool::Row& columns) {
        std::string strFlaw = *columns[0];
        for (size_t i = 0; strFlaw.empty() && i < strObjects.size(); ++i) {
            const std::string& strText = flaws.of(*columns[i + 1]);
            strFlaw = strText.empty() ? "" : "\"" + strObjects[i] + "\" " + strText;
        }
        tokens.push_back({strFlaw.empty() ? tool::compactJson(jToken) + "\n"
                                          : "token " + tool::masked(jToken["tid"].asString()) +
                                                " cannot be exported: " + strFlaw,
                          !strFlaw.empty()});
    };
    tool::Steps steps(tool::Store::Access::Glance, "", tool::Steps::Order::ById, tool::Steps::KEPT_MAX);
    while (steps.next([&](tool::Store& store, const std::string& strThose) {
        store.eachToken(strThose + " AND " + strSelected, strColumns, take);
    })) {
        for (const Token& token : tokens) {
            if (token.blFlawed) {
                tool::complain(token.strLine);
                ++exported.nLeftOut;
            } else {
                end.add(token.strLine);
                write(token.strLine);
                ++exported.nTokens;
            }
            progress.step();
        }
        tokens.clear();
    }
    if (0 == exported.nLeftOut) {
        write(tool::compactJson(end.json(exported.nTokens)) + "\n");
    }
    return exported;
}

Exported print(const tool::Selection& selection)
{
    // On one terminal, the bar and the tokens would get mixed.
    const bool blProgress = !tool::isTerminal(tool::resultStream());
    const Exported exported = writeLines(selection, blProgress, tool::print);
    tool::flushResult();
    return exported;
}

Exported save(const tool::Selection& selection, const std::string& strFile)
{
    tool::NewFile file(strFile);
    const auto write = [&file](const std::string& strText) { file.write(strText); };
    const Exported exported = writeLines(selection, true, write);
    if (0 == exported.nLeftOut) {
        file.complete();
    }
    return exported;
}

int exportTokens(const Options& options)
{
    const bool blPrint = options.strFile == "-";
    const Exported exported = blPrint ? print(options.selection) : save(options.selection, options.strFile);
    const std::string strTokens = tool::countText(exported.nTokens, "token");
    if (exported.nLeftOut) {
        throw tool::Failure(tool::EXIT_STATUS_STORE,
                            (blPrint ? strTokens : "nothing") + " exported; without " +
                                tool::countText(exported.nLeftOut, "token") + ", " +
                                (blPrint ? "the export has no end" : "the file would not be whole"),
                            "\"sqlite3 " VEMO_ATOKEN_DB_PATH " '.backup FILE'\" keeps all");
    }
    tool::complain(strTokens + " exported");
    return tool::EXIT_STATUS_DONE;
}

} // namespace

namespace tool {

void addExport(Commands& commands)
{
    auto pOptions = std::make_shared<Options>();
    Command& command = commands.add("export", "write all tokens, whole ids included, as JSON lines",
                                    [pOptions] { return exportTokens(*pOptions); });
    command.optionalArgument("FILE", notEmptyInto(pOptions->strFile),
                             "the file, of mode 0600; without it, standard output");
    addSelection(command, pOptions->selection);
    command.example("tokens.jsonl");
    command.example("--function backup >backup.jsonl");
}

} // namespace tool
