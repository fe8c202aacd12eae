// The text of a file that is imported. All of it comes in or none; and what came in can be exported and
// imported again.

#include <string>

#include "Commands.h"
#include "Console.h"
#include "Library.h"
#include "ToolStore.h"

namespace {

// Runs "vemo-access-token COMMAND ARGUMENT" and returns its exit status.
int run(void (&addCommand)(tool::Commands&), const char* szCommand, const char* szArgument)
{
    std::string strWords[] = {"vemo-access-token", szCommand, szArgument};
    char* rgWords[] = {strWords[0].data(), strWords[1].data(), strWords[2].data()};
    tool::Commands commands;
    addCommand(commands);
    try {
        return commands.run(3, rgWords);
    } catch (const tool::Failure& failure) {
        return failure.status();
    }
}

int importText(const std::string& strText)
{
    const fuzz::Input input(strText);
    return run(tool::addImport, "import", "-");
}

std::string exportText()
{
    fuzz::takeResult();
    FUZZ_REQUIRE(tool::EXIT_STATUS_DONE == run(tool::addExport, "export", "-"));
    return fuzz::takeResult();
}

void prepare()
{
    fuzz::captureStreams();
    tool::showLogLines();
}

// The tokens of a text that was imported.
Json::Value tokensOf(std::string_view strText)
{
    Json::Value jTokens(Json::arrayValue);
    while (!strText.empty()) {
        const std::string strLine = fuzz::takeLine(strText);
        if (strLine.find_first_not_of(" \t\r") != std::string::npos) {
            jTokens.append(fuzz::json(strLine));
        }
    }
    return jTokens;
}

void checkImported(fuzz::ToolStore& store, std::string_view strText)
{
    store.clear();
    FUZZ_REQUIRE(tool::EXIT_STATUS_DONE == importText(std::string(strText)));
    const Json::Value jStored = store.tokens();
    FUZZ_REQUIRE(fuzz::text(jStored) == fuzz::text(tokensOf(strText)));
    const std::string strExported = exportText();
    store.clear();
    FUZZ_REQUIRE(tool::EXIT_STATUS_DONE == importText(strExported));
    FUZZ_REQUIRE(fuzz::text(store.tokens()) == fuzz::text(jStored));
    FUZZ_REQUIRE(strExported == exportText());
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* pData, size_t cbData)
{
    const fuzz::Confinement confinement;
    static fuzz::ToolStore store;
    [[maybe_unused]] static const bool blPrepared = (prepare(), true);
    const std::string_view strText = fuzz::viewOf(pData, cbData);
    const int nStatus = importText(std::string(strText));
    FUZZ_REQUIRE(tool::EXIT_STATUS_DONE == nStatus || tool::EXIT_STATUS_USAGE == nStatus);
    if (tool::EXIT_STATUS_USAGE == nStatus) {
        FUZZ_REQUIRE(!store.isChanged());
        return 0;
    }
    checkImported(store, strText);
    store.restore();
    return 0;
}
