// Command lines of the tool: one argument on each line, and after a NUL byte the text on standard input.

#include <algorithm>
#include <cctype>
#include <map>
#include <optional>
#include <set>

#include "Command.h"
#include "ToolStore.h"

namespace {

using fuzz::Texts;
typedef tool::Command::Parameter Parameter;

const std::set<std::string> READERS = {"list", "show", "check", "stats", "export", "generate", "help", ""};

Texts argumentsOf(std::string_view strLines)
{
    Texts strArguments = {"vemo-access-token"};
    while (!strLines.empty()) {
        strArguments.push_back(fuzz::takeLine(strLines));
    }
    return strArguments;
}

// The command if the arguments begin with one, otherwise "".
std::string commandOf(const Texts& strArguments)
{
    const bool blCommand =
        strArguments.size() > 1 &&
        std::any_of(tool::COMMANDS.begin(), tool::COMMANDS.end(),
                    [&](const tool::CommandEntry& entry) { return entry.szName == strArguments[1]; });
    return blCommand ? strArguments[1] : "";
}

// The texts given to each option and argument, by its name; "" for a flag.
typedef std::map<std::string, Texts> Reading;

Reading readingOf(const tool::Command& command)
{
    Reading reading;
    for (const tool::Command::Word& word : command.words()) {
        reading[word.pParameter->strName].push_back(word.strText);
    }
    return reading;
}

template <typename IsIt>
const Parameter* find(const std::vector<Parameter>& parameters, IsIt isIt)
{
    const auto pFound = std::find_if(parameters.begin(), parameters.end(), isIt);
    return parameters.end() == pFound ? nullptr : &*pFound;
}

// What the command should read from the arguments after its name, by plain comparisons, without getopt.
// Nothing if they are not valid.
std::optional<Reading> readPlainly(const tool::Command& command, const Texts& strArguments)
{
    Reading reading;
    auto itNext = strArguments.begin() + 2;
    const auto add = [&](const Parameter* pParameter, const std::string& strText) {
        if (!pParameter || (!pParameter->blRepeated && reading.count(pParameter->strName))) {
            return false;
        }
        reading[pParameter->strName].push_back(strText);
        return true;
    };
    // An option whose text, if it takes one, is the next argument.
    const auto addNext = [&](const Parameter* pOption) {
        const bool blText = pOption && !pOption->strType.empty();
        return !(blText && strArguments.end() == itNext) && add(pOption, blText ? *itNext++ : "");
    };
    // "--name=text", "--name text" or "--name"
    const auto addLong = [&](const std::string& strNext) {
        const size_t nEquals = strNext.find('=');
        const Parameter* pOption = find(command.options(), [&](const Parameter& each) {
            return each.strName == strNext.substr(0, nEquals);
        });
        if (pOption && std::string::npos != nEquals) {
            return !pOption->strType.empty() && add(pOption, strNext.substr(nEquals + 1));
        }
        return addNext(pOption);
    };
    // "-otext", "-o text", "-o" or several flags "-ox"
    const auto addShort = [&](const std::string& strNext) {
        bool blGood = true;
        for (size_t n = 1; blGood && n < strNext.size(); ++n) {
            const Parameter* pOption = find(command.options(), [&](const Parameter& each) {
                return each.cShort && each.cShort == strNext[n];
            });
            if (pOption && !pOption->strType.empty() && n + 1 < strNext.size()) {
                return add(pOption, strNext.substr(n + 1));
            }
            blGood = addNext(pOption);
        }
        return blGood;
    };
    for (bool blOptions = true; strArguments.end() != itNext;) {
        const std::string strNext = *itNext++;
        if (blOptions && strNext == "--") {
            blOptions = false;
            continue;
        }
        const Parameter* pArgument = find(command.arguments(), [&](const Parameter& each) {
            return each.blRepeated || !reading.count(each.strName);
        });
        const bool blOption = blOptions && strNext.size() > 1 && strNext[0] == '-';
        if (!(!blOption           ? add(pArgument, strNext)
              : strNext[1] == '-' ? addLong(strNext)
                                  : addShort(strNext))) {
            return std::nullopt;
        }
    }
    return reading;
}

// The exit status.
int run(fuzz::ToolStore& store, const Texts& strArguments, const std::string& strInput)
{
    // Making all commands would take long.
    const std::string strCommand = commandOf(strArguments);
    tool::Commands commands;
    for (const tool::CommandEntry& entry : tool::COMMANDS) {
        if (entry.szName == (strCommand.empty() ? "generate" : strCommand)) {
            entry.add(commands);
        }
    }
    const int nStatus = store.run(commands, strArguments, strInput);
    if (!strCommand.empty()) { // each option and argument gets exactly its texts, or the command fails
        const auto reading = readPlainly(commands.all().front(), strArguments);
        FUZZ_REQUIRE(reading ? *reading == readingOf(commands.all().front())
                             : tool::EXIT_STATUS_USAGE == nStatus);
    }
    return nStatus;
}

// The files that arguments can name.
const Files FILES = {
    {"extra.json", R"({"a":[1]})"},
    {"tokens.jsonl",
     R"({"tid":")" + fuzz::tid("FromAFile") +
         R"(","bind_sid":"","uid":0,"deadline":4102444800,"count":1,"create_time":1,"function":"f",)"
         R"("webapi_allow":{},"extra":{}})"}};

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

// If a later file fails, the notes on the files that were imported come first.
std::string withoutNotes(std::string strComplaint)
{
    for (;;) {
        const std::string strLine = strComplaint.substr(0, strComplaint.find('\n') + 1);
        if (!endsWith(strLine, "; the whole lines were imported\n") &&
            !endsWith(strLine, " of them expired: the next call of a program purges those\n")) {
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
    static fuzz::ToolStore store(FILES);
    const std::string_view strInput = fuzz::viewOf(pData, cbData);
    const size_t cbLines = std::min(strInput.find('\0'), strInput.size());
    const std::string_view strLines = strInput.substr(0, cbLines);
    if (std::string_view::npos != strLines.find('/')) { // no path may lead out of the directory
        return -1;
    }
    const Texts strArguments = argumentsOf(strLines);
    const int nStatus =
        run(store, strArguments, std::string(strInput.substr(std::min(cbLines + 1, strInput.size()))));
    FUZZ_REQUIRE(tool::EXIT_STATUS_DONE <= nStatus && nStatus <= tool::EXIT_STATUS_FINDINGS);
    checkComplaint(strArguments, nStatus, store.takeComplaints());
    if (store.isChanged()) {
        FUZZ_REQUIRE(mayChange(strArguments, nStatus));
        // Import accepts everything that the store can hold; the other commands make only what programs can.
        for (Json::Value& jToken : store.tokens()) {
            FUZZ_REQUIRE(commandOf(strArguments) == "import" ||
                         0 == VEMO_ACCESS_TOKEN::checkJsonType(jToken));
        }
    }
    store.restore();
    return 0;
}
