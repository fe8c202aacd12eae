// export: writes all tokens as JSON lines and an end, for backups and for moving to another machine.

#include <memory>

#include "Arguments.h"
#include "Commands.h"
#include "Console.h"
#include "ExportEnd.h"
#include "Json.h"
#include "NewFile.h"
#include "Store.h"
#include "Values.h"

namespace {

struct Options {
    std::string strFile = "-";
};

template <typename Write>
void writeLines(const Json::Value& jTokens, bool blProgress, Write write)
{
    tool::Progress progress("Exporting", jTokens.size(), blProgress);
    tool::ExportEnd end;
    for (const Json::Value& jToken : jTokens) {
        const std::string strLine = tool::compactJson(jToken) + "\n";
        end.add(strLine);
        write(strLine);
        progress.step();
    }
    write(tool::compactJson(end.json(jTokens.size())) + "\n");
}

int exportTokens(const Options& options)
{
    const Json::Value jTokens = tool::Store(tool::Store::Access::Read).tokens(Json::Value(Json::objectValue));
    if (options.strFile == "-") {
        // On one terminal the two would get mixed.
        writeLines(jTokens, !tool::isTerminal(tool::resultStream()), tool::print);
        tool::flushResult();
    } else {
        tool::NewFile file(options.strFile);
        writeLines(jTokens, true, [&file](const std::string& strText) { file.write(strText); });
        file.complete();
    }
    tool::complain(tool::countText(jTokens.size(), "token") + " exported");
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
