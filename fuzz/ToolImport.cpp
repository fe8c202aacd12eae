// The text of a file to import. Either all of it is imported or nothing. What was imported can be exported
// and imported again. If an import succeeds without --partial, it imports the same.

#include "ExportEnd.h"
#include "Json.h"
#include "ToolStore.h"

namespace {

fuzz::ToolStore& store()
{
    static fuzz::ToolStore theStore({});
    return theStore;
}

int run(void (&addCommand)(tool::Commands&), const fuzz::Texts& strArguments, std::string_view strInput = "")
{
    tool::Commands commands;
    addCommand(commands);
    const int nStatus = store().run(commands, strArguments, std::string(strInput));
    store().takeComplaints();
    return nStatus;
}

int importText(std::string_view strText)
{
    return run(tool::addImport, {"vemo-access-token", "import", "-"}, strText);
}

int importPartially(std::string_view strText)
{
    return run(tool::addImport, {"vemo-access-token", "import", "--partial", "-"}, strText);
}

std::string exportText(const std::string& strFile)
{
    FUZZ_REQUIRE(tool::EXIT_STATUS_DONE == run(tool::addExport, {"vemo-access-token", "export", strFile}));
    return store().files()[strFile];
}

// The tokens in a text that can be imported.
Json::Value tokensOf(std::string_view strText)
{
    Json::Value jTokens(Json::arrayValue);
    while (!strText.empty()) {
        const bool blCutOff = strText.back() != '\n';
        const std::string strLine = fuzz::takeLine(strText);
        if (strLine.find_first_not_of(" \t\r") == std::string::npos) {
            continue;
        }
        try {
            tool::parseObject(strLine, tool::NESTED_MAX + 1);
        } catch (const tool::BadValue&) {
            FUZZ_REQUIRE(blCutOff && strText.empty());
            break;
        }
        if (!tool::ExportEnd::is(fuzz::json(strLine))) {
            jTokens.append(fuzz::json(strLine));
        }
    }
    return jTokens;
}

void checkImported(std::string_view strText)
{
    store().clear();
    FUZZ_REQUIRE(tool::EXIT_STATUS_DONE == importPartially(strText));
    const Json::Value jStored = store().tokens();
    FUZZ_REQUIRE(fuzz::text(jStored) == fuzz::text(tokensOf(strText)));
    const std::string strExported = exportText("first");
    store().clear();
    FUZZ_REQUIRE(tool::EXIT_STATUS_DONE == importText(strExported));
    FUZZ_REQUIRE(fuzz::text(store().tokens()) == fuzz::text(jStored));
    FUZZ_REQUIRE(strExported == exportText("second"));
    store().clear();
    const bool blWhole = tool::EXIT_STATUS_DONE == importText(strText);
    FUZZ_REQUIRE(fuzz::text(store().tokens()) == (blWhole ? fuzz::text(jStored) : "[]"));
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* pData, size_t cbData)
{
    const std::string_view strText = fuzz::viewOf(pData, cbData);
    const int nStatus = importPartially(strText);
    FUZZ_REQUIRE(tool::EXIT_STATUS_DONE == nStatus || tool::EXIT_STATUS_USAGE == nStatus);
    if (tool::EXIT_STATUS_USAGE == nStatus) {
        FUZZ_REQUIRE(tool::EXIT_STATUS_USAGE == importText(strText));
        FUZZ_REQUIRE(!store().isChanged());
        return 0;
    }
    checkImported(strText);
    store().restore();
    return 0;
}
