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

size_t print(const Contents& contents)
{
    // On one terminal the two would get mixed.
    const bool blProgress = !tool::isTerminal(tool::resultStream());
    const size_t nTokens = writeLines(contents, blProgress, tool::print);
    tool::flushResult();
    return nTokens;
}

size_t save(const Contents& contents, const std::string& strFile)
{
    tool::NewFile file(strFile);
    const auto write = [&file](const std::string& strText) { file.write(strText); };
    const size_t nTokens = writeLines(contents, true, write);
    file.complete();
    return nTokens;
}

// The sentence about an export that lacks the tokens with flaws.
tool::Failure notWhole(const Contents& contents, const std::string& strExported,
                       const std::string& strMeaning)
{
    return tool::Failure(tool::EXIT_STATUS_STORE,
                         strExported + " exported; without " +
                             tool::countText(contents.flaws.size(), "token") + ", " + strMeaning,
                         "\"sqlite3 " VEMO_ATOKEN_DB_PATH " '.backup FILE'\" keeps all");
}

int exportTokens(const Options& options)
{
    const Contents contents = readStore();
    for (const auto& [strTid, strFlaw] : contents.flaws) {
        tool::complain("token " + tool::masked(strTid) + " cannot be exported: " + strFlaw);
    }
    const bool blPrint = options.strFile == "-";
    if (!blPrint && !contents.flaws.empty()) {
        throw notWhole(contents, "nothing", "the file would not be whole");
    }
    const size_t nTokens = blPrint ? print(contents) : save(contents, options.strFile);
    const std::string strExported = tool::countText(nTokens, "token");
    if (!contents.flaws.empty()) {
        throw notWhole(contents, strExported, "the export has no end");
    }
    tool::complain(strExported + " exported");
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
