// export: writes all tokens as JSON lines and an end, for backups and for moving to another machine.

#include <map>
#include <memory>

#include "AccessTokenDefine.h"
#include "AccessTokenUtil.h"
#include "Arguments.h"
#include "Commands.h"
#include "Console.h"
#include "ExportEnd.h"
#include "Json.h"
#include "Masking.h"
#include "NewFile.h"
#include "Progress.h"
#include "Store.h"
#include "Values.h"

namespace {

struct Options {
    std::string strFile = "-";
};

// Why tokens cannot be exported, by their ids: an import would not make them what they are.
typedef std::map<std::string, std::string> Flaws;

Flaws findFlaws(tool::Store& store)
{
    Flaws flaws;
    for (const std::string& strName : tool::fieldNames()) {
        const auto add = [&](const tool::Rows& tids, const std::string& strReason) {
            for (const auto& row : tids) {
                flaws.emplace(row[0].value_or(""), "\"" + strName + "\" " + strReason);
            }
        };
        const auto select = [&](const std::string& strWhat, const std::string& strWhere) {
            return store.query("SELECT " + strWhat + " FROM token WHERE " + strWhere);
        };
        const Json::Value& jDefault = VEMO_ACCESS_TOKEN::tokenType()[strName][1];
        if (jDefault.isIntegral()) {
            add(select("tid", "typeof(" + strName + ") <> 'integer'"), "is no whole number");
            continue;
        }
        add(select("tid", "instr(" + strName + ", char(0))"), "holds a NUL character");
        if (jDefault.isString()) {
            add(select("tid", "typeof(" + strName + ") <> 'text'"), "is no text");
            continue;
        }
        for (const auto& row : select("tid, " + strName, strName + " <> '{}'")) {
            const std::string strFlaw = tool::flawOfStored(row[1].value_or(""));
            if (!strFlaw.empty()) {
                add({row}, strFlaw);
            }
        }
    }
    return flaws;
}

// The tokens of the store, and why some of them are not exported.
struct Contents {
    Json::Value jTokens;
    Flaws flaws;
};

Contents readStore()
{
    tool::Store store(tool::Store::Access::Read);
    Json::Value jTokens = store.tokens(Json::Value(Json::objectValue));
    return {std::move(jTokens), findFlaws(store)};
}

// Writes a line for each token and, behind all of them, the end. Returns how many lines of tokens there are.
template <typename Write>
size_t writeLines(const Contents& contents, bool blProgress, Write write)
{
    tool::Progress progress("Exporting", contents.jTokens.size(), blProgress);
    tool::ExportEnd end;
    size_t nTokens = 0;
    for (const Json::Value& jToken : contents.jTokens) {
        if (!contents.flaws.count(jToken["tid"].asString())) {
            const std::string strLine = tool::compactJson(jToken) + "\n";
            end.add(strLine);
            write(strLine);
            ++nTokens;
        }
        progress.step();
    }
    if (contents.flaws.empty()) {
        write(tool::compactJson(end.json(nTokens)) + "\n");
    }
    return nTokens;
}

int exportTokens(const Options& options)
{
    const Contents contents = readStore();
    for (const auto& [strTid, strFlaw] : contents.flaws) {
        tool::complain("token " + tool::masked(strTid) + " cannot be exported: " + strFlaw);
    }
    const bool blPrint = options.strFile == "-";
    size_t nTokens = 0;
    if (blPrint) {
        // On one terminal the two would get mixed.
        nTokens = writeLines(contents, !tool::isTerminal(tool::resultStream()), tool::print);
        tool::flushResult();
    } else if (contents.flaws.empty()) {
        tool::NewFile file(options.strFile);
        nTokens = writeLines(contents, true, [&file](const std::string& strText) { file.write(strText); });
        file.complete();
    }
    if (!contents.flaws.empty()) {
        const std::string strWithout = "without " + tool::countText(contents.flaws.size(), "token");
        throw tool::Failure(tool::EXIT_STATUS_STORE,
                            blPrint ? tool::countText(nTokens, "token") + " exported; " + strWithout +
                                          ", the export has no end"
                                    : "nothing exported; " + strWithout + ", the file would not be whole",
                            "\"sqlite3 " VEMO_ATOKEN_DB_PATH " '.backup FILE'\" keeps all");
    }
    tool::complain(tool::countText(nTokens, "token") + " exported");
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
}

} // namespace tool
