// Command lines of the tool: one argument on each line, and after a NUL byte the text on standard input.

#include <algorithm>
#include <cctype>
#include <set>
#include <string>
#include <vector>

#include "AccessTokenDefine.h"
#include "AccessTokenUtil.h"
#include "Commands.h"
#include "Console.h"
#include "Library.h"
#include "PlainReading.h"
#include "ToolStore.h"

namespace {

using fuzz::Texts;

const std::set<std::string> READERS = {"list", "show", "check", "stats", "export", "generate", "help", ""};

Texts argumentsOf(std::string_view strLines)
{
    Texts strArguments = {"vemo-access-token"};
    while (!strLines.empty()) {
        strArguments.push_back(fuzz::takeLine(strLines));
    }
    return strArguments;
}

// Of a name there is a command of, or of "generate".
const tool::CommandEntry& entryOf(const std::string& strName)
{
    const tool::CommandEntry* pFound = nullptr;
    for (const tool::CommandEntry& entry : tool::COMMANDS) {
        if (entry.szName == strName || (!pFound && entry.szName == std::string("generate"))) {
            pFound = &entry;
        }
    }
    return *pFound;
}

// The command, if the arguments begin with one; or else "".
std::string commandOf(const Texts& strArguments)
{
    return strArguments.size() > 1 && entryOf(strArguments[1]).szName == strArguments[1] ? strArguments[1]
                                                                                         : "";
}

// Each option and argument gets exactly its texts from the command line, or the command fails.
void checkReading(const tool::Command& command, const Texts& strArguments, int nStatus)
{
    fuzz::Reading reading;
    const Texts strBehindName(strArguments.begin() + 2, strArguments.end());
    if (fuzz::readPlainly(command, strBehindName, reading)) {
        FUZZ_REQUIRE(reading == fuzz::readingOf(command));
    } else {
        FUZZ_REQUIRE(tool::EXIT_STATUS_USAGE == nStatus);
    }
}

// The exit status.
int run(const Texts& strArguments, const std::string& strInput)
{
    const fuzz::Input input(strInput);
    // Making all commands would take most of the time.
    const std::string strCommand = commandOf(strArguments);
    tool::Commands commands;
    entryOf(strCommand).add(commands);
    const int nStatus = fuzz::runTool(commands, strArguments);
    if (!strCommand.empty()) {
        checkReading(commands.all().front(), strArguments, nStatus);
    }
    return nStatus;
}

void checkNames()
{
    tool::Commands commands;
    for (const tool::CommandEntry& entry : tool::COMMANDS) {
        entry.add(commands);
        FUZZ_REQUIRE(commands.all().back().name() == entry.szName);
    }
}

void prepare()
{
    checkNames();
    fuzz::setFileTexts(
        R"({"a":[1]})",
        R"({"tid":")" + fuzz::tid("FromAFile") +
            R"(","bind_sid":"","uid":0,"deadline":4102444800,"count":1,"create_time":1,"function":"f",)"
            R"("webapi_allow":{},"extra":{}})");
    fuzz::captureStreams();
}

bool has(const Texts& strArguments, const std::string& strArgument)
{
    return strArguments.end() != std::find(strArguments.begin(), strArguments.end(), strArgument);
}

bool mayChange(const Texts& strArguments, int nStatus)
{
    const std::string strCommand = commandOf(strArguments);
    const bool blDryRun = has(strArguments, "--dry-run") && !has(strArguments, "--");
    if (blDryRun || READERS.count(strCommand) || (strCommand == "doctor" && !has(strArguments, "--repair"))) {
        return false;
    }
    // The files before a bad one are imported.
    return strCommand == "import" ||
           (tool::EXIT_STATUS_USAGE != nStatus && tool::EXIT_STATUS_NO_TOKEN != nStatus);
}

bool isId(const std::string& strText)
{
    return strText.size() >= VEMO_ATOKEN_LENGTH_MIN && std::all_of(strText.begin(), strText.end(), isalnum);
}

bool endsWith(const std::string& strText, const std::string& strEnd)
{
    return strText.size() >= strEnd.size() &&
           0 == strText.compare(strText.size() - strEnd.size(), strEnd.size(), strEnd);
}

// Notes on a file that was imported. The next file may fail, so they can precede a complaint.
bool isNote(const std::string& strLine)
{
    const std::string strStart = "vemo-access-token: ";
    if (0 != strLine.compare(0, strStart.size(), strStart)) {
        return false;
    }
    const size_t nNumberEnd = strLine.find_first_not_of("0123456789", strStart.size());
    const bool blNumber = nNumberEnd != strStart.size() && nNumberEnd != std::string::npos;
    return endsWith(strLine, "; the whole lines were imported\n") ||
           (blNumber &&
            strLine.substr(nNumberEnd) == " of them expired: the next call of a program purges those\n");
}

std::string withoutNotes(std::string strComplaint)
{
    for (;;) {
        const std::string strLine = strComplaint.substr(0, strComplaint.find('\n') + 1);
        if (!isNote(strLine)) {
            return strComplaint;
        }
        strComplaint.erase(0, strLine.size());
    }
}

// A failure is reported in one sentence that contains no id from the arguments.
void checkComplaint(const Texts& strArguments, int nStatus, const std::string& strComplaints)
{
    const std::string strStart = "vemo-access-token: ";
    const bool blSilent = tool::EXIT_STATUS_DONE == nStatus || tool::EXIT_STATUS_FINDINGS == nStatus ||
                          tool::EXIT_STATUS_REFUSED == nStatus;
    if (blSilent) {
        return;
    }
    const std::string strComplaint = withoutNotes(strComplaints);
    FUZZ_REQUIRE(0 == strComplaint.compare(0, strStart.size(), strStart));
    FUZZ_REQUIRE(strComplaint.find('\n') == strComplaint.size() - 1);
    for (const std::string& strArgument : strArguments) {
        FUZZ_REQUIRE(!isId(strArgument) || std::string::npos == strComplaint.find(strArgument));
    }
    // Store and system do not fail here. Only these two requests cannot be met.
    const auto says = [&](const char* szText) { return std::string::npos != strComplaint.find(szText); };
    FUZZ_REQUIRE(tool::EXIT_STATUS_STORE != nStatus || says("the journal cannot be made") ||
                 says("granted, but there is no user"));
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* pData, size_t cbData)
{
    const fuzz::Confinement confinement;
    static fuzz::ToolStore store;
    [[maybe_unused]] static const bool blPrepared = (prepare(), true);
    const std::string_view strInput = fuzz::viewOf(pData, cbData);
    const size_t cbLines = std::min(strInput.find('\0'), strInput.size());
    const Texts strArguments = argumentsOf(strInput.substr(0, cbLines));
    const int nStatus =
        run(strArguments, std::string(strInput.substr(std::min(cbLines + 1, strInput.size()))));
    fuzz::takeResult();
    const std::string strComplaints = fuzz::takeComplaints();
    FUZZ_REQUIRE(tool::EXIT_STATUS_DONE <= nStatus && nStatus <= tool::EXIT_STATUS_FINDINGS);
    checkComplaint(strArguments, nStatus, strComplaints);
    if (store.isChanged()) {
        FUZZ_REQUIRE(mayChange(strArguments, nStatus));
        // Import accepts everything that the store can hold; the other commands make only what programs can.
        for (Json::Value& jToken : store.tokens()) {
            FUZZ_REQUIRE(commandOf(strArguments) == "import" ||
                         0 == VEMO_ACCESS_TOKEN::checkJsonType(jToken));
        }
        store.restore();
    }
    return 0;
}
